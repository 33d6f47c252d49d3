// SPDX-License-Identifier: Apache-2.0
// libkesto for C++: reports a program's use of audio to the Kesto reporting service (kestod).
//
//     kesto::Client client;
//     if (client.open() != kesto::Status::Ok)
//         return;
//     client.createSession(42);
//     client.setServiceType(kesto::ServiceType::LongFormAudio, 42);
//     client.startSession(42);
//
//     kesto::Message message;
//     message.add("session_output_running", true).add("PomoSessionVolume", 0.8);
//     client.send(message, kesto::Category::Playback, kesto::EventType::Start, 42);
//
// What a program plays or records is reported with less: see playback.hpp.
//
// This is a thin layer over kesto.h, all of it inline: the library's interface is C, so that one
// binary serves every compiler and every standard library. The rules in kesto.h about threads, real time, forks and
// lost connections hold here, too. C++17 or later; no exceptions and no run-time types are needed. A callback that
// throws ends the program.
#ifndef KESTO_KESTO_HPP
#define KESTO_KESTO_HPP

#include "kesto.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <initializer_list>
#include <limits>
#include <memory>
#include <new>
#include <string>
#include <string_view>
#include <type_traits>
#include <utility>
#include <vector>

namespace kesto {

// ---- Vocabulary: the names and numbers of kesto.h, with types ----

enum class Status : int {
    Ok = KESTO_OK,
    InvalidArgument = KESTO_INVALID_ARGUMENT,
    OutOfMemory = KESTO_OUT_OF_MEMORY,
    SystemError = KESTO_SYSTEM_ERROR,
    QueueFull = KESTO_QUEUE_FULL,
    NotConnected = KESTO_NOT_CONNECTED,
    Closed = KESTO_CLOSED,
    TimedOut = KESTO_TIMED_OUT,
    WrongThread = KESTO_WRONG_THREAD,
    InvalidUtf8 = KESTO_INVALID_UTF8,
    TooLarge = KESTO_TOO_LARGE,
    TooDeep = KESTO_TOO_DEEP,
    Misnested = KESTO_MISNESTED,
    ConnectionLost = KESTO_CONNECTION_LOST,
    ConnectFailed = KESTO_CONNECT_FAILED,
    ProtocolViolation = KESTO_PROTOCOL_VIOLATION,
    SessionEnded = KESTO_SESSION_ENDED
};

// The text of the status, such as "the queue is full".
inline const char* errorText(Status status) noexcept
{
    return kesto_error_text(static_cast<kesto_status>(status));
}

// Identifies a session; it should be unique in the whole system, so choose a random number. 0 stands for no session.
using ReporterID = kesto_reporter;

enum class ServiceType : std::uint16_t {
    Generic = KESTO_SERVICE_GENERIC,
    Merla = KESTO_SERVICE_MERLA,
    Telephony = KESTO_SERVICE_TELEPHONY,
    Haptics = KESTO_SERVICE_HAPTICS,
    Alarms = KESTO_SERVICE_ALARMS,
    Standalone = KESTO_SERVICE_STANDALONE,
    SoundAutoConfig = KESTO_SERVICE_SOUND_AUTO_CONFIG,
    LongFormAudio = KESTO_SERVICE_LONG_FORM_AUDIO,
    NonLongFormAudio = KESTO_SERVICE_NON_LONG_FORM_AUDIO,
    AudioDeviceUsage = KESTO_SERVICE_AUDIO_DEVICE_USAGE,
    Alerts = KESTO_SERVICE_ALERTS,
    Test = KESTO_SERVICE_TEST,
    APIUsage = KESTO_SERVICE_API_USAGE,
    SystemSounds = KESTO_SERVICE_SYSTEM_SOUNDS,
    Unknown = KESTO_SERVICE_UNKNOWN
};

enum class Category : std::uint32_t {
    Generic = KESTO_CATEGORY_GENERIC,
    Record = KESTO_CATEGORY_RECORD,
    Input = KESTO_CATEGORY_INPUT,
    Playback = KESTO_CATEGORY_PLAYBACK,
    Output = KESTO_CATEGORY_OUTPUT,
    PlaybackAndRecord = KESTO_CATEGORY_PLAYBACK_AND_RECORD,
    IO = KESTO_CATEGORY_IO,
    Setup = KESTO_CATEGORY_SETUP,
    ClientRequest = KESTO_CATEGORY_CLIENT_REQUEST,
    RouteChange = KESTO_CATEGORY_ROUTE_CHANGE,
    Error = KESTO_CATEGORY_ERROR,
    Cavlet = KESTO_CATEGORY_CAVLET,
    Performance = KESTO_CATEGORY_PERFORMANCE,
    Volume = KESTO_CATEGORY_VOLUME,
    HearingHealth = KESTO_CATEGORY_HEARING_HEALTH
};

enum class Group : std::uint32_t {
    MIDI = KESTO_GROUP_MIDI,
    Session = KESTO_GROUP_SESSION,
    DSP = KESTO_GROUP_DSP,
    HAL = KESTO_GROUP_HAL,
    Routing = KESTO_GROUP_ROUTING,
    Toolbox = KESTO_GROUP_TOOLBOX
};

// A category within a group: Group::DSP | Category::Playback.
constexpr Category operator|(Group group, Category category) noexcept
{
    return static_cast<Category>(static_cast<std::uint32_t>(group) | static_cast<std::uint32_t>(category));
}

enum class EventType : std::uint16_t {
    Start = KESTO_EVENT_START,
    Stop = KESTO_EVENT_STOP,
    Activate = KESTO_EVENT_ACTIVATE,
    Deactivate = KESTO_EVENT_DEACTIVATE,
    Setup = KESTO_EVENT_SETUP,
    Error = KESTO_EVENT_ERROR,
    IssueDetector = KESTO_EVENT_ISSUE_DETECTOR,
    Gimbo = KESTO_EVENT_GIMBO,
    AudioUnitUsage = KESTO_EVENT_AUDIO_UNIT_USAGE,
    MIDIDriver = KESTO_EVENT_MIDI_DRIVER,
    Summary = KESTO_EVENT_SUMMARY,
    HeadphoneAudioExposure = KESTO_EVENT_HEADPHONE_AUDIO_EXPOSURE,
    AudioExposure = KESTO_EVENT_AUDIO_EXPOSURE,
    ListeningEnhancement = KESTO_EVENT_LISTENING_ENHANCEMENT,
    Tivra = KESTO_EVENT_TIVRA,
    Simple = KESTO_EVENT_SIMPLE,
    Histogram = KESTO_EVENT_HISTOGRAM,
    State = KESTO_EVENT_STATE,
    Unknown = KESTO_EVENT_UNKNOWN
};

enum class Operation : int {
    CreateSession = KESTO_OPERATION_CREATE_SESSION,
    SetServiceType = KESTO_OPERATION_SET_SERVICE_TYPE,
    GetServiceType = KESTO_OPERATION_GET_SERVICE_TYPE,
    SetConfiguration = KESTO_OPERATION_SET_CONFIGURATION,
    StartSession = KESTO_OPERATION_START_SESSION,
    Send = KESTO_OPERATION_SEND,
    StopSession = KESTO_OPERATION_STOP_SESSION,
    DestroySession = KESTO_OPERATION_DESTROY_SESSION,
    Validate = KESTO_OPERATION_VALIDATE,
    GetAllReporters = KESTO_OPERATION_GET_ALL_REPORTERS,
    KillService = KESTO_OPERATION_KILL_SERVICE
};

enum class State : int {
    Connecting = KESTO_STATE_CONNECTING, // calls are taken and wait for the connection
    Connected = KESTO_STATE_CONNECTED,
    Disconnected = KESTO_STATE_DISCONNECTED, // calls are refused until the next attempt, if any
    Closed = KESTO_STATE_CLOSED // for good
};

using Statistics = kesto_statistics;

// ---- Messages ----

namespace detail {
template <typename T, typename = void> struct IsRange : std::false_type { };
template <typename T>
struct IsRange<T, std::void_t<decltype(std::declval<const T&>().begin()), decltype(std::declval<const T&>().end())>>
    : std::true_type { };
} // namespace detail

// A dictionary of keys and values, encoded while it is built; a message or a configuration. One thread at a time.
//
// A failure (text that is not UTF-8, too large, too deep, a forgotten `end`, no memory) stays until `clear`: `status`
// and sending the message return it. If a program keeps and clears a message instead of making a new one, the message
// does not allocate after it has held its largest content once. A message that was moved from can only be assigned to
// or destroyed.
class Message {
public:
    Message() noexcept : message_(kesto_message_create()) { }

