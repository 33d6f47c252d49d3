// SPDX-License-Identifier: Apache-2.0
// A listener that records the events of streams as lines of text.
#pragma once

#include "kesto-pipewire/Stream.h"

#include <fmt/format.h>

#include <string>
#include <utility>
#include <vector>

namespace kesto_pipewire {

class RecordingStreamListener : public StreamListener {
public:
    void appeared(StreamSerial stream, const StreamDescription& description, Moment) override
    {
        hear(stream,
             fmt::format("appeared {} role={} application={}",
                         description.direction == Direction::Output ? "output" : "input", description.role,
                         description.application));
        descriptions.push_back(description);
    }
    void runningChanged(StreamSerial stream, bool running, Moment) override
    {
        hear(stream, running ? "runs" : "halts");
    }
    void volumeChanged(StreamSerial stream, double volume, Moment) override
    {
        hear(stream, fmt::format("volume {}", volume));
    }
    void formatChanged(StreamSerial stream, const StreamFormat& format, Moment) override
    {
        hear(stream, fmt::format("format {} {}", format.text, format.channels));
    }
    void devicesChanged(StreamSerial stream, const std::string& devices, Moment) override
    {
        hear(stream, fmt::format("devices '{}'", devices));
    }
    void cycleWasLate(StreamSerial stream, Moment) override { hear(stream, "late"); }
    void gone(StreamSerial stream, Moment) override { hear(stream, "gone"); }

    // The events since the last call, such as "500 runs".
    std::vector<std::string> news() { return std::exchange(heard_, {}); }

    std::vector<StreamDescription> descriptions; // of all that have appeared

private:
    void hear(StreamSerial stream, const std::string& what) { heard_.push_back(fmt::format("{} {}", stream, what)); }

    std::vector<std::string> heard_;
};

} // namespace kesto_pipewire
