// SPDX-License-Identifier: Apache-2.0
// A runner on fakes, with helper functions for its tests.
#pragma once

#include "support/TestPlatform.h"
#include "tracing/TraceEventsOf.h"
#include "tracing/TraceParams.h"
#include "tracing/TraceRunner.h"

#include <gmock/gmock.h>
#include <string>

namespace support {

class RunnerFixture : public testing::Test {
protected:
    static constexpr std::uint32_t beginCode = 0x21040010;
    static constexpr std::uint32_t endCode = 0x21040014;

    // Parameters of a trace that measures one interval.
    static TraceParams interval(std::string name, std::string interval)
    {
        return {.name = std::move(name),
                .traceDataParams = {{std::move(interval), TraceDataParams::interval, beginCode, endCode, false}}};
    }
    static TraceParams signpost(std::string name)
    {
        TraceParams params = interval(std::move(name), "interval");
        params.traceType = TraceParams::signpostTrace;
        return params;
    }

    void add(const TraceParams& params) { runner->createTraceFromTraceParams(&params); }
    // Emits an interval of that length for every trace that runs.
    void emit(std::uint64_t length)
    {
        platform.kernelTrace.deliver(eventOf(beginCode, now));
        platform.kernelTrace.deliver(eventOf(endCode, now + length));
        now += length + 1;
    }
    [[nodiscard]] const FakeKernelTrace::Session& session(std::size_t number) const
    {
        return *platform.kernelTrace.sessions().at(number);
    }
    // Of the only results file.
    [[nodiscard]] const FakePerformanceWriter::File& file() const { return *platform.performanceWriter.files().at(0); }
    [[nodiscard]] std::vector<std::string> messages() const
    {
        std::vector<std::string> messages;
        for (const LogLine& line : platform.log.lines("kert"))
            messages.push_back(line.message);
        return messages;
    }

    TestPlatform platform;
    std::unique_ptr<TraceRunner> runner = std::make_unique<TraceRunner>();
    std::uint64_t now = 1000;
};

inline FakePerformanceWriter::Measurement measurement(std::string name, double value)
{
    return {std::move(name), value, platform::PerformanceUnit::Nanoseconds};
}

} // namespace support
