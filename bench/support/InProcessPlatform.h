// SPDX-License-Identifier: Apache-2.0
// The platform of what is measured inside this process. It costs no time, so that only the service's own work remains:
// a queue runs each item immediately, no event is wanted, the log drops its lines and has the default levels, no driver
// publishes a channel, and no trace runs. It has no files unless a file system is given; then it is that of an internal
// build, which writes some.
#pragma once

#include "platform/Platform.h"

#include <string>
#include <utility>
#include <vector>

namespace bench {

class InProcessPlatform {
public:
    explicit InProcessPlatform(platform::FileSystem* filesOfInternalBuild = nullptr)
        : deviceProperties_(filesOfInternalBuild != nullptr)
    {
        platform::install({.log = log_,
                           .ledger = ledger_,
                           .clock = clock_,
                           .workQueues = workQueues_,
                           .preferences = preferences_,
                           .featureFlags = featureFlags_,
                           .deviceProperties = deviceProperties_,
                           .processTable = processTable_,
                           .notifications = notifications_,
                           .analytics = analytics_,
                           .traceEmitter = traceEmitter_,
                           .reportingChannels = reportingChannels_,
                           .bugCapture = bugCapture_,
                           .kernelTrace = kernelTrace_,
                           .performanceWriter = performanceWriter_,
                           .fileSystem = filesOfInternalBuild != nullptr ? *filesOfInternalBuild : fileSystem_,
                           .memory = memory_});
    }
    ~InProcessPlatform() { platform::uninstall(); }
    InProcessPlatform(const InProcessPlatform&) = delete;
    InProcessPlatform& operator=(const InProcessPlatform&) = delete;

