// SPDX-License-Identifier: Apache-2.0
// If the service traces, it answers a start immediately, and again at the stop.
#include "neighbours/TraceStops.h"

#include "platform/linux/trace/TracefsInstance.h"

#include <array>
#include <fmt/format.h>
#include <fstream>
#include <kesto/trace.hpp>
#include <kesto/trace_parameters.h>
#include <stdexcept>
#include <string>
#include <thread>

namespace bench {
namespace {

constexpr int eventCount = 1'000'000;
constexpr std::uint32_t beginCode = 0x21040010;
constexpr std::uint32_t endCode = 0x21040014;
constexpr std::int64_t reporter = 42;
constexpr int typeTest = 11;

std::string entry(std::string_view key, std::string_view text)
{
    return fmt::format("<key>{}</key><string>{}</string>", key, text);
}

std::string parameters()
{
    const std::string point = entry(KESTO_TRACE_POINT_DESCRIPTION, "mix")
        + entry(KESTO_TRACE_POINT_TYPE, KESTO_TRACE_POINT_TYPE_INTERVAL)
        + entry(KESTO_TRACE_POINT_BEGIN_CODE, fmt::format("{:#010x}", beginCode))
        + entry(KESTO_TRACE_POINT_END_CODE, fmt::format("{:#010x}", endCode))
        + entry(KESTO_TRACE_POINT_EVENTS_MATCHED_BY, KESTO_TRACE_POINT_EVENTS_MATCHED_BY_THREAD);
    return fmt::format("<plist version=\"1.0\"><dict><key>{}</key><array><dict>{}<key>{}</key><array><dict>{}</dict>"
                       "</array></dict></array></dict></plist>",
                       KESTO_TRACE_PARAM_CHILDREN_NODES, entry(KESTO_TRACE_DATA_DESCRIPTION, "flood"),
                       KESTO_TRACE_DATA_CHILDREN_NODES, point);
}

namespace fs = std::filesystem;

std::set<fs::path> currentTraces()
{
    const auto place = traceInstances();
    std::error_code ignored;
    return place ? std::set<fs::path>(fs::begin(fs::directory_iterator(*place, ignored)), fs::directory_iterator())
                 : std::set<fs::path>();
}

fs::path parametersPath(const ServiceProcess& service)
{
    return service.socketPath().parent_path() / "parameters.plist";
}

class TracedSession {
public:
    explicit TracedSession(const ServiceProcess& service) : socket_(service.connect())
    {
        const foundation::Dictionary configuration{
            {"KestoReportingPellorinPlistFilePath", parametersPath(service).native()}};
        writeAll(socket_.get(),
                 frame({1, 1, reporter}) + frame({1, 2, typeTest, reporter}) + frame({1, 4, configuration, reporter}));
        for (int call = 0; call < 3; ++call)
            numberOfAnswer();
    }

    void start()
    {
        constexpr std::int64_t noReporter = 0;
        constexpr char startCall = 1;
        constexpr char nextCall = 2;
        writeAll(socket_.get(), frame({startCall, 5, reporter}) + frame({nextCall, 2, typeTest, noReporter}));
        if (numberOfAnswer() != startCall)
            throw std::runtime_error("the service cannot trace");
        numberOfAnswer();
    }
    void stop()
    {
        writeAll(socket_.get(), frame({1, 7, reporter}));
        numberOfAnswer(); // the start
        numberOfAnswer();
    }

private:
    // Of the next answer: [number, null, true].
    char numberOfAnswer()
    {
        std::array<char, 8> bytes;
        if (!readAll(socket_.get(), bytes.data(), bytes.size()))
            throw std::runtime_error("the service ended the connection");
        return bytes[5];
    }

    platform::FileDescriptor socket_;
};

// The first trace hands out what an emitter needs.
void awaitTracing(const kesto::Tracer& tracer)
{
    constexpr std::chrono::seconds patience(10);
    for (const auto start = Clock::now(); !tracer.isActive(); std::this_thread::yield())
        if (Clock::now() - start > patience)
            throw std::runtime_error("the service hands out no marker");
}

void emit(const kesto::Tracer& tracer, int count)
{
    for (int event = 0; event < count; ++event)
        tracer.emit(event % 2 == 0 ? beginCode : endCode);
}

} // namespace

std::optional<fs::path> traceInstances()
{
    const auto tracefs = platform::findTracefs("/proc/self/mounts");
    return tracefs ? std::optional(*tracefs / "instances") : std::nullopt;
}

TracesLeft::TracesLeft() : others_(currentTraces()) { }

TracesLeft::~TracesLeft()
{
    std::error_code ignored;
    for (const fs::path& trace : currentTraces())
        if (!others_.contains(trace))
            fs::remove(trace, ignored);
}

void writeTraceParameters(const ServiceProcess& service)
{
    std::ofstream(parametersPath(service)) << parameters();
}

void stopTraces(const FloodPart& part)
{
    kesto::Options options;
    options.socketPath = part.service.socketPath();
    options.trace = true;
    kesto::Client client;
    if (client.open(options) != kesto::Status::Ok)
        throw std::runtime_error("the client cannot be made");
    const kesto::Tracer tracer(client);
    TracedSession session(part.service);
    const auto trace = [&] {
        session.start();
        awaitTracing(tracer);
        emit(tracer, part.of(eventCount));
    };
    trace();
    part.waitForStart();
    while (true) {
        session.stop();
        trace();
    }
}

} // namespace bench
