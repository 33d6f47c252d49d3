// SPDX-License-Identifier: Apache-2.0
// A real kernel trace: the service measures the events that a program emits from several threads, and the program's own
// clock agrees.
#include "end_to_end/Kestod.h"
#include "end_to_end/WireClient.h"
#include "kesto/trace/TraceResultsFile.h"
#include "platform/linux/trace/RealTracefs.h"

#include <algorithm>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <kesto/trace.hpp>
#include <kesto/trace_parameters.h>

namespace end_to_end {
namespace {

using Clock = std::chrono::steady_clock; // of the trace, too
using foundation::Array;
using foundation::Dictionary;
using testing::SizeIs;

constexpr std::int64_t reporter = 42;
constexpr int typeTest = 11;

constexpr std::uint32_t firstOwnCode = 0x21040000; // two for each thread
constexpr std::uint32_t sharedBegin = 0x21040080;
constexpr std::uint32_t sharedEnd = 0x21040084;
constexpr unsigned threadCount = 4;
constexpr unsigned intervalsOfThread = 25;

std::uint32_t ownBegin(unsigned thread)
{
    return firstOwnCode + 8 * thread;
}

std::string point(const std::string& name, std::uint32_t begin, std::uint32_t end)
{
    const auto text = [](std::uint32_t code) {
        char digits[16];
        std::snprintf(digits, sizeof digits, "0x%08x", code);
        return std::string(digits);
    };
    const auto entry = [](std::string_view key, std::string_view value) {
        return "<key>" + std::string(key) + "</key><string>" + std::string(value) + "</string>";
    };
    return "<dict>" + entry(KESTO_TRACE_POINT_DESCRIPTION, name)
        + entry(KESTO_TRACE_POINT_TYPE, KESTO_TRACE_POINT_TYPE_INTERVAL)
        + entry(KESTO_TRACE_POINT_BEGIN_CODE, text(begin)) + entry(KESTO_TRACE_POINT_END_CODE, text(end))
        + entry(KESTO_TRACE_POINT_EVENTS_MATCHED_BY, KESTO_TRACE_POINT_EVENTS_MATCHED_BY_THREAD) + "</dict>";
}

std::string parameters()
{
    std::string points = point("shared", sharedBegin, sharedEnd);
    for (unsigned thread = 0; thread < threadCount; ++thread)
        points += point("thread " + std::to_string(thread), ownBegin(thread), ownBegin(thread) + 4);
    return "<plist version=\"1.0\"><dict><key>" KESTO_TRACE_PARAM_CHILDREN_NODES "</key><array><dict>"
           "<key>" KESTO_TRACE_DATA_DESCRIPTION "</key><string>test</string>"
           "<key>" KESTO_TRACE_DATA_CHILDREN_NODES "</key><array>"
        + points + "</array></dict></array></dict></plist>";
}

// Bounds of an interval's length by the emitter's clock, in nanoseconds.
struct Bounds {
    double least;
    double most;
};

double nanoseconds(Clock::duration duration)
{
    return static_cast<double>(std::chrono::nanoseconds(duration).count());
}

Bounds emitInterval(const kesto::Tracer& tracer, std::uint32_t begin, std::uint32_t end, Clock::duration length)
{
    const auto beforeBegin = Clock::now();
    tracer.emit(begin, 1, 2, 3, 4);
    const auto afterBegin = Clock::now();
    while (Clock::now() < afterBegin + length) { }
    const auto beforeEnd = Clock::now();
    tracer.emit(end);
    const auto afterEnd = Clock::now();
    return {.least = nanoseconds(beforeEnd - afterBegin), .most = nanoseconds(afterEnd - beforeBegin)};
}

// The intervals of one thread, in the order of time: each its own, and then one with the shared codes.
struct Emitted {
    std::vector<Bounds> own;
    std::vector<Bounds> shared;
};

// All lengths differ, so that intervals cannot be confused.
Emitted emitIntervals(const kesto::Tracer& tracer, unsigned thread)
{
    Emitted emitted;
    for (unsigned number = 0; number < intervalsOfThread; ++number) {
        const auto length = std::chrono::microseconds(100 + 40 * (number * threadCount + thread));
        emitted.own.push_back(emitInterval(tracer, ownBegin(thread), ownBegin(thread) + 4, length));
        emitted.shared.push_back(emitInterval(tracer, sharedBegin, sharedEnd, length));
    }
    return emitted;
}

void expectWithin(const std::vector<double>& values, const std::vector<Bounds>& bounds)
{
    constexpr double tolerance = 50'000;
    ASSERT_THAT(values, SizeIs(bounds.size()));
    for (std::size_t index = 0; index < values.size(); ++index) {
        EXPECT_GE(values[index], bounds[index].least - tolerance) << index;
        EXPECT_LE(values[index], bounds[index].most + tolerance) << index;
    }
}

class KernelTraceTest : public testing::Test {
protected:
    void SetUp() override
    {
        support::writeFile(parametersPath, parameters());
        kestod.start();
        session.emplace(kestod.socketPath());
    }

