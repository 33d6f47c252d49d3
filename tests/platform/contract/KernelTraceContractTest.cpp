// SPDX-License-Identifier: Apache-2.0
// The contract of platform/KernelTrace.h: the events of a session, its completion, and its end.
//
// The provider of Linux is tested twice: on an imitation of tracefs, everywhere, and on the kernel itself where this
// machine allows it.
#include "platform/contract/Contract.h"
#include "platform/linux/queues/LinuxWorkQueues.h"
#include "platform/linux/trace/DeliveredEvents.h"
#include "platform/linux/trace/ImitatedTracefs.h"
#include "platform/linux/trace/RealTracefs.h"
#include "platform/linux/trace/TracefsKernelTrace.h"
#include "support/fakes/FakeKernelTrace.h"
#include "support/fakes/FakeLog.h"
#include "support/fakes/FakeWorkQueues.h"

#include <algorithm>
#include <gmock/gmock.h>
#include <optional>

namespace contract {
namespace {

using platform::KernelTraceEvent;
using platform::KernelTraceSession;
using platform::KernelTraceWallTime;
using testing::ElementsAre;
using testing::IsEmpty;

class KernelTraceSubject {
public:
    virtual ~KernelTraceSubject() = default;
    // The reason if this machine cannot test it.
    [[nodiscard]] virtual std::optional<std::string> absence() const { return std::nullopt; }
    [[nodiscard]] virtual platform::KernelTrace& trace() = 0;
    [[nodiscard]] virtual platform::WorkQueues& queues() = 0;
    // Emits an event now.
    virtual void emit(std::uint32_t code, const std::array<std::uint64_t, 4>& arguments = {}) = 0;
    // From its start on, the system has no trace.
    virtual void takeTraceAway() = 0;
    // Makes existing sessions unable to start; false if the subject cannot do this.
    [[nodiscard]] virtual bool refuseToStart() = 0;
    // Loses so many events; false if the subject cannot do this.
    [[nodiscard]] virtual bool lose(std::uint64_t count) = 0;
    // Runs waiting items, if the queues have no threads.
    virtual void work() { }
};

class FakeKernelTraceSubject final : public KernelTraceSubject {
public:
    [[nodiscard]] platform::KernelTrace& trace() override { return trace_; }
    [[nodiscard]] platform::WorkQueues& queues() override { return queues_; }
    void emit(std::uint32_t code, const std::array<std::uint64_t, 4>& arguments) override
    {
        trace_.deliver({.timestamp = ++time_,
                        .arguments = arguments,
                        .eventCode = code,
                        .wallTime = {.seconds = 1'700'000'000, .microseconds = 5}});
    }
    void takeTraceAway() override { trace_.available = false; }
    [[nodiscard]] bool refuseToStart() override
    {
        trace_.startError = 16;
        return true;
    }
    [[nodiscard]] bool lose(std::uint64_t count) override
    {
        trace_.lose(count);
        return true;
    }
    void work() override { queues_.runAll(); }

private:
    support::FakeClock clock_;
    support::FakeWorkQueues queues_{clock_};
    support::FakeKernelTrace trace_;
    std::uint64_t time_ = 0;
};

class LinuxKernelTraceSubject : public KernelTraceSubject {
public:
    explicit LinuxKernelTraceSubject(const platform::TracefsPlace& place)
        : mounts_(place.mounts),
          trace_(place, emitter_, access_, platform::ProviderLog(log_))
    {
    }
    [[nodiscard]] platform::KernelTrace& trace() override { return trace_; }
    [[nodiscard]] platform::WorkQueues& queues() override { return queues_; }
    void takeTraceAway() override { support::writeFile(mounts_, ""); }

protected:
    platform::TracefsEmitter emitter_;

private:
    const std::filesystem::path mounts_;
    support::FakeLog log_;
    platform::EmitterAccess access_;
    platform::LinuxWorkQueues queues_;
    platform::TracefsKernelTrace trace_;
};

// Must be made before the provider that looks for it.
struct TreeFirst {
    support::TracefsTree tree;
};

class TreeKernelTraceSubject final : TreeFirst, public LinuxKernelTraceSubject {
public:
    TreeKernelTraceSubject() : LinuxKernelTraceSubject({.mounts = tree.mounts, .instanceName = "kesto"}) { }
    void emit(std::uint32_t code, const std::array<std::uint64_t, 4>& arguments) override
    {
        const auto now = static_cast<std::uint64_t>(std::chrono::steady_clock::now().time_since_epoch().count());
        tree.put(0, support::RingBufferPageBuilder(now).event(now, code, 1, arguments).page());
    }
    [[nodiscard]] bool refuseToStart() override { return std::filesystem::remove(tree.instance / "tracing_on"); }
    [[nodiscard]] bool lose(std::uint64_t count) override
    {
        const auto now = static_cast<std::uint64_t>(std::chrono::steady_clock::now().time_since_epoch().count());
        tree.put(0, support::RingBufferPageBuilder(now).event(now, 0xFFFFFFFF).missed(count).page());
        return true;
    }
};

struct KernelFirst {
    support::RealTracefs tracefs;
};

class RealKernelTraceSubject final : KernelFirst, public LinuxKernelTraceSubject {
public:
    RealKernelTraceSubject()
        : LinuxKernelTraceSubject({.mounts = tracefs.mounts(), .instanceName = tracefs.instanceName})
    {
    }
    [[nodiscard]] std::optional<std::string> absence() const override { return tracefs.problem(); }
    void emit(std::uint32_t code, const std::array<std::uint64_t, 4>& arguments) override
    {
        emitter_.emit(code, arguments);
    }
    [[nodiscard]] bool refuseToStart() override { return false; }
    [[nodiscard]] bool lose(std::uint64_t) override { return false; } // it would need a full buffer
};

// A session and its delivered events.
class TraceListener {
public:
    explicit TraceListener(KernelTraceSubject& subject)
        : subject_(subject),
          queue(subject.queues().makeSerialQueue("trace", {})),
          session(subject.trace().createTraceSession())
    {
        delivered_.listenTo(*session, *queue);
    }
    ~TraceListener()
    {
        session.reset();
        drain(); // events that were on their way
    }
    TraceListener(const TraceListener&) = delete;
    TraceListener& operator=(const TraceListener&) = delete;

    [[nodiscard]] int filter(std::uint32_t firstCode, std::uint32_t lastCode)
    {
        return delivered_.filter(*session, *queue, firstCode, lastCode);
    }
    [[nodiscard]] bool waitForCompletion()
    {
        subject_.work();
        return delivered_.waitForCompletion();
    }
    [[nodiscard]] bool waitForEvents(std::size_t count)
    {
        subject_.work();
        return delivered_.waitForEvents(count);
    }
    [[nodiscard]] int completions() { return delivered_.completions(); }
    [[nodiscard]] std::vector<KernelTraceEvent> events()
    {
        const auto events = delivered_.events();
        EXPECT_TRUE(std::ranges::is_sorted(events, {}, &KernelTraceEvent::timestamp));
        return events;
    }
    [[nodiscard]] std::vector<std::uint32_t> codes() { return delivered_.codes(); }
    // Returns when everything on the queue has run.
    void drain()
    {
        support::Progress progress;
        bool isDrained = false;
        queue->submit([&] { progress.change([&] { isDrained = true; }); });
        subject_.work();
        EXPECT_TRUE(progress.waitFor([&] { return isDrained; }));
    }

private:
    KernelTraceSubject& subject_;
    support::DeliveredEvents delivered_;

public:
    const std::shared_ptr<platform::WorkQueue> queue;
    std::unique_ptr<KernelTraceSession> session;
};

class KernelTraceContract : public Suite<KernelTraceSubject> {
protected:
    void SetUp() override
    {
        if (const auto absence = subject->absence())
            GTEST_SKIP() << *absence;
    }
    // Waits until earlier work has ended.
    void settle()
    {
        TraceListener fence(*subject);
        ASSERT_EQ(fence.filter(0, 0xFFFFFFFF), 0);
        ASSERT_EQ(fence.session->start(fence.queue), 0);
        fence.session->end();
        ASSERT_TRUE(fence.waitForCompletion());
    }
};
KESTO_CONTRACT(KernelTraceContract, (provider<KernelTraceSubject, FakeKernelTraceSubject>("Fake")),
               (provider<KernelTraceSubject, TreeKernelTraceSubject>("Linux")),
               (provider<KernelTraceSubject, RealKernelTraceSubject>("Kernel")));

TEST_P(KernelTraceContract, HasNoSessionsOnASystemThatCannotTrace)
{
    subject->takeTraceAway();
    EXPECT_FALSE(subject->trace().isAvailable());
    EXPECT_EQ(subject->trace().createTraceSession(), nullptr);
}

TEST_P(KernelTraceContract, HasSessionsOnASystemThatCan)
{
    EXPECT_TRUE(subject->trace().isAvailable());
    EXPECT_NE(subject->trace().createTraceSession(), nullptr);
}

TEST_P(KernelTraceContract, DeliversTheEventsOfTheCodesInTheOrderOfTime)
{
    TraceListener listener(*subject);
    ASSERT_EQ(listener.filter(5, 9), 0);
    ASSERT_EQ(listener.session->start(listener.queue), 0);
    for (const std::uint32_t code : {4U, 9U, 5U, 10U, 7U})
        subject->emit(code, {code, 2, 3, ~std::uint64_t{0}});
    listener.session->end();
    ASSERT_TRUE(listener.waitForCompletion());
    ASSERT_THAT(listener.codes(), ElementsAre(9U, 5U, 7U)) << "both ends of the range are in it";
    const auto events = listener.events();
    EXPECT_THAT(events[0].arguments, ElementsAre(9U, 2U, 3U, ~std::uint64_t{0}));
    EXPECT_LE(listener.session->timestampToNanoseconds(events[0].timestamp),
              listener.session->timestampToNanoseconds(events[2].timestamp));
}

TEST_P(KernelTraceContract, DeliversAnEventToEveryHandlerThatFiltersForItsCode)
{
    TraceListener listener(*subject);
    ASSERT_EQ(listener.filter(1, 5), 0);
    ASSERT_EQ(listener.filter(5, 9), 0);
    ASSERT_EQ(listener.filter(7, 7), 0);
    ASSERT_EQ(listener.session->start(listener.queue), 0);
    for (const std::uint32_t code : {1U, 5U, 6U, 7U})
        subject->emit(code);
    listener.session->end();
    ASSERT_TRUE(listener.waitForCompletion());
    EXPECT_THAT(listener.codes(), ElementsAre(1U, 5U, 5U, 6U, 7U, 7U));
}

TEST_P(KernelTraceContract, DeliversWhatHappensFromTheStartToTheEnd)
{
    TraceListener listener(*subject);
    ASSERT_EQ(listener.filter(0, 99), 0);
    TraceListener other(*subject);
    ASSERT_EQ(other.filter(0, 99), 0);
    ASSERT_EQ(other.session->start(other.queue), 0);
    subject->emit(1);
    ASSERT_EQ(listener.session->start(listener.queue), 0);
    subject->emit(2);
    subject->emit(3);
    listener.session->end();
    subject->emit(4);
    other.session->end();
    ASSERT_TRUE(listener.waitForCompletion());
    ASSERT_TRUE(other.waitForCompletion());
    EXPECT_THAT(listener.codes(), ElementsAre(2U, 3U));
    EXPECT_THAT(other.codes(), ElementsAre(1U, 2U, 3U, 4U)) << "each session separately";
}

TEST_P(KernelTraceContract, DeliversWhileASessionRuns)
{
    TraceListener listener(*subject);
    ASSERT_EQ(listener.filter(0, 99), 0);
    ASSERT_EQ(listener.session->start(listener.queue), 0);
    subject->emit(1);
    EXPECT_TRUE(listener.waitForEvents(1));
    EXPECT_EQ(listener.completions(), 0);
}

TEST_P(KernelTraceContract, TellsTheTimeOfDayToSessionsThatEnabledItOnly)
{
    TraceListener with(*subject);
    TraceListener without(*subject);
    TraceListener changed(*subject);
    with.session->enableWallTimes(true);
    changed.session->enableWallTimes(true);
    changed.session->enableWallTimes(false);
    for (TraceListener* listener : {&with, &without, &changed}) {
        ASSERT_EQ(listener->filter(0, 99), 0);
        ASSERT_EQ(listener->session->start(listener->queue), 0);
    }
    subject->emit(1);
    for (TraceListener* listener : {&with, &without, &changed}) {
        listener->session->end();
        ASSERT_TRUE(listener->waitForCompletion());
        ASSERT_EQ(listener->events().size(), 1U);
    }
    EXPECT_GE(with.events()[0].wallTime.seconds, 1'700'000'000);
    EXPECT_EQ(without.events()[0].wallTime, KernelTraceWallTime());
    EXPECT_EQ(changed.events()[0].wallTime, KernelTraceWallTime());
}

TEST_P(KernelTraceContract, TellsInTheCompletionHandlerHowManyEventsWereLostWhileASessionRan)
{
    support::Progress progress;
    std::vector<std::uint64_t> lost;
    const auto queue = subject->queues().makeSerialQueue("trace", {});
    const auto run = [&](bool isLosing) {
        const std::size_t before = lost.size();
        const auto session = subject->trace().createTraceSession();
        session->setCompletionHandler(
            [&, told = session.get()] { progress.change([&] { lost.push_back(told->lostEvents()); }); });
        EXPECT_EQ(session->start(queue), 0);
        const bool isLost = isLosing && subject->lose(1840);
        subject->emit(1);
        session->end();
        subject->work();
        EXPECT_TRUE(progress.waitFor([&] { return lost.size() > before; }));
        return isLost;
    };
    run(false);
    EXPECT_THAT(lost, ElementsAre(0U));
    if (!run(true))
        GTEST_SKIP() << "this provider cannot lose events on purpose";
    run(false);
    EXPECT_THAT(lost, ElementsAre(0U, 1840U, 0U)) << "earlier losses do not count for the last session";
}

TEST_P(KernelTraceContract, CompletesASessionOnceHoweverOftenItIsEnded)
{
    TraceListener listener(*subject);
    ASSERT_EQ(listener.filter(0, 99), 0);
    ASSERT_EQ(listener.session->start(listener.queue), 0);
    listener.session->end();
    listener.session->end();
    ASSERT_TRUE(listener.waitForCompletion());
    listener.session->end();
    settle();
    listener.drain();
    EXPECT_EQ(listener.completions(), 1);
}

TEST_P(KernelTraceContract, CompletesASessionWithoutFilters)
{
    TraceListener listener(*subject);
    ASSERT_EQ(listener.session->start(listener.queue), 0);
    subject->emit(1);
    listener.session->end();
    EXPECT_TRUE(listener.waitForCompletion());
}

TEST_P(KernelTraceContract, CompletesASessionThatCouldNotBeStartedWhenItIsEnded)
{
    TraceListener listener(*subject);
    ASSERT_EQ(listener.filter(0, 99), 0);
    if (!subject->refuseToStart())
        GTEST_SKIP() << "the kernel does not refuse";
    EXPECT_NE(listener.session->start(listener.queue), 0);
    subject->emit(1);
    listener.queue->submit([&] { // so that the session is ended twice before its completion can run
        listener.session->end();
        listener.session->end();
    });
    EXPECT_TRUE(listener.waitForCompletion());
    listener.drain();
    EXPECT_EQ(listener.completions(), 1);
    EXPECT_THAT(listener.events(), IsEmpty());
}

TEST_P(KernelTraceContract, CompletesNoSessionThatWasNeverStarted)
{
    TraceListener listener(*subject);
    ASSERT_EQ(listener.filter(0, 99), 0);
    listener.session->end();
    settle();
    listener.drain();
    EXPECT_EQ(listener.completions(), 0) << "it has no queue";
}

TEST_P(KernelTraceContract, NeverCompletesASessionThatIsDestroyedBefore)
{
    TraceListener running(*subject);
    TraceListener ended(*subject);
    TraceListener complete(*subject);
    for (TraceListener* listener : {&running, &ended, &complete}) {
        ASSERT_EQ(listener->filter(0, 99), 0);
        ASSERT_EQ(listener->session->start(listener->queue), 0);
    }
    running.session.reset();
    ended.session->end();
    ended.session.reset();
    complete.queue->submit([&] { // the completion has to wait behind it
        complete.session->end();
        settle();
        complete.session.reset();
    });
    complete.drain();
    settle();
    for (TraceListener* listener : {&running, &ended, &complete}) {
        listener->drain();
        EXPECT_EQ(listener->completions(), 0);
    }
}

TEST_P(KernelTraceContract, LetsACompletionHandlerDestroyItsSession)
{
    support::Progress progress;
    bool isDone = false;
    const auto queue = subject->queues().makeSerialQueue("trace", {});
    std::unique_ptr<KernelTraceSession> session = subject->trace().createTraceSession();
    session->setCompletionHandler([&] {
        session.reset();
        progress.change([&] { isDone = true; });
    });
    ASSERT_EQ(session->start(queue), 0);
    session->end();
    subject->work();
    EXPECT_TRUE(progress.waitFor([&] { return isDone; }));
    EXPECT_EQ(session, nullptr);
}

TEST_P(KernelTraceContract, LetsACompletionHandlerEndItsSessionAgainAndStartAnother)
{
    support::Progress progress;
    bool isDone = false;
    const auto queue = subject->queues().makeSerialQueue("trace", {});
    const auto session = subject->trace().createTraceSession();
    std::unique_ptr<KernelTraceSession> other;
    session->setCompletionHandler([&] {
        session->end();
        EXPECT_TRUE(subject->trace().isAvailable());
        other = subject->trace().createTraceSession();
        other->setCompletionHandler([&] { progress.change([&] { isDone = true; }); });
        EXPECT_EQ(other->start(queue), 0);
        other->end();
    });
    ASSERT_EQ(session->start(queue), 0);
    session->end();
    subject->work();
    EXPECT_TRUE(progress.waitFor([&] { return isDone; }));
}

TEST_P(KernelTraceContract, HoldsNothingOfASessionThatIsGone)
{
    auto held = std::make_shared<int>(7);
    const std::weak_ptr<int> watched = held;
    const auto queue = subject->queues().makeSerialQueue("trace", {});
    {
        const auto session = subject->trace().createTraceSession();
        session->setCompletionHandler([held] { });
        ASSERT_EQ(session->filterEventRange(0, 99, [held = std::move(held)](const KernelTraceEvent&) { }), 0);
        ASSERT_EQ(session->start(queue), 0);
        subject->emit(1);
    }
    settle();
    subject->work();
    EXPECT_TRUE(eventually([&] { return watched.expired(); }));
}

TEST_P(KernelTraceContract, RefusesAnEmptyRangeAndAnEmptyHandler)
{
    TraceListener listener(*subject);
    EXPECT_NE(listener.filter(9, 5), 0);
    EXPECT_NE(listener.session->filterEventRange(0, 99, nullptr), 0);
    ASSERT_EQ(listener.filter(20, 20), 0);
    ASSERT_EQ(listener.session->start(listener.queue), 0);
    for (const std::uint32_t code : {5U, 7U, 9U, 20U})
        subject->emit(code);
    listener.session->end();
    ASSERT_TRUE(listener.waitForCompletion());
    EXPECT_THAT(listener.codes(), ElementsAre(20U));
}

TEST_P(KernelTraceContract, SaysThatASessionHasStartedAlready)
{
    TraceListener listener(*subject);
    ASSERT_EQ(listener.filter(1, 1), 0);
    EXPECT_NE(listener.session->start(nullptr), 0) << "a session without a queue has not started";
    ASSERT_EQ(listener.session->start(listener.queue), 0);
    EXPECT_NE(listener.session->start(listener.queue), 0);
    EXPECT_NE(listener.filter(2, 2), 0);
    subject->emit(1);
    subject->emit(2);
    listener.session->end();
    ASSERT_TRUE(listener.waitForCompletion());
    EXPECT_THAT(listener.codes(), ElementsAre(1U)) << "and goes on as before";
}

} // namespace
} // namespace contract
