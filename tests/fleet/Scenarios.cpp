// SPDX-License-Identifier: Apache-2.0
// Each scenario leaves the fleet as it found it: all servers, ingests and devices run.
#include "fleet/Scenarios.h"

#include "fleet/Measures.h"
#include "fleet/News.h"
#include "kesto-ingest/stream/JetStream.h"
#include "support/Relay.h"

#include <algorithm>
#include <ctime>
#include <fmt/format.h>
#include <stdexcept>
#include <string>

namespace fleet {

namespace {

using kesto_ingest::waitUntil;
using kesto_uplink::Outcome;
using support::Relay;

void expect(bool holds, const std::string& what)
{
    if (!holds)
        throw std::runtime_error("it does not hold that " + what);
}

// The devices that take part in a scenario that is about servers.
std::size_t part(const Fleet& fleet)
{
    return std::max<std::size_t>(fleet.devices.size() / 5, 10);
}

void liveAndSend(Device& device)
{
    constexpr int sessions = 3;
    device.live(sessions);
    device.sendAll();
}

std::uint16_t portOf(const std::string& address)
{
    return static_cast<std::uint16_t>(std::stoi(address.substr(address.rfind(':') + 1)));
}

std::string throughRelay(const Relay& relay, const char* scheme)
{
    return fmt::format("{}://127.0.0.1:{}", scheme, relay.port());
}

// --- Devices

void beOffline(Fleet& fleet)
{
    const support::KeptPort port; // no server listens on it
    const std::vector<std::string> away{fmt::format("nats://127.0.0.1:{}", port.number())};
    fleet.withDevices(part(fleet), [&](Device& device) {
        device.useServers(away);
        for (int day = 0; day < 3; ++day) {
            device.live(2);
            expect(device.round().outcome == Outcome::Away, "a device without servers finds none");
        }
        device.useServers(fleet.broker.addresses());
        device.sendAll();
    });
}

void sendTwice(Fleet& fleet)
{
    fleet.withDevices(part(fleet), [](Device& device) {
        device.keepCopyOfState();
        liveAndSend(device);
        device.goBackToCopyOfState(); // the stream knows the message
        device.sendAll();
        device.goBackToCopyOfState(); // now the range is longer, so the message is another
        liveAndSend(device);
    });
}

void loseStores(Fleet& fleet)
{
    std::atomic<std::uint32_t> seed = 1'000'000;
    fleet.withDevices(part(fleet), [&](Device& device) {
        device.sendAll();
        device.beginStoreAnew(++seed, fleet.edition.sessions);
        device.sendAll();
    });
}

void jumpClocks(Fleet& fleet)
{
    constexpr double day = 86'400;
    fleet.withDevices(part(fleet), [](Device& device) {
        for (const double ahead : {-20'000 * day, 0.0, 100 * day, 0.0}) { // at first a clock without a battery
            device.setClock(ahead);
            device.live(2);
            device.sendAllAndHear(); // before a pseudonym is too old
        }
    });
    expect(fleet.devices.front()->chapters().size() > 1, "a pseudonym is renewed when it is too old");
}

void forge(Fleet& fleet)
{
    Device thief(fleet.directory / "thief", forger, fleet.broker.addresses());
    thief.makeStore(7, fleet.edition.sessions);
    thief.stealFrom(*fleet.devices.front());
    const std::int64_t before = fleet.metric("kesto_ingest_batches_refused_total{reason=\"forged\"}");
    thief.sendAll(); // the stream takes it, since the name is the thief's own
    waitUntil("the metrics count a forged batch",
              [&] { return fleet.metric("kesto_ingest_batches_refused_total{reason=\"forged\"}") > before; });
    waitUntil("a dead letter has the forged batch",
              [&] { return fleet.broker.deadLetters(forger, "belongs to the credential " + victim) > 0; });

    kesto_ingest::JetStream stream({.servers = fleet.broker.addresses(), .user = forger, .password = forger});
    const auto forbidden = stream.publish("kesto.events." + victim, "x", {{"Kesto-Edition", "1"}});
    expect(!forbidden && forbidden.error().contains("Permissions Violation"),
           "the broker refuses a batch under the name of another credential");
}

void useSlowLink(Fleet& fleet)
{
    constexpr std::size_t bytesPerSecond = 6000;
    const Relay link(portOf(fleet.broker.addresses().front()), bytesPerSecond);
    fleet.withDevices(part(fleet) / 4, [&](Device& device) {
        device.useServers({throughRelay(link, "nats")});
        device.live(100);
        device.sendAll();
        device.useServers(fleet.broker.addresses());
    });
}

void killUplink(Fleet& fleet)
{
    Relay way(portOf(fleet.broker.addresses().front()));
    const auto store = fleet.directory / "killed.sqlite3";
    makeStore(store, 42, fleet.edition.sessions, static_cast<double>(std::time(nullptr)));
    fleet.furtherUplinks.push_back(std::make_unique<RealUplink>(fleet.directory / "killed", store, shared,
                                                                fmt::format("[\"{}\"]", throughRelay(way, "nats"))));
    RealUplink& uplink = *fleet.furtherUplinks.back();
    way.loseAnswersWith(R"("stream":"KESTO",)");
    uplink.start();
    waitUntil("the stream answers a batch", [&] { return way.hasLostAnAnswer(); });
    expect(uplink.sentUpTo() == 0, "the uplink knows nothing of an answer that is lost");
    uplink.kill();
    way.loseNothing();
    uplink.start();
    uplink.awaitAllSent();
    uplink.kill(); // it would lose its way, and wait for long
}

void playOnRealDevices(Fleet& fleet)
{
    for (const auto& device : fleet.realDevices)
        device->play(10);
}

// --- Servers

void killBroker(Fleet& fleet, std::size_t server)
{
    fleet.withDevicesWhile(part(fleet), liveAndSend, [&] {
        fleet.broker.server(server).end();
        playOnRealDevices(fleet);
        if (fleet.edition.brokers == 1)
            fleet.broker.server(server).start();
    });
    if (fleet.edition.brokers > 1)
        fleet.broker.server(server).start();
    fleet.broker.awaitWhole();
}

void killIngest(Fleet& fleet)
{
    fleet.endIngests();
    Relay way(fleet.database.server(1, 1).port());
    IngestCopy copy(fleet.directory / "ingest-killed", fleet.broker.configuredAddresses(),
                    fmt::format("[\"{}\"]", throughRelay(way, "http")));
    way.loseAnswersWith("");
    liveAndSend(*fleet.devices.front());
    waitUntil("the database answers", [&] { return way.hasLostAnAnswer(); });
    const StreamState stream = fleet.broker.stream();
    expect(stream.isComplete && stream.waiting > 0, "the ingest acknowledges nothing before the database answers");
    copy.kill();
    fleet.startIngests();
}

void killDatabase(Fleet& fleet)
{
    auto& server = fleet.database.server(1, 1);
    const bool isAlone = fleet.edition.replicas == 1;
    fleet.withDevicesWhile(part(fleet), liveAndSend, [&] {
        server.end();
        playOnRealDevices(fleet);
        if (isAlone) {
            waitUntil("the metrics say that the database is away",
                      [&] { return fleet.metric("kesto_ingest_database_up") == 0; });
            server.start();
        }
    });
    if (isAlone)
        return;
    waitUntil("the other replica takes all",
              [&] { return fleet.broker.stream().isComplete && fleet.broker.stream().waiting == 0; });
    server.start();
}

// --- The beginning and the end

void hearOfAll(Fleet& fleet)
{
    playOnRealDevices(fleet);
    fleet.withDevices(fleet.devices.size(), [](Device& device) {
        device.live(1);
        device.sendAllAndHear();
    });
}

} // namespace

const std::vector<Scenario>& allScenarios()
{
    static const std::vector<Scenario> all{
        {"the weeks of all devices wait in the stream, and an ingest takes them", measureIngest},
        {"a real uplink sends the weeks of one device, and then a session in each round", measureUplink},
        {"real devices play, and send", playOnRealDevices},
        {"devices are offline for a while", beOffline},
        {"batches are sent twice", sendTwice},
        {"databases of devices are begun anew", loseStores},
        {"clocks of devices jump by years, and pseudonyms are renewed", jumpClocks},
        {"a device sends under the name of another", forge},
        {"a link is slow", useSlowLink},
        {"an uplink is killed between the answer and its note of it", killUplink},
        {"an ingest is killed between the insert and the acknowledgement", killIngest},
        {"the broker that leads the stream is killed, and comes back",
         [](Fleet& fleet) { killBroker(fleet, fleet.broker.leader()); }},
        {"a broker that follows is killed, and comes back",
         [](Fleet& fleet) { killBroker(fleet, fleet.broker.follower()); }, 2},
        {"a server of the database is killed, and comes back", killDatabase},
        {"every device hears that all is stored", hearOfAll},
    };
    return all;
}

} // namespace fleet
