// SPDX-License-Identifier: Apache-2.0
// libnats' C interface, with an owner for each of its objects.
//
// A server that forbids something does not answer, so it looks like one that is away: only the connection's error
// handler hears why. Its last words go into every error.
#include "kesto-ingest/stream/JetStream.h"

#include "kesto-ingest/stream/Subjects.h"

#include <fmt/format.h>
#include <nats/nats.h>
#include <rapidjson/document.h>

#include <algorithm>
#include <array>
#include <cstring>
#include <mutex>
#include <stdexcept>
#include <utility>

namespace kesto_ingest {

namespace {

template <typename Object, void (*destroy)(Object*)> struct Destroyer {
    void operator()(Object* object) const noexcept { destroy(object); }
};
template <typename Object, void (*destroy)(Object*)> using Owned = std::unique_ptr<Object, Destroyer<Object, destroy>>;

using OwnedOptions = Owned<natsOptions, natsOptions_Destroy>;
using OwnedConnection = Owned<natsConnection, natsConnection_Destroy>;
using OwnedContext = Owned<jsCtx, jsCtx_Destroy>;
using OwnedSubscription = Owned<natsSubscription, natsSubscription_Destroy>;
using OwnedMessage = Owned<natsMsg, natsMsg_Destroy>;

constexpr std::int64_t nanosecondsASecond = 1'000'000'000;
constexpr std::int64_t giveBackAfter = 2 * nanosecondsASecond;
constexpr std::int64_t rememberIdsFor = 120 * nanosecondsASecond;
constexpr std::int64_t keepDeadFor = 90 * 86400 * nanosecondsASecond;
constexpr std::int64_t mostUnacknowledged = 20'000;
constexpr int largestMessage = 544 * 1024; // a batch, or a dead letter, and its headers

std::string headerOf(natsMsg* message, const char* name)
{
    const char* value = nullptr;
    return natsMsgHeader_Get(message, name, &value) == NATS_OK && value != nullptr ? value : "";
}

// What the server said of a question that it did not answer; a thread of libnats writes it.
struct LastWords {
    std::mutex mutex;
    std::string text;
};

void keepLastWords(natsConnection* connection, natsSubscription*, natsStatus status, void* words)
{
    const char* text = nullptr;
    static_cast<void>(natsConnection_GetLastError(connection, &text));
    auto& kept = *static_cast<LastWords*>(words);
    const std::scoped_lock lock(kept.mutex);
    kept.text = text != nullptr && *text != 0 ? text : natsStatus_GetText(status);
}

const char* streamOf(std::string_view subject)
{
    return subject.starts_with(ownerPrefix) ? ownerStream : subject.starts_with(deadPrefix) ? deadStream : storedStream;
}

natsStatus sendPut(natsConnection& connection, const Put& put, const std::string& answerTo)
{
    natsMsg* made = nullptr;
    natsStatus status = natsMsg_Create(&made, put.subject.c_str(), answerTo.c_str(), put.payload.data(),
                                       static_cast<int>(put.payload.size()));
    const OwnedMessage message(made);
    if (status == NATS_OK)
        status = natsMsgHeader_Set(made, "Nats-Expected-Last-Subject-Sequence", fmt::format("{}", put.after).c_str());
    return status == NATS_OK ? natsConnection_PublishMsg(&connection, made) : status;
}

std::expected<PutAnswer, std::string> readPutAnswer(natsMsg* message)
{
    if (natsMsg_IsNoResponders(message))
        return std::unexpected("no server has the stream");
    rapidjson::Document answer;
    answer.Parse(natsMsg_GetData(message), static_cast<std::size_t>(natsMsg_GetDataLength(message)));
    if (answer.IsObject() && answer.HasMember("seq") && answer["seq"].IsUint64() && !answer.HasMember("error"))
        return answer["seq"].GetUint64();
    if (!answer.IsObject() || !answer.HasMember("error") || !answer["error"].IsObject())
        return std::unexpected("its answer cannot be read");
    const auto& error = answer["error"];
    if (error.HasMember("err_code") && error["err_code"].IsInt()
        && error["err_code"].GetInt() == JSStreamWrongLastSequenceErr)
        return std::nullopt;
    const bool hasText = error.HasMember("description") && error["description"].IsString();
    return std::unexpected(hasText ? error["description"].GetString() : "it does not say why");
}

} // namespace

struct JetStream::Connection {
    [[nodiscard]] std::string reason(std::string_view what, natsStatus status)
    {
        std::string text = fmt::format("{}: {}", what, natsStatus_GetText(status));
        natsStatus last = NATS_OK; // of this thread; it may be older
        if (const char* const detail = nats_GetLastError(&last); last == status && detail != nullptr && *detail != 0)
            text += fmt::format(" ({})", detail);
        const std::scoped_lock lock(words.mutex);
        if (!words.text.empty())
            text += fmt::format("; the server said: {}", std::exchange(words.text, {}));
        return text;
    }

