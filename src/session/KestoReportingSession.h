// SPDX-License-Identifier: Apache-2.0
// One reporting session of one client process: its identity, service type and configuration, and, between start and
// stop, the messages that it got.
//
// A session records what it gets. Its client instance hands the same messages to the sinks. Only the volume events,
// which the session derives itself, go from it to the analytics bridge.
#pragma once

#include "foundation/Mutex.h"
#include "foundation/values/Value.h"
#include "ledger/Tally.h"
#include "session/DriverSnapShot.h"
#include "session/MessageStore.h"
#include "session/Run.h"
#include "session/RunEnd.h"
#include "sinks/SinkSession.h"
#include "utility/Reply.h"

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

struct TraceParams;
class TraceRunner;

// The one value of "KestoReportingTraceType" that lets a trace start. It is recognised by its identity, so text that a
// client sends never counts as this value.
extern const foundation::String KestoReportingTraceTypeKtrace;

// Owned by a shared pointer. It runs on the server queue, where its client instance also reads and writes what it keeps
// in it. Any thread may read what sinks read (service type, configuration) and what the session recorded.
class KestoReportingSession final : public sinks::SinkSession,
                                    public std::enable_shared_from_this<KestoReportingSession> {
public:
    // The identity never changes. The first process is the session's owner. The budget pays for what the session keeps
    // for its client, whom the ledger charges with what is refused.
    KestoReportingSession(std::int64_t reporterID, std::vector<std::int32_t> processIdentifiers,
                          std::shared_ptr<session::StorageBudget> budget = session::StorageBudget::service(),
                          ledger::Culprit client = {});
    ~KestoReportingSession() override;
    KestoReportingSession(const KestoReportingSession&) = delete;
    KestoReportingSession& operator=(const KestoReportingSession&) = delete;

    [[nodiscard]] std::int64_t reporterID() const { return reporterID_; }
    [[nodiscard]] const std::vector<std::int32_t>& processIdentifiers() const { return processIdentifiers_; }
    // One line for the log.
    [[nodiscard]] std::string description() const;

    // Makes it a session that the store knows: its events carry its number and that of its owner's connection.
    void setOwner(std::uint64_t source);
    [[nodiscard]] platform::Origin announcedOrigin(platform::Turn& turn) override;
    // Announces that it gets no more messages, if the store knows it.
    void announceEnd(platform::Turn& turn);
    // Announces that it plays nothing any more, if the store got an event of it since the last time.
    void announcePlayingEnd(platform::Turn& turn, platform::PlayingEnding ending);

    void setServiceType(AudioServiceType type);
    [[nodiscard]] AudioServiceType serviceType() const override { return serviceType_; }
    // The service type's name; empty until a service type is set.
    [[nodiscard]] std::string_view serviceName() const { return serviceName_; }

    [[nodiscard]] foundation::Dictionary configuration() const override;
    // Adds all entries, and replaces those of the same key. Without a dictionary it changes nothing. If the
    // configuration would exceed `largestConfiguration` bytes or the budget, it stays as it was, and a log line says
    // so.
    void setConfiguration(const std::optional<foundation::Dictionary>& configuration);
    void updateConfigurationWithContentsOfConfiguration(const std::optional<foundation::Dictionary>& configuration);
    static constexpr std::size_t largestConfiguration = std::size_t{1} << 20;

    [[nodiscard]] bool started() const { return started_; }
    // The session calls the observer when it starts and when it stops. It has one at most; null takes that away.
    void observeStarted(std::move_only_function<void(bool started)> observer)
    {
        startedObserver_ = std::move(observer);
    }
    // The number of the last run that it began; the runs of all sessions count up from 1.
    [[nodiscard]] std::uint64_t lastRun() const { return lastRun_; }
    // The number of the last run of all sessions.
    [[nodiscard]] static std::uint64_t lastRunOfAll() noexcept;
    // Begins a run with an empty store. A session that has started already is not changed.
    void start();
    // Ends the run and drops the recorded messages; the events made of them go with the turn. Has no effect on a
    // session that is not started.
    void stop(platform::Turn& turn);
    // Whether that would take so long that other clients should not wait for it.
    [[nodiscard]] bool takesLongToStop() const;
    // Whether that is because of the messages, and not only of the file that is written, or of a trace.
    [[nodiscard]] bool hasManyMessages() const;
    // The same as a stop, in two parts, for a session that is started. The first takes the run out of the session,
    // which is stopped from then on; the caller carries out the steps of its end, and then calls the second. Nothing
    // may start the session in between.
    [[nodiscard]] std::unique_ptr<session::RunEnd> beginStop();
    void finishStop(platform::Turn& turn, session::RunEnd& end);

    // Whether sessions of this service type may run kernel traces: those for tests, where the feature is enabled and
    // the system can trace.
    [[nodiscard]] bool mayBeTraced() const;
    // Prepares a trace from a trace-parameters file. It replaces a trace that is prepared or running. Without a file it
    // changes nothing.
    void setupTracing(const std::optional<std::string>& fileName);
    // Whether a trace of this session is running. If the session is destroyed, so is its running trace.
    [[nodiscard]] bool startedTracing() const { return startedTracing_; }
    // In bytes; no path is longer. A start with a longer name logs this and begins no trace.
    static constexpr std::size_t longestTracingFileName = 4095;
    // The file of the running or prepared trace.
    [[nodiscard]] const std::optional<std::string>& tracingFileName() const { return tracingFileName_; }
    // The runner of the running or prepared trace, or null.
    [[nodiscard]] const TraceRunner* traceRunner() const { return traceRunner_.get(); }
    [[nodiscard]] const TraceParams* traceParams() const { return traceParams_.get(); }

    // `sendMessage` calls it before it returns; `sendSingleMessage` never calls it.
    using MessageReply = std::function<void(const std::optional<utility::ReplyError>& error)>;
    // Normalises and records the message, counts what became of it, then calls the reply, if there is one, without an
    // error. `sync` has no effect: the message is always handled before this returns, on the caller's thread. An absent
    // message counts as an empty one.
    void sendMessage(ledger::Tally& tally, const std::optional<foundation::Dictionary>& message,
                     AudioEventCategory category, AudioEventType type, bool sync, const MessageReply& reply);
    void sendMessage(ledger::Tally& tally, const std::optional<foundation::Dictionary>& message,
                     AudioEventCategory category, AudioEventType type, const MessageReply& reply);
    // Records the normalised message unless it repeats the previous one of its kind. True if it was dropped as a
    // repetition.
    bool createMessageIdentifier(ledger::Tally& tally, AudioEventCategory category, AudioEventType type,
                                 const foundation::Dictionary& message);
    // Accepts a message outside any session and, a second later, does nothing with it. The reply is not called.
    static void sendSingleMessage(const foundation::Dictionary& message, AudioEventCategory category,
                                  AudioEventType type, AudioServiceType serviceType,
                                  const foundation::Dictionary& userInfo, const MessageReply& reply);

    // The payloads of the messages in order. Those with any of the keys are folded: one that comes within the pause
    // (seconds) after the previous one is merged into it, at the place of the first. This is the definition; the volume
    // analysis folds only the entries that it reads. The properties `RapidMessages` and `VolumeMessagesOfAnyStore` bind
    // both to one description of it.
    [[nodiscard]] static std::vector<foundation::Dictionary>
    combineRapidMessages(const session::MessageStore& messages, std::span<const std::string_view> keysToCombine,
                         double maximumPausetime);
    // One event for each stretch of more than `minimumPlaytime` seconds during which output ran unchanged. Without a
    // process there are no events. The share, which must be empty, pays for them, except for the first
    // `unpaidVolumeEventBytes`. Events beyond `mostVolumeEventBytes` together, or beyond the budget, are lost, and a
    // log line says so.
    [[nodiscard]] static std::vector<foundation::Dictionary>
    createVolumeMessages(const session::MessageStore& messages, const std::optional<foundation::Value>& process,
                         double minimumPlaytime, session::StorageShare& share);
    static constexpr std::size_t mostVolumeEventBytes = std::size_t{64} << 20;
    // A client that has used up its budget still gets the first few events of what it played. They take next to no
    // memory from other clients, because only one session ends on a thread of its own at a time, and one on the server
    // queue.
    static constexpr std::size_t unpaidVolumeEventBytes = std::size_t{64} << 10;

    // The limit for the summary files of all sessions. Beyond it the oldest are removed.
    static constexpr std::size_t mostSummaryFiles = 4096;
    static constexpr std::uint64_t mostSummaryBytes = std::uint64_t{256} << 20; // of all together

    // For every key of this run's messages, all its values, joined by commas; nothing without messages. If the budget
    // has no room for it, it is lost and logged like a message. Nothing may be recorded meanwhile.
    [[nodiscard]] std::optional<foundation::Dictionary> createSummaryEventForSession() const;
    // On internal builds, writes this run's messages to a file below the diagnostic-log root. A failure is logged.
    void writeSummaryJson() const;

    // The reply of the call that started this run. The client instance keeps it here until the run's work is done.
    [[nodiscard]] const utility::ResultReply<bool>& transactionCompleteBlock() const
    {
        return transactionCompleteBlock_;
    }
    void setTransactionCompleteBlock(utility::ResultReply<bool> block) { transactionCompleteBlock_ = std::move(block); }

    // What the drivers' channels held when the session started; the client instance sets and clears it. A snapshot for
    // which the budget has no room is not kept, and a log line says so.
    [[nodiscard]] const std::optional<session::DriverSnapShot>& driverSnapShot() const { return driverSnapShot_; }
    void setDriverSnapShot(std::optional<session::DriverSnapShot> snapShot);

    // The client asks for it; this process keeps it and never reads it.
    [[nodiscard]] bool blinReportingEnabled() const { return blinReportingEnabled_; }
    void setBlinReportingEnabled(bool enabled) { blinReportingEnabled_ = enabled; }

    // This run's messages, each a dictionary of one entry, identifier to payload; nothing unless the session is
    // started.
    [[nodiscard]] std::optional<std::vector<foundation::Dictionary>> nestedAggregatedPayloadData() const;
    // How many messages of each kind this run accepted; nothing unless the session is started.
    [[nodiscard]] std::optional<foundation::Dictionary> messageIdentifierCounts() const;

    // Constant answers.
    [[nodiscard]] static std::optional<foundation::Value> getBlinReportingStartedState() { return std::nullopt; }
    [[nodiscard]] static std::optional<std::string> getPTTraceFileURL() { return std::nullopt; }
    [[nodiscard]] static bool shouldReportOrientation() { return false; }

private:
    [[nodiscard]] std::shared_ptr<session::Run> run() const;
    [[nodiscard]] std::unique_ptr<session::RunEnd> makeRunEnd();
    void letGoOfMessages();
    void setStarted(bool started);
    void startTracing();
    [[nodiscard]] std::unique_ptr<TraceRunner> takeRunningTrace();

    bool started_ = false;
    std::move_only_function<void(bool started)> startedObserver_;
    std::uint64_t lastRun_ = 0;
    bool blinReportingEnabled_ = false;
    bool startedTracing_ = false;
    std::atomic<AudioServiceType> serviceType_{0};
    foundation::Dictionary configuration_ KESTO_GUARDED_BY(configurationLock_);
    std::string applicationText_ KESTO_GUARDED_BY(configurationLock_); // the host application's name, for the log
    std::optional<session::DriverSnapShot> driverSnapShot_;
    utility::ResultReply<bool> transactionCompleteBlock_;
    const std::int64_t reporterID_;
    const std::vector<std::int32_t> processIdentifiers_;
    std::shared_ptr<session::Run> run_ KESTO_GUARDED_BY(runLock_); // null unless it is started
    std::string_view serviceName_;
    platform::Origin origin_;
    double created_ = 0; // seconds since 1970
    bool isAnnounced_ = false; // as it is now
    bool mayPlay_ = false; // for all that the store knows
    bool wasAnnounced_ = false;
    std::optional<std::string> tracingFileName_;
    std::unique_ptr<TraceParams> traceParams_;
    std::unique_ptr<TraceRunner> traceRunner_;

    [[nodiscard]] ledger::Culprit culprit() const;

    const ledger::Culprit client_;
    const std::shared_ptr<session::StorageBudget> budget_;
    session::StorageShare configurationShare_ KESTO_GUARDED_BY(configurationLock_);
    session::StorageShare driverSnapShotShare_;
    mutable foundation::Mutex configurationLock_;
    mutable foundation::Mutex runLock_;
};
