// What makes events last, behind the store: it opens its place, keeps batches of events, tidies up, and closes its
// place when it goes. The store decides when each happens; how and where events are kept is the keeper's matter alone.
//
// Another engine is one file that implements this, and one line in LinuxPlatform that makes it.
#pragma once

#include "platform/EventBatch.h"
#include "platform/linux/store/AnalyticsConfiguration.h"
#include "platform/linux/store/StoreError.h"

#include <cstdint>

namespace platform {

// One thread, but for the counts. What fails is the keeper's to log and to count.
class EventKeeper {
public:
    EventKeeper() = default;
    virtual ~EventKeeper() = default;
    EventKeeper(const EventKeeper&) = delete;
    EventKeeper& operator=(const EventKeeper&) = delete;

    // For how long and how many events are kept, and how safely. Before anything else, and whenever it changes.
    virtual void setConfiguration(const AnalyticsConfiguration& configuration) = 0;
    // Makes the place for events, so that it is there before the first.
    virtual void open() = 0;
    // Keeps the events, in their order, all or none of them; they last, or are counted as lost, when this returns.
    // One whose payload JSON cannot say is lost alone.
    virtual void keep(EventBatch& events) = 0;
    // Whether some tidying waits for a quiet moment.
    [[nodiscard]] virtual bool awaitsQuiet() const = 0;
    // Does some of the tidying that is due, removing what is too old or too much; true when more is left to do.
    // `isQuiet`: nothing is to be kept now.
    virtual bool tidy(bool isQuiet) = 0;

    // How many events were kept since the start, and how many were lost for that reason. Any thread.
    [[nodiscard]] virtual std::uint64_t keptEvents() const noexcept = 0;
    [[nodiscard]] virtual std::uint64_t lostEvents(StoreError reason) const noexcept = 0;
};

} // namespace platform