    // No batch is no sign of a broken connection, but the two look alike.
    [[nodiscard]] bool isUp()
    {
        const std::scoped_lock lock(words.mutex);
        return words.text.empty() && natsConnection_Status(connection.get()) == NATS_CONN_STATUS_CONNECTED;
    }

    [[nodiscard]] std::expected<void, std::string> subscribe()
    {
        jsSubOptions options;
        jsSubOptions_Init(&options);
        options.Stream = eventsStream;
        options.Consumer = consumerName;
        natsSubscription* made = nullptr;
        jsErrCode code{};
        if (const natsStatus status =
                js_PullSubscribe(&made, context.get(), nullptr, consumerName, nullptr, &options, &code);
            status != NATS_OK) {
            if (code == JSStreamNotFoundErr || code == JSConsumerNotFoundErr)
                return std::unexpected("there is no stream KESTO with a consumer named ingest: run kesto-ingest setup");
            return std::unexpected(reason("the stream cannot be read", status));
        }
        subscription.reset(made);
        return {};
    }

    // The thread of libnats that receives looks a subscription up and uses it without holding it. So one that is given
    // up still lives for a while: until the next one is given up, or the connection has ended.
    void giveUp(natsSubscription* former)
    {
        static_cast<void>(natsSubscription_Unsubscribe(former));
        givenUp.reset(former);
    }

