// SPDX-License-Identifier: Apache-2.0
// A session's messages for a person who reads them one after the other: the time of each, its differences from the
// previous message of its kind, the stretches of sound, and the volume events that the service computed.
#pragma once

#include "foundation/values/Value.h"

#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

// A stretch in which sound ran, in seconds since the session's first time stamp.
struct Stretch {
    double begin = 0;
    double end = 0;
    friend bool operator==(const Stretch&, const Stretch&) = default;
};

// Times are those of the messages, unchanged: they may be missing, and they may decrease.
class Timeline {
public:
    // The stretches of sound according to one key of the messages.
    class Sound {
    public:
        explicit Sound(std::string_view key) : key_(key) { }
        void add(const foundation::Dictionary& payload, double time);
        [[nodiscard]] bool isRunning() const { return isRunning_; }
        // The ended stretches and, if sound still runs, the present one up to that time.
        [[nodiscard]] std::vector<Stretch> stretches(double now) const;

    private:
        std::string_view key_;
        bool isRunning_ = false;
        double begin_ = 0;
        std::vector<Stretch> ended_;
    };

    enum class Run : std::uint8_t { Silent, Begins, GoesOn, Ends };

    struct Row {
        std::optional<double> time; // in seconds since the first
        std::string kind; // "Playback Start"
        std::string changes; // "key=value key=old→new -gone"
        Run run = Run::Silent;
    };

    // Adds the next message. Its identifier is its kind and number, such as "Playback_Start_1"; false if it has another
    // form. Volume events have no rows, because they describe the whole session.
    [[nodiscard]] bool add(std::string_view identifier, const foundation::Dictionary& payload, std::optional<Row>& row);

    [[nodiscard]] std::size_t messages() const { return messages_; }
    // In seconds since 1970.
    [[nodiscard]] std::optional<double> start() const { return start_; }
    // The time of the last message that has one, in seconds since the start.
    [[nodiscard]] double end() const { return now_; }
    [[nodiscard]] std::vector<Stretch> played() const { return output_.stretches(now_); }
    [[nodiscard]] std::vector<Stretch> recorded() const { return input_.stretches(now_); }
    [[nodiscard]] const std::vector<foundation::Dictionary>& volumeEvents() const { return volumeEvents_; }

private:
    [[nodiscard]] std::string changes(std::string_view kind, const foundation::Dictionary& payload);

    std::size_t messages_ = 0;
    std::optional<double> start_;
    double now_ = 0;
    Sound output_{"session_output_running"};
    Sound input_{"session_input_running"};
    std::map<std::string, foundation::Dictionary, std::less<>> lastOfKind_;
    std::vector<foundation::Dictionary> volumeEvents_;
};