    // Adds an entry: nullptr, a bool, an integer, a float, a double, text, or a vector, an array or a list of
    // these in braces, which becomes an array.
    template <typename T> Message& add(std::string_view key, const T& value)
    {
        kesto_message_key(get(), key.data(), key.size());
        return append(value);
    }
    template <typename T> Message& add(std::string_view key, std::initializer_list<T> values)
    {
        kesto_message_key(get(), key.data(), key.size());
        return append(values);
    }

    // Adds an element to the innermost open array.
    template <typename T> Message& append(const T& value)
    {
        if constexpr (std::is_same_v<T, std::nullptr_t>)
            kesto_message_add_null(get(), nullptr);
        else if constexpr (std::is_same_v<T, bool>)
            kesto_message_add_bool(get(), nullptr, value);
        else if constexpr (std::is_integral_v<T> && std::is_signed_v<T>)
            kesto_message_add_int64(get(), nullptr, value);
        else if constexpr (std::is_integral_v<T>)
            kesto_message_add_uint64(get(), nullptr, value);
        else if constexpr (std::is_same_v<T, float>)
            kesto_message_add_float(get(), nullptr, value);
        else if constexpr (std::is_same_v<T, double>)
            kesto_message_add_double(get(), nullptr, value);
        else if constexpr (std::is_convertible_v<const T&, std::string_view>)
            appendText(value);
        else if constexpr (detail::IsRange<T>::value)
            appendAll(value);
        else
            static_assert(std::is_void_v<T>, "a value is nullptr, bool, an integer, a float, a double, text or a list");
        return *this;
    }