    // Whether it is traced.
    [[nodiscard]] bool startSession()
    {
        session->ask(Create, reporter);
        session->ask(SetServiceType, typeTest, reporter);
        session->ask(SetConfiguration, Dictionary{{"KestoReportingPellorinPlistFilePath", parametersPath.native()}},
                     reporter);
        return start();
    }
    // If the service traces, it answers a start immediately, and again at the stop.
    [[nodiscard]] bool start()
    {
        startCall = session->call(Start, reporter);
        const auto next = session->call(Validate, reporter);
        const auto reply = session->nextReply();
        const bool isTraced = reply && (*reply)[0] == foundation::Value(startCall);
        if (isTraced)
            session->replyTo(next);
        return isTraced;
    }
    void stopSession()
    {
        const auto stop = session->call(Stop, reporter);
        session->replyTo(startCall);
        session->replyTo(stop);
    }
    [[nodiscard]] std::vector<double> results(std::string_view name) const
    {
        const auto file = parseTraceResults(support::readFile(resultsPath));
        if (!file)
            throw std::runtime_error(file.error());
        for (const TraceSeries& series : file->series)
            if (series.name == name)
                return series.values;
        return {};
    }
    // The reason why this machine cannot trace; empty if it can.
    [[nodiscard]] std::string missing() const
    {
        if (tracefs.problem())
            return *tracefs.problem();
        kestod.awaitLog();
        const std::string log = kestod.log();
        const std::size_t place = log.find("the kernel trace is not available: ");
        return place == std::string::npos ? "" : log.substr(place, log.find('\n', place) - place);
    }

    bool openForTracing(kesto::Client& client) const
    {
        kesto::Options options;
        options.socketPath = kestod.socketPath();
        options.trace = true;
        return client.open(options) == kesto::Status::Ok;
    }

