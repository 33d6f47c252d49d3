// SPDX-License-Identifier: Apache-2.0
// How many messages a second the service answers for one client that sends without waiting for answers.
#include "Groups.h"
#include "peers/BusPeer.h"
#include "support/ServiceProcess.h"

namespace bench {
namespace {

// Messages a second, measured over so many after a few warm-up messages.
template <typename Client> double rateOf(Client& client, std::size_t count)
{
    client.pipeline(RawClient::mostUnanswered);
    const auto start = Clock::now();
    client.pipeline(count);
    return static_cast<double>(count) / nanosecondsSince(start) * 1e9;
}

} // namespace

void measurePipeline(const BenchOptions& options, Report& report)
{
    constexpr std::size_t count = 50'000;
    const ServiceProcess service(options);

    SocketPair busSockets;
    const ChildProcess bus = runBusServer(busSockets);
    BusClient busClient(std::move(busSockets.client));

    SocketPair rawBusSockets;
    const ChildProcess rawBus = runBusServer(rawBusSockets);
    RawClient rawBusClient = makeRawBusClient(std::move(rawBusSockets.client));

    const std::string what = "sendMessage pipelined";
    const auto rates = compete(
        options, what,
        [&] { // with a session of its own in each round
            RawClient client = service.makeClient();
            return rateOf(client, count);
        },
        [&] { return rateOf(busClient, count); }, [&] { return rateOf(rawBusClient, count); });
    report.add({what, "/s", rates[0], PeerFigure{"sd-bus at both ends", rates[1]}, Target::ratioAtLeast(5)});
    report.add({what, "/s", rates[0], PeerFigure{"sd-bus server, raw client", rates[2]}, Target::ratioAtLeast(5)});
}

} // namespace bench