    // The next additions go into the array or dictionary, until the matching `end`. Without a key it becomes an element
    // of the innermost open array.
    Message& beginArray(std::string_view key) noexcept
    {
        kesto_message_key(get(), key.data(), key.size());
        return beginArray();
    }
    Message& beginDictionary(std::string_view key) noexcept
    {
        kesto_message_key(get(), key.data(), key.size());
        return beginDictionary();
    }
    Message& beginArray() noexcept
    {
        kesto_message_begin_array(get(), nullptr);
        return *this;
    }
    Message& beginDictionary() noexcept
    {
        kesto_message_begin_dictionary(get(), nullptr);
        return *this;
    }
    Message& end() noexcept
    {
        kesto_message_end(get());
        return *this;
    }

    // Empties the message and forgets its failure. The memory is kept.
    Message& clear() noexcept
    {
        kesto_message_clear(get());
        return *this;
    }

    // Makes room for so many encoded bytes; an entry takes about 10 bytes and its key and value.
    Status reserve(std::size_t bytes) noexcept { return Status(kesto_message_reserve(get(), bytes)); }

    // The first failure, or Misnested while an array or a dictionary has not ended, or Ok.
    [[nodiscard]] Status status() const noexcept { return Status(kesto_message_status(get())); }
    // The encoded size so far, in bytes.
    [[nodiscard]] std::size_t size() const noexcept { return kesto_message_size(get()); }

    [[nodiscard]] kesto_message* get() const noexcept { return message_.get(); }

private:
    void appendText(std::string_view text) noexcept
    {
        kesto_message_add_text(get(), nullptr, text.data(), text.size());
    }
    template <typename Range> void appendAll(const Range& values)
    {
        beginArray();
        for (const auto& value : values)
            append(static_cast<const std::decay_t<decltype(value)>&>(value));
        end();
    }

