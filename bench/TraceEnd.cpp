// SPDX-License-Identifier: Apache-2.0
// The cost of a trace after its end: pairing its events, and everything from its stop to the results file.
#include "Groups.h"
#include "platform/linux/diagnostics/LinuxFileSystem.h"
#include "platform/linux/queues/LinuxWorkQueues.h"
#include "platform/linux/trace/LinuxPerformanceWriter.h"
#include "support/ChildProcess.h"
#include "support/ExchangedProviders.h"
#include "support/InProcessPlatform.h"
#include "support/TemporaryDirectory.h"
#include "tracing/TraceParams.h"
#include "tracing/TraceRunner.h"

#include <algorithm>
#include <fmt/format.h>
#include <fstream>
#include <iterator>
#include <stdexcept>

namespace bench {
namespace {

constexpr std::uint32_t beginCode = 0x21040010;
constexpr std::uint32_t endCode = 0x21040014;

// Threads that take turns, each with an interval that its next turn ends.
std::vector<trace_point> eventsOf(std::size_t count, std::uint64_t threads)
{
    std::vector<trace_point> events(count);
    for (std::size_t number = 0; number < count; ++number)
        events[number] = {.timestamp = 1'000'000 + 500 * number,
                          .threadID = 4000 + number % threads,
                          .eventCode = number / threads % 2 == 0 ? beginCode : endCode};
    return events;
}

// A kernel trace that had these events while a session ran: they are delivered when it ends.
class RecordedTrace final : public platform::KernelTrace {
public:
    explicit RecordedTrace(std::vector<trace_point> events) : events_(std::move(events)) { }

    bool isAvailable() override { return true; }
    std::unique_ptr<platform::KernelTraceSession> createTraceSession() override
    {
        return std::make_unique<Session>(events_);
    }

private:
    class Session final : public platform::KernelTraceSession {
    public:
        explicit Session(const std::vector<trace_point>& events) : events_(events) { }

        void setCompletionHandler(std::function<void()> handler) override { complete_ = std::move(handler); }
        void enableWallTimes(bool) override { }
        [[nodiscard]] std::uint64_t lostEvents() const override { return 0; }
        int filterEventRange(std::uint32_t, std::uint32_t, std::function<void(const trace_point&)> handler) override
        {
            handler_ = std::move(handler);
            return 0;
        }
        int start(std::shared_ptr<platform::WorkQueue> queue) override
        {
            queue_ = std::move(queue);
            return 0;
        }
        void end() override
        {
            queue_->submit([this, complete = complete_] {
                for (const trace_point& event : events_)
                    handler_(event);
                complete();
            });
        }
        [[nodiscard]] std::uint64_t timestampToNanoseconds(std::uint64_t timestamp) const override { return timestamp; }

    private:
        const std::vector<trace_point>& events_;
        std::function<void()> complete_;
        std::function<void(const trace_point&)> handler_;
        std::shared_ptr<platform::WorkQueue> queue_;
    };

    const std::vector<trace_point> events_;
};

// Millions of events a second.
double pairingRate(const platform::KernelTraceSession& session, const std::vector<trace_point>& events, bool byThread)
{
    TraceInterval interval("mix", beginCode, endCode, byThread);
    const double cost = nanosecondsEach(1, [&](std::size_t) { interval.processTracepoints(session, events); });
    if (interval.getNumTimesTraced() != events.size() / 2)
        throw std::runtime_error("intervals are missing");
    use(interval.getResults());
    return static_cast<double>(events.size()) * 1e3 / cost;
}

void measurePairing(const BenchOptions& options, Report& report)
{
    constexpr std::size_t count = 1'000'000;
    RecordedTrace trace({});
    const auto session = trace.createTraceSession();
    const auto few = eventsOf(count, 4);
    const auto many = eventsOf(count, 1000);
    const auto single = eventsOf(count, 1);
    const auto rates = compete(
        options, "pairing of events", [&] { return pairingRate(*session, few, true); },
        [&] { return pairingRate(*session, many, true); }, [&] { return pairingRate(*session, single, false); });
    const auto add = [&](std::string_view how, const Series& rate) {
        report.add({fmt::format("pairing {} events, {}", count, how), "M/s", rate, {}, Target::figureAtLeast(50)});
    };
    add("each thread's own, 4 threads", rates[0]);
    add("each thread's own, 1000 threads", rates[1]);
    add("of any thread", rates[2]);
}

// The services that a trace's end needs are real ones.
class TracingPlatform {
public:
    TracingPlatform(platform::KernelTrace& kernelTrace, platform::FileSystem& files)
        : performanceWriter_(files, platform::ProviderLog(platform::current().log))
    {
        platform::install(
            support::withExchanged(platform::current(), workQueues_, kernelTrace, performanceWriter_, files));
    }

private:
    platform::LinuxWorkQueues workQueues_;
    platform::LinuxPerformanceWriter performanceWriter_;
};

double millisecondsToStop()
{
    const TraceParams params{.name = "trace",
                             .traceDataParams = {{"mix", TraceDataParams::interval, beginCode, endCode, true}}};
    TraceRunner runner;
    runner.createTraceFromTraceParams(&params);
    runner.runTraces();
    const auto start = Clock::now();
    runner.stopTracingandProcessResults();
    return nanosecondsSince(start) / 1e6;
}

void measureStop(const BenchOptions& options, Report& report)
{
    constexpr std::size_t count = 100'000;
    const support::TemporaryDirectory directory;
    platform::LinuxFileSystem files(directory.path());
    RecordedTrace trace(eventsOf(count, 4));
    const TracingPlatform platform(trace, files);
    const auto times = compete(options, "stop of a trace", millisecondsToStop);
    std::ifstream results(KestoReportingTracingLogsDirectory() / TraceRunner::resultsFileName);
    if (std::count(std::istreambuf_iterator<char>(results), {}, '\n') < static_cast<std::ptrdiff_t>(count / 2))
        throw std::runtime_error("results are missing");
    report.add({fmt::format("stop of a trace of {} events, to its results", count),
                "ms",
                times[0],
                {},
                Target::figureAtMost(100)});
}

} // namespace

void measureTraceEnd(const BenchOptions& options, Report& report)
{
    const InProcessPlatform platform;
    measurePairing(options, report);
    measureStop(options, report);
}

} // namespace bench
