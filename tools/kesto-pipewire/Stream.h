// SPDX-License-Identifier: Apache-2.0
// A stream as plain data, and the interface that reports changes of streams.
//
// A stream is one player's or recorder's connection to PipeWire, or one direction of a filter's. These types separate
// the code for PipeWire from the code for the reporting service: neither includes the other.
#pragma once

#include "kesto-pipewire/Moment.h"

#include <cstdint>
#include <string>

namespace kesto_pipewire {

// PipeWire's `object.serial`. Object IDs are soon used again, serials never while the server lives.
using StreamSerial = std::uint64_t;

enum class Direction : std::uint8_t { Output, Input };

// The properties that never change in a stream's life.
struct StreamDescription {
    Direction direction = Direction::Output;
    std::string role{}; // PipeWire's `media.role`, such as "Music"; may be empty
    std::string application{}; // the player or recorder; may be empty
    std::string name{}; // tells it from the other streams of its application
    bool isFilter = false; // its channels are its links, which come and go one by one
};

struct StreamFormat {
    std::string text; // such as "S16LE/44100/2"
    int channels = 0;
    friend bool operator==(const StreamFormat&, const StreamFormat&) = default;
};

// Gets the events of streams, in their order: `appeared`, any number of others, `gone`. An event may repeat a known
// state.
class StreamListener {
public:
    virtual ~StreamListener() = default;

    virtual void appeared(StreamSerial stream, const StreamDescription& description, Moment when) = 0;
    virtual void runningChanged(StreamSerial stream, bool running, Moment when) = 0;
    // From 0 to 1 on the scale of the user's slider; 0 when muted.
    virtual void volumeChanged(StreamSerial stream, double volume, Moment when) = 0;
    virtual void formatChanged(StreamSerial stream, const StreamFormat& format, Moment when) = 0;
    // The names of the linked devices, sorted and joined with ","; empty without a device.
    virtual void devicesChanged(StreamSerial stream, const std::string& devices, Moment when) = 0;
    // The stream was not ready in time in the cycle that began then, and had not just started.
    virtual void cycleWasLate(StreamSerial stream, Moment when) = 0;
    virtual void gone(StreamSerial stream, Moment when) = 0;
};

} // namespace kesto_pipewire
