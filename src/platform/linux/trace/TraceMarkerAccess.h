// How clients come to emit events themselves: the service hands them the marker of its trace, open for writing, and the
// page that says whether anybody traces.
//
// A client that asks is answered when there is something to hand out, which is when somebody traces for the first time:
// until then, and where nobody ever does, asking costs next to nothing. What a client then has cannot be turned against
// others: of the marker it has the writing end alone, and the page's file is sealed against everything but reading.
#pragma once

#include "foundation/Mutex.h"
#include "platform/linux/files/FileDescriptor.h"

#include <functional>
#include <map>
#include <optional>
#include <system_error>

namespace platform {

// What is handed out. They stay open as long as the service.
struct TraceDescriptors {
    int marker = -1;
    int page = -1; // TraceMarkerPage
};

// Any thread.
class TraceMarkerAccess {
public:
    using Answer = std::move_only_function<void(const TraceDescriptors& descriptors)>;

    TraceMarkerAccess() = default;
    ~TraceMarkerAccess();
    TraceMarkerAccess(const TraceMarkerAccess&) = delete;
    TraceMarkerAccess& operator=(const TraceMarkerAccess&) = delete;

    // Answers once: now or from `open`, or never if the asker is forgotten before.
    void ask(const void* asker, Answer answer);
    void forget(const void* asker);

    // There is a marker, which stays open as long as this lives: makes the page and answers all who wait. Once.
    [[nodiscard]] std::error_code open(int marker);
    // Writes to the page whether somebody traces; without a page it does nothing.
    void setTracing(bool isTracing) noexcept;

private:
    foundation::Mutex lock_;
    std::map<const void*, Answer> waiting_ KESTO_GUARDED_BY(lock_);
    std::optional<TraceDescriptors> descriptors_ KESTO_GUARDED_BY(lock_);
    FileDescriptor page_ KESTO_GUARDED_BY(lock_);
    void* mapping_ KESTO_GUARDED_BY(lock_) = nullptr;
};

} // namespace platform
