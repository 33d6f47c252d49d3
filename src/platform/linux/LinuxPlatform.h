// All providers of this system, made in the order in which they need each other.
//
//     auto launch = platform::LaunchConfiguration::fromEnvironment();
//     if (!launch)
//         ... print launch.error(), exit with LaunchConfiguration::exitStatus
//     platform::LinuxPlatform providers(*launch);
//     platform::install(providers.platform());
#pragma once

#include "platform/Platform.h"
#include "platform/linux/LaunchConfiguration.h"
#include "platform/linux/bugs/LinuxBugCapture.h"
#include "platform/linux/channels/LinuxReportingChannels.h"
#include "platform/linux/diagnostics/FolderKeeper.h"
#include "platform/linux/diagnostics/LinuxFileSystem.h"
#include "platform/linux/log/LinuxLog.h"
#include "platform/linux/process/LinuxClock.h"
#include "platform/linux/process/LinuxProcessTable.h"
#include "platform/linux/queues/LinuxMemory.h"
#include "platform/linux/queues/LinuxWorkQueues.h"
#include "platform/linux/settings/ConfigurationWatcher.h"
#include "platform/linux/settings/LinuxDeviceProperties.h"
#include "platform/linux/settings/LinuxFeatureFlags.h"
#include "platform/linux/settings/LinuxNotifications.h"
#include "platform/linux/settings/LinuxPreferences.h"
#include "platform/linux/store/AnalyticsStore.h"
#include "platform/linux/trace/LinuxPerformanceWriter.h"
#include "platform/linux/trace/TraceMarkerAccess.h"
#include "platform/linux/trace/TracefsKernelTrace.h"
#include "platform/linux/trace/TracefsMarkers.h"

namespace platform {

// One a process, for as long as it lives: its queues run until the very end.
class LinuxPlatform {
public:
    explicit LinuxPlatform(const LaunchConfiguration& launch);

    [[nodiscard]] Platform platform();
    // What the bundle does not show: how many events were kept and lost, and a way to write all that were sent.
    [[nodiscard]] AnalyticsStore& analyticsStore() noexcept { return analytics_; }
    // For the start: see LinuxFileSystem.
    void removeUnfinished(const std::filesystem::path& folder) { fileSystem_.removeUnfinished(folder); }
    // What the listener hands out to clients.
    [[nodiscard]] TraceMarkerAccess& traceMarkerAccess() noexcept { return traceMarkerAccess_; }

private:
    LinuxLog log_;
    ConfigurationWatcher configurationWatcher_;
    LinuxClock clock_;
    LinuxNotifications notifications_;
    LinuxPreferences preferences_; // tells through notifications
    LinuxFeatureFlags featureFlags_;
    LinuxDeviceProperties deviceProperties_;
    LinuxProcessTable processTable_;
    FolderKeeper folderKeeper_;
    LinuxFileSystem fileSystem_;
    TracefsMarkers traceMarkers_;
    TraceMarkerAccess traceMarkerAccess_;
    LinuxReportingChannels reportingChannels_;
    LinuxBugCapture bugCapture_;
    TracefsKernelTrace kernelTrace_;
    LinuxPerformanceWriter performanceWriter_;
    LinuxMemory memory_{workQueues_};
    AnalyticsStore analytics_;
    LinuxWorkQueues workQueues_; // ends first, for its turns end in the store
};

} // namespace platform
