// SPDX-License-Identifier: Apache-2.0
// The kernel event trace service: on an imitation of tracefs, for failures; and on the kernel itself, with real
// emitting processes, where this machine allows it.
#include "platform/linux/trace/TracefsKernelTrace.h"
#include "platform/linux/queues/SerialQueue.h"
#include "platform/linux/trace/DeliveredEvents.h"
#include "platform/linux/trace/ImitatedTracefs.h"
#include "platform/linux/trace/RealTracefs.h"
#include "support/ProcessThreads.h"
#include "support/fakes/FakeLog.h"

#include <algorithm>
#include <atomic>
#include <csignal>
#include <deque>
#include <future>
#include <gmock/gmock.h>
#include <map>
#include <sys/file.h>
#include <sys/mman.h>
#include <sys/resource.h>
#include <sys/wait.h>

namespace platform {
namespace {

namespace fs = std::filesystem;
using support::IsLine;
using support::RingBufferPageBuilder;
using testing::Each;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::SizeIs;

constexpr std::uint32_t firstCode = 0x21040000;
constexpr std::uint32_t lastCode = 0x2104408A;
constexpr std::chrono::seconds patience{60}; // with a busy machine

std::uint64_t now()
{
    return static_cast<std::uint64_t>(std::chrono::steady_clock::now().time_since_epoch().count());
}

// In microseconds.
std::int64_t timeOfDay()
{
    return std::chrono::floor<std::chrono::microseconds>(std::chrono::system_clock::now()).time_since_epoch().count();
}
std::int64_t timeOfDay(const KernelTraceEvent& event)
{
    return event.wallTime.seconds * 1'000'000 + event.wallTime.microseconds;
}
constexpr std::int64_t clockTolerance = 500'000; // the two clocks are not read at the same moment

// A session and its delivered events.
class SessionListener {
public:
    explicit SessionListener(TracefsKernelTrace& trace, bool hasWallTimes = true) : session(trace.createTraceSession())
    {
        if (!session)
            throw std::runtime_error("the trace is not available");
        session->enableWallTimes(hasWallTimes);
        delivered_.listenTo(*session, *queue);
        EXPECT_EQ(delivered_.filter(*session, *queue, firstCode, lastCode), 0);
    }

    int start()
    {
        beforeStart = now();
        const int error = session->start(queue);
        afterStart = now();
        return error;
    }
    void end()
    {
        beforeEnd = now();
        session->end();
        afterEnd = now();
    }
    // Whether it was completed exactly once.
    [[nodiscard]] bool waitForCompletion() { return delivered_.waitForCompletion() && delivered_.completions() == 1; }
    [[nodiscard]] bool waitForEvents(std::size_t count) { return delivered_.waitForEvents(count); }
    [[nodiscard]] std::vector<KernelTraceEvent> events() { return delivered_.events(); }
    [[nodiscard]] std::vector<std::uint32_t> codes() { return delivered_.codes(); }

    std::uint64_t beforeStart = 0;
    std::uint64_t afterStart = 0;
    std::uint64_t beforeEnd = 0;
    std::uint64_t afterEnd = 0;

private:
    support::DeliveredEvents delivered_;

public: // these go first
    const std::shared_ptr<SerialQueue> queue = std::make_shared<SerialQueue>("trace", SerialQueueOptions());
    std::unique_ptr<KernelTraceSession> session;
};

class TracefsKernelTraceTest : public testing::Test {
protected:
    [[nodiscard]] std::string markers() const { return tree.content("trace_marker_raw"); }
    // Waits until the thread has switched the instance off.
    [[nodiscard]] bool waitUntilOff() const
    {
        const auto end = std::chrono::steady_clock::now() + patience;
        while (tree.content("buffer_size_kb") != "4" && std::chrono::steady_clock::now() < end)
            std::this_thread::yield();
        return tree.content("tracing_on") == "0" && tree.content("buffer_size_kb") == "4";
    }

