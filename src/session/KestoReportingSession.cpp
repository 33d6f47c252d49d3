// SPDX-License-Identifier: Apache-2.0
// The session's life: creation, configuration, start, stop and teardown.
#include "session/KestoReportingSession.h"

#include "foundation/cbor/Cbor.h"
#include "foundation/text/Format.h"
#include "platform/Platform.h"
#include "tracing/TraceParams.h"
#include "tracing/TraceRunner.h"
#include "utility/KestoReportingUtility.h"
#include "utility/ServerQueue.h"
#include "utility/ServiceTraceCodes.h"

#include <cassert>
#include <utility>

namespace {

constinit std::atomic<std::uint64_t> runs{0};

// The part of the application's name that a log line shows: the client chooses the name, and one line lists all
// sessions.
std::string applicationText(const foundation::Dictionary& configuration)
{
    constexpr std::size_t longest = 256;
    return std::string(
        foundation::cutBetweenCharacters(KestoReportingUtilityRetrieveAppName(configuration).text(), longest));
}

// What a session takes besides what it has paid for, roughly: itself, and its places in the maps of sessions.
constexpr std::size_t bytesOfASession = sizeof(KestoReportingSession) + 256;

// What a snapshot takes, roughly.
std::size_t roughBytes(const session::DriverSnapShot& snapShot)
{
    std::size_t bytes = 0;
    for (const auto& [driver, sample] : snapShot)
        for (const platform::ReportingChannel& channel : sample.channels) {
            bytes += sizeof channel + channel.buckets.size() * sizeof(platform::HistogramBucket);
            for (const auto* text : {&channel.driver, &channel.group, &channel.subgroup, &channel.name, &channel.unit})
                bytes += text->has_value() ? (*text)->size() : 0;
            for (const platform::StateResidency& state : channel.states)
                bytes += sizeof state + state.name.size();
        }
    return bytes;
}

} // namespace

std::uint64_t KestoReportingSession::lastRunOfAll() noexcept
{
    return runs;
}

KestoReportingSession::KestoReportingSession(std::int64_t reporterID, std::vector<std::int32_t> processIdentifiers,
                                             std::shared_ptr<session::StorageBudget> budget, ledger::Culprit client)
    : applicationText_(applicationText({})),
      reporterID_(reporterID),
      processIdentifiers_(std::move(processIdentifiers)),
      client_(std::move(client)),
      budget_(std::move(budget)),
      configurationShare_(budget_),
      driverSnapShotShare_(budget_)
{
    KESTO_LOG(KestoReportingSessionCategory(), Info, "created reporting session for ID: {}", reporterID_);
    utility::emitTraceCode(utility::ServiceTraceCode::SessionCreated);
}

KestoReportingSession::~KestoReportingSession()
{
    utility::emitTraceCode(utility::ServiceTraceCode::SessionDestroyed);
    KESTO_LOG(KestoReportingSessionCategory(), Info, "deallocing this session {}", reporterID_);
    if (platform::isInstalled())
        platform::current().memory.letGo(bytesOfASession);
}

std::string KestoReportingSession::description() const
{
    const foundation::Lock lock(configurationLock_);
    return foundation::format("reporterID={},serviceName={},ownerPid={},HostApplicationDisplayID={},started={}",
                              reporterID_, serviceName_.empty() ? "(null)" : serviceName_,
                              processIdentifiers_.empty() ? 0 : processIdentifiers_.front(), applicationText_,
                              started_ ? 1 : 0);
}

// The client, in the session's application.
ledger::Culprit KestoReportingSession::culprit() const
{
    ledger::Culprit culprit = client_;
    const foundation::Lock lock(configurationLock_);
    culprit.application = applicationText_;
    return culprit;
}

void KestoReportingSession::setServiceType(AudioServiceType type)
{
    serviceType_ = type;
    serviceName_ = KestoReportingUtilityGenerateServiceNameFromServiceType(type);
    isAnnounced_ = false;
    KESTO_LOG(KestoReportingSessionCategory(), Info, "setting service type {}", serviceName_);
}

foundation::Dictionary KestoReportingSession::configuration() const
{
    const foundation::Lock lock(configurationLock_);
    return configuration_;
}

void KestoReportingSession::setConfiguration(const std::optional<foundation::Dictionary>& configuration)
{
    updateConfigurationWithContentsOfConfiguration(configuration);
}

void KestoReportingSession::updateConfigurationWithContentsOfConfiguration(
    const std::optional<foundation::Dictionary>& configuration)
{
    if (!configuration)
        return;
    const foundation::Lock lock(configurationLock_);
    foundation::Dictionary merged = configuration_.mergedWith(*configuration);
    if (foundation::cborSize(merged) > largestConfiguration) {
        platform::current().ledger.count(ledger::Counter::ConfigurationsRefused);
        KESTO_LOG(KestoReportingSessionCategory(), Error,
                  "configuration of session {} would take more than {} bytes; the change is ignored", reporterID_,
                  largestConfiguration);
        return;
    }
    if (!configurationShare_.resize(merged.roughBytes())) {
        platform::current().ledger.count(ledger::Counter::ConfigurationsRefused);
        KESTO_LOG(KestoReportingSessionCategory(), Error,
                  "no memory left for the configuration of session {}; the change is ignored", reporterID_);
        return;
    }
    configuration_ = std::move(merged);
    if (configuration->contains(utility::hostApplicationKey))
        applicationText_ = applicationText(configuration_);
    isAnnounced_ = isAnnounced_ && !configuration->contains(utility::hostApplicationKey);
}

void KestoReportingSession::setOwner(std::uint64_t source)
{
    utility::assertServerQueue();
    origin_ = {.source = source, .session = platform::nextOriginNumber()};
    created_ = platform::current().clock.secondsSince1970();
}

