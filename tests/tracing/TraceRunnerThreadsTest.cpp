// SPDX-License-Identifier: Apache-2.0
// Runners on real queues, with a kernel trace that delivers events on its own thread. While the threads work
// at the same time, the results hold every interval that was delivered before the end. The thread sanitizer checks that
// no two threads use the same data.
#include "platform/linux/queues/LinuxWorkQueues.h"
#include "support/ExchangedProviders.h"
#include "support/TestPlatform.h"
#include "tracing/TraceParams.h"
#include "tracing/TraceRunner.h"

#include <atomic>
#include <gtest/gtest.h>
#include <thread>

namespace {

constexpr std::uint32_t beginCode = 0x21040010;
constexpr std::uint32_t endCode = 0x21040014;
constexpr int cycles = 200;

// A session emits intervals on its own thread, from its start to its end.
class EmittingTrace final : public platform::KernelTrace {
public:
    // The number of events of all sessions that are delivered or on their way to the queue.
    std::atomic<std::uint64_t> intervals = 0;

    bool isAvailable() override { return true; }
    std::unique_ptr<platform::KernelTraceSession> createTraceSession() override
    {
        return std::make_unique<Session>(*this);
    }

private:
    class Session final : public platform::KernelTraceSession {
    public:
        explicit Session(EmittingTrace& trace) : trace_(trace) { }

        void setCompletionHandler(std::function<void()> handler) override { complete_ = std::move(handler); }
        void enableWallTimes(bool) override { }
        int filterEventRange(std::uint32_t, std::uint32_t, std::function<void(const trace_point&)> handler) override
        {
            handler_ = std::move(handler);
            return 0;
        }
        int start(std::shared_ptr<platform::WorkQueue> queue) override
        {
            queue_ = std::move(queue);
            thread_ = std::jthread([this](const std::stop_token& isGone) { emit(isGone); });
            return 0;
        }
        void end() override { hasEnded_ = true; }
        [[nodiscard]] std::uint64_t lostEvents() const override { return 0; }
        [[nodiscard]] std::uint64_t timestampToNanoseconds(std::uint64_t timestamp) const override { return timestamp; }

    private:
        // Destroyed before its end, a session is never completed.
        void emit(const std::stop_token& isGone)
        {
            for (std::uint64_t now = 1; !hasEnded_ && !isGone.stop_requested(); now += 10) {
                deliver({.timestamp = now, .eventCode = beginCode});
                deliver({.timestamp = now + 3, .eventCode = endCode});
                ++trace_.intervals;
                std::this_thread::yield();
            }
            if (hasEnded_)
                queue_->submit(complete_);
        }
        void deliver(const trace_point& event)
        {
            queue_->submit([handler = handler_, event] { handler(event); });
        }

        EmittingTrace& trace_;
        std::function<void()> complete_;
        std::function<void(const trace_point&)> handler_;
        std::shared_ptr<platform::WorkQueue> queue_;
        std::atomic<bool> hasEnded_ = false;
        std::jthread thread_; // destroyed first
    };
};

class RunnerThreads : public testing::Test {
protected:
    RunnerThreads()
    {
        platform::install(support::withExchanged(platform::current(), workQueues, kernelTrace));
        platform.log.setThreshold(platform::LogLevel::Error);
    }

    std::unique_ptr<TraceRunner> run(std::size_t traces)
    {
        const TraceParams params{.name = "trace",
                                 .traceDataParams = {{"mix", TraceDataParams::interval, beginCode, endCode, true}}};
        auto runner = std::make_unique<TraceRunner>();
        for (std::size_t count = 0; count < traces; ++count)
            runner->createTraceFromTraceParams(&params);
        runner->runTraces();
        return runner;
    }
    void waitForIntervals(std::uint64_t more)
    {
        for (const std::uint64_t before = kernelTrace.intervals; kernelTrace.intervals < before + more;)
            std::this_thread::yield();
    }

    support::TestPlatform platform;
    platform::LinuxWorkQueues workQueues;
    EmittingTrace kernelTrace;
};

TEST_F(RunnerThreads, MeasureEveryIntervalThatCameBeforeTheirEnd)
{
    for (std::uint64_t cycle = 0; cycle < cycles; ++cycle) {
        const std::uint64_t before = kernelTrace.intervals;
        const auto runner = run(1);
        waitForIntervals(cycle % 3);
        runner->stopTracingandProcessResults();
        EXPECT_EQ(runner->completedTraceCount(), 1U);
        const auto& measured = platform.performanceWriter.files().back()->measurements;
        ASSERT_EQ(measured.size(), kernelTrace.intervals - before);
        for (const auto& measurement : measured)
            ASSERT_EQ(measurement.value, 3);
    }
    EXPECT_EQ(TraceRunner::numberOfRunners(), 0U);
    EXPECT_TRUE(platform.log.lines().empty()) << "nothing is lost";
}

TEST_F(RunnerThreads, GoWhileTheirEventsAreDelivered)
{
    for (std::uint64_t cycle = 0; cycle < cycles; ++cycle) {
        auto runner = run(1 + cycle % 3);
        waitForIntervals(cycle % 4);
        runner.reset();
    }
    EXPECT_EQ(TraceRunner::numberOfRunners(), 0U);
    EXPECT_TRUE(platform.performanceWriter.files().empty());
}

TEST_F(RunnerThreads, OfSeveralSessionsRunSideBySide)
{
    for (int cycle = 0; cycle < cycles / 10; ++cycle) {
        const std::uint64_t before = kernelTrace.intervals;
        const std::size_t filesBefore = platform.performanceWriter.files().size();
        std::vector<std::unique_ptr<TraceRunner>> runners;
        for (std::size_t traces : {1U, 2U, 3U})
            runners.push_back(run(traces));
        waitForIntervals(20);
        std::size_t measured = 0;
        for (const auto& runner : runners)
            runner->stopTracingandProcessResults();
        const auto& files = platform.performanceWriter.files();
        for (std::size_t number = filesBefore; number < files.size(); ++number)
            measured += files[number]->measurements.size();
        EXPECT_EQ(measured, kernelTrace.intervals - before);
    }
}

} // namespace