    struct Free {
        void operator()(kesto_message* message) const noexcept { kesto_message_free(message); }
    };
    std::unique_ptr<kesto_message, Free> message_;
};

// ---- Answers ----

// A view of a list of reporters, for arguments and answers: it does not own the list.
class Reporters {
public:
    using value_type = ReporterID;
    using const_iterator = const ReporterID*;

    Reporters() noexcept : Reporters(nullptr, 0) { } // an empty list
    Reporters(const ReporterID& one) noexcept : reporters_(&one), count_(1) { }
    Reporters(std::initializer_list<ReporterID> reporters) noexcept : Reporters(reporters.begin(), reporters.size()) { }
    Reporters(const std::vector<ReporterID>& reporters) noexcept : Reporters(reporters.data(), reporters.size()) { }
    Reporters(const ReporterID* reporters, std::size_t count) noexcept
        : reporters_(count == 0 ? &none : reporters),
          count_(count)
    {
    }

    // As the receivers of a message: all started sessions of all clients.
    static Reporters allStarted() noexcept
    {
        Reporters all;
        all.reporters_ = nullptr;
        return all;
    }

    [[nodiscard]] const ReporterID* data() const noexcept { return reporters_; }
    [[nodiscard]] std::size_t size() const noexcept { return count_; }
    [[nodiscard]] const ReporterID* begin() const noexcept { return reporters_; }
    [[nodiscard]] const ReporterID* end() const noexcept { return reporters_ + count_; }

private:
    static constexpr ReporterID none = 0; // an empty list is not a null list
    const ReporterID* reporters_;
    std::size_t count_;
};

// One answer to one call, valid during the callback.
class Answer {
public:
    explicit Answer(const kesto_answer& answer) noexcept : answer_(answer) { }

    [[nodiscard]] std::uint64_t call() const noexcept { return answer_.call; } // its number on the connection
    [[nodiscard]] Operation operation() const noexcept { return Operation(answer_.operation); }
    // The call's reporter; 0 for calls without one, and for `send`.
    [[nodiscard]] ReporterID reporter() const noexcept { return answer_.reporter; }

    // Whether the call succeeded; only then the results below are valid.
    [[nodiscard]] bool ok() const noexcept { return answer_.error_domain == nullptr; }
    // Empty on success.
    [[nodiscard]] std::string_view errorDomain() const noexcept
    {
        return ok() ? std::string_view() : std::string_view(answer_.error_domain);
    }
    [[nodiscard]] std::int64_t errorCode() const noexcept { return answer_.error_code; }
    // The library's own error (ConnectionLost, Closed, SessionEnded); Ok for answers of the service.
    [[nodiscard]] Status status() const noexcept
    {
        return errorDomain() == KESTO_ERROR_DOMAIN ? Status(answer_.error_code) : Status::Ok;
    }