    std::chrono::milliseconds timeLimit{};
    std::string inboxes = "_INBOX"; // the beginning of their names
    LastWords words;
    OwnedConnection connection;
    OwnedContext context;
    OwnedSubscription subscription;
    OwnedSubscription givenUp;
};

JetStream::JetStream(const JetStreamConfiguration& configuration) : connection_(std::make_unique<Connection>())
{
    connection_->timeLimit = configuration.timeLimit;
    natsOptions* made = nullptr;
    natsStatus status = natsOptions_Create(&made);
    const OwnedOptions options(made);
    std::vector<const char*> servers;
    servers.reserve(configuration.servers.size());
    for (const std::string& server : configuration.servers)
        servers.push_back(server.c_str());
    const auto set = [&status](auto function, auto... arguments) {
        if (status == NATS_OK)
            status = function(arguments...);
    };
    set(natsOptions_SetServers, made, servers.data(), static_cast<int>(servers.size()));
    set(natsOptions_SetName, made, "kesto-ingest");
    set(natsOptions_SetTimeout, made, std::int64_t{configuration.timeLimit.count()});
    set(natsOptions_SetMaxReconnect, made, -1);
    set(natsOptions_SetReconnectWait, made, std::int64_t{250});
    set(natsOptions_SetFailRequestsOnDisconnect, made, true);
    if (!configuration.user.empty()) // so that permissions can keep others from reading the answers
        connection_->inboxes += '_' + configuration.user;
    set(natsOptions_SetCustomInboxPrefix, made, connection_->inboxes.c_str());
    set(natsOptions_SetErrorHandler, made, &keepLastWords, static_cast<void*>(&connection_->words));
    if (!configuration.nkey.empty())
        set(natsOptions_SetNKeyFromSeed, made, configuration.nkey.c_str(), configuration.nkeySeedFile.c_str());
    if (!configuration.user.empty())
        set(natsOptions_SetUserInfo, made, configuration.user.c_str(), configuration.password.c_str());
    const bool asksForTLS = std::ranges::any_of(configuration.servers,
                                                [](const std::string& server) { return server.starts_with("tls://"); });
    if (asksForTLS || !configuration.certificateAuthority.empty())
        set(natsOptions_SetSecure, made, true); // for all servers
    if (!configuration.certificateAuthority.empty())
        set(natsOptions_LoadCATrustedCertificates, made, configuration.certificateAuthority.c_str());
    natsConnection* connection = nullptr;
    set(natsConnection_Connect, &connection, made);
    connection_->connection.reset(connection);
    jsOptions contextOptions;
    jsOptions_Init(&contextOptions);
    contextOptions.Wait = configuration.timeLimit.count();
    jsCtx* context = nullptr;
    set(natsConnection_JetStream, &context, connection, &contextOptions);
    connection_->context.reset(context);
    if (status != NATS_OK)
        throw std::runtime_error(connection_->reason("no connection to the stream's servers", status));
}

JetStream::~JetStream()
{
    natsConnection* const connection = connection_->connection.get();
    if (connection == nullptr)
        return;
    static_cast<void>(natsConnection_FlushTimeout(connection, 2000)); // acknowledgements
    natsConnection_Close(connection); // and with it the thread that receives
}

std::expected<void, std::string> JetStream::setUp(const StreamSizes& sizes)
{
    struct Wanted {
        const char* name;
        const char* subjects;
        void (*shape)(jsStreamConfig& stream, const StreamSizes& sizes);
    };
    constexpr std::array<Wanted, 4> streams = {
        Wanted{eventsStream, "kesto.events.>",
               [](jsStreamConfig& stream, const StreamSizes& all) {
                   stream.Retention = js_WorkQueuePolicy; // what is acknowledged takes no room
                   stream.Discard = js_DiscardNew;
                   stream.MaxBytes = all.eventsBytes;
                   stream.Duplicates = rememberIdsFor;
               }},
        Wanted{ownerStream, "kesto.owner.>",
               [](jsStreamConfig& stream, const StreamSizes&) { stream.MaxMsgsPerSubject = 1; }},
        Wanted{storedStream, "kesto.stored.>",
               [](jsStreamConfig& stream, const StreamSizes&) {
                   stream.MaxMsgsPerSubject = 1;
                   stream.AllowDirect = true;
               }},
        Wanted{deadStream, "kesto.dead.>", [](jsStreamConfig& stream, const StreamSizes& all) {
                   stream.MaxBytes = all.deadBytes;
                   stream.MaxAge = keepDeadFor;
                   stream.Duplicates = rememberIdsFor;
               }}};
    jsCtx* const context = connection_->context.get();
    for (const Wanted& wanted : streams) {
        jsStreamConfig stream;
        jsStreamConfig_Init(&stream);
        const char* subjects = wanted.subjects;
        stream.Name = wanted.name;
        stream.Subjects = &subjects;
        stream.SubjectsLen = 1;
        stream.MaxMsgSize = largestMessage;
        stream.Replicas = sizes.replicas;
        wanted.shape(stream, sizes);
        jsErrCode code{};
        jsStreamInfo* info = nullptr;
        natsStatus status = js_GetStreamInfo(&info, context, wanted.name, nullptr, &code);
        jsStreamInfo_Destroy(info);
        if (status == NATS_OK)
            status = js_UpdateStream(nullptr, context, &stream, nullptr, &code);
        else if (code == JSStreamNotFoundErr)
            status = js_AddStream(nullptr, context, &stream, nullptr, &code);
        if (status != NATS_OK)
            return std::unexpected(
                connection_->reason(fmt::format("the stream {} cannot be made", wanted.name), status));
    }
    jsConsumerConfig consumer;
    jsConsumerConfig_Init(&consumer);
    consumer.Durable = consumerName;
    consumer.AckPolicy = js_AckExplicit;
    consumer.AckWait = sizes.redeliverAfter.count() * nanosecondsASecond;
    consumer.MaxDeliver = -1;
    consumer.MaxAckPending = mostUnacknowledged;
    if (const natsStatus status = js_AddConsumer(nullptr, context, eventsStream, &consumer, nullptr, nullptr);
        status != NATS_OK)
        return std::unexpected(connection_->reason("the consumer cannot be made", status));
    return {};
}

std::expected<std::vector<Delivery>, std::string> JetStream::fetch(std::size_t most, std::chrono::milliseconds wait)
{
    if (!connection_->subscription)
        if (auto subscribed = connection_->subscribe(); !subscribed)
            return std::unexpected(subscribed.error());
    natsMsgList list{};
    jsErrCode code{};
    const natsStatus status =
        natsSubscription_Fetch(&list, connection_->subscription.get(), static_cast<int>(most), wait.count(), &code);
    if (status == NATS_TIMEOUT && connection_->isUp())
        return {};
    if (status != NATS_OK) {
        connection_->giveUp(connection_->subscription.release());
        return std::unexpected(connection_->reason("no batches come", status));
    }
    std::vector<Delivery> deliveries;
    deliveries.reserve(static_cast<std::size_t>(list.Count));
    for (int place = 0; place < list.Count; ++place) {
        natsMsg* const message = std::exchange(list.Msgs[place], nullptr);
        Delivery& delivery = deliveries.emplace_back();
        delivery.message = std::shared_ptr<void>(OwnedMessage(message).release(),
                                                 [](void* owned) { natsMsg_Destroy(static_cast<natsMsg*>(owned)); });
        delivery.subject = natsMsg_GetSubject(message);
        delivery.edition = headerOf(message, "Kesto-Edition");
        delivery.payload = {natsMsg_GetData(message), static_cast<std::size_t>(natsMsg_GetDataLength(message))};
        jsMsgMetaData* data = nullptr;
        if (natsMsg_GetMetaData(&data, message) == NATS_OK) {
            delivery.sequence = data->Sequence.Stream;
            delivery.isRepeated = data->NumDelivered > 1;
            jsMsgMetaData_Destroy(data);
        }
    }
    natsMsgList_Destroy(&list);
    return deliveries;
}

// libnats' own functions for these need the subscription by which the batch came, which may be gone by now.
void JetStream::tell(const Delivery& delivery, const std::string& word)
{
    auto* const message = static_cast<natsMsg*>(delivery.message.get());
    static_cast<void>(
        natsConnection_PublishString(connection_->connection.get(), natsMsg_GetReply(message), word.c_str()));
}

void JetStream::acknowledge(const Delivery& delivery)
{
    tell(delivery, "+ACK");
}

void JetStream::workGoesOn(const Delivery& delivery)
{
    tell(delivery, "+WPI");
}

void JetStream::giveBack(const Delivery& delivery)
{
    tell(delivery, fmt::format(R"(-NAK {{"delay":{}}})", giveBackAfter));
}

std::expected<std::optional<Entry>, std::string> JetStream::last(const std::string& subject)
{
    natsMsg* got = nullptr;
    jsErrCode code{};
    const natsStatus status =
        js_GetLastMsg(&got, connection_->context.get(), streamOf(subject), subject.c_str(), nullptr, &code);
    const OwnedMessage message(got);
    if (status == NATS_NOT_FOUND && code == JSNoMessageFoundErr)
        return std::nullopt;
    if (status != NATS_OK)
        return std::unexpected(connection_->reason(fmt::format("{} cannot be read", streamOf(subject)), status));
    return Entry{.payload = {natsMsg_GetData(got), static_cast<std::size_t>(natsMsg_GetDataLength(got))},
                 .sequence = natsMsg_GetSequence(got)};
}

std::expected<std::vector<PutAnswer>, std::string> JetStream::put(std::span<const Put> puts)
{
    constexpr std::size_t mostAtOnce = 256; // less than a subscription holds
    std::vector<PutAnswer> answers(puts.size());
    for (std::size_t first = 0; first < puts.size(); first += mostAtOnce) {
        const std::size_t count = std::min(mostAtOnce, puts.size() - first);
        if (auto done = putSome(puts.subspan(first, count), std::span(answers).subspan(first, count)); !done)
            return std::unexpected(done.error());
    }
    return answers;
}

// libnats waits for the answer to each message, or loses answers; so the answers come to an inbox of their own.
std::expected<void, std::string> JetStream::putSome(std::span<const Put> puts, std::span<PutAnswer> answers)
{
    natsInbox* madeInbox = nullptr;
    natsStatus status = natsInbox_Create(&madeInbox);
    const Owned<natsInbox, natsInbox_Destroy> inbox(madeInbox);
    constexpr std::size_t usualBeginning = std::string_view("_INBOX").size();
    const std::string beginning =
        status == NATS_OK ? connection_->inboxes + (madeInbox + usualBeginning) + '.' : std::string();
    natsSubscription* madeSubscription = nullptr;
    if (status == NATS_OK)
        status =
            natsConnection_SubscribeSync(&madeSubscription, connection_->connection.get(), (beginning + '*').c_str());
    const auto giveUp = [this](natsSubscription* subscription) { connection_->giveUp(subscription); };
    const std::unique_ptr<natsSubscription, decltype(giveUp)> subscription(madeSubscription, giveUp);
    for (std::size_t place = 0; place < puts.size() && status == NATS_OK; ++place)
        status = sendPut(*connection_->connection, puts[place], beginning + fmt::format("{}", place));
    for (std::size_t count = 0; count < puts.size() && status == NATS_OK; ++count) {
        natsMsg* got = nullptr;
        status = natsSubscription_NextMsg(&got, madeSubscription, connection_->timeLimit.count());
        const OwnedMessage message(got);
        if (status != NATS_OK)
            break;
        const std::size_t place = std::stoul(std::string(natsMsg_GetSubject(got)).substr(beginning.size()));
        const auto answer = readPutAnswer(got);
        if (!answer)
            return std::unexpected(fmt::format("{} takes nothing: {}", streamOf(puts[place].subject), answer.error()));
        answers[place] = *answer;
    }
    if (status != NATS_OK)
        return std::unexpected(
            connection_->reason(fmt::format("{} takes nothing", streamOf(puts.front().subject)), status));
    return {};
}

std::expected<Publication, std::string> JetStream::publish(const std::string& subject, std::string_view payload,
                                                           const Headers& headers)
{
    natsMsg* made = nullptr;
    natsStatus status =
        natsMsg_Create(&made, subject.c_str(), nullptr, payload.data(), static_cast<int>(payload.size()));
    const OwnedMessage message(made);
    for (const auto& [name, value] : headers)
        if (status == NATS_OK)
            status = natsMsgHeader_Set(made, name.c_str(), value.c_str());
    jsErrCode code{};
    if (status == NATS_OK)
        status = js_PublishMsg(nullptr, connection_->context.get(), made, nullptr, &code);
    if (status == NATS_MAX_PAYLOAD || code == JSStreamMessageExceedsMaximumErr)
        return Publication::TooLarge;
    if (status != NATS_OK)
        return std::unexpected(connection_->reason(fmt::format("{} cannot be published", subject), status));
    return Publication::Taken;
}

} // namespace kesto_ingest
