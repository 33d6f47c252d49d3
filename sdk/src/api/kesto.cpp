// SPDX-License-Identifier: Apache-2.0
// The room of the interface: the functions of the public headers, on top of the classes of the other rooms. It adds
// only checks of what callers pass.
//
// Implements kesto.h with the classes of the library: checks for null pointers, and lets no exception out.
#include "kesto/kesto.h"

#include "calls/Client.h"
#include "wire/MessageEncoder.h"
#include "wire/ServicePath.h"

#include <algorithm>
#include <bit>
#include <cerrno>
#include <cstring>
#include <memory>
#include <new>
#include <utility>

using foundation::Value;
using libkesto::Callback;
using libkesto::CallHead;
using std::chrono::milliseconds;

namespace {

// ---- Messages ----

// Adds the key, if it is given, and then the value by `addValue`.
template <typename AddValue> kesto_status addEntry(kesto_message* message, const char* key, AddValue addValue) noexcept
{
    if (message == nullptr)
        return KESTO_INVALID_ARGUMENT;
    if (key != nullptr)
        if (const kesto_status status = message->encoder.addKey(key); status != KESTO_OK)
            return status;
    return addValue(message->encoder);
}

kesto_status addValue(kesto_message* message, const char* key, const Value& value) noexcept
{
    return addEntry(message, key, [&](libkesto::MessageEncoder& encoder) { return encoder.addValue(value); });
}

// ---- Options ----

constexpr std::size_t defaultQueueBytes = std::size_t{256} * 1024;
constexpr std::size_t leastQueueBytes = std::size_t{4} * 1024;
constexpr std::size_t mostQueueBytes = std::size_t{64} * 1024 * 1024;
constexpr std::uint32_t defaultUnansweredLimit = 4096;
constexpr std::uint32_t defaultFirstRetry = 100;
constexpr std::uint32_t defaultLongestRetry = 10'000;

template <typename Integer> Integer orDefault(Integer given, Integer fallback) noexcept
{
    return given == 0 ? fallback : given;
}

std::string textOrEmpty(const char* text)
{
    return text == nullptr ? std::string() : std::string(text);
}

// The options of a caller, which may have been built with another version of the header, in this version's form.
kesto_options completed(const kesto_options* given) noexcept
{
    kesto_options options{};
    if (given != nullptr)
        std::memcpy(&options, given, std::min(given->size, sizeof options));
    return options;
}

libkesto::ClientSettings settings(const kesto_options& options, std::vector<std::string> paths,
                                  libkesto::StateListener listener,
                                  std::unique_ptr<libkesto::AttachableEmitter> emitter)
{
    const std::size_t queueBytes =
        std::clamp(orDefault(options.queue_bytes, defaultQueueBytes), leastQueueBytes, mostQueueBytes);
    const milliseconds firstRetry(orDefault(options.first_retry_ms, defaultFirstRetry));
    return {.paths = std::move(paths),
            .queueBytes = std::bit_ceil(queueBytes),
            .unansweredLimit = orDefault(options.unanswered_limit, defaultUnansweredLimit),
            .wakeOnSend = options.wake_on_send,
            .reconnect = options.reconnect,
            .stampsMessages = !options.without_stamps,
            .firstRetry = firstRetry,
            .longestRetry =
                std::max(firstRetry, milliseconds(orDefault(options.longest_retry_ms, defaultLongestRetry))),
            .stateChanged = std::move(listener),
            .emitter = std::move(emitter)};
}

// ---- Operations ----

CallHead callHead(kesto_operation operation, kesto_reporter reporter, libkesto::RawCallback callback) noexcept
{
    CallHead head{.operation = operation};
    head.reporter = reporter;
    head.callback = callback;
    return head;
}

kesto_status refuse(const CallHead& head, kesto_status status) noexcept
{
    const Callback released(head.callback);
    return status;
}

kesto_status call(kesto_client* client, const CallHead& head) noexcept
{
    return client == nullptr ? refuse(head, KESTO_CLOSED) : client->call(head);
}

} // namespace

const char* kesto_error_text(kesto_status status)
{
    switch (status) {
    case KESTO_OK: return "all is well";
    case KESTO_INVALID_ARGUMENT: return "an argument is invalid";
    case KESTO_OUT_OF_MEMORY: return "memory is exhausted";
    case KESTO_SYSTEM_ERROR: return "the system refused a descriptor, a thread or a file";
    case KESTO_QUEUE_FULL: return "the queue is full";
    case KESTO_NOT_CONNECTED: return "the client is not connected to the service";
    case KESTO_CLOSED: return "the client is closed";
    case KESTO_TIMED_OUT: return "the time is over";
    case KESTO_WRONG_THREAD: return "a callback of a client cannot wait for that client";
    case KESTO_INVALID_UTF8: return "text is not valid UTF-8";
    case KESTO_TOO_LARGE: return "the message is too large";
    case KESTO_TOO_DEEP: return "the message is nested too deep";
    case KESTO_MISNESTED: return "keys, values, beginnings and ends of the message do not match";
    case KESTO_CONNECTION_LOST: return "the connection to the service was lost";
    case KESTO_CONNECT_FAILED: return "the service cannot be reached";
    case KESTO_PROTOCOL_VIOLATION: return "the peer does not speak the service's protocol";
    case KESTO_SESSION_ENDED: return "the session was destroyed before its start was answered";
    }
    return "unknown status";
}