    [[nodiscard]] bool success() const noexcept { return answer_.success; }
    // For getServiceType and validate. Unknown: the session does not exist.
    [[nodiscard]] ServiceType serviceType() const noexcept { return ServiceType(answer_.service_type); }
    // For validate. 0: the session does not exist.
    [[nodiscard]] ReporterID validReporter() const noexcept { return answer_.valid_reporter; }
    // For getAllReporters.
    [[nodiscard]] Reporters reporters() const noexcept { return {answer_.reporters, answer_.reporter_count}; }

private:
    const kesto_answer& answer_;
};

// Called on the client's thread for every answer of a call, and destroyed when no more can come.
using AnswerCallback = std::function<void(const Answer& answer)>;

// ---- Clients ----

// A change of a client's state.
struct StateChange {
    State state;
    Status reason; // why it is disconnected: ConnectFailed, ConnectionLost or ProtocolViolation; else Ok
    int systemError; // `errno` of that reason if the system gave one, else 0
    bool willRetry; // whether another attempt will follow
    std::chrono::milliseconds retryAfter; // the time until that attempt
    std::string_view socketPath; // of the connection, or of the last attempt
};

// Called on the client's thread for every change of state after the first Connecting.
using StateCallback = std::function<void(const StateChange& change)>;

// Options of a client; kesto.h describes each.
struct Options {
    std::string socketPath; // empty: the service's default
    std::string serviceName; // empty: "com.quarn.kesto.reporting"
    std::size_t queueBytes = 0; // 0: 256 KiB
    std::uint32_t unansweredLimit = 0; // 0: 4096
    bool wakeOnSend = false; // true: send makes a system call when the client's thread sleeps
    bool reconnect = false;
    std::chrono::milliseconds firstRetry{0}; // 0: 100 ms
    std::chrono::milliseconds longestRetry{0}; // 0: 10 s
    StateCallback stateChanged;
    bool trace = false; // true: events can be emitted into the kernel's trace; see trace.hpp
    bool stamp = true; // whether `send` adds the time to messages that do not have it
};

// One connection to the service. Any thread; but no other thread may use it while it is opened, moved or destroyed. A
// client that is not open answers every call with Closed.
//
// `callback` may be empty. With one, a call allocates; `send` without one never does.
class Client {
public:
    Client() noexcept = default;
    Client(Client&& other) noexcept : client_(std::exchange(other.client_, nullptr)) { }
    Client& operator=(Client&& other) noexcept
    {
        std::swap(client_, other.client_);
        return *this;
    }
    ~Client() { kesto_client_free(client_); }

    // Starts connecting, without waiting; calls are possible immediately. Closes a client that was open before.
    // InvalidArgument, OutOfMemory or SystemError on failure.
    [[nodiscard]] Status open(const Options& options = Options())
    {
        kesto_options given{};
        given.size = sizeof given;
        given.socket_path = options.socketPath.empty() ? nullptr : options.socketPath.c_str();
        given.service_name = options.serviceName.empty() ? nullptr : options.serviceName.c_str();
        given.queue_bytes = options.queueBytes;
        given.unanswered_limit = options.unansweredLimit;
        given.wake_on_send = options.wakeOnSend;
        given.reconnect = options.reconnect;
        given.first_retry_ms = milliseconds(options.firstRetry);
        given.longest_retry_ms = milliseconds(options.longestRetry);
        given.trace = options.trace;
        given.without_stamps = !options.stamp;
        if (options.stateChanged) {
            given.state_changed = callState;
            given.state_user = new StateCallback(options.stateChanged);
            given.state_release = release<StateCallback>;
        }
        kesto_client_free(client_);
        return Status(kesto_client_open(&given, &client_)); // sets it before the first callback, which may use it
    }

    [[nodiscard]] bool isOpen() const noexcept { return client_ != nullptr; }

    // Sends the taken calls and waits for their answers, for at most `timeout`, then ends the connection. All callbacks
    // have been called when it returns. The destructor closes without waiting for answers.
    Status close(std::chrono::milliseconds timeout = std::chrono::seconds(1)) noexcept
    {
        return Status(kesto_client_close(get(), milliseconds(timeout)));
    }

    // Waits until all earlier calls of this thread are sent and answered, for at most `timeout`.
    Status flush(std::chrono::milliseconds timeout) noexcept
    {
        return Status(kesto_client_flush(get(), milliseconds(timeout)));
    }

    [[nodiscard]] State state() const noexcept { return State(kesto_client_state(get())); }
    [[nodiscard]] Statistics statistics() const noexcept
    {
        Statistics statistics{};
        kesto_client_statistics(get(), &statistics, sizeof statistics);
        return statistics;
    }

    // The operations, in the order of the wire. Ok if the call was taken; else the reason, and the callback is
    // destroyed without a call.

