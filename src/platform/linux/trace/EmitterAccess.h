// SPDX-License-Identifier: Apache-2.0
// Lets clients emit events: the service gives them the marker of its trace, open for writing, and the page that shows
// whether a trace runs.
//
// A client that asks gets the answer when the first trace starts; until then a request costs almost nothing. A client
// cannot harm others with these descriptors: it has only the writing end of the marker, and the page's file is sealed
// against everything but reading.
#pragma once

#include "foundation/Mutex.h"
#include "platform/linux/files/FileDescriptor.h"

#include <functional>
#include <map>
#include <optional>
#include <system_error>

namespace platform {

// The descriptors for clients. They stay open as long as the service runs.
struct EmitterDescriptors {
    int marker = -1;
    int page = -1; // TraceSwitchPage
};

// Any thread.
class EmitterAccess {
public:
    using Answer = std::move_only_function<void(const EmitterDescriptors& descriptors)>;

    EmitterAccess() = default;
    ~EmitterAccess();
    EmitterAccess(const EmitterAccess&) = delete;
    EmitterAccess& operator=(const EmitterAccess&) = delete;

    // Answers once: now, or in `answerWaiting`, or never if the asker is forgotten before.
    void ask(const void* asker, Answer answer);
    void forget(const void* asker);

    // Sets the marker, which must stay open as long as this object lives, and makes the page. Call it once.
    [[nodiscard]] std::error_code open(int marker);
    // Answers all waiting askers; without a page it does nothing. An answer may use the trace, so call it without a
    // lock.
    void answerWaiting();
    // Writes to the page whether a trace runs; without a page it does nothing.
    void setTracing(bool isTracing) noexcept;

private:
    foundation::Mutex lock_;
    std::map<const void*, Answer> waiting_ KESTO_GUARDED_BY(lock_);
    std::optional<EmitterDescriptors> descriptors_ KESTO_GUARDED_BY(lock_);
    FileDescriptor page_ KESTO_GUARDED_BY(lock_);
    void* mapping_ KESTO_GUARDED_BY(lock_) = nullptr;
};

} // namespace platform
