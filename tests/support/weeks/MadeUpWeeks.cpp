// SPDX-License-Identifier: Apache-2.0
// Each session is lived through from its beginning to its end, and leaves stretches, faults and messages on its way.
// What would lie behind the present is cut off.
#include "support/weeks/MadeUpWeeks.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <numbers>
#include <random>
#include <span>
#include <utility>

namespace weeks {
namespace {

constexpr double minute = 60;
constexpr double hour = 60 * minute;
constexpr double day = 24 * hour;

// The distributions of the standard library differ from one library to the next; these do not.
class Dice {
public:
    explicit Dice(std::uint32_t seed) : engine_(seed) { }

    double between(double low, double high) { return low + (high - low) * engine_() / 4294967296.0; }
    bool happens(double probability) { return between(0, 1) < probability; }
    std::size_t below(std::size_t count) { return static_cast<std::size_t>(between(0, static_cast<double>(count))); }
    double exponential(double mean) { return -mean * std::log(1 - between(0, 1)); }
    double normal()
    {
        const double radius = std::sqrt(-2 * std::log(1 - between(0, 1)));
        return radius * std::cos(between(0, 2 * std::numbers::pi));
    }
    std::size_t weighted(std::span<const double> weights)
    {
        double sum = 0;
        for (const double weight : weights)
            sum += weight;
        double left = between(0, sum);
        for (std::size_t index = 0; index + 1 < weights.size(); ++index)
            if ((left -= weights[index]) < 0)
                return index;
        return weights.size() - 1;
    }

private:
    std::mt19937 engine_;
};

constexpr const char* speaker = "alsa_output.pci-0000_00_1f.3.analog-stereo";
constexpr const char* headset = "bluez_output.94_DB_56_00_11_22.1";
constexpr const char* converter = "alsa_output.usb-Acme_DAC-00.analog-stereo";
constexpr const char* television = "alsa_output.pci-0000_01_00.1.hdmi-stereo";
constexpr const char* speakerAndTelevision =
    "alsa_output.pci-0000_00_1f.3.analog-stereo,alsa_output.pci-0000_01_00.1.hdmi-stereo";
constexpr const char* microphone = "alsa_input.pci-0000_00_1f.3.analog-stereo";

struct Output {
    const char* devices;
    double weight;
};

struct Application {
    const char* name;
    const char* service;
    const char* process;
    double weight;
    double medianSeconds;
    double spread; // of the logarithm
    const char* format;
    double volume; // negative: it never tells one
    double firstHour, lastHour; // of the day, in which it begins most often; behind 24 is the next day
    std::array<Output, 3> outputs;
};

constexpr std::size_t musicIndex = 0;
constexpr std::size_t browserIndex = 1;
constexpr std::size_t callIndex = 3;
const std::array<Application, 5> applications{{
    {"org.example.Music",
     "longformaudio",
     "music",
     20,
     25 * minute,
     0.9,
     "S32LE/96000/2",
     0.42,
     16,
     25.5,
     {{{converter, 6}, {headset, 4}, {speaker, 3}}}},
    {"org.example.Browser",
     "generic",
     "browser",
     30,
     6 * minute,
     1.2,
     "F32LE/48000/2",
     0.55,
     9,
     24,
     {{{speaker, 6}, {headset, 3}, {television, 2}}}},
    {"org.example.Game",
     "nonlongformaudio",
     "game.x86_64",
     6,
     45 * minute,
     0.6,
     "F32LE/48000/6",
     0.63,
     18,
     25,
     {{{television, 6}, {headset, 2}, {speakerAndTelevision, 2}}}},
    {"org.example.Call",
     "telephony",
     "call",
     8,
     28 * minute,
     0.5,
     "S16LE/16000/1",
     0.74,
     8,
     18,
     {{{headset, 7}, {speaker, 2}, {headset, 1}}}},
    {"desktop-sounds",
     "systemsounds",
     "sounds",
     30,
     3,
     0.5,
     "S16LE/44100/2",
     -1,
     8,
     24,
     {{{speaker, 8}, {headset, 2}, {speaker, 1}}}},
}};

double faultsAnHour(const std::string& devices, bool isBad)
{
    return devices == converter ? (isBad ? 2.5 : 0.1) : devices == headset ? 1.0 : 0.15;
}

class Life {
public:
    Life(Weeks& weeks, Dice& dice, const Wish& wish) : weeks_(weeks), dice_(dice), wish_(wish) { }

