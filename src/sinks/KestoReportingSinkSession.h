// What a sink sees of a session: enough to name an event and to say who played, and nothing more.
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
