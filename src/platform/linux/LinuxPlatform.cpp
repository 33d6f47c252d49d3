#include "platform/linux/LinuxPlatform.h"

#include "platform/linux/Outbox.h"

namespace platform {

LinuxPlatform::LinuxPlatform(const LaunchConfiguration& launch)
    : log_(launch.logThresholds, LinuxLog::destinationOfThisProcess()),
      configurationWatcher_(launch.configurationDirectory, ProviderLog(log_)),
      preferences_(configurationWatcher_, ProviderLog(log_)),
      featureFlags_(configurationWatcher_, ProviderLog(log_)),
      deviceProperties_(configurationWatcher_, ProviderLog(log_)),
      fileSystem_(launch.logsDirectory),
      analytics_(launch.stateDirectory, configurationWatcher_, clock_, ProviderLog(log_))
{
    // The replies of a turn leave once its events are kept.
    workQueues_.setTurnEndHandler([this] { analytics_.endTurn(Outbox::endTurn()); });
}

Platform LinuxPlatform::platform()
{
    return {.log = log_,
            .clock = clock_,
            .workQueues = workQueues_,
            .preferences = preferences_,
            .featureFlags = featureFlags_,
            .deviceProperties = deviceProperties_,
            .processTable = processTable_,
            .notifications = notifications_,
            .analytics = analytics_,
            .traceMarkers = traceMarkers_,
            .reportingChannels = reportingChannels_,
            .bugCapture = bugCapture_,
            .kernelTrace = kernelTrace_,
            .performanceWriter = performanceWriter_,
            .fileSystem = fileSystem_};
}

} // namespace platform