    // Nothing: it would have begun in the future.
    void live(const Application& application, double begins, double plays, bool isRecording)
    {
        application_ = &application;
        isRecording_ = isRecording;
        time_ = begins;
        weeks_.sessions.push_back({.id = static_cast<std::int64_t>(weeks_.sessions.size()) + 1,
                                   .application = application.name,
                                   .service = application.service,
                                   .process = application.process,
                                   .user = 1000,
                                   .processID = static_cast<std::int64_t>(1000 + dice_.below(30000)),
                                   .began = begins});
        chooseDevices();
        volume_ = application.volume < 0 ? std::nullopt : std::optional(aVolumeNear(application.volume));
        const double fate = dice_.between(0, 1);
        const bool isVanishing = fate < 0.02;
        const bool isInterrupted = fate >= 0.02 && fate < 0.03;
        const std::size_t runs = plays < 5 * minute ? 1 : 1 + dice_.below(4);
        for (std::size_t run = 0; run < runs; ++run) {
            const bool isLast = run + 1 == runs;
            playOnce(plays / static_cast<double>(runs), isLast && isVanishing ? Ending::Vanished : Ending::Stopped);
            if (!isLast) // now and then the player stays open until the next day
                time_ += dice_.happens(0.04) ? dice_.between(3 * hour, 12 * hour) : dice_.exponential(4 * minute);
        }
        if (!isVanishing && !isInterrupted)
            say(MessageKind::Deactivate, time_ - begins);
        if (time_ < weeks_.now)
            session().ended = time_;
    }

    // The kill of the service ends the stretch. The session has no end.
    void liveUntilTheServiceIsKilled(double begins, double plays)
    {
        const std::size_t first = weeks_.stretches.size();
        live(applications[musicIndex], begins, plays, false);
        if (weeks_.stretches.size() == first || !session().ended)
            return;
        session().ended.reset();
        weeks_.stretches.back().ending = Ending::ServiceEnded;
        const double end = weeks_.stretches.back().began + weeks_.stretches.back().seconds;
        std::erase_if(weeks_.messages, [&](const Message& message) {
            return message.session == session().id && message.happened >= end;
        });
    }

private:
    Session& session() { return weeks_.sessions.back(); }

    void chooseDevices()
    {
        std::array<double, 3> weights{};
        for (std::size_t index = 0; index < weights.size(); ++index)
            weights[index] = application_->outputs[index].weight;
        devices_ = isRecording_ ? microphone : application_->outputs[dice_.weighted(weights)].devices;
        if (application_ == &applications[browserIndex] && dice_.happens(0.03))
            devices_.clear();
    }

    // With four decimals, as every client tells it.
    double aVolumeNear(double volume)
    {
        return std::round(std::clamp(volume + 0.15 * dice_.normal(), 0.02, 1.0) * 1e4) / 1e4;
    }

    void say(MessageKind kind, double number = 0)
    {
        if (time_ < weeks_.now)
            weeks_.messages.push_back({kind, isRecording_, session().id, time_, number});
    }

    void cut(double began, Ending ending)
    {
        if (began >= weeks_.now || time_ <= began)
            return;
        const bool isRunning = time_ >= weeks_.now;
        weeks_.stretches.push_back({.session = session().id,
                                    .isRecording = isRecording_,
                                    .began = began,
                                    .seconds = std::min(time_, weeks_.now) - began,
                                    .devices = devices_,
                                    .format = application_->format,
                                    .volume = volume_,
                                    .ending = isRunning ? Ending::None : ending});
        addFaults(began, std::min(time_, weeks_.now));
    }

