// SPDX-License-Identifier: Apache-2.0
// All providers of this system, declared so that the queues end first: what a queue still runs finds every other
// provider. Providers that are made before the queues only keep a reference to them while they are made.
//
//     auto launch = platform::LaunchConfiguration::fromEnvironment();
//     if (!launch)
//         ... print launch.error(), exit with LaunchConfiguration::exitStatus
//     platform::LinuxPlatform providers(*launch);
//     platform::install(providers.platform());
#pragma once

#include "ledger/Report.h"
#include "platform/Platform.h"
#include "platform/linux/LaunchConfiguration.h"
#include "platform/linux/bugs/LinuxBugCapture.h"
#include "platform/linux/channels/LinuxReportingChannels.h"
#include "platform/linux/diagnostics/FolderLimits.h"
#include "platform/linux/diagnostics/LinuxFileSystem.h"
#include "platform/linux/log/LinuxLog.h"
#include "platform/linux/memory/LinuxMemory.h"
#include "platform/linux/process/LinuxClock.h"
#include "platform/linux/process/LinuxProcessTable.h"
#include "platform/linux/queues/LinuxWorkQueues.h"
#include "platform/linux/settings/ConfigurationWatcher.h"
#include "platform/linux/settings/LinuxDeviceSettings.h"
#include "platform/linux/settings/LinuxNotifications.h"
#include "platform/linux/settings/LinuxPreferences.h"
#include "platform/linux/store/AnalyticsStore.h"
#include "platform/linux/store/LedgerFile.h"
#include "platform/linux/trace/EmitterAccess.h"
#include "platform/linux/trace/LinuxPerformanceWriter.h"
#include "platform/linux/trace/TracefsEmitter.h"
#include "platform/linux/trace/TracefsKernelTrace.h"

namespace platform {

// One for each process; it lives as long as the process, because its queues run until the end.
class LinuxPlatform {
public:
    explicit LinuxPlatform(const LaunchConfiguration& launch);

    [[nodiscard]] Platform platform();
    // Not part of the bundle: it can write all sent events immediately.
    [[nodiscard]] AnalyticsStore& analyticsStore() noexcept { return analytics_; }
    // For the start: see LinuxFileSystem.
    void removeUnfinished(const std::filesystem::path& folder) { fileSystem_.removeUnfinished(folder); }
    // Any thread; never waits for the disk.
    [[nodiscard]] ledger::Backlog backlog();
    // The listener gives its descriptors to clients.
    [[nodiscard]] EmitterAccess& emitterAccess() noexcept { return emitterAccess_; }

    // For the end, when the connections have ended. Returns when all submitted work is done and all events are kept or
    // counted as lost. Not for items of a queue.
    void finish();
    // For an end that waits no longer: counts and logs what is not finished, with the reason. Never waits for the disk.
    // Any thread.
    void giveUp(std::string_view reason);

private:
    LinuxLog log_;
    ConfigurationWatcher configurationWatcher_;
    LinuxClock clock_;
    LedgerFile ledgerFile_;
    ledger::Ledger ledger_{ledgerFile_.image()};
    LinuxNotifications notifications_;
    LinuxPreferences preferences_; // posts notifications
    LinuxDeviceSettings deviceSettings_;
    LinuxProcessTable processTable_;
    FolderLimits folderLimits_;
    LinuxFileSystem fileSystem_;
    TracefsEmitter traceEmitter_;
    EmitterAccess emitterAccess_;
    LinuxReportingChannels reportingChannels_;
    LinuxBugCapture bugCapture_;
    TracefsKernelTrace kernelTrace_;
    LinuxPerformanceWriter performanceWriter_;
    LinuxMemory memory_;
    AnalyticsStore analytics_;
    LinuxWorkQueues workQueues_; // destroyed first, because its turns end in the store
};

} // namespace platform
