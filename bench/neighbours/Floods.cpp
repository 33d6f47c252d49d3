// SPDX-License-Identifier: Apache-2.0
// One function for each flood, and the table. Ten processes do together what one does alone: each opens its part of the
// connections, and makes its part of the sessions and messages.
#include "neighbours/Floods.h"

#include "neighbours/FloodPipeline.h"
#include "neighbours/TraceStops.h"
#include "support/SampleMessage.h"

#include <array>
#include <stdexcept>
#include <string>
#include <vector>

namespace bench {
namespace {

using foundation::Array;
using Answers = FloodPipeline::Answers;

constexpr int manyConnections = 50;
constexpr std::int64_t reporter = sampleReporterID;

Request request(const Array& call)
{
    return Request::marked(frame(call), std::endian::big);
}

Request sampleMessageRequest()
{
    return Request::marked(sampleFrame(), std::endian::big);
}

// --- Sessions

// Reads so many answers of the form [1, null, true].
void readAnswers(int socket, int count)
{
    std::vector<char> bytes(static_cast<std::size_t>(count) * 8);
    if (!readAll(socket, bytes.data(), bytes.size()))
        throw std::runtime_error("the service ended the connection");
}

enum class Sessions : std::uint8_t { Created, Started };

// IDs that count up from `first`.
void makeSessions(int socket, std::int64_t first, int count, Sessions state)
{
    constexpr int together = 500;
    std::string calls;
    for (int done = 0; done < count; done += together) {
        const int next = std::min(count - done, together);
        for (int session = done; session < done + next; ++session) {
            calls += frame({1, 1, first + session});
            if (state == Sessions::Started)
                calls += frame({1, 5, first + session}); // answered when the session ends
        }
        writeAll(socket, calls);
        readAnswers(socket, next);
        calls.clear();
    }
    constexpr std::int64_t noReporter = 0;
    writeAll(socket, frame({1, 2, 0, noReporter})); // its answer shows that all starts are carried out
    readAnswers(socket, 1);
}

// --- Floods of calls

void sendMessages(const FloodPart& part, int connections, Answers answers)
{
    FloodPipeline{connections, [&] { return part.service.connectWithSession(); }, {sampleMessageRequest()}, answers}
        .run(part.waitForStart);
}

void sendThroughMany(const FloodPart& part)
{
    sendMessages(part, part.of(manyConnections), Answers::Discarded);
}

void sendThroughOne(const FloodPart& part)
{
    sendMessages(part, 1, Answers::Discarded);
}

void sendWithoutReading(const FloodPart& part)
{
    sendMessages(part, part.of(manyConnections), Answers::NotRead);
}

void validate(const FloodPart& part)
{
    FloodPipeline{
        part.of(manyConnections), [&] { return part.service.connect(); }, {request({numberMark, 9, reporter})}}
        .run(part.waitForStart);
}

void startAndStop(const FloodPart& part, int connections)
{
    const auto connect = [&] {
        auto socket = part.service.connect();
        makeSessions(socket.get(), reporter, 1, Sessions::Created);
        return socket;
    };
    FloodPipeline{connections, connect, {request({numberMark, 5, reporter}), request({numberMark, 7, reporter})}}.run(
        part.waitForStart);
}

void startAndStopThroughMany(const FloodPart& part)
{
    startAndStop(part, part.of(manyConnections));
}

void startAndStopThroughOne(const FloodPart& part)
{
    startAndStop(part, 1);
}

void sendToAllSessions(const FloodPart& part)
{
    constexpr int sessionCount = 10'000;
    const auto connect = [&] {
        auto socket = part.service.connect();
        makeSessions(socket.get(), 1, part.of(sessionCount), Sessions::Started);
        return socket;
    };
    FloodPipeline{
        1, connect, {request({numberMark, 6, sampleMessage(), sampleCategory, sampleType, foundation::Value()})}}
        .run(part.waitForStart);
}

void askForAllIDs(const FloodPart& part)
{
    constexpr int sessionCount = 110'000;
    constexpr int mostOfAClient = 10'000;
    constexpr std::int64_t longID = std::int64_t{1} << 40; // of nine bytes in the answer
    std::vector<platform::FileDescriptor> owners;
    for (int left = part.of(sessionCount); left > 0; left -= mostOfAClient) {
        owners.push_back(part.service.connect());
        makeSessions(owners.back().get(), longID, std::min(left, mostOfAClient), Sessions::Created);
    }
    FloodPipeline{1, [&] { return part.service.connect(); }, {request({numberMark, 10})}}.run(part.waitForStart);
}

void sendLargeMessages(const FloodPart& part)
{
    constexpr std::size_t almostLargestFrame = (std::size_t{1} << 20) - 1024;
    const foundation::Dictionary message{{"frames_rendered", numberMark},
                                         {"active_devices", std::string(almostLargestFrame, 'x')}};
    const Request call =
        request({numberMark, 6, message, sampleCategory, sampleType, Array{foundation::Value(reporter)}});
    FloodPipeline{1, [&] { return part.service.connectWithSession(); }, {call}}.run(part.waitForStart);
}

void openAndClose(const FloodPart& part)
{
    constexpr int connectionCount = 5000;
    std::vector<platform::FileDescriptor> connections;
    part.waitForStart();
    while (true) {
        for (int connection = 0; connection < part.of(connectionCount); ++connection)
            connections.push_back(part.service.connect());
        connections.clear();
    }
}

// --- Floods of stops: a client's end stops its session

template <typename MakeClient>
void stopSessions(const FloodPart& part, int sessions, int messagesEach, MakeClient makeClient)
{
    std::vector<RawClient> clients;
    const auto record = [&] {
        for (int session = 0; session < sessions; ++session) {
            clients.push_back(makeClient());
            clients.back().pipeline(static_cast<std::size_t>(messagesEach));
        }
    };
    record();
    part.waitForStart();
    while (true) {
        clients.clear();
        record();
    }
}

void stopLongSession(const FloodPart& part)
{
    constexpr int messageCount = 1'000'000;
    stopSessions(part, 1, part.of(messageCount), [&] { return part.service.makeClient(); });
}

void stopVolumeChanges(const FloodPart& part)
{
    constexpr int sessionCount = 10;
    constexpr int changeCount = 100'000;
    const foundation::Dictionary change{
        {"session_output_running", true}, {"PomoSessionVolume", numberMark}, {"kestoreporting_timestamp", numberMark}};
    const Request call =
        request({numberMark, 6, change, sampleCategory, sampleType, Array{foundation::Value(reporter)}});
    stopSessions(part, part.of(sessionCount), changeCount,
                 [&] { return RawClient(part.service.connectWithSession(), call, sampleAnswerSize); });
}

using enum Flood::Needs;

constexpr std::array all{
    Flood{"sending", Nothing, manyConnections, sendThroughMany},
    Flood{"validating", Nothing, manyConnections, validate},
    Flood{"starting and stopping", Nothing, manyConnections, startAndStopThroughMany},
    Flood{"never reading", Nothing, manyConnections, sendWithoutReading},
    Flood{"full window", Nothing, 1, sendThroughOne},
    Flood{"to 10,000 sessions", Nothing, 1, sendToAllSessions},
    Flood{"stops of 1,000,000 messages", Nothing, 1, stopLongSession},
    Flood{"stops of 1,000,000 messages, internal build", InternalBuild, 1, stopLongSession},
    Flood{"stops of 100,000 volume changes", InternalBuild, 1, stopVolumeChanges},
    Flood{"110,000 IDs", Nothing, 1, askForAllIDs},
    Flood{"1 MiB messages", Nothing, 1, sendLargeMessages},
    Flood{"crowded channels", CrowdedChannels, 1, startAndStopThroughOne},
    Flood{"opening and closing", Nothing, manyConnections, openAndClose},
    Flood{"stops of traces", Tracing, 1, stopTraces},
};

} // namespace

std::span<const Flood> floods()
{
    return all;
}

} // namespace bench
