// SPDX-License-Identifier: Apache-2.0
// Each question has a connection of its own, to any server that answers: others may be dead.
#include "fleet/Broker.h"

#include "support/TemporaryDirectory.h"

#include <fmt/format.h>
#include <fmt/ranges.h>

#include <algorithm>
#include <stdexcept>

namespace fleet {

namespace {

using kesto_ingest::waitUntil;

constexpr std::int64_t patience = 30'000; // milliseconds

// The rights of docs/fleet-protocol.md.
std::string rightsOf(const std::string& name)
{
    return fmt::format("{{ user: {0}, password: {0}, permissions: {{\n"
                       "  publish: [ \"kesto.events.{0}\", \"$JS.API.DIRECT.GET.KESTO_STORED.kesto.stored.{0}.>\" ]\n"
                       "  subscribe: [ \"_INBOX_{0}.>\", \"kesto.stored.{0}.>\" ] }} }}\n",
                       name);
}

constexpr const char* rightsOfIngest = R"({ user: ingest, password: ingest, permissions: {
  publish: [ "$JS.API.CONSUMER.INFO.KESTO.ingest", "$JS.API.CONSUMER.MSG.NEXT.KESTO.ingest"
             "$JS.API.STREAM.MSG.GET.KESTO_OWNER", "$JS.API.STREAM.MSG.GET.KESTO_STORED", "$JS.ACK.KESTO.ingest.>"
             "kesto.owner.>", "kesto.stored.>", "kesto.dead.>" ]
  subscribe: [ "_INBOX_ingest.>" ] } }
)";

std::string accountsWith(const std::vector<std::string>& credentials)
{
    std::string users = fmt::format("{{ user: admin, password: admin }}\n{}", rightsOfIngest);
    for (const std::string& name : credentials)
        users += rightsOf(name);
    return fmt::format("accounts {{ FLEET {{ jetstream: enabled, users: [\n{}] }} }}\n", users);
}

void check(natsStatus status, const char* what)
{
    if (status != NATS_OK)
        throw std::runtime_error(fmt::format("nats: {}: {}", what, natsStatus_GetText(status)));
}

StreamState stateIn(const jsStreamInfo& facts)
{
    StreamState state{.waiting = 0, .bytes = facts.State.Bytes, .leader = {}, .isComplete = true};
    if (facts.Cluster == nullptr)
        return state;
    state.leader = facts.Cluster->Leader == nullptr ? "" : facts.Cluster->Leader;
    for (int number = 0; number < facts.Cluster->ReplicasLen; ++number) {
        const jsPeerInfo& peer = *facts.Cluster->Replicas[number];
        state.isComplete = state.isComplete && peer.Current && !peer.Offline;
    }
    state.isComplete = state.isComplete && !state.leader.empty();
    return state;
}

// The server that leads the consumer may lag behind the one that leads the stream: it then counts too few.
std::uint64_t undelivered(const jsStreamInfo& stream, const jsConsumerInfo& consumer)
{
    const std::uint64_t last = stream.State.LastSeq;
    return std::max(consumer.NumPending, last - std::min(last, consumer.Delivered.Stream));
}

} // namespace

Broker::Broker(const std::filesystem::path& directory, int servers, const std::vector<std::string>& credentials)
    : accounts_(directory / "accounts.conf"),
      clusterPorts_(static_cast<std::size_t>(servers))
{
    std::filesystem::create_directories(directory);
    support::writeFile(accounts_, accountsWith(credentials));
    std::vector<std::uint16_t> routes;
    for (const support::KeptPort& port : clusterPorts_)
        routes.push_back(port.number());
    for (std::size_t number = 0; number < clusterPorts_.size(); ++number)
        servers_.push_back(std::make_unique<kesto_ingest::NatsServer>(
            directory / fmt::format("nats-{}", number + 1), accounts_, servers > 1 ? routes[number] : 0, routes));
}