    void addFaults(double from, double until)
    {
        const bool isBad = from > weeks_.now - 6 * day && from < weeks_.now - 3 * day;
        const double mean = hour / faultsAnHour(devices_, isBad);
        for (double at = from + dice_.exponential(mean); at < until; at += dice_.exponential(mean)) {
            const auto cycles = static_cast<std::int64_t>(1 + dice_.exponential(14));
            weeks_.faults.push_back({session().id, at, devices_, cycles});
            weeks_.messages.push_back(
                {MessageKind::Fault, isRecording_, session().id, at, static_cast<double>(cycles)});
        }
    }

    void playOnce(double seconds, Ending ending)
    {
        say(MessageKind::Start);
        const double end = time_ + seconds;
        for (std::size_t told = 0; told < wish_.idleMessages; ++told)
            weeks_.messages.push_back({MessageKind::Idle, isRecording_, session().id,
                                       std::min(time_ + dice_.between(0, seconds), weeks_.now - 1), 0});
        while (seconds > 20 && dice_.happens(0.3)) {
            const double began = time_;
            const double change = dice_.between(time_, end);
            time_ = change;
            cut(began, Ending::Change);
            if (volume_ && dice_.happens(0.8)) {
                volume_ = dice_.happens(0.1) ? 0 : aVolumeNear(application_->volume);
                say(MessageKind::Volume, *volume_);
            } else if (!isRecording_) {
                chooseDevices();
                say(MessageKind::Route);
            }
        }
        const double began = time_;
        time_ = end;
        cut(began, ending);
        if (ending == Ending::Stopped)
            say(MessageKind::Stop);
    }

    Weeks& weeks_;
    Dice& dice_;
    const Wish& wish_;
    const Application* application_ = nullptr;
    bool isRecording_ = false;
    double time_ = 0;
    std::string devices_;
    std::optional<double> volume_;
};

double aBeginning(Dice& dice, const Wish& wish, const Application& application)
{
    const double midnight = wish.midnights[dice.below(wish.midnights.size() - 1)];
    return midnight + dice.between(application.firstHour, application.lastHour) * hour;
}

void addSession(Life& life, Dice& dice, const Wish& wish)
{
    std::array<double, applications.size()> weights{};
    for (std::size_t index = 0; index < weights.size(); ++index)
        weights[index] = applications[index].weight;
    const std::size_t chosen = dice.weighted(weights);
    const Application& application = applications[chosen];
    const double begins = std::min(aBeginning(dice, wish, application), wish.midnights.back() - minute);
    const double plays = std::min(application.medianSeconds * std::exp(application.spread * dice.normal()), 6 * hour);
    life.live(application, begins, plays, chosen == callIndex && dice.happens(0.3));
}

} // namespace

std::vector<double> midnightsBefore(double end, std::size_t days)
{
    std::vector<double> midnights(days + 1);
    for (std::size_t index = 0; index <= days; ++index)
        midnights[index] = end - day * static_cast<double>(days - index);
    return midnights;
}

Weeks makeWeeks(const Wish& wish)
{
    Weeks weeks;
    weeks.now = wish.midnights.back();
    Dice dice(wish.seed);
    Life life(weeks, dice, wish);
    // What every made-up time has, however few its sessions are; the rest is left to chance.
    const double lastMidnight = wish.midnights[wish.midnights.size() - 2];
    life.live(applications[musicIndex], weeks.now - 25 * minute, 4 * minute, false);
    life.live(applications[musicIndex], weeks.now - 2 * minute, 4 * minute, false); // plays at the end
    life.live(applications[browserIndex], lastMidnight + 10 * hour, 4 * minute, false);
    life.live(applications[browserIndex], lastMidnight + 10 * hour + minute, 4 * minute, false); // at once with it
    life.live(applications[callIndex], lastMidnight + 11 * hour, hour, true);
    life.live(applications[musicIndex], lastMidnight - hour, 90 * minute, false); // over midnight
    life.liveUntilTheServiceIsKilled(lastMidnight + 13 * hour, 2 * minute);
    while (weeks.sessions.size() < wish.sessions)
        addSession(life, dice, wish);
    std::ranges::stable_sort(weeks.messages, {}, &Message::happened);
    return weeks;
}

} // namespace weeks
