// SPDX-License-Identifier: Apache-2.0
// How long a client waits for the answer to a message. The lower bound is a process that only reads and writes as many
// bytes.
//
// On most machines processors spend most of the time waking up, which is equal for all contestants; so everything is
// measured a second time on one processor, which does not sleep.
#include "Groups.h"
#include "peers/BusPeer.h"
#include "support/ServiceProcess.h"

#include <fmt/format.h>

namespace bench {
namespace {

ChildProcess runPingPong(const SocketPair& sockets, std::size_t requestSize)
{
    return ChildProcess::run([&] {
        std::string request(requestSize, '\0');
        const std::string answer(sampleAnswerSize, '\0');
        while (readAll(sockets.server.get(), request.data(), request.size()))
            writeAll(sockets.server.get(), answer);
    });
}

// The median of many round trips, in microseconds.
template <typename Client> Contestant roundTripsOf(Client& client)
{
    return [&client] {
        constexpr std::size_t count = 3000;
        std::vector<double> times;
        times.reserve(count);
        for (std::size_t each = 0; each < count; ++each) {
            const auto start = Clock::now();
            client.roundTrip();
            times.push_back(nanosecondsSince(start) / 1000);
        }
        return median(std::move(times));
    };
}

} // namespace

void measureRoundTrip(const BenchOptions& options, Report& report)
{
    const ServiceProcess service(options);
    RawClient client = service.makeClient();

    Request request = Request::marked(sampleFrame(), std::endian::big);
    SocketPair pingPongSockets;
    const ChildProcess pingPong = runPingPong(pingPongSockets, request.bytes.size());
    RawClient pingPongClient(std::move(pingPongSockets.client), std::move(request), sampleAnswerSize);

    SocketPair busSockets;
    const ChildProcess bus = runBusServer(busSockets);
    BusClient busClient(std::move(busSockets.client));

    SocketPair rawBusSockets;
    const ChildProcess rawBus = runBusServer(rawBusSockets);
    RawClient rawBusClient = makeRawBusClient(std::move(rawBusSockets.client));

    const auto measure = [&](std::string_view how) {
        const std::string what = fmt::format("sendMessage round trip, {}", how);
        const auto times = compete(options, what, roundTripsOf(client), roundTripsOf(pingPongClient),
                                   roundTripsOf(busClient), roundTripsOf(rawBusClient));
        report.add({what, "us", times[0], PeerFigure{"Unix-socket ping-pong", times[1]}, Target::ratioAtMost(1.6)});
        report.add({what, "us", times[0], PeerFigure{"sd-bus at both ends", times[2]}, Target::ratioAtMost(1.0 / 3)});
        report.add(
            {what, "us", times[0], PeerFigure{"sd-bus server, raw client", times[3]}, Target::ratioAtMost(1.0 / 3)});
    };
    measure("as scheduled");
    const OneProcessor processor{service.identifier(), pingPong.identifier(), bus.identifier(), rawBus.identifier()};
    measure("on one processor");
}

} // namespace bench