const char* kesto_version(void)
{
    return KESTO_VERSION;
}

kesto_message* kesto_message_create(void)
{
    return new (std::nothrow) kesto_message;
}

void kesto_message_free(kesto_message* message)
{
    delete message;
}

kesto_status kesto_message_reserve(kesto_message* message, size_t bytes)
{
    return message == nullptr ? KESTO_INVALID_ARGUMENT : message->encoder.reserve(bytes);
}

void kesto_message_clear(kesto_message* message)
{
    if (message != nullptr)
        message->encoder.clear();
}

kesto_status kesto_message_add_null(kesto_message* message, const char* key)
{
    return addValue(message, key, Value());
}

kesto_status kesto_message_add_bool(kesto_message* message, const char* key, bool value)
{
    return addValue(message, key, value);
}

kesto_status kesto_message_add_int64(kesto_message* message, const char* key, int64_t value)
{
    return addValue(message, key, value);
}

kesto_status kesto_message_add_uint64(kesto_message* message, const char* key, uint64_t value)
{
    return addValue(message, key, value);
}

kesto_status kesto_message_add_float(kesto_message* message, const char* key, float value)
{
    return addValue(message, key, value);
}

kesto_status kesto_message_add_double(kesto_message* message, const char* key, double value)
{
    return addValue(message, key, value);
}

kesto_status kesto_message_add_string(kesto_message* message, const char* key, const char* text)
{
    return kesto_message_add_text(message, key, text, text == nullptr ? 0 : std::strlen(text));
}

kesto_status kesto_message_add_text(kesto_message* message, const char* key, const char* text, size_t length)
{
    return addEntry(message, key, [&](libkesto::MessageEncoder& encoder) {
        if (text == nullptr && length > 0)
            return encoder.fail(KESTO_INVALID_ARGUMENT);
        return encoder.addText({text, length});
    });
}

kesto_status kesto_message_begin_array(kesto_message* message, const char* key)
{
    return addEntry(message, key, [](libkesto::MessageEncoder& encoder) { return encoder.beginArray(); });
}

kesto_status kesto_message_begin_dictionary(kesto_message* message, const char* key)
{
    return addEntry(message, key, [](libkesto::MessageEncoder& encoder) { return encoder.beginDictionary(); });
}

kesto_status kesto_message_end(kesto_message* message)
{
    return message == nullptr ? KESTO_INVALID_ARGUMENT : message->encoder.end();
}

kesto_status kesto_message_key(kesto_message* message, const char* key, size_t length)
{
    if (message == nullptr)
        return KESTO_INVALID_ARGUMENT;
    if (key == nullptr && length > 0)
        return message->encoder.fail(KESTO_INVALID_ARGUMENT);
    return message->encoder.addKey({key, length});
}

kesto_status kesto_message_status(const kesto_message* message)
{
    return message == nullptr ? KESTO_OUT_OF_MEMORY : message->encoder.status();
}

size_t kesto_message_size(const kesto_message* message)
{
    return message == nullptr ? 0 : message->encoder.entries().size();
}

kesto_status kesto_client_open(const kesto_options* given, kesto_client** client)
try {
    const kesto_options options = completed(given);
    libkesto::StateListener listener(options.state_changed, options.state_user, options.state_release);
    if (client == nullptr)
        return KESTO_INVALID_ARGUMENT;
    *client = nullptr;
    if (given != nullptr && given->size == 0)
        return KESTO_INVALID_ARGUMENT;
    auto paths = libkesto::servicePaths(textOrEmpty(options.socket_path), textOrEmpty(options.service_name));
    if (!paths)
        return paths.error();
    auto emitter = options.trace ? libkesto::AttachableEmitter::create() : nullptr;
    if (options.trace && emitter == nullptr)
        return KESTO_SYSTEM_ERROR;
    auto made = kesto_client::create(settings(options, *std::move(paths), std::move(listener), std::move(emitter)));
    if (made == nullptr)
        return KESTO_SYSTEM_ERROR;
    *client = made.get(); // before the first callback, which may use it
    if (!made->start()) {
        *client = nullptr;
        return KESTO_SYSTEM_ERROR;
    }
    static_cast<void>(made.release());
    return KESTO_OK;
} catch (const std::bad_alloc&) {
    return KESTO_OUT_OF_MEMORY;
}

