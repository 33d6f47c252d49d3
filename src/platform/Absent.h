// Providers for a system that lacks a service: each does what the rest of the service expects of a device
// without it.
#pragma once

#include "platform/BugCapture.h"
#include "platform/KernelTrace.h"
#include "platform/Memory.h"
#include "platform/PerformanceWriter.h"
#include "platform/ReportingChannels.h"
#include "platform/TraceMarkers.h"

namespace platform {

// Markers go nowhere.
class AbsentTraceMarkers final : public TraceMarkers {
public:
    void emit(std::uint32_t code, const std::array<std::uint64_t, 4>& arguments) override;
};

// No driver publishes a channel.
class AbsentReportingChannels final : public ReportingChannels {
public:
    FoundChannels copyChannelsInGroup(std::optional<std::string_view> group,
                                      std::optional<std::string_view> subgroup) override;
    [[nodiscard]] std::size_t channelCount(const ChannelSet& channels) const override;
    Subscribed createSubscription(const ChannelSet& channels) override;
    std::expected<ReportingSample, ReportingChannelError> createSamples(const Subscription& subscription,
                                                                        const ChannelSet& channels) override;
    std::expected<ReportingSample, ReportingChannelError> createDifference(const ReportingSample& from,
                                                                           const ReportingSample& to) override;

private:
    static constexpr ReportingChannelError unavailable = 1;
};

// Signatures are made; a snapshot is answered, on the background queue, with a response that says that none was taken.
class AbsentBugCapture final : public BugCapture {
public:
    [[nodiscard]] std::unique_ptr<BugCaptureReporter> makeReporter() override;
};

// Nothing can be done about the memory that is let go.
class AbsentMemory final : public Memory {
public:
    void letGo(std::size_t bytes) override;
};

// There is no kernel trace: no session can be made.
class AbsentKernelTrace final : public KernelTrace {
public:
    [[nodiscard]] bool isAvailable() override;
    [[nodiscard]] std::unique_ptr<KernelTraceSession> createTraceSession() override;
};

// No file can be opened.
class AbsentPerformanceWriter final : public PerformanceWriter {
public:
    [[nodiscard]] std::unique_ptr<PerformanceFile> open(const std::filesystem::path& path, std::string_view project,
                                                        std::uint32_t version) override;
};

} // namespace platform