    const support::RealTracefs tracefs; // before the service, which must find it
    Kestod kestod{{{"feature-flags.toml", "[Sonalis]\nTracing = true\n"}}};
    const std::filesystem::path parametersPath = kestod.directory() / "parameters.plist";
    const std::filesystem::path resultsPath = kestod.directory() / "logs/Audio/Traces/tracing_results.qdj";
    std::optional<WireClient> session;
    std::uint64_t startCall = 0;
};

TEST_F(KernelTraceTest, MeasuresWhatAClientEmitsFromSeveralThreads)
{
    kesto::Client client;
    ASSERT_TRUE(openForTracing(client));
    const kesto::Tracer tracer(client);
    EXPECT_FALSE(tracer.isActive());

    if (!startSession()) {
        ASSERT_NE(missing(), "");
        GTEST_SKIP() << missing();
    }
    ASSERT_TRUE(waitUntil([&] { return tracer.isActive(); }));
    std::vector<Emitted> emitted(threadCount);
    std::vector<std::thread> threads;
    for (unsigned thread = 0; thread < threadCount; ++thread)
        threads.emplace_back([&, thread] { emitted[thread] = emitIntervals(tracer, thread); });
    for (std::thread& thread : threads)
        thread.join();
    stopSession();
    EXPECT_FALSE(tracer.isActive());

    std::vector<double> least;
    std::vector<double> most;
    for (unsigned thread = 0; thread < threadCount; ++thread) {
        SCOPED_TRACE(thread);
        expectWithin(results("thread " + std::to_string(thread)), emitted[thread].own);
        for (const Bounds& bounds : emitted[thread].shared) {
            least.push_back(bounds.least);
            most.push_back(bounds.most);
        }
    }
    // The file does not show the threads of the shared intervals, but each has its place in the order of lengths.
    std::ranges::sort(least);
    std::ranges::sort(most);
    std::vector<Bounds> shared;
    for (std::size_t index = 0; index < least.size(); ++index)
        shared.push_back({.least = least[index], .most = most[index]});
    std::vector<double> values = results("shared");
    std::ranges::sort(values);
    expectWithin(values, shared);
    kestod.awaitLog();
    EXPECT_EQ(kestod.countInLog("DISCARDED"), 0U);
}

TEST_F(KernelTraceTest, MeasuresNothingThatWasEmittedBeforeItsStartOrAfterItsEnd)
{
    kesto::Client client;
    ASSERT_TRUE(openForTracing(client));
    const kesto::Tracer tracer(client);
    const auto emit = [&](std::uint32_t code) { kesto_tracer_emit(tracer.get(), code, 0, 0, 0, 0); };

    if (!startSession()) {
        ASSERT_NE(missing(), "");
        GTEST_SKIP() << missing();
    }
    ASSERT_TRUE(waitUntil([&] { return tracer.isActive(); }));
    stopSession();
    EXPECT_THAT(results("shared"), SizeIs(0));

    emit(sharedBegin); // between two runs
    ASSERT_TRUE(start());
    emit(sharedEnd);
    emit(sharedBegin);
    emit(sharedEnd);
    emit(sharedBegin);
    stopSession();
    emit(sharedEnd);
    EXPECT_THAT(results("shared"), SizeIs(1));
}

TEST_F(KernelTraceTest, EndsTheServiceWithStatusOneWhenItsResultsCannotBeWritten)
{
    if (!startSession()) {
        ASSERT_NE(missing(), "");
        GTEST_SKIP() << missing();
    }
    std::filesystem::create_directories(resultsPath);
    session->call(Stop, reporter);
    EXPECT_EQ(kestod.exitStatus(), 1);
    EXPECT_EQ(kestod.countInLog(resultsPath.native() + " is a directory: remove it\n"), 1U);
    EXPECT_TRUE(kestod.log().ends_with("Failed to open quilldat writer\n")) << "nothing is logged after it";
}

TEST_F(KernelTraceTest, MeasuresAgainWhenTheServiceWasKilledDuringATrace)
{
    kesto::Client client;
    kesto::Options options;
    options.socketPath = kestod.socketPath();
    options.trace = true;
    options.reconnect = true;
    ASSERT_EQ(client.open(options), kesto::Status::Ok);
    const kesto::Tracer tracer(client);

    if (!startSession()) {
        ASSERT_NE(missing(), "");
        GTEST_SKIP() << missing();
    }
    ASSERT_TRUE(waitUntil([&] { return tracer.isActive(); }));
    tracer.emit(sharedBegin);
    kestod.kill();
    EXPECT_TRUE(waitUntil([&] { return !tracer.isActive(); })) << "no service reads these events";
    EXPECT_FALSE(std::filesystem::exists(resultsPath));

    kestod.start();
    session.emplace(kestod.socketPath());
    ASSERT_TRUE(startSession());
    ASSERT_TRUE(waitUntil([&] { return tracer.isActive(); })) << "the client has connected again";
    tracer.emit(sharedEnd); // of an interval that began before the restart
    const Bounds bounds = emitInterval(tracer, sharedBegin, sharedEnd, std::chrono::microseconds(500));
    stopSession();
    expectWithin(results("shared"), {bounds});
    kestod.awaitLog();
    EXPECT_EQ(kestod.countInLog("the kernel trace is not available"), 0U) << "it is taken over";
}

} // namespace
} // namespace end_to_end
