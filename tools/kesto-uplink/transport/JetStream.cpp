// SPDX-License-Identifier: Apache-2.0
// Statuses and codes of the library become the few kinds of answers here. A publish that the servers do not permit
// looks like one that nobody answers; only the last error of the connection tells the two apart.
#include "kesto-uplink/transport/JetStream.h"

#include "kesto-uplink/transport/ConfirmationText.h"

#include <fmt/format.h>

#include <algorithm>
#include <array>
#include <random>
#include <string_view>

namespace kesto_uplink {

namespace {

constexpr const char* edition = "1"; // of the rows in a batch
constexpr const char* confirmationStream = "KESTO_STORED";
constexpr std::size_t largestBatch = std::size_t{512} * 1024;

Answer refused(std::string sentence)
{
    return {Answer::Kind::Refused, false, std::move(sentence)};
}

Answer away(std::string sentence)
{
    return {Answer::Kind::Away, false, std::move(sentence)};
}

Answer interrupted()
{
    return {Answer::Kind::Interrupted, false, "the program was told to end"};
}

std::string lastError(natsStatus status)
{
    const char* const detail = nats_GetLastError(nullptr);
    return detail != nullptr && *detail != '\0' ? detail : natsStatus_GetText(status);
}

// Of SCHEME://HOST:PORT; an address of IPv6 stands in brackets, and is named without them.
std::string hostOf(std::string_view url)
{
    url.remove_prefix(std::min(url.size(), url.find("://") + 3));
    if (url.starts_with('['))
        return std::string(url.substr(1, url.find(']') - 1));
    return std::string(url.substr(0, url.find(':')));
}

std::string_view bytesOf(const natsMsg* message)
{
    return {natsMsg_GetData(message), static_cast<std::size_t>(natsMsg_GetDataLength(message))};
}

// What is wrong with the server's entry in the configuration; empty: nothing.
std::string wrongEntry(const std::string& url, bool isPlain)
{
    if (url.contains('@'))
        return fmt::format("the server {} has a password in it: put it into the credentials file", url);
    if (url.starts_with("tls://"))
        return {};
    if (!url.starts_with("nats://"))
        return fmt::format("the server {} must begin with tls://, or nats:// without encryption", url);
    if (!isPlain)
        return fmt::format(
            "the server {} is without encryption: write tls://, or allow it by plain = true in the credentials file",
            url);
    return {};
}

bool isFull(jsErrCode code)
{
    constexpr std::array codes{JSStreamStoreFailedErr, JSStorageResourcesExceededErr, JSMemoryResourcesExceededErr,
                               JSAccountResourcesExceededErr, JSInsufficientResourcesErr};
    return std::ranges::find(codes, code) != codes.end();
}

bool isForGood(jsErrCode code)
{
    constexpr std::array codes{JSStreamMessageExceedsMaximumErr, JSBadRequestErr, JSNotEnabledForAccountErr,
                               JSNotEnabledErr, JSStreamNotMatchErr};
    return std::ranges::find(codes, code) != codes.end();
}

} // namespace

JetStream::JetStream(Servers servers, Credentials credentials, TimeLimits limits)
    : servers_(std::move(servers)),
      credentials_(std::move(credentials)),
      limits_(limits),
      eventSubject_("kesto.events." + credentials_.name)
{
    std::ranges::shuffle(servers_.urls, std::mt19937(std::random_device()()));
}

// In milliseconds.
std::int64_t JetStream::timeFor(std::size_t bytes) const
{
    return limits_.answer.count() + static_cast<std::int64_t>(bytes) * 1000 / limits_.slowestBytesPerSecond;
}

natsStatus JetStream::sign(char** /*problem*/, unsigned char** signature, int* size, const char* nonce, void* transport)
{
    return nats_Sign(static_cast<JetStream*>(transport)->credentials_.seed.c_str(), nonce, signature, size);
}

JetStream::Options JetStream::optionsFor(const std::string& url)
{
    natsOptions* made = nullptr;
    natsStatus status = natsOptions_Create(&made);
    Options options(made);
    const auto set = [&](auto function, auto... values) {
        if (status == NATS_OK)
            status = function(options.get(), values...);
    };
    const std::int64_t limit = limits_.connect.count();
    set(natsOptions_SetURL, url.c_str());
    set(natsOptions_SetName, "kesto-uplink");
    set(natsOptions_SetTimeout, limit);
    set(natsOptions_SetWriteDeadline, timeFor(largestBatch));
    set(natsOptions_SetAllowReconnect, false);
    set(natsOptions_SetFailRequestsOnDisconnect, true);
    // Else the library prints errors, which the answers tell.
    set(natsOptions_SetErrorHandler, [](natsConnection*, natsSubscription*, natsStatus, void*) { }, nullptr);
    // Servers let a device listen only to its own answers.
    set(natsOptions_SetCustomInboxPrefix, ("_INBOX_" + credentials_.name).c_str());
    if (credentials_.seed.empty())
        set(natsOptions_SetUserInfo, credentials_.name.c_str(), credentials_.password.c_str());
    else
        set(natsOptions_SetNKey, credentials_.publicKey.c_str(), &JetStream::sign, static_cast<void*>(this));
    set(natsOptions_SetSecure, url.starts_with("tls://"));
    // Also without tls://, since a server may insist on encryption.
    set(natsOptions_SetExpectedHostname, hostOf(url).c_str());
    if (!servers_.authorities.empty())
        set(natsOptions_LoadCATrustedCertificates, servers_.authorities.c_str());
    if (status != NATS_OK)
        options.reset();
    return options;
}

Answer JetStream::connectTo(const std::string& url)
{
    if (const std::string wrong = wrongEntry(url, credentials_.isPlain); !wrong.empty())
        return refused(wrong);
    const Options options = optionsFor(url);
    if (!options)
        return refused(fmt::format("the connection to {} cannot be set up: {}; check servers and ca", url,
                                   lastError(NATS_INVALID_ARG)));
    natsConnection* made = nullptr;
    const natsStatus status = natsConnection_Connect(&made, options.get());
    Connection connection(made);
    switch (status) {
    case NATS_OK: break;
    case NATS_CONNECTION_AUTH_FAILED:
    case NATS_NOT_PERMITTED:
        return refused(fmt::format("{} does not accept {} with this {}: check the credentials file and the accounts of "
                                   "the servers",
                                   url, credentials_.name, credentials_.seed.empty() ? "password" : "key"));
    case NATS_SSL_ERROR:
        return refused(fmt::format("the certificate of {} is not trusted: {}; check ca, the name of the server and the "
                                   "clocks of both sides",
                                   url, lastError(status)));
    case NATS_SECURE_CONNECTION_WANTED:
        return refused(fmt::format("{} has no encryption: enable TLS at the server", url));
    case NATS_SECURE_CONNECTION_REQUIRED:
        return refused(fmt::format("{} takes encrypted connections only: write tls:// in servers", url));
    default: return away(fmt::format("{} is not reached: {}", url, lastError(status)));
    }
    jsOptions contextOptions;
    jsOptions_Init(&contextOptions);
    contextOptions.Wait = limits_.answer.count();
    jsCtx* madeContext = nullptr;
    const natsStatus streams = natsConnection_JetStream(&madeContext, connection.get(), &contextOptions);
    Context context(madeContext);
    if (streams != NATS_OK)
        return away(fmt::format("{} has no streams: {}", url, lastError(streams)));
    const std::scoped_lock lock(mutex_);
    if (isInterrupted_) // meanwhile
        return interrupted();
    connection_ = std::move(connection);
    context_ = std::move(context);
    server_ = url;
    return {};
}

Answer JetStream::connect()
{
    disconnect();
    std::optional<Answer> worst; // a server that refuses tells more than one that is away
    for (const std::string& url : servers_.urls) {
        if (isInterrupted())
            return interrupted();
        Answer answer = connectTo(url);
        if (answer.isStored() || answer.kind == Answer::Kind::Interrupted)
            return answer;
        if (!worst || answer.kind == Answer::Kind::Refused)
            worst = std::move(answer);
    }
    return worst.value_or(refused("the configuration names no servers"));
}

// The library's thread that receives looks a subscription up and uses it without holding it: a message that comes
// meanwhile would meet a destroyed one. So subscriptions live until the connection, and with it this thread, has ended.
void JetStream::disconnect()
{
    {
        const std::scoped_lock lock(mutex_);
        if (connection_)
            natsConnection_Close(connection_.get());
    }
    confirmations_.reset();
    context_.reset();
    const std::scoped_lock lock(mutex_);
    connection_.reset();
}

JetStream::~JetStream()
{
    JetStream::disconnect();
}

void JetStream::interrupt()
{
    const std::scoped_lock lock(mutex_);
    isInterrupted_ = true;
    if (connection_)
        natsConnection_Close(connection_.get());
}

bool JetStream::isInterrupted()
{
    const std::scoped_lock lock(mutex_);
    return isInterrupted_;
}

Answer JetStream::withoutConnection()
{
    return isInterrupted() ? interrupted() : away("there is no connection");
}

Answer JetStream::failure(natsStatus status, jsErrCode code)
{
    const char* complaint = nullptr;
    if (isInterrupted())
        return interrupted();
    if (natsConnection_GetLastError(connection_.get(), &complaint) == NATS_NOT_PERMITTED)
        return refused(fmt::format("{} refuses {}: {}; check the permissions of this name at the servers", server_,
                                   credentials_.name, complaint));
    if (status == NATS_NO_RESPONDERS) // the library then gives a code, too
        return away(
            fmt::format("no stream at {} takes {}: it is missing, or has no leader for now", server_, eventSubject_));
    if (isFull(code))
        return {Answer::Kind::Full, false,
                fmt::format("the stream is full: {}; the device keeps its events and tries again", lastError(status))};
    if (status == NATS_MAX_PAYLOAD || isForGood(code))
        return refused(fmt::format("{} refuses the batch: {}; check max_payload and the limits of the stream", server_,
                                   lastError(status)));
    if (status == NATS_TIMEOUT)
        return away(fmt::format("{} did not answer in time", server_));
    return away(fmt::format("the connection to {} is lost: {}", server_, lastError(status)));
}

Answer JetStream::put(const std::string& id, std::string_view batch)
{
    if (!connection_)
        return withoutConnection();
    natsMsg* made = nullptr;
    natsStatus status =
        natsMsg_Create(&made, eventSubject_.c_str(), nullptr, batch.data(), static_cast<int>(batch.size()));
    const Message message(made);
    if (status == NATS_OK)
        status = natsMsgHeader_Set(message.get(), "Kesto-Edition", edition);
    jsPubOptions options;
    jsPubOptions_Init(&options);
    options.MsgId = id.c_str();
    options.MaxWait = timeFor(batch.size());
    jsPubAck* received = nullptr;
    jsErrCode code = {};
    if (status == NATS_OK)
        status = js_PublishMsg(&received, context_.get(), message.get(), &options, &code);
    const std::unique_ptr<jsPubAck, Destroyer<jsPubAck_Destroy>> stored(received);
    if (status != NATS_OK)
        return failure(status, code);
    return {Answer::Kind::Stored, stored->Duplicate, {}};
}

// Nobody answers where the stream is missing.
Answer JetStream::confirmationsFailed(natsStatus status)
{
    Answer answer = failure(status, {});
    if (answer.kind == Answer::Kind::Away && (status == NATS_TIMEOUT || status == NATS_NO_RESPONDERS))
        answer.sentence = fmt::format("{} does not tell what the fleet's store has: the stream {} is missing or away",
                                      server_, confirmationStream);
    return answer;
}

Transport::Confirmed JetStream::lastConfirmation(const std::string& device)
{
    if (!connection_)
        return std::unexpected(withoutConnection());
    const std::string subject = fmt::format("kesto.stored.{}.{}", credentials_.name, device);
    // First listen, then ask: what comes in between is told twice, and nothing is missed.
    natsStatus status = NATS_OK;
    if (!confirmations_) {
        natsSubscription* made = nullptr;
        status = natsConnection_SubscribeSync(&made, connection_.get(), subject.c_str());
        confirmations_.reset(made);
    }
    jsDirectGetMsgOptions which;
    jsDirectGetMsgOptions_Init(&which);
    which.LastBySubject = subject.c_str();
    natsMsg* received = nullptr;
    if (status == NATS_OK)
        status = js_DirectGetMsg(&received, context_.get(), confirmationStream, nullptr, &which);
    const Message message(received);
    if (status == NATS_NOT_FOUND)
        return std::optional<Confirmation>();
    if (status != NATS_OK)
        return std::unexpected(confirmationsFailed(status));
    return confirmationIn(bytesOf(message.get()));
}

Transport::Confirmed JetStream::awaitConfirmation(std::chrono::milliseconds limit)
{
    if (!connection_ || !confirmations_)
        return std::unexpected(withoutConnection());
    natsMsg* received = nullptr;
    const natsStatus status = natsSubscription_NextMsg(&received, confirmations_.get(), limit.count());
    const Message message(received);
    if (status == NATS_TIMEOUT)
        return std::optional<Confirmation>();
    if (status != NATS_OK)
        return std::unexpected(confirmationsFailed(status));
    return confirmationIn(bytesOf(message.get()));
}

} // namespace kesto_uplink