kesto_status kesto_client_close(kesto_client* client, uint32_t timeout_ms)
{
    return client == nullptr ? KESTO_OK : client->close(milliseconds(timeout_ms));
}

void kesto_client_free(kesto_client* client)
{
    if (client != nullptr)
        kesto_client::free(client);
}

kesto_status kesto_client_flush(kesto_client* client, uint32_t timeout_ms)
{
    return client == nullptr ? KESTO_CLOSED : client->flush(milliseconds(timeout_ms));
}

kesto_state kesto_client_state(const kesto_client* client)
{
    return client == nullptr ? KESTO_STATE_CLOSED : client->state();
}

kesto_status kesto_client_create_session(kesto_client* client, kesto_reporter reporter, kesto_answer_callback callback,
                                         void* user, kesto_release_callback release)
{
    return call(client, callHead(KESTO_OPERATION_CREATE_SESSION, reporter, {callback, user, release}));
}

kesto_status kesto_client_set_service_type(kesto_client* client, kesto_service_type type, kesto_reporter reporter,
                                           kesto_answer_callback callback, void* user, kesto_release_callback release)
{
    CallHead head = callHead(KESTO_OPERATION_SET_SERVICE_TYPE, reporter, {callback, user, release});
    head.type = type;
    return call(client, head);
}

kesto_status kesto_client_get_service_type(kesto_client* client, kesto_reporter reporter,
                                           kesto_answer_callback callback, void* user, kesto_release_callback release)
{
    return call(client, callHead(KESTO_OPERATION_GET_SERVICE_TYPE, reporter, {callback, user, release}));
}

kesto_status kesto_client_set_configuration(kesto_client* client, const kesto_message* configuration,
                                            kesto_reporter reporter, kesto_answer_callback callback, void* user,
                                            kesto_release_callback release)
{
    const CallHead head = callHead(KESTO_OPERATION_SET_CONFIGURATION, reporter, {callback, user, release});
    if (client == nullptr)
        return refuse(head, KESTO_CLOSED);
    if (configuration == nullptr)
        return refuse(head, KESTO_INVALID_ARGUMENT);
    return client->setConfiguration(configuration->encoder, head);
}

kesto_status kesto_client_start_session(kesto_client* client, kesto_reporter reporter, kesto_answer_callback callback,
                                        void* user, kesto_release_callback release)
{
    return call(client, callHead(KESTO_OPERATION_START_SESSION, reporter, {callback, user, release}));
}

kesto_status kesto_client_send(kesto_client* client, const kesto_message* message, kesto_category category,
                               kesto_event_type type, const kesto_reporter* reporters, size_t reporter_count,
                               kesto_answer_callback callback, void* user, kesto_release_callback release)
{
    CallHead head = callHead(KESTO_OPERATION_SEND, 0, {callback, user, release});
    if (client == nullptr)
        return refuse(head, KESTO_CLOSED);
    if (message == nullptr || (reporters == nullptr && reporter_count > 0)) {
        client->countUnusable();
        return refuse(head, KESTO_INVALID_ARGUMENT);
    }
    head.category = category;
    head.type = type;
    head.hasReporters = reporters != nullptr;
    return client->send(message->encoder, head, {reporters, reporter_count});
}

kesto_status kesto_client_stop_session(kesto_client* client, kesto_reporter reporter, kesto_answer_callback callback,
                                       void* user, kesto_release_callback release)
{
    return call(client, callHead(KESTO_OPERATION_STOP_SESSION, reporter, {callback, user, release}));
}

kesto_status kesto_client_destroy_session(kesto_client* client, kesto_reporter reporter, kesto_answer_callback callback,
                                          void* user, kesto_release_callback release)
{
    return call(client, callHead(KESTO_OPERATION_DESTROY_SESSION, reporter, {callback, user, release}));
}

kesto_status kesto_client_validate(kesto_client* client, kesto_reporter reporter, kesto_answer_callback callback,
                                   void* user, kesto_release_callback release)
{
    return call(client, callHead(KESTO_OPERATION_VALIDATE, reporter, {callback, user, release}));
}

kesto_status kesto_client_get_all_reporters(kesto_client* client, kesto_answer_callback callback, void* user,
                                            kesto_release_callback release)
{
    return call(client, callHead(KESTO_OPERATION_GET_ALL_REPORTERS, 0, {callback, user, release}));
}

kesto_status kesto_client_kill_service(kesto_client* client, kesto_answer_callback callback, void* user,
                                       kesto_release_callback release)
{
    return call(client, callHead(KESTO_OPERATION_KILL_SERVICE, 0, {callback, user, release}));
}

void kesto_client_statistics(const kesto_client* client, kesto_statistics* statistics, size_t size)
{
    if (statistics == nullptr)
        return;
    const kesto_statistics current = client == nullptr ? kesto_statistics{} : client->statistics();
    std::memset(statistics, 0, size);
    std::memcpy(statistics, &current, std::min(size, sizeof current));
}
