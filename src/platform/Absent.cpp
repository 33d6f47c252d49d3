// None of them does anything, but each answers whoever waits for an answer.
#include "platform/Absent.h"

#include "platform/Platform.h"

#include <utility>

namespace platform {

void AbsentTraceMarkers::emit(std::uint32_t, const std::array<std::uint64_t, 4>&) { }

void AbsentMemory::letGo(std::size_t) { }

ReportingChannels::FoundChannels AbsentReportingChannels::copyChannelsInGroup(std::optional<std::string_view>,
                                                                              std::optional<std::string_view>)
{
    return {};
}

std::size_t AbsentReportingChannels::channelCount(const ChannelSet&) const
{
    return 0;
}

ReportingChannels::Subscribed AbsentReportingChannels::createSubscription(const ChannelSet&)
{
    return {.subscription = nullptr, .channels = nullptr, .error = unavailable};
}

std::expected<ReportingSample, ReportingChannelError> AbsentReportingChannels::createSamples(const Subscription&,
                                                                                             const ChannelSet&)
{
    return std::unexpected(unavailable);
}

std::expected<ReportingSample, ReportingChannelError> AbsentReportingChannels::createDifference(const ReportingSample&,
                                                                                                const ReportingSample&)
{
    return std::unexpected(unavailable);
}

namespace {

class AbsentBugCaptureReporter final : public BugCaptureReporter {
public:
    void requestSnapshot(foundation::Dictionary, double, const std::optional<foundation::Value>&,
                         const std::optional<foundation::Value>&, Reply reply) override
    {
        current().workQueues.backgroundQueue().submit([reply = std::move(reply)]() mutable {
            reply({{"success", false}, {"reason", "this device has no bug-capture service"}});
        });
    }
};

} // namespace

std::unique_ptr<BugCaptureReporter> AbsentBugCapture::makeReporter()
{
    return std::make_unique<AbsentBugCaptureReporter>();
}

bool AbsentKernelTrace::isAvailable()
{
    return false;
}

std::unique_ptr<KernelTraceSession> AbsentKernelTrace::createTraceSession()
{
    return nullptr;
}

std::unique_ptr<PerformanceFile> AbsentPerformanceWriter::open(const std::filesystem::path&, std::string_view,
                                                               std::uint32_t)
{
    return nullptr;
}

} // namespace platform