    Status createSession(ReporterID reporter, AnswerCallback callback = nullptr)
    {
        return call(std::move(callback), kesto_client_create_session, reporter);
    }
    Status setServiceType(ServiceType type, ReporterID reporter, AnswerCallback callback = nullptr)
    {
        return call(std::move(callback), kesto_client_set_service_type, static_cast<kesto_service_type>(type),
                    reporter);
    }
    // Reporter 0 is answered twice.
    Status getServiceType(ReporterID reporter, AnswerCallback callback)
    {
        return call(std::move(callback), kesto_client_get_service_type, reporter);
    }
    // "HostApplicationDisplayID" names the application for which the session plays.
    Status setConfiguration(const Message& configuration, ReporterID reporter, AnswerCallback callback = nullptr)
    {
        return call(std::move(callback), kesto_client_set_configuration, configuration.get(), reporter);
    }
    // Answered when the run ends.
    Status startSession(ReporterID reporter, AnswerCallback callback = nullptr)
    {
        return call(std::move(callback), kesto_client_start_session, reporter);
    }

    // For real-time threads: see `kesto_client_send`.
    Status send(const Message& message, Category category, EventType type, Reporters reporters) noexcept
    {
        return Status(kesto_client_send(get(), message.get(), static_cast<kesto_category>(category),
                                        static_cast<kesto_event_type>(type), reporters.data(), reporters.size(),
                                        nullptr, nullptr, nullptr));
    }
    // Not for real-time threads: the callback is allocated.
    Status send(const Message& message, Category category, EventType type, Reporters reporters, AnswerCallback callback)
    {
        return call(std::move(callback), kesto_client_send, message.get(), static_cast<kesto_category>(category),
                    static_cast<kesto_event_type>(type), reporters.data(), reporters.size());
    }

    Status stopSession(ReporterID reporter, AnswerCallback callback = nullptr)
    {
        return call(std::move(callback), kesto_client_stop_session, reporter);
    }
    // Answers a start that was not stopped with SessionEnded.
    Status destroySession(ReporterID reporter, AnswerCallback callback = nullptr)
    {
        return call(std::move(callback), kesto_client_destroy_session, reporter);
    }
    Status validate(ReporterID reporter, AnswerCallback callback)
    {
        return call(std::move(callback), kesto_client_validate, reporter);
    }
    Status getAllReporters(AnswerCallback callback)
    {
        return call(std::move(callback), kesto_client_get_all_reporters);
    }
    // Ends the service. The only answer is ConnectionLost.
    Status killService(AnswerCallback callback = nullptr)
    {
        return call(std::move(callback), kesto_client_kill_service);
    }

    [[nodiscard]] kesto_client* get() const noexcept { return client_; }

private:
    static std::uint32_t milliseconds(std::chrono::milliseconds duration) noexcept
    {
        const auto count = duration.count();
        constexpr auto most = std::numeric_limits<std::uint32_t>::max();
        return count < 0 ? 0 : count < most ? static_cast<std::uint32_t>(count) : most;
    }

    static void callAnswer(void* user, const kesto_answer* answer) noexcept
    {
        (*static_cast<AnswerCallback*>(user))(Answer(*answer));
    }
    static void callState(void* user, const kesto_state_change* change) noexcept
    {
        const bool willRetry = change->state == KESTO_STATE_DISCONNECTED && change->retry_after_ms != UINT32_MAX;
        (*static_cast<StateCallback*>(user))(
            {State(change->state), Status(change->reason), change->system_error, willRetry,
             std::chrono::milliseconds(willRetry ? change->retry_after_ms : 0), change->socket_path});
    }
    template <typename Callback> static void release(void* user) noexcept { delete static_cast<Callback*>(user); }

    // Calls the function of kesto.h with the callback behind its arguments; the library releases the callback.
    template <typename Function, typename... Arguments>
    Status call(AnswerCallback callback, Function function, Arguments... arguments)
    {
        if (!callback)
            return Status(function(get(), arguments..., nullptr, nullptr, nullptr));
        auto* const user = new AnswerCallback(std::move(callback));
        return Status(function(get(), arguments..., callAnswer, user, release<AnswerCallback>));
    }

    kesto_client* client_ = nullptr;
};

} // namespace kesto

#endif
