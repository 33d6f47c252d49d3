// The long steps of an end run on the thread, and those that need a turn on the lane of the client. Each step submits
// the next, so at any time one thread at most has the end.
#include "client/SessionEnds.h"

#include "platform/Platform.h"
#include "utility/LogCategories.h"
#include "utility/ServerQueue.h"
#include "utility/Slice.h"

#include <system_error>
#include <utility>

namespace client {

void SessionEnds::stop(platform::Turn& turn, std::shared_ptr<KestoReportingSession> session,
                       const std::shared_ptr<platform::Lane>& lane, Then then)
{
    utility::assertServerQueue();
    session->announcePlayingEnd(turn, platform::PlayingEnding::Stopped);
    if (!session->takesLongToStop()) {
        session->stop(turn);
        session.reset(); // `then` may be what lets go of it
        return then(turn);
    }
    if (!session->hasManyMessages())
        return writeFile(turn, std::move(session), lane, std::move(then));
    auto run = session->beginStop();
    ends_.push_back({std::move(session), std::move(run), lane, std::move(then), lane->pause()});
    if (ends_.size() == 1)
        begin(ends_.front());
}

// The file of a short session. Its other steps are quick, so it waits for no end of a long one.
void SessionEnds::writeFile(platform::Turn& turn, std::shared_ptr<KestoReportingSession> session,
                            const std::shared_ptr<platform::Lane>& lane, Then then)
{
    auto run = session->beginStop();
    run->makeVolumeEvents();
    while (run->hasVolumeEvents())
        run->sendVolumeEvent(turn, session);
    elsewhere(
        [run = std::move(run), session = std::move(session), then = std::move(then), resume = lane->pause()]() mutable {
            run->summarise();
            run->letGo();
            resume([run = std::move(run), session = std::move(session),
                    then = std::move(then)](platform::Turn& last) mutable {
                session->finishStop(last, *run);
                session.reset(); // before `then` may let go of it
                then(last);
            });
        });
}

void SessionEnds::begin(End& end)
{
    elsewhere([self = shared_from_this(), &end] {
        end.run->makeVolumeEvents();
        if (!end.run->hasVolumeEvents())
            return self->summarise(end);
        resume(end, [self, &end](platform::Turn& turn) { self->sendVolumeEvents(turn, end); });
    });
}

void SessionEnds::sendVolumeEvents(platform::Turn& turn, End& end)
{
    const utility::Slice slice;
    do
        end.run->sendVolumeEvent(turn, end.session);
    while (end.run->hasVolumeEvents() && !slice.isOver());
    end.resume = end.lane->pause();
    if (end.run->hasVolumeEvents())
        resume(end, [self = shared_from_this(), &end](platform::Turn& next) { self->sendVolumeEvents(next, end); });
    else
        elsewhere([self = shared_from_this(), &end] { self->summarise(end); });
}

// On the thread.
void SessionEnds::summarise(End& end)
{
    end.run->summarise();
    end.run->letGo();
    resume(end, [self = shared_from_this()](platform::Turn& turn) { self->finish(turn); });
}

// The item may run, and let go of the end, before this returns.
void SessionEnds::resume(End& end, platform::TurnItem item)
{
    auto resume = std::move(end.resume);
    resume(std::move(item));
}

void SessionEnds::finish(platform::Turn& turn)
{
    End& end = ends_.front();
    end.session->finishStop(turn, *end.run);
    auto then = std::move(end.then);
    ends_.pop_front(); // which lets go of the session before `then` may
    if (!ends_.empty())
        begin(ends_.front());
    then(turn);
}

void SessionEnds::elsewhere(platform::WorkItem work)
{
    if (queue_ == nullptr)
        makeQueue();
    if (queue_ != nullptr)
        queue_->submit(std::move(work));
    else
        work();
}

void SessionEnds::makeQueue()
{
    try {
        queue_ = platform::current().workQueues.makeSerialQueue("com.quarn.kesto.reporting.ends", {});
    } catch (const std::system_error& refusal) { // slower calls are better than a service that ends
        if (!std::exchange(isRefused_, true))
            KESTO_LOG(KestoReportingClientCategory(), Error,
                      "no thread for the ends of long sessions ({}): all calls wait while one stops",
                      refusal.code().message());
    }
}

} // namespace client
