// SPDX-License-Identifier: Apache-2.0
// Implements playback.h with the classes of the library: a null stream is one of a closed client, and no exception gets
// out.
#include "kesto/playback.h"

#include "calls/StreamHandle.h"

#include <new>

struct kesto_playback final : libkesto::StreamHandle {
    using StreamHandle::StreamHandle;
};

struct kesto_recording final : libkesto::StreamHandle {
    using StreamHandle::StreamHandle;
};

namespace {

using libkesto::Direction;

template <typename Handle>
kesto_status create(kesto_client* client, Direction direction, const char* application, kesto_service_type type,
                    Handle** handle) noexcept
try {
    if (handle == nullptr)
        return KESTO_INVALID_ARGUMENT;
    *handle = nullptr;
    if (client == nullptr)
        return KESTO_CLOSED;
    if (application == nullptr || *application == '\0')
        return KESTO_INVALID_ARGUMENT;
    *handle = new Handle(*client, direction, application, type);
    return KESTO_OK;
} catch (const std::bad_alloc&) {
    return KESTO_OUT_OF_MEMORY;
}

// Calls the function of the handle.
template <typename Handle, typename... Parameters, typename... Arguments>
kesto_status call(Handle* handle, kesto_status (libkesto::StreamHandle::*function)(Parameters...) noexcept,
                  Arguments... arguments) noexcept
{
    return handle == nullptr ? KESTO_CLOSED : (handle->*function)(arguments...);
}

using Stream = libkesto::StreamHandle;

} // namespace

kesto_status kesto_playback_create(kesto_client* client, const char* application, kesto_service_type service_type,
                                   kesto_playback** playback)
{
    return create(client, Direction::Output, application, service_type, playback);
}

kesto_status kesto_playback_start(kesto_playback* playback, const kesto_format* format, const char* device)
{
    return call(playback, &Stream::start, format, device);
}

kesto_status kesto_playback_volume(kesto_playback* playback, double volume)
{
    return call(playback, &Stream::volume, volume);
}

kesto_status kesto_playback_mute(kesto_playback* playback, bool muted)
{
    return call(playback, &Stream::mute, muted);
}

kesto_status kesto_playback_route(kesto_playback* playback, const char* device)
{
    return call(playback, &Stream::route, device);
}

kesto_status kesto_playback_format(kesto_playback* playback, const kesto_format* format)
{
    return call(playback, &Stream::format, format);
}

kesto_status kesto_playback_pause(kesto_playback* playback)
{
    return call(playback, &Stream::pause);
}

kesto_status kesto_playback_resume(kesto_playback* playback)
{
    return call(playback, &Stream::resume);
}

kesto_status kesto_playback_underrun(kesto_playback* playback, uint64_t cycles, double seconds)
{
    return call(playback, &Stream::fault, cycles, seconds);
}

kesto_status kesto_playback_stop(kesto_playback* playback)
{
    return call(playback, &Stream::stop);
}

void kesto_playback_free(kesto_playback* playback)
{
    delete playback;
}

kesto_status kesto_recording_create(kesto_client* client, const char* application, kesto_service_type service_type,
                                    kesto_recording** recording)
{
    return create(client, Direction::Input, application, service_type, recording);
}

kesto_status kesto_recording_start(kesto_recording* recording, const kesto_format* format, const char* device)
{
    return call(recording, &Stream::start, format, device);
}

kesto_status kesto_recording_volume(kesto_recording* recording, double volume)
{
    return call(recording, &Stream::volume, volume);
}

kesto_status kesto_recording_mute(kesto_recording* recording, bool muted)
{
    return call(recording, &Stream::mute, muted);
}

kesto_status kesto_recording_route(kesto_recording* recording, const char* device)
{
    return call(recording, &Stream::route, device);
}

kesto_status kesto_recording_format(kesto_recording* recording, const kesto_format* format)
{
    return call(recording, &Stream::format, format);
}

kesto_status kesto_recording_pause(kesto_recording* recording)
{
    return call(recording, &Stream::pause);
}

kesto_status kesto_recording_resume(kesto_recording* recording)
{
    return call(recording, &Stream::resume);
}

kesto_status kesto_recording_overrun(kesto_recording* recording, uint64_t cycles, double seconds)
{
    return call(recording, &Stream::fault, cycles, seconds);
}

kesto_status kesto_recording_stop(kesto_recording* recording)
{
    return call(recording, &Stream::stop);
}

void kesto_recording_free(kesto_recording* recording)
{
    delete recording;
}
