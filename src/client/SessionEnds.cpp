// SPDX-License-Identifier: Apache-2.0
// The long steps of an end run on the thread, and those that need a turn on the lane of the client. Each step submits
// the next, so at any time one thread at most has the end.
#include "client/SessionEnds.h"

#include "platform/Platform.h"
#include "utility/KestoReportingUtility.h"
#include "utility/ServerQueue.h"
#include "utility/Slice.h"

#include <system_error>
#include <utility>

namespace client {

void SessionEnds::stop(platform::Turn& turn, std::shared_ptr<KestoReportingSession> session, std::uint32_t user,
                       const std::shared_ptr<platform::Lane>& lane, Then then)
{
    utility::assertServerQueue();
    session->announcePlayingEnd(turn, platform::PlayingEnding::Stopped);
    if (!session->takesLongToStop()) {
        session->stop(turn);
        session.reset(); // `then` may be what lets go of it
        return then(turn);
    }
    const bool isLong = session->hasManyMessages();
    auto run = session->beginStop();
    auto end = std::make_shared<End>(std::move(session), std::move(run), lane, std::move(then));
    if (!isLong)
        return endShort(turn, end);
    end->resume = lane->pause();
    waiting_[user].push_back(std::move(end));
    beginNext();
}

// Only its file and its trace take long, so it waits for no end of a long one.
void SessionEnds::endShort(platform::Turn& turn, const SharedEnd& end)
{
    end->run->makeVolumeEvents();
    while (end->run->hasVolumeEvents())
        end->run->sendVolumeEvent(turn, end->session);
    const auto summarise = [end] {
        end->run->summarise();
        end->run->letGo();
    };
    if (!KestoReportingUtilityIsInternalBuild()) {
        summarise();
        return stopTrace(turn, end);
    }
    end->resume = end->lane->pause();
    on(ends_, [self = shared_from_this(), end, summarise] {
        summarise();
        resume(*end, [self, end](platform::Turn& next) { self->stopTrace(next, end); });
    });
}

// The users in the order of their numbers, each with the end that has waited longest.
void SessionEnds::beginNext()
{
    if (current_ != nullptr || waiting_.empty())
        return;
    auto next = waiting_.upper_bound(lastUser_);
    if (next == waiting_.end())
        next = waiting_.begin();
    auto& [user, ends] = *next;
    lastUser_ = user;
    current_ = std::move(ends.front());
    ends.pop_front();
    if (ends.empty())
        waiting_.erase(next);
    begin(current_);
}

void SessionEnds::begin(const SharedEnd& end)
{
    on(ends_, [self = shared_from_this(), end] {
        end->run->makeVolumeEvents();
        if (!end->run->hasVolumeEvents())
            return self->summarise(end);
        resume(*end, [self, end](platform::Turn& turn) { self->sendVolumeEvents(turn, end); });
    });
}

void SessionEnds::sendVolumeEvents(platform::Turn& turn, const SharedEnd& end)
{
    const auto sendNext = [end](platform::Turn& now) {
        end->run->sendVolumeEvent(now, end->session);
        return end->run->hasVolumeEvents();
    };
    utility::inSlices(end->lane, turn, sendNext, [self = shared_from_this(), end](platform::Turn&) {
        end->resume = end->lane->pause();
        self->on(self->ends_, [self, end] { self->summarise(end); });
    });
}

// On the thread.
void SessionEnds::summarise(const SharedEnd& end)
{
    end->run->summarise();
    end->run->letGo();
    resume(*end, [self = shared_from_this(), end](platform::Turn& turn) {
        self->current_.reset();
        self->beginNext();
        self->stopTrace(turn, end);
    });
}

void SessionEnds::stopTrace(platform::Turn& turn, const SharedEnd& end)
{
    if (!end->run->isTraced())
        return finish(turn, *end);
    end->run->beginToStopTrace(); // what it collects does not wait for the traces before it
    end->resume = end->lane->pause();
    on(traces_, [end, share = platform::LogShare::ofThisThread()] { // the share lives as long as the lane
        const platform::LogShare::Writing writing(share);
        end->run->stopTrace();
        resume(*end, [end](platform::Turn& last) { finish(last, *end); });
    });
}

void SessionEnds::finish(platform::Turn& turn, End& end)
{
    end.session->finishStop(turn, *end.run);
    end.run.reset();
    end.session.reset(); // before `then` may let go of it
    auto then = std::exchange(end.then, nullptr); // the thread may hold the end for a moment longer
    then(turn);
}

// The item may run before this returns.
void SessionEnds::resume(End& end, platform::TurnItem item)
{
    auto resume = std::move(end.resume);
    resume(std::move(item));
}

void SessionEnds::on(Thread& thread, platform::WorkItem work)
{
    if (thread.queue == nullptr)
        makeQueue(thread);
    if (thread.queue != nullptr)
        thread.queue->submit(std::move(work));
    else
        work();
}

void SessionEnds::makeQueue(Thread& thread)
{
    try {
        thread.queue = platform::current().workQueues.makeSerialQueue(thread.name, {});
    } catch (const std::system_error& refusal) { // slower calls are better than a service that ends
        if (!std::exchange(thread.isRefused, true))
            KESTO_LOG(KestoReportingClientCategory(), Error,
                      "no thread for the ends of {} ({}): all calls wait while one stops", thread.work,
                      refusal.code().message());
    }
}

} // namespace client