std::vector<std::string> Broker::addresses() const
{
    std::vector<std::string> addresses;
    for (const auto& server : servers_)
        addresses.push_back(server->address());
    return addresses;
}

std::string Broker::configuredAddresses() const
{
    return fmt::format("[\"{}\"]", fmt::join(addresses(), "\", \""));
}

void Broker::asAdministrator(const std::function<void(jsCtx*)>& work)
{
    const std::vector<std::string> urls = addresses();
    std::vector<const char*> texts;
    for (const std::string& url : urls)
        texts.push_back(url.c_str());
    natsOptions* options = nullptr;
    check(natsOptions_Create(&options), "options");
    natsOptions_SetServers(options, texts.data(), static_cast<int>(texts.size()));
    natsOptions_SetTimeout(options, patience);
    natsOptions_SetUserInfo(options, "admin", "admin");
    natsConnection* connection = nullptr;
    const natsStatus connected = natsConnection_Connect(&connection, options);
    natsOptions_Destroy(options);
    check(connected, "the administrator");
    const std::unique_ptr<natsConnection, decltype(&natsConnection_Destroy)> owned(connection, natsConnection_Destroy);
    jsOptions contextOptions;
    jsOptions_Init(&contextOptions);
    contextOptions.Wait = patience;
    jsCtx* context = nullptr;
    check(natsConnection_JetStream(&context, connection, &contextOptions), "streams");
    const std::unique_ptr<jsCtx, decltype(&jsCtx_Destroy)> ownedContext(context, jsCtx_Destroy);
    work(context);
}

StreamState Broker::stream()
{
    StreamState state{.waiting = UINT64_MAX}; // while no server tells
    asAdministrator([&state](jsCtx* context) {
        jsStreamInfo* facts = nullptr;
        jsConsumerInfo* consumer = nullptr;
        if (js_GetStreamInfo(&facts, context, "KESTO", nullptr, nullptr) == NATS_OK
            && js_GetConsumerInfo(&consumer, context, "KESTO", "ingest", nullptr, nullptr) == NATS_OK) {
            state = stateIn(*facts);
            state.waiting = undelivered(*facts, *consumer) + static_cast<std::uint64_t>(consumer->NumAckPending);
        }
        jsConsumerInfo_Destroy(consumer);
        jsStreamInfo_Destroy(facts);
    });
    return state;
}

void Broker::awaitWhole()
{
    waitUntil("all servers of the broker have all", [this] { return stream().isComplete; });
}

std::size_t Broker::leader()
{
    if (servers_.size() == 1)
        return 0;
    std::string name;
    waitUntil("the stream has a leader", [&] { return !(name = stream().leader).empty(); });
    const auto found = std::ranges::find_if(servers_, [&](const auto& server) { return server->name() == name; });
    if (found == servers_.end())
        throw std::runtime_error("no server of the broker is called " + name);
    return static_cast<std::size_t>(found - servers_.begin());
}

std::size_t Broker::follower()
{
    return (leader() + 1) % servers_.size();
}

std::size_t Broker::deadLetters(const std::string& credential, const std::string& word)
{
    std::size_t count = 0;
    asAdministrator([&](jsCtx* context) {
        jsStreamInfo* facts = nullptr;
        check(js_GetStreamInfo(&facts, context, "KESTO_DEAD", nullptr, nullptr), "the stream of dead letters");
        const std::uint64_t last = facts->State.LastSeq;
        jsStreamInfo_Destroy(facts);
        for (std::uint64_t number = 1; number <= last; ++number) {
            natsMsg* message = nullptr;
            if (js_GetMsg(&message, context, "KESTO_DEAD", number, nullptr, nullptr) != NATS_OK)
                continue;
            const char* reason = "";
            natsMsgHeader_Get(message, "Kesto-Reason", &reason);
            if (natsMsg_GetSubject(message) == "kesto.dead." + credential && std::string_view(reason).contains(word))
                ++count;
            natsMsg_Destroy(message);
        }
    });
    return count;
}

} // namespace fleet
