// SPDX-License-Identifier: Apache-2.0
// Arguments are checked here and not by the client's thread, so that the caller learns at once that they are wrong.
#include "calls/StreamHandle.h"

#include "foundation/values/String.h"

#include <cstring>

namespace libkesto {
namespace {

bool isUsable(const kesto_format& format) noexcept
{
    return format.encoding != nullptr && *format.encoding != '\0';
}

// The text, cut between characters. Reads no further than a little behind the cut.
std::string_view cut(const char* text, std::size_t longest) noexcept
{
    return foundation::cutBetweenCharacters({text, ::strnlen(text, longest + 1)}, longest);
}

// Whether a quantity makes sense; NaN does not.
bool isPossible(double quantity) noexcept
{
    return quantity >= 0;
}

} // namespace

StreamHandle::StreamHandle(kesto_client& client, Direction direction, std::string_view application,
                           kesto_service_type type)
    : client_(client),
      stream_(client.createStream(direction, application, type))
{
}

StreamHandle::~StreamHandle()
{
    client_.freeStream(stream_);
}

kesto_status StreamHandle::start(const kesto_format* format, const char* device) noexcept
{
    return format != nullptr && !isUsable(*format) ? refuse() : put({.action = StreamAction::Start}, device, format);
}

kesto_status StreamHandle::volume(double volume) noexcept
{
    return isPossible(volume) ? put({.action = StreamAction::Volume, .number = volume}) : refuse();
}

kesto_status StreamHandle::mute(bool isMuted) noexcept
{
    return put({.action = StreamAction::Mute, .isMuted = isMuted});
}

kesto_status StreamHandle::route(const char* device) noexcept
{
    return put({.action = StreamAction::Route}, device == nullptr ? "" : device);
}

kesto_status StreamHandle::format(const kesto_format* format) noexcept
{
    return format != nullptr && isUsable(*format) ? put({.action = StreamAction::Format}, nullptr, format) : refuse();
}

kesto_status StreamHandle::fault(std::uint64_t cycles, double seconds) noexcept
{
    return isPossible(seconds) ? put({.action = StreamAction::Fault, .number = seconds, .cycles = cycles}) : refuse();
}

kesto_status StreamHandle::put(StreamRecord record, const char* device, const kesto_format* format) noexcept
{
    record.stream = &stream_;
    std::string_view deviceText;
    if (device != nullptr) {
        deviceText = cut(device, KESTO_LONGEST_DEVICE);
        record.hasDevice = true;
        record.deviceBytes = static_cast<std::uint16_t>(deviceText.size());
    }
    std::string_view encoding;
    if (format != nullptr) {
        encoding = cut(format->encoding, KESTO_LONGEST_ENCODING);
        record.hasFormat = true;
        record.rate = format->rate;
        record.channels = format->channels;
    }
    return client_.putStreamRecord(record, deviceText, encoding);
}

kesto_status StreamHandle::refuse() noexcept
{
    client_.countUnusable();
    return KESTO_INVALID_ARGUMENT;
}

} // namespace libkesto