// With the first event, and again after a change: a client cannot cause more announcements than events.
platform::Origin KestoReportingSession::announcedOrigin(platform::Turn& turn)
{
    utility::assertServerQueue();
    mayPlay_ = origin_.session != 0;
    if (origin_.session == 0 || std::exchange(isAnnounced_, true))
        return origin_;
    wasAnnounced_ = true;
    const foundation::Lock lock(configurationLock_);
    turn.events.announce({.number = origin_.session,
                          .source = origin_.source,
                          .reporterID = reporterID_,
                          .serviceType = std::string(serviceName_),
                          .application = applicationText_,
                          .time = created_});
    return origin_;
}

void KestoReportingSession::announceEnd(platform::Turn& turn)
{
    utility::assertServerQueue();
    if (std::exchange(wasAnnounced_, false))
        turn.events.announceSessionEnd({origin_.session, platform::current().clock.secondsSince1970()});
}

void KestoReportingSession::announcePlayingEnd(platform::Turn& turn, platform::PlayingEnding ending)
{
    utility::assertServerQueue();
    if (std::exchange(mayPlay_, false))
        turn.events.announcePlayingEnd(origin_.session, platform::current().clock.secondsSince1970(), ending);
}

void KestoReportingSession::setDriverSnapShot(std::optional<session::DriverSnapShot> snapShot)
{
    utility::assertServerQueue();
    if (!driverSnapShotShare_.resize(snapShot ? roughBytes(*snapShot) : 0)) {
        platform::current().ledger.count(ledger::Counter::SnapShotsLost);
        KESTO_LOG(KestoReportingSessionCategory(), Error,
                  "no memory left for the drivers' snapshot of session {}; its driver statistics are lost",
                  reporterID_);
        snapShot.reset();
        driverSnapShotShare_.shrink(driverSnapShotShare_.bytes());
    }
    driverSnapShot_ = std::move(snapShot);
}

void KestoReportingSession::start()
{
    utility::assertServerQueue();
    KESTO_LOG(KestoReportingSessionCategory(), Debug, "starting session owned by {}", reporterID_);
    if (started_) {
        KESTO_LOG(KestoReportingSessionCategory(), Info, "{} is already started", reporterID_);
        return;
    }
    lastRun_ = ++runs;
    setStarted(true);
    {
        const foundation::Lock lock(runLock_);
        run_ = std::make_shared<session::Run>(reporterID_, budget_);
    }
    utility::emitTraceCode(utility::ServiceTraceCode::SessionStarted);
    startTracing();
}

// The session shares its run with the end, and counts as started until that is over.
void KestoReportingSession::stop(platform::Turn& turn)
{
    utility::assertServerQueue();
    KESTO_LOG(KestoReportingSessionCategory(), Debug, "ending session {}", reporterID_);
    if (!started_)
        return;
    const auto end = makeRunEnd();
    end->makeVolumeEvents();
    while (end->hasVolumeEvents())
        end->sendVolumeEvent(turn, shared_from_this());
    end->summarise();
    end->stopTrace();
    finishStop(turn, *end);
}

std::unique_ptr<session::RunEnd> KestoReportingSession::beginStop()
{
    utility::assertServerQueue();
    assert(started_);
    KESTO_LOG(KestoReportingSessionCategory(), Debug, "ending session {}", reporterID_);
    auto end = makeRunEnd();
    letGoOfMessages();
    setStarted(false);
    return end;
}

void KestoReportingSession::finishStop(platform::Turn& turn, session::RunEnd& end)
{
    utility::assertServerQueue();
    end.addTo(turn.tally);
    turn.tally.add(ledger::Counter::SessionsStopped);
    if (end.messagesLost() != 0)
        KESTO_LOG(KestoReportingSessionCategory(), Error, "session {} lost {} messages for lack of memory", reporterID_,
                  end.messagesLost());
    end.letGo();
    letGoOfMessages();
    setStarted(false);
}

std::unique_ptr<session::RunEnd> KestoReportingSession::makeRunEnd()
{
    KESTO_LOG(KestoReportingSessionCategory(), Debug, "ending session {}", reporterID_);
    utility::emitTraceCode(utility::ServiceTraceCode::SessionStopping);
    return std::make_unique<session::RunEnd>(session::RunEnd::Facts{.reporterID = reporterID_,
                                                                    .serviceType = serviceType_,
                                                                    .configuration = configuration(),
                                                                    .culprit = culprit(),
                                                                    .budget = budget_},
                                             run(), takeRunningTrace());
}

bool KestoReportingSession::takesLongToStop() const
{
    const auto run = this->run();
    const bool hasMessages = run && !run->store().empty();
    return startedTracing_ || (hasMessages && (hasManyMessages() || KestoReportingUtilityIsInternalBuild()));
}

// What ends sooner than another thread is woken, is not many. Ordinary messages of so many bytes take 0.1 ms, and those
// with as many different keys as there is room for, 2 ms.
bool KestoReportingSession::hasManyMessages() const
{
    constexpr std::size_t fewMessages = 512;
    constexpr std::size_t fewBytes = std::size_t{48} << 10;
    const auto run = this->run();
    return run && (run->store().size() > fewMessages || run->store().bytes() > fewBytes);
}

void KestoReportingSession::setStarted(bool started)
{
    if (std::exchange(started_, started) != started && startedObserver_)
        startedObserver_(started);
}

void KestoReportingSession::letGoOfMessages()
{
    const foundation::Lock lock(runLock_);
    run_.reset();
}

std::shared_ptr<session::Run> KestoReportingSession::run() const
{
    const foundation::Lock lock(runLock_);
    return run_;
}
