// SPDX-License-Identifier: Apache-2.0
// The few connections between otherwise independent providers: which preferences post which notification, and what
// happens at the end of a turn.
#include "platform/linux/LinuxPlatform.h"

#include "platform/linux/store/SqliteKeeper.h"

namespace platform {
namespace {

// The notification by which the owner of a preferences domain reports a change. Other domains have the empty name,
// which cannot be registered.
std::string_view notificationOf(std::string_view domain)
{
    if (domain == "com.quarn.kesto")
        return "com.quarn.kesto.reporting";
    if (domain == "com.quarn.halden")
        return "com.quarn.halden.spatial-audio-accessory-feature.changed";
    return {};
}

std::filesystem::path notificationsDirectory(const LaunchConfiguration& launch)
{
    return launch.runtimeDirectory.empty() ? std::filesystem::path() : launch.runtimeDirectory / "notifications";
}

} // namespace

LinuxPlatform::LinuxPlatform(const LaunchConfiguration& launch)
    : log_(launch.logThresholds, LinuxLog::destinationOfThisProcess()),
      configurationWatcher_(launch.configurationDirectory, ProviderLog(log_)),
      ledgerFile_(launch.stateDirectory, clock_, ProviderLog(log_)),
      notifications_(notificationsDirectory(launch), configurationWatcher_, ProviderLog(log_)),
      preferences_(configurationWatcher_, ProviderLog(log_)),
      deviceSettings_(configurationWatcher_, ProviderLog(log_)),
      folderLimits_(workQueues_, ProviderLog(log_)),
      fileSystem_(launch.logsDirectory, &folderLimits_),
      reportingChannels_(launch.channelRoot, launch.soundRoot, ledger_, ProviderLog(log_)),
      bugCapture_(launch.stateDirectory,
                  {.log = log_.recentLines(), .clock = clock_, .workQueues = workQueues_, .ledger = ledger_},
                  ProviderLog(log_)),
      kernelTrace_(TracefsPlace(), traceEmitter_, emitterAccess_, ProviderLog(log_)),
      performanceWriter_(fileSystem_, ProviderLog(log_)),
      memory_(workQueues_, configurationWatcher_, ProviderLog(log_)),
      analytics_(std::make_unique<SqliteKeeper>(launch.stateDirectory, clock_, ProviderLog(log_)),
                 configurationWatcher_, clock_, ledger_, ProviderLog(log_),
                 loadApplicationRules(launch.configurationDirectory, launch.stateDirectory, ProviderLog(log_)))
{
    log_.setLedger(ledger_);
    preferences_.setChangeHandler([this](std::string_view domain) { notifications_.post(notificationOf(domain)); });
    // The replies of a turn leave once its events are kept.
    workQueues_.setTurnEndHandler(
        [this](Turn& turn) {
            ledgerFile_.keepInPlace(ledger_);
            analytics_.endTurn(turn, turn.letters.take());
        },
        [this] { return analytics_.isFillingUp(); });
}

ledger::Backlog LinuxPlatform::backlog()
{
    return {.calls = workQueues_.unfinished().ofTurnQueues, .events = analytics_.waitingEvents()};
}

void LinuxPlatform::finish()
{
    workQueues_.finish();
    analytics_.finish();
}

void LinuxPlatform::giveUp(std::string_view reason)
{
    const auto [calls, work] = workQueues_.unfinished();
    ledger_.count(ledger::Counter::CallsLostToEnd, calls);
    ledger_.count(ledger::Counter::WorkLostToEnd, work);
    const std::size_t events = analytics_.giveUp();
    ProviderLog(log_).error("the end was cut short: {}: given up: {} calls and ends of connections, {} items of "
                            "background work, {} events that were not stored yet",
                            reason, calls, work, events);
}

Platform LinuxPlatform::platform()
{
    return {.log = log_,
            .ledger = ledger_,
            .clock = clock_,
            .workQueues = workQueues_,
            .preferences = preferences_,
            .featureFlags = deviceSettings_,
            .deviceProperties = deviceSettings_,
            .processTable = processTable_,
            .notifications = notifications_,
            .analytics = analytics_,
            .traceEmitter = traceEmitter_,
            .reportingChannels = reportingChannels_,
            .bugCapture = bugCapture_,
            .kernelTrace = kernelTrace_,
            .performanceWriter = performanceWriter_,
            .fileSystem = fileSystem_,
            .memory = memory_};
}

} // namespace platform
