// SPDX-License-Identifier: Apache-2.0
// The bundle of platform services that the process runs on.
//
// The entry point installs it once, before anything else runs; tests install fakes. Free functions
// reach it as `platform::current()`.
#pragma once

#include "ledger/Ledger.h"
#include "platform/Analytics.h"
#include "platform/BugCapture.h"
#include "platform/Clock.h"
#include "platform/DeviceProperties.h"
#include "platform/FeatureFlags.h"
#include "platform/FileSystem.h"
#include "platform/KernelTrace.h"
#include "platform/Log.h"
#include "platform/Memory.h"
#include "platform/Notifications.h"
#include "platform/PerformanceWriter.h"
#include "platform/Preferences.h"
#include "platform/ProcessTable.h"
#include "platform/ReportingChannels.h"
#include "platform/TraceEmitter.h"
#include "platform/WorkQueue.h"

namespace platform {

// References to the providers, all of which outlive the installation.
struct Platform {
    Log& log;
    ledger::Ledger& ledger;
    Clock& clock;
    WorkQueues& workQueues;
    Preferences& preferences;
    FeatureFlags& featureFlags;
    DeviceProperties& deviceProperties;
    ProcessTable& processTable;
    Notifications& notifications;
    Analytics& analytics;
    TraceEmitter& traceEmitter;
    ReportingChannels& reportingChannels;
    BugCapture& bugCapture;
    KernelTrace& kernelTrace;
    PerformanceWriter& performanceWriter;
    FileSystem& fileSystem;
    Memory& memory;
};

// Makes the platform current. No other thread may use the platform meanwhile.
void install(const Platform& platform);
// Removes the current platform; log statements are then dropped.
void uninstall();

// The installed platform. Any thread.
[[nodiscard]] Platform& current();
[[nodiscard]] bool isInstalled() noexcept;

// The number of installations so far. State that is kept "once for the life of the process" is kept for one
// installation, so that tests do not share it.
[[nodiscard]] std::uint64_t installationNumber() noexcept;

} // namespace platform
