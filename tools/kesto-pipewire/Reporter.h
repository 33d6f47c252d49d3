// What is reported of streams, and when: one session a stream, from its appearance to its end.
//
// PipeWire tells every step, the reporter what a listener would notice. When a device is plugged in, streams
// stop, lose their links, get new ones and run again within a few milliseconds; that is a change of route and
// no pause. So a change waits a moment for what follows it, and what has come undone by then never happened.
// What did happen is told in the order and with the times at which it happened, however late.
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
constexpr double settlingTime = 0.1; // a stop, a device or a format counts when it has lasted that long
constexpr double volumeInterval = 0.1; // a slider on the move is told no more often
constexpr double longestHold = 1; // what never settles is told as it is after that long
constexpr double quietTime = 2; // an episode of late cycles ends when there was none for that long
constexpr double longestEpisode = 60; // trouble without end is told once in that time

class Reporter : public StreamListener {
public:
    // Tells when `settle` is to be called next, as an uptime; nothing means not before something happens.
    using Alarm = std::function<void(std::optional<double> uptime)>;
    // Called before a session starts or ends, when the service samples what the devices have done.
    using BeforeSampling = std::function<void()>;

    // Sessions get the IDs from `firstID` upwards, which is greater than 0. The service outlives this.
    Reporter(ReportingService& service, ReporterID firstID, Alarm alarm, BeforeSampling beforeSampling = [] { });

    // The service can be reached from now on and knows nothing: every stream gets a session that begins with
    // the state it is in. Without a service, streams are followed and nothing is reported.
    void serviceAppeared();
    void serviceLost();

    // Reports what is due.
    void settle(Moment now);

    void appeared(StreamSerial serial, const StreamDescription& description, Moment when) override;
    void runningChanged(StreamSerial serial, bool running, Moment when) override;
    void volumeChanged(StreamSerial serial, double volume, Moment when) override;
    void formatChanged(StreamSerial serial, const StreamFormat& format, Moment when) override;
    void devicesChanged(StreamSerial serial, const std::string& devices, Moment when) override;
    void cycleWasLate(StreamSerial serial, Moment when) override;
    void gone(StreamSerial serial, Moment when) override;

private:
    // Something that changes: as it is, and as it was last told.
    template <typename Value> struct Fact {
        Value current{};
        Value told{};
        Moment changedAt; // when it became what it is
        Moment toldSince; // since when it is so, by what was told
        Moment pendingSince; // since when it is not what was told

        void observe(Value value, Moment when)
        {
            if (value == current)
                return;
            if (!isPending())
                pendingSince = when;
            current = std::move(value);
            changedAt = when;
        }
        [[nodiscard]] bool isPending() const { return current != told; }
        void tell(Moment since)
        {
            told = current;
            toldSince = since;
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
        std::int64_t runs = 0; // how often it has begun to run
        std::optional<Episode> episode;

        [[nodiscard]] bool isKnownWhole() const;
        [[nodiscard]] Category category() const;
    };

    // A difference between what is and what was told.
    struct Change {
        void (Reporter::*tell)(Stream&, Moment);
        Moment when;
        double due = 0; // not to be told before, as an uptime; nor before those that happened before
    };
    using Changes = std::vector<Change>; // in the order in which they happened

    [[nodiscard]] static Changes changesOf(const Stream& stream);
    [[nodiscard]] static std::optional<double> changesDue(const Stream& stream);
    [[nodiscard]] static std::optional<double> episodeDue(const Stream& stream);

    // Runs the action on the stream, if it is known, reports what is then due and sets the alarm.
    template <typename Action> void update(StreamSerial serial, Moment when, Action action);
    void setAlarm();

    void tellDue(Stream& stream, Moment now);
    void tellChanges(Stream& stream, double dueUntil);
    void tellRunning(Stream& stream, Moment when);
    void tellVolume(Stream& stream, Moment when);
    void tellFormat(Stream& stream, Moment when);
    void tellDevices(Stream& stream, Moment when);
    void tellEpisode(Stream& stream);

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

// The service type that stands for a `media.role`.
[[nodiscard]] ServiceType serviceTypeOfRole(std::string_view role);

} // namespace kesto_pipewire
