// One reporting session of one client process: identity, service type, configuration, and, between start and
// stop, the messages that were sent to it.
//
// A session records what it is sent; handing that to the sinks is its client instance's work, which calls the session
// and the sinks side by side. Only the volume events, which it derives itself, it hands to the analytics bridge.
#pragma once

#include "foundation/Mutex.h"
#include "foundation/values/Value.h"
#include "session/DriverSnapShot.h"
#include "session/MessageStore.h"
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

// The one value of "KestoReportingTraceType" that lets a trace start. Told by its identity: text that a client
// sends never is this object.
extern const foundation::String KestoReportingTraceTypeKtrace;

// Owned by a shared pointer. Driven from the server queue, on which all that its client instance keeps in it is read
// and written. What sinks read (service type, configuration) may be read from any thread, and so may what it recorded.
class KestoReportingSession final : public sinks::SinkSession,
                                    public std::enable_shared_from_this<KestoReportingSession> {
public:
    // The identity never changes. The first process is the session's owner. What the session keeps for its client is
    // paid from the budget.
    KestoReportingSession(std::int64_t reporterID, std::vector<std::int32_t> processIdentifiers,
                          std::shared_ptr<session::StorageBudget> budget = session::StorageBudget::service());
    ~KestoReportingSession() override;
    KestoReportingSession(const KestoReportingSession&) = delete;
    KestoReportingSession& operator=(const KestoReportingSession&) = delete;

    [[nodiscard]] std::int64_t reporterID() const { return reporterID_; }
    [[nodiscard]] const std::vector<std::int32_t>& processIdentifiers() const { return processIdentifiers_; }
    // One line for the log.
    [[nodiscard]] std::string description() const;

    void setServiceType(AudioServiceType type);
    [[nodiscard]] AudioServiceType serviceType() const override { return serviceType_; }
    // The service type's name; empty until one was set.
    [[nodiscard]] std::string_view serviceName() const { return serviceName_; }

    [[nodiscard]] foundation::Dictionary configuration() const override;
    // Adds all entries, replacing those of the same key; no dictionary changes nothing. A configuration that would
    // outgrow `largestConfiguration` bytes, or the budget, stays as it was, with a log line.
    void setConfiguration(const std::optional<foundation::Dictionary>& configuration);
    void updateConfigurationWithContentsOfConfiguration(const std::optional<foundation::Dictionary>& configuration);
    static constexpr std::size_t largestConfiguration = std::size_t{1} << 20;

    [[nodiscard]] bool started() const { return started_; }
    // Begins a run with an empty store; a session that is started already goes on as it is.
    void start();
    // Ends the run and drops what it recorded; the events that it makes of that go with the turn. Nothing happens to a
    // session that is not started.
    void stop(platform::Turn& turn);

    // Whether sessions of this service type may run kernel traces: those for tests, where the feature is enabled and
    // the system can trace.
    [[nodiscard]] bool mayBeTraced() const;
    // Prepares a trace from a trace-parameters file, in the place of one that was prepared or is running. Without a
    // file nothing changes.
    void setupTracing(const std::optional<std::string>& fileName);
    // Whether a trace of this session is running. One that is running when the session goes, goes with it.
    [[nodiscard]] bool startedTracing() const { return startedTracing_; }
    // In bytes, as of any path. A start with a longer one begins no trace, with a log line.
    static constexpr std::size_t longestTracingFileName = 4095;
    // Of the trace that is running or prepared.
    [[nodiscard]] const std::optional<std::string>& tracingFileName() const { return tracingFileName_; }
    // Of the trace that is running or prepared; null without one.
    [[nodiscard]] const TraceRunner* traceRunner() const { return traceRunner_.get(); }
    [[nodiscard]] const TraceParams* traceParams() const { return traceParams_.get(); }

    // Called before the message's function returns, if at all.
    using MessageReply = std::function<void(const std::optional<utility::ReplyError>& error)>;
    // Normalises and records the message, then calls the reply, if there is one, with no error. `sync` makes no
    // difference: the message is always handled at once on the caller's thread. No message is an empty one.
    void sendMessage(const std::optional<foundation::Dictionary>& message, AudioEventCategory category,
                     AudioEventType type, bool sync, const MessageReply& reply);
    void sendMessage(const std::optional<foundation::Dictionary>& message, AudioEventCategory category,
                     AudioEventType type, const MessageReply& reply);
    // Records the normalised message, unless it repeats the one before of its kind: true when it was dropped
    // for that.
    bool createMessageIdentifier(AudioEventCategory category, AudioEventType type,
                                 const foundation::Dictionary& message);
    // Accepts a message outside of any session and does nothing with it, a second later; the reply is not called.
    static void sendSingleMessage(const foundation::Dictionary& message, AudioEventCategory category,
                                  AudioEventType type, AudioServiceType serviceType,
                                  const foundation::Dictionary& userInfo, const MessageReply& reply);

    // The payloads of the messages in order, those that carry any of the keys folded together: one that comes no more
    // than the pause (seconds) after the one before joins it, at the place of the first of them. This is the
    // definition; the volume analysis folds only the entries that it reads. The properties `RapidMessages` and
    // `VolumeMessagesOfAnyStore` bind both to one description of it.
    [[nodiscard]] static std::vector<foundation::Dictionary>
    combineRapidMessages(const session::MessageStore& messages, std::span<const std::string_view> keysToCombine,
                         double maximumPausetime);
    // One event for each stretch of more than so many seconds during which output ran unchanged. Without a process
    // there are none. The share, which is empty, pays for them from now on, but for the first `unpaidVolumeEventBytes`.
    // Events that would take more than `mostVolumeEventBytes` together, or more than the budget has, are lost, with a
    // log line.
    [[nodiscard]] static std::vector<foundation::Dictionary>
    createVolumeMessages(const session::MessageStore& messages, const std::optional<foundation::Value>& process,
                         double minimumPlaytime, session::StorageShare& share);
    static constexpr std::size_t mostVolumeEventBytes = std::size_t{64} << 20;
    // One session ends at a time, so that a few events take nothing from anybody: a client that has used up its budget
    // still learns what was played.
    static constexpr std::size_t unpaidVolumeEventBytes = std::size_t{64} << 10;

    // Summary files of all sessions that are kept; beyond these the oldest go.
    static constexpr std::size_t mostSummaryFiles = 4096;
    static constexpr std::uint64_t mostSummaryBytes = std::uint64_t{256} << 20; // of all together

    // For every key of this run's messages all values that it took, joined by commas; nothing without messages. One
    // that the budget has no room for is lost like a message, with a log line. Nothing is recorded meanwhile.
    [[nodiscard]] std::optional<foundation::Dictionary> createSummaryEventForSession() const;
    // On internal builds writes this run's messages to a file below the diagnostic-log root. What fails is logged.
    void writeSummaryJson() const;

    // The reply of the call that started this run, kept by the client instance until its work is done.
    [[nodiscard]] const utility::ResultReply<bool>& transactionCompleteBlock() const
    {
        return transactionCompleteBlock_;
    }
    void setTransactionCompleteBlock(utility::ResultReply<bool> block) { transactionCompleteBlock_ = std::move(block); }

    // What the drivers' channels held when the session started; set and cleared by the client instance. One that the
    // budget has no room for is not kept, with a log line.
    [[nodiscard]] const std::optional<session::DriverSnapShot>& driverSnapShot() const { return driverSnapShot_; }
    void setDriverSnapShot(std::optional<session::DriverSnapShot> snapShot);

    // Asked for by the client; kept for it and never read here.
    [[nodiscard]] bool blinReportingEnabled() const { return blinReportingEnabled_; }
    void setBlinReportingEnabled(bool enabled) { blinReportingEnabled_ = enabled; }

    // This run's messages, each a dictionary of one entry, identifier to payload; nothing while not started.
    [[nodiscard]] std::optional<std::vector<foundation::Dictionary>> nestedAggregatedPayloadData() const;
    // By kind, how many messages this run accepted; nothing while not started.
    [[nodiscard]] std::optional<foundation::Dictionary> messageIdentifierCounts() const;

    // Constant answers.
    [[nodiscard]] static std::optional<foundation::Value> getBlinReportingStartedState() { return std::nullopt; }
    [[nodiscard]] static std::optional<std::string> getPTTraceFileURL() { return std::nullopt; }
    [[nodiscard]] static bool shouldReportOrientation() { return false; }

private:
    [[nodiscard]] std::shared_ptr<const session::MessageStore> store() const;
    [[nodiscard]] std::string summaryFileName() const;
    void sendVolumeEvents(platform::Turn& turn);
    void sendSummaryEvent();
    void letGoOfMessages();
    void startTracing();
    void stopTracing();

    bool started_ = false;
    bool blinReportingEnabled_ = false;
    bool startedTracing_ = false;
    std::atomic<AudioServiceType> serviceType_{0};
    foundation::Dictionary configuration_ KESTO_GUARDED_BY(configurationLock_);
    std::string applicationText_ KESTO_GUARDED_BY(configurationLock_); // the host application's name, for the log
    std::optional<session::DriverSnapShot> driverSnapShot_;
    utility::ResultReply<bool> transactionCompleteBlock_;
    const std::int64_t reporterID_;
    const std::vector<std::int32_t> processIdentifiers_;
    std::shared_ptr<session::MessageStore>
        nestedAggregatedPayloadData_ KESTO_GUARDED_BY(nestedAggregatedPayloadDataLock_);
    std::string_view serviceName_;
    std::optional<std::string> tracingFileName_;
    std::unique_ptr<TraceParams> traceParams_;
    std::unique_ptr<TraceRunner> traceRunner_;

    const std::shared_ptr<session::StorageBudget> budget_;
    session::StorageShare configurationShare_ KESTO_GUARDED_BY(configurationLock_);
    session::StorageShare driverSnapShotShare_;
    mutable std::uint64_t messagesLost_ = 0; // in this run, for lack of memory
    mutable foundation::Mutex configurationLock_;
    mutable foundation::Mutex nestedAggregatedPayloadDataLock_;
};