    support::TracefsTree tree;
    support::FakeLog log;
    TracefsEmitter ownEmitter;
    EmitterAccess access;
    TracefsKernelTrace trace{{.mounts = tree.mounts, .instanceName = "kesto"}, ownEmitter, access, ProviderLog(log)};
};

TEST_F(TracefsKernelTraceTest, TouchesNothingBeforeThereIsASession)
{
    EXPECT_EQ(tree.content("tracing_on"), "before");
    ownEmitter.emit(1, {});
    EXPECT_EQ(markers(), "before");
}

TEST_F(TracefsKernelTraceTest, IsOnWhileASessionRunsAndOffOtherwise)
{
    SessionListener listener(trace);
    EXPECT_EQ(tree.content("tracing_on"), "0");
    ASSERT_EQ(listener.start(), 0);
    EXPECT_EQ(tree.content("tracing_on"), "1");
    listener.end();
    EXPECT_TRUE(listener.waitForCompletion());
    EXPECT_TRUE(waitUntilOff());
    SessionListener again(trace);
    ASSERT_EQ(again.start(), 0);
    EXPECT_EQ(tree.content("tracing_on"), "1");
    EXPECT_EQ(tree.content("buffer_size_kb"), "8192");
    again.session.reset();
    EXPECT_TRUE(waitUntilOff()) << "a session that is destroyed without an end is over, too";
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(TracefsKernelTraceTest, IsOffWhenItIsGoneEvenIfItsThreadHadNoTimeLeft)
{
    const auto queue = std::make_shared<SerialQueue>("trace", SerialQueueOptions());
    for (int round = 0; round < 20; ++round) {
        TracefsEmitter emitter;
        EmitterAccess otherAccess;
        {
            TracefsKernelTrace other({.mounts = tree.mounts, .instanceName = "kesto"}, emitter, otherAccess,
                                     ProviderLog(log));
            const auto session = other.createTraceSession();
            ASSERT_NE(session, nullptr);
            ASSERT_EQ(session->start(queue), 0);
        }
        EXPECT_EQ(tree.content("tracing_on"), "0");
    }
}

TEST_F(TracefsKernelTraceTest, ReadsWithThePriorityOfWhatSomebodyWaitsFor)
{
    const int own = ::getpriority(PRIO_PROCESS, 0);
    if (::setpriority(PRIO_PROCESS, static_cast<id_t>(::gettid()), own - 1) != 0)
        GTEST_SKIP() << "this process may not raise priorities";
    ::setpriority(PRIO_PROCESS, static_cast<id_t>(::gettid()), own);
    SessionListener listener(trace);
    ASSERT_EQ(listener.start(), 0);
    EXPECT_EQ(support::nicenessBeyondOwn("kesto.trace"), -10);
}

TEST_F(TracefsKernelTraceTest, DeliversWhatComesWhileASessionRuns)
{
    SessionListener listener(trace);
    ASSERT_EQ(listener.start(), 0);
    const std::int64_t day = timeOfDay();
    const std::uint64_t time = now();
    tree.put(0,
             RingBufferPageBuilder(1000)
                 .event(2000, firstCode) // before the start
                 .event(time, firstCode + 1, 77, {1, 2, 3, 4})
                 .event(time + 50, lastCode + 1)
                 .event(time + 100, lastCode)
                 .page());
    tree.put(1, RingBufferPageBuilder(time).event(time + 50, firstCode + 2).page());
    ASSERT_TRUE(listener.waitForEvents(3));
    tree.put(0, RingBufferPageBuilder(time).event(now() + 3'000'000'000, firstCode + 3).page()); // after the end
    listener.end();
    EXPECT_TRUE(listener.waitForCompletion());
    EXPECT_THAT(listener.codes(), ElementsAre(firstCode + 1, firstCode + 2, lastCode));
    const KernelTraceEvent first = listener.events()[0];
    EXPECT_EQ(first.threadID, 77U);
    EXPECT_EQ(listener.session->timestampToNanoseconds(first.timestamp), time);
    EXPECT_NEAR(timeOfDay(first), day, clockTolerance);
}

TEST_F(TracefsKernelTraceTest, TellsASessionThatIsCompleteHowManyEventsWereLost)
{
    SessionListener listener(trace);
    ASSERT_EQ(listener.start(), 0);
    tree.put(0, RingBufferPageBuilder(1000).event(now(), firstCode).missed(1840).page());
    ASSERT_TRUE(listener.waitForEvents(1));
    listener.end();
    ASSERT_TRUE(listener.waitForCompletion());
    EXPECT_EQ(listener.session->lostEvents(), 1840U);

    SessionListener next(trace);
    ASSERT_EQ(next.start(), 0);
    next.end();
    ASSERT_TRUE(next.waitForCompletion());
    EXPECT_EQ(next.session->lostEvents(), 0U) << "what others lost before";
}

TEST_F(TracefsKernelTraceTest, LetsEmittersKnowWhetherATraceRuns)
{
    std::optional<EmitterDescriptors> handedOut;
    access.ask(this, [&](const EmitterDescriptors& descriptors) { handedOut = descriptors; });
    SessionListener one(trace);
    ASSERT_TRUE(handedOut) << "when the first session is made";
    const auto flag = [&] {
        std::uint32_t value = 7;
        EXPECT_EQ(::pread(handedOut->page, &value, sizeof value, 0), 4);
        return value;
    };
    SessionListener two(trace);
    EXPECT_EQ(flag(), 0U);
    ASSERT_EQ(one.start(), 0);
    ASSERT_EQ(two.start(), 0);
    EXPECT_EQ(flag(), 1U);
    ownEmitter.emit(0x2104482C, {});
    EXPECT_EQ(markers().substr(0, 8), std::string("KSTO\x2C\x48\x04\x21"));
    one.end();
    EXPECT_EQ(flag(), 1U);
    two.end();
    EXPECT_EQ(flag(), 0U) << "immediately, although it is not complete";
    fs::resize_file(tree.instance / "trace_marker_raw", 0);
    ownEmitter.emit(0x2104482C, {});
    EXPECT_EQ(markers(), "");
    EXPECT_TRUE(one.waitForCompletion());
    EXPECT_TRUE(two.waitForCompletion());
}

TEST_F(TracefsKernelTraceTest, CanBeUsedByAnEmitterThatIsAnswered)
{
    std::vector<bool> areInTime;
    std::future<bool> use;
    access.ask(this, [&](const EmitterDescriptors&) {
        // On another thread, so that a lock that is held makes the test fail and does not let it hang.
        use = std::async(std::launch::async, [this] { return trace.createTraceSession() != nullptr; });
        areInTime.push_back(use.wait_for(patience) == std::future_status::ready);
    });
    EXPECT_TRUE(trace.isAvailable());
    ASSERT_THAT(areInTime, ElementsAre(true));
    EXPECT_TRUE(use.get());
}

TEST_F(TracefsKernelTraceTest, CompletesASessionThatCouldNotBeStarted)
{
    SessionListener listener(trace);
    fs::remove(tree.instance / "tracing_on");
    EXPECT_EQ(listener.start(), ENOENT);
    EXPECT_THAT(log.lines(),
                ElementsAre(IsLine(LogLevel::Error, "kerl",
                                   "the kernel trace cannot be switched on: No such file or directory")));
    listener.end();
    EXPECT_TRUE(listener.waitForCompletion());
}

TEST_F(TracefsKernelTraceTest, RunsNoMoreSessionsThanItMay)
{
    std::deque<SessionListener> listeners;
    for (std::size_t count = 0; count < TraceFanOut::mostSessions; ++count)
        ASSERT_EQ(listeners.emplace_back(trace).start(), 0);
    SessionListener extra(trace);
    EXPECT_EQ(extra.start(), EMFILE);
    extra.end();
    EXPECT_TRUE(extra.waitForCompletion());
}

TEST_F(TracefsKernelTraceTest, CountsAsOffWithoutTracefsAndSaysSoOnce)
{
    const std::string mounted = support::readFile(tree.mounts);
    support::writeFile(tree.mounts, "");
    EXPECT_FALSE(trace.isAvailable());
    EXPECT_EQ(trace.createTraceSession(), nullptr);
    EXPECT_EQ(trace.createTraceSession(), nullptr);
    EXPECT_THAT(
        log.take(),
        ElementsAre(IsLine(LogLevel::Error, "kerl", "the kernel trace is not available: tracefs is not mounted")));
    support::writeFile(tree.mounts, mounted);
    fs::rename(tree.instance / "tracing_on", tree.instance / "kept");
    EXPECT_EQ(trace.createTraceSession(), nullptr);
    EXPECT_EQ(trace.createTraceSession(), nullptr);
    EXPECT_THAT(log.take(), SizeIs(1)) << "another reason";
    fs::rename(tree.instance / "kept", tree.instance / "tracing_on");
    EXPECT_TRUE(trace.isAvailable()) << "the missing file exists now";
    EXPECT_NE(trace.createTraceSession(), nullptr);
    EXPECT_THAT(log.take(), IsEmpty());
}

TEST_F(TracefsKernelTraceTest, TracesAlsoWhenClientsCannotEmitAndSaysSo)
{
    // No file may have the size of the page that clients map.
    rlimit before = {};
    ASSERT_EQ(::getrlimit(RLIMIT_FSIZE, &before), 0);
    const rlimit small = {.rlim_cur = TraceSwitchPage::size - 1, .rlim_max = before.rlim_max};
    const auto handler = std::signal(SIGXFSZ, SIG_IGN);
    ASSERT_EQ(::setrlimit(RLIMIT_FSIZE, &small), 0);
    const auto session = trace.createTraceSession();
    ASSERT_EQ(::setrlimit(RLIMIT_FSIZE, &before), 0);
    std::signal(SIGXFSZ, handler);
    EXPECT_NE(session, nullptr);
    EXPECT_THAT(log.take(),
                ElementsAre(IsLine(LogLevel::Error, "kerl", "clients cannot emit trace events: File too large")));
}

TEST_F(TracefsKernelTraceTest, HasTheFirstInstanceThatNoneOfSevenOtherServicesHas)
{
    const fs::path folder = tree.instance.parent_path();
    std::vector<FileDescriptor> others;
    const auto takeByAnother = [&](const std::string& name) {
        fs::create_directories(folder / name);
        others.emplace_back(::open((folder / name).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
        EXPECT_EQ(::flock(others.back().get(), LOCK_EX | LOCK_NB), 0);
    };
    takeByAnother("kesto");
    for (const char* next : {"kesto-2", "kesto-3", "kesto-4", "kesto-5", "kesto-6", "kesto-7", "kesto-8"}) {
        EXPECT_FALSE(trace.isAvailable());
        EXPECT_THAT(log.take(),
                    ElementsAre(IsLine(LogLevel::Error, "kerl",
                                       "the kernel trace is not available: " + (folder / next).string()
                                           + "/tracing_on cannot be written: No such file or directory")))
            << "it is made, but has no files in this tree";
        takeByAnother(next);
    }
    EXPECT_FALSE(trace.isAvailable());
    EXPECT_THAT(log.take(),
                ElementsAre(IsLine(LogLevel::Error, "kerl",
                                   "the kernel trace is not available: " + (folder / "kesto-8").string()
                                       + " is in use by another running service")));
    EXPECT_FALSE(fs::exists(folder / "kesto-9"));
}

TEST_F(TracefsKernelTraceTest, SaysWhatIsForbidden)
{
    constexpr uid_t nobody = 65534;
    const bool isRoot = ::geteuid() == 0;
    for (const fs::path& path : {tree.directory.path(), tree.directory.path() / "tracing", tree.mounts})
        fs::permissions(path, fs::perms(0055), fs::perm_options::add);
    fs::permissions(tree.instance.parent_path(), fs::perms::none);
    ASSERT_TRUE(!isRoot || ::seteuid(nobody) == 0); // root may do everything
    const auto session = trace.createTraceSession();
    ASSERT_TRUE(!isRoot || ::seteuid(0) == 0);
    fs::permissions(tree.instance.parent_path(), fs::perms::owner_all);
    EXPECT_EQ(session, nullptr);
    EXPECT_THAT(log.take().at(0).message, HasSubstr("Permission denied"));
}

// ---- On the kernel

// A process that emits, with the times before and after each event.
struct Emitter {
    static constexpr std::size_t most = 100'000;
    static constexpr std::size_t lead = 200; // how far it may run ahead of the reader, which may be much slower
    struct Moment {
        std::uint64_t before;
        std::uint64_t after;
    };
    std::atomic<std::size_t> count;
    std::atomic<std::size_t> allowed;
    std::array<Moment, most> moments;
};

class RealTraceTest : public testing::Test {
protected:
    void SetUp() override
    {
        if (tracefs.problem())
            GTEST_SKIP() << *tracefs.problem();
        trace.emplace(TracefsPlace{.mounts = tracefs.mounts(), .instanceName = tracefs.instanceName}, ownEmitter,
                      access, ProviderLog(log));
        access.ask(this, [this](const EmitterDescriptors& descriptors) { marker = descriptors.marker; });
    }

    void write(const EmittedEvent& record) const { EXPECT_EQ(::write(marker, &record, sizeof record), 40); }

    support::RealTracefs tracefs;
    support::FakeLog log;
    TracefsEmitter ownEmitter;
    EmitterAccess access;
    std::optional<TracefsKernelTrace> trace;
    int marker = -1;
};

TEST_F(RealTraceTest, DeliversTheEventsOfThisProcessWithTheirTimes)
{
    SessionListener listener(*trace);
    const EmittedEvent early{.code = firstCode};
    EXPECT_LT(::write(marker, &early, sizeof early), 0) << "the kernel takes no events while no trace runs";
    ASSERT_EQ(listener.start(), 0);
    const std::int64_t day = timeOfDay();
    const std::uint64_t before = now();
    ownEmitter.emit(firstCode + 1, {1, 2, 3, UINT64_MAX});
    const std::uint64_t between = now();
    ownEmitter.emit(firstCode + 2, {});
    const std::uint64_t after = now();
    ownEmitter.emit(lastCode + 1, {});
    listener.end();
    ASSERT_TRUE(listener.waitForCompletion());
    ASSERT_THAT(listener.codes(), ElementsAre(firstCode + 1, firstCode + 2));
    const auto events = listener.events();
    EXPECT_THAT(events[0].arguments, ElementsAre(1U, 2U, 3U, UINT64_MAX));
    EXPECT_EQ(events[0].threadID, static_cast<std::uint64_t>(::gettid()));
    EXPECT_GE(events[0].timestamp, before);
    EXPECT_LE(events[0].timestamp, between);
    EXPECT_NEAR(timeOfDay(events[0]), day, clockTolerance);
    EXPECT_GE(events[1].timestamp, between);
    EXPECT_LE(events[1].timestamp, after);
    EXPECT_THAT(log.lines(), IsEmpty());
}

// All together: sessions come and go while processes emit, and each session gets exactly its own events.
TEST_F(RealTraceTest, GivesEverySessionAllOfItsTimeFromEveryProcess)
{
    constexpr std::size_t processes = 3;
    constexpr std::size_t sessions = 40;
    constexpr std::size_t step = 300; // events between two starts
    constexpr std::size_t length = 3000; // events from a session's start to its end
    std::deque<SessionListener> listeners;
    for (std::size_t index = 0; index < sessions; ++index)
        listeners.emplace_back(*trace);

    void* const shared =
        ::mmap(nullptr, sizeof(Emitter) * processes, PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    ASSERT_NE(shared, MAP_FAILED);
    auto* const emitters = static_cast<Emitter*>(shared);
    std::vector<pid_t> children;
    for (std::size_t index = 0; index < processes; ++index) {
        const pid_t child = ::fork();
        ASSERT_GE(child, 0);
        if (child == 0) {
            Emitter& emitter = emitters[index];
            for (std::size_t number = 0; number < Emitter::most; ++number) {
                while (number >= emitter.allowed)
                    ::sched_yield();
                const EmittedEvent record{.code = firstCode + static_cast<std::uint32_t>(index), .arguments = {number}};
                emitter.moments[number].before = now();
                (void)!::write(marker, &record, sizeof record);
                emitter.moments[number].after = now();
                emitter.count.store(number + 1, std::memory_order_release);
                ::sched_yield();
            }
            ::_exit(0);
        }
        children.push_back(child);
    }
    const auto total = [&] {
        std::size_t count = 0;
        for (std::size_t index = 0; index < processes; ++index)
            count += emitters[index].count.load(std::memory_order_acquire);
        return count;
    };
    const auto letThemGoOn = [&] {
        for (std::size_t index = 0; index < processes; ++index)
            emitters[index].allowed = emitters[index].count + Emitter::lead;
    };
    const auto giveUp = std::chrono::steady_clock::now() + patience;
    std::size_t started = 0;
    std::size_t ended = 0;
    std::vector<std::size_t> startedAt(sessions);
    for (std::size_t first = total(); ended < sessions && std::chrono::steady_clock::now() < giveUp;) {
        letThemGoOn();
        const std::size_t count = total();
        if (started < sessions && count >= first + started * step) {
            startedAt[started] = count;
            EXPECT_EQ(listeners[started++].start(), 0);
        } else if (ended < started && count >= startedAt[ended] + length) {
            listeners[ended++].end();
        } else {
            ::sched_yield();
        }
    }
    for (const pid_t child : children)
        ::kill(child, SIGKILL);
    for (const pid_t child : children)
        ::waitpid(child, nullptr, 0);
    ASSERT_EQ(ended, sessions);

    for (SessionListener& listener : listeners) {
        ASSERT_TRUE(listener.waitForCompletion());
        const auto events = listener.events();
        EXPECT_TRUE(std::ranges::is_sorted(events, {}, &KernelTraceEvent::timestamp));
        std::array<std::vector<std::uint64_t>, processes> delivered;
        for (const KernelTraceEvent& event : events) {
            ASSERT_LT(event.eventCode - firstCode, processes);
            ASSERT_EQ(event.threadID, static_cast<std::uint64_t>(children[event.eventCode - firstCode]));
            delivered[event.eventCode - firstCode].push_back(event.arguments[0]);
        }
        for (std::size_t index = 0; index < processes; ++index) {
            const Emitter& emitter = emitters[index];
            const std::size_t count = emitter.count;
            const auto begin = emitter.moments.begin();
            const auto end = begin + static_cast<std::ptrdiff_t>(count);
            const auto& numbers = delivered[index];
            // The events that were certainly within the session, and those that may have been.
            const auto sure = std::ranges::lower_bound(begin, end, listener.afterStart, {}, &Emitter::Moment::before);
            const auto sureEnd = std::ranges::upper_bound(sure, end, listener.beforeEnd, {}, &Emitter::Moment::after);
            for (std::size_t place = 1; place < numbers.size(); ++place)
                ASSERT_EQ(numbers[place], numbers[place - 1] + 1) << "missing or doubled";
            if (sure != sureEnd) {
                ASSERT_FALSE(numbers.empty());
                EXPECT_LE(numbers.front(), static_cast<std::uint64_t>(sure - begin));
                EXPECT_GE(numbers.back(), static_cast<std::uint64_t>(sureEnd - begin) - 1);
            }
            if (!numbers.empty()) {
                EXPECT_GE(emitter.moments[numbers.front()].after, listener.beforeStart) << "from before the start";
                EXPECT_LE(emitter.moments[numbers.back()].before, listener.afterEnd) << "from after the end";
            }
        }
    }
    EXPECT_THAT(log.lines(), IsEmpty()) << "nothing is lost";
    ::munmap(shared, sizeof(Emitter) * processes);
}

TEST_F(RealTraceTest, LeavesOutWhatOthersWriteToTheMarker)
{
    SessionListener listener(*trace);
    ASSERT_EQ(listener.start(), 0);
    const std::string noise(3000, 'K');
    for (const std::size_t size : {4U, 39U, 41U, 40U, 3000U})
        EXPECT_EQ(::write(marker, noise.data(), size), static_cast<ssize_t>(size));
    EmittedEvent record{.code = firstCode};
    EXPECT_LT(::write(marker, &record, 3), 0) << "the kernel wants a tag";
    EXPECT_EQ(::write(marker, &record, 36), 36);
    write(record);
    listener.end();
    ASSERT_TRUE(listener.waitForCompletion());
    EXPECT_THAT(listener.codes(), ElementsAre(firstCode));
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(RealTraceTest, CountsWhatTheKernelLost)
{
    auto instance = TracefsInstance::open(tracefs.path(), tracefs.instanceName);
    ASSERT_TRUE(instance) << instance.error().what;
    ASSERT_FALSE(instance->switchOn());
    constexpr std::size_t emitted = 500'000;
    const EmittedEvent record{.code = firstCode};
    for (std::size_t count = 0; count < emitted; ++count)
        ASSERT_EQ(::write(instance->marker(), &record, sizeof record), 40);
    TraceMerger merger(instance->pageFormat(), instance->markerType());
    instance->readPages([&](std::uint32_t cpu, std::span<const std::byte> page) { merger.take(cpu, page); });
    const std::size_t delivered = merger.eventsUpTo(UINT64_MAX).size();
    const std::uint64_t lost = merger.takeLosses();
    EXPECT_GE(delivered, 100'000U) << "the capacity of a buffer";
    EXPECT_GT(lost, 0U);
    EXPECT_EQ(delivered + lost, emitted);
    instance->switchOff();
}

TEST_F(RealTraceTest, TakesOverWhatAKilledServiceLeftBehind)
{
    std::array<int, 2> ready{};
    ASSERT_EQ(::pipe(ready.data()), 0);
    const pid_t child = ::fork();
    ASSERT_GE(child, 0);
    if (child == 0) {
        auto instance = TracefsInstance::open(tracefs.path(), tracefs.instanceName);
        const bool isOn = instance && !instance->switchOn();
        const EmittedEvent record{.code = firstCode};
        if (isOn)
            (void)!::write(instance->marker(), &record, sizeof record);
        (void)!::write(ready[1], isOn ? "1" : "0", 1);
        ::pause();
        ::_exit(0);
    }
    char isOn = 0;
    ASSERT_EQ(::read(ready[0], &isOn, 1), 1);
    ::close(ready[0]);
    ::close(ready[1]);
    EXPECT_EQ(isOn, '1');
    {
        const auto taken = TracefsInstance::open(tracefs.path(), tracefs.instanceName);
        ASSERT_FALSE(taken);
        EXPECT_TRUE(taken.error().isInUse);
    }
    ::kill(child, SIGKILL);
    ::waitpid(child, nullptr, 0);
    SessionListener listener(*trace);
    ASSERT_EQ(listener.start(), 0);
    ownEmitter.emit(firstCode + 1, {});
    listener.end();
    ASSERT_TRUE(listener.waitForCompletion());
    EXPECT_THAT(listener.codes(), ElementsAre(firstCode + 1));
    EXPECT_FALSE(fs::exists(tracefs.path() / "instances" / (tracefs.instanceName + "-2")));
}

TEST_F(RealTraceTest, HasAnInstanceForEachServiceOnTheMachine)
{
    TracefsEmitter otherEmitter;
    EmitterAccess otherAccess;
    TracefsKernelTrace other({.mounts = tracefs.mounts(), .instanceName = tracefs.instanceName}, otherEmitter,
                             otherAccess, ProviderLog(log));
    SessionListener one(*trace);
    SessionListener two(other);
    ASSERT_EQ(one.start(), 0);
    ASSERT_EQ(two.start(), 0);
    ownEmitter.emit(firstCode + 1, {});
    otherEmitter.emit(firstCode + 2, {});
    one.end();
    two.end();
    ASSERT_TRUE(one.waitForCompletion());
    ASSERT_TRUE(two.waitForCompletion());
    EXPECT_THAT(one.codes(), ElementsAre(firstCode + 1));
    EXPECT_THAT(two.codes(), ElementsAre(firstCode + 2));
    two.session.reset();
}

} // namespace
} // namespace platform