    // Gives every notification that state, and calls the handlers of the name.
    void post(std::string_view name, std::uint64_t state) { notifications_.post(name, state); }

private:
    class Log final : public platform::Log {
        [[nodiscard]] platform::LogLevel threshold(const platform::LogCategory&) const override
        {
            return platform::LogLevel::Default;
        }
        void write(const platform::LogRecord&) override { }
        void flush() override { }
    };
    class Clock final : public platform::Clock {
        [[nodiscard]] double secondsSince1970() const override { return 1'767'225'600; }
        [[nodiscard]] double systemUptime() const override { return 86'400; }
    };
    class ImmediateQueue final : public platform::Lane {
        void submit(platform::WorkItem item) override { item(); }
        void submit(platform::TurnItem item) override
        {
            platform::Turn turn;
            item(turn);
            if (auto send = turn.letters.take())
                send();
        }
        [[nodiscard]] std::shared_ptr<Lane> makeLane(const platform::Submitter&) override
        {
            return std::make_shared<ImmediateQueue>();
        }
        [[nodiscard]] bool isFull(std::size_t) override { return false; }
        void setRoomHandler(std::function<void()>) override { }
        void setReleaseHandler(std::function<void(std::size_t)>) override { }
        void setWorkload(std::shared_ptr<ledger::Workload>) override { }
        void setLogShare(std::shared_ptr<platform::LogShare>) override { }
        [[nodiscard]] Resume pause() override
        {
            return [this](platform::TurnItem item) { submit(std::move(item)); };
        }
        [[nodiscard]] bool isCurrent() const override { return true; }
    };
    class WorkQueues final : public platform::WorkQueues {
        [[nodiscard]] std::shared_ptr<platform::WorkQueue> makeSerialQueue(std::string_view,
                                                                           platform::SerialQueueOptions) override
        {
            return std::make_shared<ImmediateQueue>();
        }
        [[nodiscard]] std::shared_ptr<platform::TurnQueue> makeTurnQueue(std::string_view,
                                                                         platform::SerialQueueOptions) override
        {
            return std::make_shared<ImmediateQueue>();
        }
        [[nodiscard]] platform::WorkQueue& backgroundQueue() override { return background_; }
        void submitAfter(std::chrono::nanoseconds, platform::WorkQueue&, platform::WorkItem) override { }
        [[nodiscard]] std::unique_ptr<platform::Semaphore> makeSemaphore(unsigned) override { return nullptr; }
        ImmediateQueue background_;
    };
    class Preferences final : public platform::Preferences {
        [[nodiscard]] std::optional<foundation::Value> value(std::string_view, std::string_view) const override
        {
            return std::nullopt;
        }
    };
    class FeatureFlags final : public platform::FeatureFlags {
        [[nodiscard]] bool isEnabled(std::string_view, std::string_view) const override { return false; }
    };
    class DeviceProperties final : public platform::DeviceProperties {
    public:
        explicit DeviceProperties(bool isInternalBuild) : isInternalBuild_(isInternalBuild) { }

    private:
        [[nodiscard]] std::optional<bool> boolean(std::string_view) const override { return isInternalBuild_; }
        const bool isInternalBuild_;
    };
    class ProcessTable final : public platform::ProcessTable {
        [[nodiscard]] std::int32_t ownProcessIdentifier() const override { return 1; }
        [[nodiscard]] std::string ownProcessName() const override { return "kestod"; }
        [[nodiscard]] std::optional<platform::ProcessTableEntry> entry(std::int32_t identifier) const override
        {
            return platform::ProcessTableEntry{identifier, "player"};
        }
    };
    class Notifications final : public platform::Notifications {
    public:
        void post(std::string_view name, std::uint64_t state)
        {
            state_ = state;
            for (std::size_t index = 0; index < registered_.size(); ++index)
                if (registered_[index].first == name)
                    registered_[index].second(static_cast<std::int32_t>(index + 1));
        }

    private:
        Registration registerNotification(std::string_view name, std::shared_ptr<platform::WorkQueue>,
                                          Handler handler) override
        {
            registered_.emplace_back(name, std::move(handler));
            return {.status = 0, .token = static_cast<std::int32_t>(registered_.size())};
        }
        [[nodiscard]] std::expected<std::uint64_t, platform::NotificationStatus> state(std::int32_t) const override
        {
            return state_;
        }
        std::vector<std::pair<std::string, Handler>> registered_;
        std::uint64_t state_ = 0;
    };
    class Analytics final : public platform::Analytics {
        [[nodiscard]] bool isEnabled() const override { return true; }
        [[nodiscard]] bool isAnalyticsEventUsed(std::string_view) override { return false; }
        void sendAnalyticsEventLazy(platform::Turn&, const platform::Origin&, std::string_view, PayloadBuilder) override
        {
        }
        void sendAnalyticsEventLazy(platform::OutsideTurn, const platform::SourceBegin&, std::string_view,
                                    PayloadBuilder) override
        {
        }
        void reportLosses() override { }
    };
    class TraceEmitter final : public platform::TraceEmitter {
        void emit(std::uint32_t, const std::array<std::uint64_t, 4>&) override { }
    };
    class ReportingChannels final : public platform::ReportingChannels {
        [[nodiscard]] std::shared_ptr<const Moment>
        readChannels(const std::vector<platform::ChannelSelection>&) override
        {
            return std::make_shared<Moment>();
        }
        FoundChannels copyChannelsInGroup(std::optional<std::string_view>, std::optional<std::string_view>,
                                          const Moment&) override
        {
            return {};
        }
        [[nodiscard]] std::size_t channelCount(const ChannelSet&) const override { return 0; }
        Subscribed createSubscription(const ChannelSet&) override
        {
            return {.subscription = nullptr, .channels = nullptr, .error = unavailable};
        }
        std::expected<platform::ReportingSample, platform::ReportingChannelError>
        createSamples(const Subscription&, const ChannelSet&, const Moment&) override
        {
            return std::unexpected(unavailable);
        }
        std::expected<platform::ReportingSample, platform::ReportingChannelError>
        createDifference(const platform::ReportingSample&, const platform::ReportingSample&) override
        {
            return std::unexpected(unavailable);
        }
        static constexpr platform::ReportingChannelError unavailable = 1;
    };
    class BugCapture final : public platform::BugCapture {
        class Reporter final : public platform::BugCaptureReporter {
            void requestSnapshot(foundation::Dictionary, double, const std::optional<foundation::Value>&,
                                 const std::optional<foundation::Value>&, Reply reply) override
            {
                reply({{"success", false}});
            }
        };
        [[nodiscard]] std::unique_ptr<platform::BugCaptureReporter> makeReporter() override
        {
            return std::make_unique<Reporter>();
        }
    };
    class KernelTrace final : public platform::KernelTrace {
        [[nodiscard]] bool isAvailable() override { return false; }
        [[nodiscard]] std::unique_ptr<platform::KernelTraceSession> createTraceSession() override { return nullptr; }
    };
    class PerformanceWriter final : public platform::PerformanceWriter {
        [[nodiscard]] std::unique_ptr<platform::PerformanceFile> open(const std::filesystem::path&, std::string_view,
                                                                      std::uint32_t) override
        {
            return nullptr;
        }
    };
    class FileSystem final : public platform::FileSystem {
        [[nodiscard]] std::filesystem::path diagnosticLogRoot() const override { return {}; }
        [[nodiscard]] std::expected<void, std::error_code> createDirectories(const std::filesystem::path&,
                                                                             unsigned) override
        {
            return std::unexpected(std::make_error_code(std::errc::permission_denied));
        }
        [[nodiscard]] std::expected<std::unique_ptr<platform::AtomicFile>, std::error_code>
        createAtomically(const std::filesystem::path&) override
        {
            return std::unexpected(std::make_error_code(std::errc::permission_denied));
        }
        void keepWithin(const std::filesystem::path&, const platform::KeptFiles&, std::uint64_t) override { }
        [[nodiscard]] std::expected<std::string, std::error_code> readFile(const std::filesystem::path&,
                                                                           std::size_t) override
        {
            return std::unexpected(std::make_error_code(std::errc::permission_denied));
        }
    };
    class Memory final : public platform::Memory {
        void letGo(std::size_t) override { }
        void clientGone() override { }
        [[nodiscard]] platform::MemoryLimits limits() const override { return {most, most, most}; }
        static constexpr std::size_t most = std::size_t{2} << 30;
    };

    Log log_;
    ledger::Ledger ledger_;
    Clock clock_;
    WorkQueues workQueues_;
    Preferences preferences_;
    FeatureFlags featureFlags_;
    DeviceProperties deviceProperties_;
    ProcessTable processTable_;
    Notifications notifications_;
    Analytics analytics_;
    TraceEmitter traceEmitter_;
    ReportingChannels reportingChannels_;
    BugCapture bugCapture_;
    KernelTrace kernelTrace_;
    PerformanceWriter performanceWriter_;
    FileSystem fileSystem_;
    Memory memory_;
};

} // namespace bench
