// SPDX-License-Identifier: Apache-2.0
// The part behind the store that keeps events: it opens its place, keeps batches of events, tidies up, and closes its
// place when it is destroyed. The store decides when each happens; the keeper alone decides how and where it keeps
// events.
//
// Another engine needs one file that implements this, and the line in LinuxPlatform that makes it.
#pragma once

#include "ledger/LedgerImage.h"
#include "ledger/Tally.h"
#include "platform/EventBatch.h"
#include "platform/linux/store/AnalyticsConfiguration.h"

#include <functional>
#include <optional>

namespace platform {

// The store's thread calls its functions, unless said otherwise. The keeper is made on the thread that makes the store,
// before the first call, and destroyed on the thread that destroys the store, after the last. It logs its own failures,
// and counts in the tally that it gets: events kept, lost and removed, and by whose doing.
class EventKeeper {
public:
    EventKeeper() = default;
    virtual ~EventKeeper() = default;
    EventKeeper(const EventKeeper&) = delete;
    EventKeeper& operator=(const EventKeeper&) = delete;

    // For how long and how safely events are kept, and how many. Called before `open`, and after every change.
    virtual void setConfiguration(const AnalyticsConfiguration& configuration) = 0;
    // Gives the keeper a way to get an empty batch soon, from any thread. Called before `open`.
    virtual void setWaker(std::function<void()> wake) = 0;
    // Opens the place for events, or makes it. Called once, before the first `keep`. If it fails, the keeper logs this,
    // and the store goes on as if it had not: `keep` tries again, and counts the events as lost while that fails.
    virtual void open() = 0;
    // Keeps all the events, in their order, or none. When it returns, they are kept or counted as lost. A payload that
    // JSON cannot express is lost alone. The batch may be empty: when the store is quiet, when a configuration changed,
    // and when only callers wait. Its events stay in it: another thread may look whose they are.
    virtual void keep(EventBatch& events, ledger::Tally& tally) = 0;
    // Whether some tidying waits until the store is quiet.
    [[nodiscard]] virtual bool awaitsQuiet() const = 0;
    // Does a part of the tidying that is due: removes events that are too old or too many. True if more is left to do.
    // `isQuiet`: no events wait now.
    virtual bool tidy(bool isQuiet, ledger::Tally& tally) = 0;
    // The service begins to end: the connections that end from now on end with it. Any thread.
    virtual void beginEnd() = 0;
    // Leaves the place as a service does that ends in order, because the process ends soon without closing it.
    virtual void prepareForEnd() = 0;
    // What the place holds now; nothing while it is not open, or while it gets back what damage took away.
    [[nodiscard]] virtual std::optional<ledger::StoreState> state() const = 0;
    // Logs the lost events that the log does not show yet. Never waits for the disk. Any thread.
    virtual void reportLosses() = 0;
};

} // namespace platform
