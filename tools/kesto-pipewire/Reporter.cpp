// SPDX-License-Identifier: Apache-2.0
// Three independent steps: events become pending changes; pending changes become due; due changes are reported in the
// order in which they happened.
#include "kesto-pipewire/Reporter.h"

#include <algorithm>
#include <cmath>
#include <limits>
#include <tuple>
#include <utility>

namespace kesto_pipewire {

namespace {

constexpr std::string_view noDevice = "none";
constexpr auto infinity = std::numeric_limits<double>::infinity();

double roundedToMilliseconds(double seconds)
{
    return std::round(seconds * 1000) / 1000;
}

Moment later(Moment left, Moment right)
{
    return left.uptime < right.uptime ? right : left;
}

std::string devicesText(const std::string& devices)
{
    return std::string(devices.empty() ? noDevice : devices);
}

void append(Payload& payload, const std::optional<StreamFormat>& format)
{
    if (!format)
        return;
    payload.emplace_back("session_selected_format", format->text);
    if (format->channels > 0)
        payload.emplace_back("mChannelsPerFrame", std::int64_t{format->channels});
}

} // namespace

ServiceType serviceTypeOfRole(std::string_view role)
{
    constexpr std::pair<std::string_view, ServiceType> types[] = {
        {"Phone", ServiceType::Telephony},
        {"Communication", ServiceType::Telephony},
        {"Notification", ServiceType::Alerts},
        {"Alarm", ServiceType::Alarms},
        {"Music", ServiceType::LongFormAudio},
        {"Movie", ServiceType::LongFormAudio},
        {"Game", ServiceType::NonLongFormAudio},
        {"Event", ServiceType::SystemSounds},
        {"Test", ServiceType::Test},
    };
    const auto* found = std::ranges::find(types, role, &std::pair<std::string_view, ServiceType>::first);
    return found == std::end(types) ? ServiceType::Generic : found->second;
}

bool Reporter::Stream::isKnownWhole() const
{
    return volume.current && format.current && !devices.current.empty();
}

Category Reporter::Stream::category() const
{
    return description.direction == Direction::Output ? Category::Playback : Category::Record;
}

Reporter::Reporter(ReportingService& service, ReporterID firstID, Alarm alarm, BeforeSampling beforeSampling)
    : service_(service),
      alarm_(std::move(alarm)),
      beforeSampling_(std::move(beforeSampling)),
      nextID_(firstID)
{
}

// Events of streams.

template <typename Action> void Reporter::update(StreamSerial serial, Moment when, Action action)
{
    const auto found = streams_.find(serial);
    if (found == streams_.end())
        return;
    action(found->second);
    reportDue(found->second, when);
    setAlarm();
}

void Reporter::appeared(StreamSerial serial, const StreamDescription& description, Moment when)
{
    Stream stream;
    stream.session = nextID_++;
    stream.description = description;
    stream.appearedAt = when;
    if (serviceIsThere_)
        openSession(stream);
    streams_.insert_or_assign(serial, std::move(stream));
}

void Reporter::runningChanged(StreamSerial serial, bool running, Moment when)
{
    update(serial, when, [&](Stream& stream) {
        if (!running && stream.running.current && !stream.running.reported)
            reportChanges(stream, infinity); // even the shortest run is reported
        // A stream stops a moment after its device has gone. Its Stop still names that device, so the device counts as
        // gone since then, also if the stream runs again at once: later changes may have been reported by that time.
        if (!running && stream.running.current && stream.devices.current.empty())
            stream.devices.changedAt = when;
        stream.running.observe(running, when);
    });
}

void Reporter::volumeChanged(StreamSerial serial, double volume, Moment when)
{
    update(serial, when, [&](Stream& stream) { stream.volume.observe(volume, when); });
}

void Reporter::formatChanged(StreamSerial serial, const StreamFormat& format, Moment when)
{
    update(serial, when, [&](Stream& stream) { stream.format.observe(format, when); });
}

void Reporter::devicesChanged(StreamSerial serial, const std::string& devices, Moment when)
{
    update(serial, when, [&](Stream& stream) {
        if (devices.empty() && stream.description.isFilter)
            settleLostFilter(stream);
        stream.devices.observe(devices, when);
    });
}

// A filter loses its links one by one, and the last one now. It has played with all its channels until then.
void Reporter::settleLostFilter(Stream& stream)
{
    if (stream.running.current && !stream.running.reported)
        reportChanges(stream, infinity); // even the shortest run is reported, with its devices
    if (stream.runs > 0)
        stream.format.current = stream.format.reported;
}

void Reporter::cycleWasLate(StreamSerial serial, Moment when)
{
    update(serial, when, [&](Stream& stream) {
        if (!stream.running.reported)
            return;
        if (!stream.episode)
            stream.episode = Episode{when, when, 0};
        stream.episode->last = when;
        ++stream.episode->cycles;
    });
}

void Reporter::gone(StreamSerial serial, Moment when)
{
    update(serial, when, [&](Stream& stream) {
        if (stream.devices.current.empty())
            stream.devices.current = stream.devices.reported; // its links have gone with it
        reportChanges(stream, infinity);
        stream.running.observe(false, when);
        reportChanges(stream, infinity);
        closeSession(stream, when);
    });
    streams_.erase(serial);
    setAlarm();
}

// Due changes.

Reporter::Changes Reporter::changesOf(const Stream& stream)
{
    Changes changes;
    const auto add = [&changes](const auto& fact, auto report, Moment when, double due) {
        if (!fact.isPending())
            return;
        const auto place =
            std::ranges::upper_bound(changes, when.uptime, {}, [](const Change& change) { return change.when.uptime; });
        changes.insert(place, {report, when, std::min(due, fact.pendingSince.uptime + longestHold)});
    };
    const auto& [running, volume, format, devices] =
        std::tie(stream.running, stream.volume, stream.format, stream.devices);
    const auto startsAtOnce =
        running.current && (stream.runs > 0 || (stream.isKnownWhole() && !stream.description.isFilter));
    const auto addRunning = [&] {
        add(stream.running, &Reporter::reportRunning, stream.running.changedAt,
            stream.running.changedAt.uptime + (startsAtOnce ? 0 : settlingTime));
    };
    if (!running.current || stream.runs == 0)
        addRunning();
    if (stream.runs == 0)
        return changes; // the first Start reports the others

    add(volume, &Reporter::reportVolume, volume.changedAt,
        std::max(volume.changedAt.uptime, volume.reportedSince.uptime + volumeInterval));
    add(format, &Reporter::reportFormat, format.changedAt, format.changedAt.uptime + settlingTime);
    add(devices, &Reporter::reportDevices, devices.changedAt, devices.changedAt.uptime + settlingTime);
    if (running.current)
        addRunning(); // a filter runs from the moment of its link: with the device, not before it
    return changes;
}

std::optional<double> Reporter::changesDue(const Stream& stream)
{
    const auto changes = changesOf(stream);
    return changes.empty() ? std::nullopt : std::optional(changes.front().due); // later changes wait for it
}

std::optional<double> Reporter::episodeDue(const Stream& stream)
{
    if (!stream.episode)
        return std::nullopt;
    return std::min(stream.episode->last.uptime + quietTime, stream.episode->first.uptime + longestEpisode);
}

void Reporter::reportDue(Stream& stream, Moment now)
{
    if (episodeDue(stream).value_or(infinity) <= now.uptime)
        reportEpisode(stream);
    reportChanges(stream, now.uptime);
}

void Reporter::settle(Moment now)
{
    for (auto& [serial, stream] : streams_)
        reportDue(stream, now);
    alarmTime_.reset(); // it has gone off
    setAlarm();
}

void Reporter::setAlarm()
{
    auto earliest = infinity;
    for (const auto& [serial, stream] : streams_)
        earliest = std::min({earliest, changesDue(stream).value_or(infinity), episodeDue(stream).value_or(infinity)});
    const auto time = earliest == infinity ? std::nullopt : std::optional(earliest);
    if (std::exchange(alarmTime_, time) != time)
        alarm_(time);
}

// Reports.

void Reporter::reportChanges(Stream& stream, double dueUntil)
{
    for (const auto& change : changesOf(stream)) {
        if (change.due > dueUntil)
            return;
        (this->*change.report)(stream, change.when);
    }
}

void Reporter::reportRunning(Stream& stream, Moment when)
{
    reportEpisode(stream);
    stream.running.setReported(when);
    if (stream.running.reported && ++stream.runs == 1) {
        stream.volume.setReported(when);
        stream.format.setReported(when);
        stream.devices.setReported(when);
    }
    sendRunning(stream, when);
}

void Reporter::reportVolume(Stream& stream, Moment when)
{
    stream.volume.setReported(when);
    send(stream, Category::Volume, EventType::State, {{"PomoSessionVolume", *stream.volume.reported}}, when);
}

void Reporter::reportFormat(Stream& stream, Moment when)
{
    stream.format.setReported(when);
    Payload message;
    append(message, stream.format.reported);
    send(stream, Category::Setup, EventType::State, std::move(message), when);
}

void Reporter::reportDevices(Stream& stream, Moment when)
{
    stream.devices.setReported(when);
    send(stream, Category::RouteChange, EventType::State, {{"active_devices", devicesText(stream.devices.reported)}},
         when);
}

void Reporter::reportEpisode(Stream& stream)
{
    const auto episode = std::exchange(stream.episode, std::nullopt);
    if (!episode)
        return;
    send(stream, Category::Error, EventType::IssueDetector,
         {{"issue", "late_cycles"},
          {"late_cycles", episode->cycles},
          {"issue_duration", roundedToMilliseconds(episode->last.uptime - episode->first.uptime)},
          {"active_devices", devicesText(stream.devices.reported)}},
         episode->last);
}

void Reporter::sendRunning(const Stream& stream, Moment when)
{
    const auto isOutput = stream.description.direction == Direction::Output;
    Payload message{{isOutput ? "session_output_running" : "session_input_running", stream.running.reported}};
    append(message, stream.format.reported);
    message.emplace_back("active_devices", devicesText(stream.devices.reported));
    if (stream.volume.reported)
        message.emplace_back("PomoSessionVolume", *stream.volume.reported);
    // Without it a second Start would repeat the first, and the service drops repetitions.
    message.emplace_back("session_run", stream.runs);
    send(stream, stream.category(), stream.running.reported ? EventType::Start : EventType::Stop, std::move(message),
         when);
}

void Reporter::send(const Stream& stream, Category category, EventType type, Payload message, Moment when)
{
    if (!serviceIsThere_)
        return;
    message.emplace_back("stream", stream.description.name);
    message.emplace_back("kestoreporting_timestamp", when.secondsSince1970);
    message.emplace_back("systemuptime_sec", std::int64_t{std::llround(when.uptime)});
    service_.send(stream.session, category, type, message);
}

// Sessions.

void Reporter::serviceAppeared()
{
    serviceIsThere_ = true;
    for (const auto& [serial, stream] : streams_) {
        openSession(stream);
        // The state is reported with the time since which it has not changed; the service got all earlier changes
        // before it went.
        if (stream.running.reported)
            sendRunning(stream,
                        later(later(stream.running.reportedSince, stream.volume.reportedSince),
                              later(stream.format.reportedSince, stream.devices.reportedSince)));
    }
}

void Reporter::serviceLost()
{
    serviceIsThere_ = false;
}

void Reporter::openSession(const Stream& stream)
{
    service_.create(stream.session);
    service_.setServiceType(stream.session, serviceTypeOfRole(stream.description.role));
    if (!stream.description.application.empty())
        service_.setConfiguration(stream.session, {{"HostApplicationDisplayID", stream.description.application}});
    beforeSampling_();
    service_.start(stream.session);
}

void Reporter::closeSession(const Stream& stream, Moment when)
{
    send(stream, stream.category(), EventType::Deactivate,
         {{"session_duration", roundedToMilliseconds(when.uptime - stream.appearedAt.uptime)}}, when);
    if (!serviceIsThere_)
        return;
    beforeSampling_();
    service_.stop(stream.session);
    service_.destroy(stream.session);
}

} // namespace kesto_pipewire
