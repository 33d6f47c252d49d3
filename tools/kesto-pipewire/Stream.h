// What there is to know of a stream, as plain data, and the way changes of it are told.
//
// A stream is one player's or recorder's connection to PipeWire. This vocabulary stands between the side
// that speaks PipeWire and the side that speaks to the reporting service: neither includes the other.
#pragma once

#include "kesto-pipewire/Moment.h"

#include <cstdint>
#include <string>

namespace kesto_pipewire {

// PipeWire's `object.serial`. Object IDs are used again at once, serials never while the server lives.
using StreamSerial = std::uint64_t;

enum class Direction : std::uint8_t { Output, Input };

// What never changes in a stream's life.
struct StreamDescription {
    Direction direction = Direction::Output;
    std::string role{}; // PipeWire's `media.role`, such as "Music"; may be empty
    std::string application{}; // who plays or records; may be empty
};

struct StreamFormat {
    std::string text; // such as "S16LE/44100/2"
    int channels = 0;
    friend bool operator==(const StreamFormat&, const StreamFormat&) = default;
};

// Hears of streams, in the order of what happened: `appeared`, any number of others, `gone`. What is told may
// repeat what is known already.
class StreamListener {
public:
    virtual ~StreamListener() = default;

    virtual void appeared(StreamSerial stream, const StreamDescription& description, Moment when) = 0;
    virtual void runningChanged(StreamSerial stream, bool running, Moment when) = 0;
    // From 0 to 1 on the scale of the user's slider; 0 when muted.
    virtual void volumeChanged(StreamSerial stream, double volume, Moment when) = 0;
    virtual void formatChanged(StreamSerial stream, const StreamFormat& format, Moment when) = 0;
    // The names of the devices it is linked with, sorted and joined with ","; empty when there is none.
    virtual void devicesChanged(StreamSerial stream, const std::string& devices, Moment when) = 0;
    // The stream was not ready in time in the cycle that began then, and was not just setting off.
    virtual void cycleWasLate(StreamSerial stream, Moment when) = 0;
    virtual void gone(StreamSerial stream, Moment when) = 0;
};

} // namespace kesto_pipewire
