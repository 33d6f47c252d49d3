// SPDX-License-Identifier: Apache-2.0
// Reports streams: one session for each stream, from its appearance to its end.
//
// PipeWire reports every step, the reporter only changes that a listener would notice. When a device is plugged in,
// streams stop, lose their links, get new ones and run again within a few milliseconds; that is a change of route, not
// a pause. So a change waits a moment, and is dropped if it is undone by then. Other changes are reported in their
// order and with the times at which they happened.
//
// Pure logic: no clock, no sockets. All of it on one thread.
#pragma once

#include "kesto-pipewire/ReportingService.h"
#include "kesto-pipewire/Stream.h"

#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace kesto_pipewire {

// Seconds.
constexpr double settlingTime = 0.1; // a stop, a device or a format counts after it has lasted this long
constexpr double volumeInterval = 0.1; // the shortest time between two reports of a moving slider
constexpr double longestHold = 1; // a change that never settles is reported after this time
constexpr double quietTime = 2; // an episode of late cycles ends after this time without one
constexpr double longestEpisode = 60; // a longer episode is reported in parts of this length

class Reporter : public StreamListener {
public:
    // Gets the uptime of the next call of `settle`; nothing means that none is needed before the next event.
    using Alarm = std::function<void(std::optional<double> uptime)>;
    // Called before a session starts or ends, because the service then samples the devices' channels.
    using BeforeSampling = std::function<void()>;

    // Sessions get the IDs from `firstID` upwards, which is greater than 0. The service must outlive the reporter.
    Reporter(ReportingService& service, ReporterID firstID, Alarm alarm, BeforeSampling beforeSampling = [] { });

    // From now on the service can be reached, and has no sessions: every stream gets a session that begins with its
    // present state. Without a service the reporter follows streams but does not report.
    void serviceAppeared();
    void serviceLost();

    // Reports due changes.
    void settle(Moment now);

    void appeared(StreamSerial serial, const StreamDescription& description, Moment when) override;
    void runningChanged(StreamSerial serial, bool running, Moment when) override;
    void volumeChanged(StreamSerial serial, double volume, Moment when) override;
    void formatChanged(StreamSerial serial, const StreamFormat& format, Moment when) override;
    void devicesChanged(StreamSerial serial, const std::string& devices, Moment when) override;
    void cycleWasLate(StreamSerial serial, Moment when) override;
    void gone(StreamSerial serial, Moment when) override;

private:
    // A value that changes: the current one and the last reported one.
    template <typename Value> struct Fact {
        Value current{};
        Value reported{};
        Moment changedAt; // when the current value began
        Moment reportedSince; // when the reported value began
        Moment pendingSince; // since when the two differ

        void observe(Value value, Moment when)
        {
            if (value == current)
                return;
            if (!isPending())
                pendingSince = when;
            current = std::move(value);
            changedAt = when;
        }
        [[nodiscard]] bool isPending() const { return current != reported; }
        void setReported(Moment since)
        {
            reported = current;
            reportedSince = since;
        }
    };

    struct Episode {
        Moment first;
        Moment last;
        std::int64_t cycles = 0;
    };

    struct Stream {
        ReporterID session = 0;
        StreamDescription description;
        Moment appearedAt;
        Fact<bool> running;
        Fact<std::optional<double>> volume;
        Fact<std::optional<StreamFormat>> format;
        Fact<std::string> devices;
        std::int64_t runs = 0; // how often it has started to run
        std::optional<Episode> episode;

        [[nodiscard]] bool isKnownWhole() const;
        [[nodiscard]] Category category() const;
    };

    // A difference between a current and a reported value.
    struct Change {
        void (Reporter::*report)(Stream&, Moment);
        Moment when;
        double due = 0; // the earliest uptime of its report; earlier changes go first
    };
    using Changes = std::vector<Change>; // in the order in which they happened

    [[nodiscard]] static Changes changesOf(const Stream& stream);
    [[nodiscard]] static std::optional<double> changesDue(const Stream& stream);
    [[nodiscard]] static std::optional<double> episodeDue(const Stream& stream);

    // Runs the action on the stream, if it is known, reports due changes and sets the alarm.
    template <typename Action> void update(StreamSerial serial, Moment when, Action action);
    void setAlarm();

    void settleLostFilter(Stream& stream);
    void reportDue(Stream& stream, Moment now);
    void reportChanges(Stream& stream, double dueUntil);
    void reportRunning(Stream& stream, Moment when);
    void reportVolume(Stream& stream, Moment when);
    void reportFormat(Stream& stream, Moment when);
    void reportDevices(Stream& stream, Moment when);
    void reportEpisode(Stream& stream);

    void openSession(const Stream& stream);
    void closeSession(const Stream& stream, Moment when);
    void sendRunning(const Stream& stream, Moment when);
    void send(const Stream& stream, Category category, EventType type, Payload message, Moment when);

    ReportingService& service_;
    Alarm alarm_;
    BeforeSampling beforeSampling_;
    ReporterID nextID_;
    bool serviceIsThere_ = false;
    std::optional<double> alarmTime_;
    std::map<StreamSerial, Stream> streams_;
};

// The service type of a `media.role`.
[[nodiscard]] ServiceType serviceTypeOfRole(std::string_view role);

} // namespace kesto_pipewire
