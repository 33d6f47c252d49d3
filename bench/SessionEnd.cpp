// SPDX-License-Identifier: Apache-2.0
// The cost of a long session's end: computing the playing times, the file, the summary event, and the memory of all of
// these.
#include "Groups.h"
#include "platform/linux/diagnostics/LinuxFileSystem.h"
#include "session/KestoReportingSession.h"
#include "support/ChildProcess.h"
#include "support/InProcessPlatform.h"
#include "support/SampleMessage.h"
#include "support/TemporaryDirectory.h"

#include <cstdio>
#include <fmt/format.h>
#include <fstream>
#include <malloc.h>
#include <memory>
#include <rapidjson/filewritestream.h>
#include <rapidjson/prettywriter.h>

namespace bench {
namespace {

constexpr std::uint32_t messageCount = 1'000'000;

// A player that runs for days: it sends eight messages a second, is paused now and then, and its volume changes while
// it plays. The message has as many entries as the sample message; spatial audio is rarely switched.
foundation::Dictionary playerMessage(std::uint32_t number)
{
    constexpr std::uint32_t pause = 2000;
    constexpr std::uint32_t volume = 500;
    constexpr std::uint32_t spatialSwitch = 100;
    const auto switched = number % spatialSwitch == 0 ? foundation::Dictionary{{"spatializationEnabled", false}}
                                                      : foundation::Dictionary{{"route_change_reason", 3}};
    return sampleMessage(numberMark + number)
        .without("spatializationEnabled")
        .mergedWith({{"kestoreporting_timestamp", 1'767'225'600.25 + number * 0.128371},
                     {"systemuptime_sec", 86'523 + number / 8},
                     {"session_output_running", number % pause >= pause / 10},
                     {"PomoSessionVolume", 0.25 + 0.0625 * (number / volume % 8)}})
        .mergedWith(switched);
}

template <typename Send> void sendMessages(Send send)
{
    for (std::uint32_t number = 1; number <= messageCount; ++number)
        send(playerMessage(number));
}

std::shared_ptr<KestoReportingSession> makeLongSession()
{
    auto session = std::make_shared<KestoReportingSession>(sampleReporterID, std::vector<std::int32_t>{1});
    session->start();
    ledger::Tally tally;
    sendMessages(
        [&](const auto& message) { session->sendMessage(tally, message, sampleCategory, sampleType, nullptr); });
    return session;
}

std::size_t textSize(const foundation::Dictionary& summary)
{
    std::size_t size = 0;
    for (const auto& [key, value] : summary)
        size += value.stringView().size();
    return size;
}

// Each round begins with memory fresh from the system, as when a long session ends in a service: memory of an earlier
// round would save the first touch of every page.
template <typename Work> Contestant millisecondsOf(Work work)
{
    return [work] {
        ::malloc_trim(0);
        const auto start = Clock::now();
        work();
        return nanosecondsSince(start) / 1e6;
    };
}

void measureAnalysis(const BenchOptions& options, Report& report)
{
    session::MessageStore store(session::StorageBudget::service());
    sendMessages([&](const auto& message) { use(store.record(sampleCategory, sampleType, message)); });
    const std::optional<foundation::Value> process("player");
    const auto times = compete(options, "combining and volume analysis", millisecondsOf([&] {
                                   session::StorageShare share(session::StorageBudget::service());
                                   use(KestoReportingSession::createVolumeMessages(store, process, 0.5, share));
                               }));
    std::vector<double> each;
    for (const double milliseconds : times[0].figures())
        each.push_back(milliseconds * 1e6 / messageCount);
    report.add({fmt::format("combining and volume analysis, each of {} messages", messageCount),
                "ns",
                each,
                {},
                Target::figureAtMost(200)});
}

// In bytes.
std::size_t allocated()
{
    const auto info = ::mallinfo2();
    return info.uordblks + info.hblkhd;
}

// For a session in which only the volume changes: each message ends a stretch.
void measureVolumeEvents(const BenchOptions& options, Report& report)
{
    constexpr int changeCount = 200'000;
    session::MessageStore store(session::StorageBudget::service());
    for (int change = 0; change <= changeCount; ++change)
        use(store.record(sampleCategory, sampleType,
                         {{"session_output_running", true},
                          {"PomoSessionVolume", change % 2},
                          {"kestoreporting_timestamp", change}}));
    const std::optional<foundation::Value> process("player");
    std::vector<double> perSecond;
    std::vector<double> bytes;
    std::vector<double> paidBytes;
    for (int round = 0; round < options.rounds; ++round) {
        ::malloc_trim(0);
        session::StorageShare share(session::StorageBudget::service());
        const std::size_t before = allocated();
        const auto start = Clock::now();
        const auto events = KestoReportingSession::createVolumeMessages(store, process, 0.5, share);
        const auto count = static_cast<double>(events.size());
        perSecond.push_back(count * 1e9 / nanosecondsSince(start));
        bytes.push_back(static_cast<double>(allocated() - before) / count);
        paidBytes.push_back(static_cast<double>(share.bytes()) / count);
    }
    report.add({"volume events made a second", "", perSecond});
    report.add(
        {"memory of a volume event", "B", bytes, PeerFigure{"what is paid for it", paidBytes}, Target::ratioAtMost(1)});
}

// The values, handed to RapidJSON's writer.
template <typename Writer> void writeWithRapidJson(const foundation::Value& value, Writer& writer)
{
    const auto size = [](std::string_view text) { return static_cast<rapidjson::SizeType>(text.size()); };
    if (const auto dictionary = value.dictionary()) {
        writer.StartObject();
        for (const auto& [key, element] : *dictionary) {
            writer.Key(key.view().data(), size(key));
            writeWithRapidJson(element, writer);
        }
        writer.EndObject();
    } else if (const auto number = value.number()) {
        if (number->kind() == foundation::Number::Kind::Boolean)
            writer.Bool(number->booleanValue());
        else if (number->isFloat())
            writer.Double(number->doubleValue());
        else
            writer.Int64(number->int64Value());
    } else {
        writer.String(value.stringView().data(), size(value.stringView()));
    }
}

void writeWithRapidJson(const std::vector<foundation::Dictionary>& messages, const std::filesystem::path& path)
{
    const std::unique_ptr<std::FILE, int (*)(std::FILE*)> file(std::fopen(path.c_str(), "w"), std::fclose);
    std::vector<char> buffer(std::size_t{64} << 10);
    rapidjson::FileWriteStream stream(file.get(), buffer.data(), buffer.size());
    rapidjson::PrettyWriter<rapidjson::FileWriteStream> writer(stream);
    writer.StartArray();
    for (const auto& message : messages)
        writeWithRapidJson(message, writer);
    writer.EndArray();
}

void measureFile(const BenchOptions& options, Report& report, const KestoReportingSession& session,
                 const std::filesystem::path& directory)
{
    const auto messages = session.nestedAggregatedPayloadData().value();
    const auto times = compete(options, "summary file", millisecondsOf([&] { session.writeSummaryJson(); }),
                               millisecondsOf([&] { writeWithRapidJson(messages, directory / "rapidjson.json"); }));
    report.add({fmt::format("summary file of {} messages", messageCount), "ms", times[0],
                PeerFigure{"RapidJSON's pretty writer", times[1]}, Target::ratioAtMost(1.3)});
}

void measureEvent(const BenchOptions& options, Report& report, const KestoReportingSession& session)
{
    const foundation::Dictionary summary = session.createSummaryEventForSession().value();
    const auto copyText = [&summary] {
        std::string copy;
        copy.reserve(textSize(summary));
        for (const auto& [key, value] : summary)
            copy += value.stringView();
        use(copy);
    };
    const auto times =
        compete(options, "summary event", millisecondsOf([&] { use(session.createSummaryEventForSession()); }),
                millisecondsOf(copyText));
    report.add({fmt::format("summary event of {} messages", messageCount), "ms", times[0],
                PeerFigure{"copy of its text", times[1]}, Target::ratioAtMost(3)});
}

// Memory of this process, in megabytes: "VmRSS", or "VmHWM" for the maximum since `forgetMostMemory`.
double memory(std::string_view what)
{
    std::ifstream status("/proc/self/status");
    for (std::string line; std::getline(status, line);)
        if (line.starts_with(what))
            return std::stod(line.substr(what.size() + 1)) / 1024;
    return 0;
}

void forgetMostMemory()
{
    std::ofstream("/proc/self/clear_refs") << "5";
}

void measureMemory(const BenchOptions& options, Report& report)
{
    std::vector<double> more;
    std::vector<double> texts;
    for (int round = 0; round < options.rounds; ++round) {
        showProgress(fmt::format("memory of a session's end: round {} of {}", round + 1, options.rounds));
        const auto session = makeLongSession();
        texts.push_back(static_cast<double>(textSize(session->createSummaryEventForSession().value())) / (1 << 20));
        ::malloc_trim(0);
        const double before = memory("VmRSS");
        forgetMostMemory();
        platform::Turn turn;
        session->stop(turn);
        more.push_back(memory("VmHWM") - before);
    }
    clearProgress();
    report.add({"memory while it ends, over before", "MB", more, PeerFigure{"text of the summary event", texts},
                Target::ratioAtMost(1.5)});
}

} // namespace

void measureSessionEnd(const BenchOptions& options, Report& report)
{
    const support::TemporaryDirectory directory;
    platform::LinuxFileSystem files(directory.path());
    const InProcessPlatform platform(&files);
    measureMemory(options, report);
    measureAnalysis(options, report);
    measureVolumeEvents(options, report);
    const auto session = makeLongSession();
    measureFile(options, report, *session, directory.path());
    measureEvent(options, report, *session);
}

} // namespace bench
