// A sink's view of a session: only what it needs to name an event and the application.
#pragma once

#include "foundation/values/Value.h"
#include "utility/KestoReportingVocabulary.h"

// Any thread: a payload may be built after the session's own work went on.
class KestoReportingSinkSession {
public:
    virtual ~KestoReportingSinkSession() = default;
    [[nodiscard]] virtual AudioServiceType serviceType() const = 0;
    [[nodiscard]] virtual foundation::Dictionary configuration() const = 0;
};
