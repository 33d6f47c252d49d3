// SPDX-License-Identifier: Apache-2.0
// libkesto for C++, playbacks and recordings: a program says what it plays, and the library makes the session and its
// messages, so that the service (kestod) knows how long it played, at which volume, on which device.
//
//     kesto::Client client;
//     if (client.open() != kesto::Status::Ok)
//         return;
//     kesto::Playback playback(client, "org.example.player", kesto::ServiceType::LongFormAudio);
//     playback.start({"S16LE", 44100, 2}, "speaker");
//     playback.volume(0.5);
//     playback.pause();
//     playback.resume();
//     playback.stop();
//     client.close(std::chrono::seconds(1));
//
// A thin layer over playback.h, all of it inline; the rules there about threads, real time and lost connections hold
// here, too.
#ifndef KESTO_PLAYBACK_HPP
#define KESTO_PLAYBACK_HPP

#include "kesto.hpp"
#include "playback.h"

#include <cstdint>
#include <utility>

namespace kesto {

// A stream's format: {"S16LE", 44100, 2} is encoding, rate and channels.
using Format = kesto_format;

namespace detail {
struct PlaybackFunctions {
    using Handle = kesto_playback;
    static constexpr auto create = kesto_playback_create;
    static constexpr auto start = kesto_playback_start;
    static constexpr auto volume = kesto_playback_volume;
    static constexpr auto mute = kesto_playback_mute;
    static constexpr auto route = kesto_playback_route;
    static constexpr auto format = kesto_playback_format;
    static constexpr auto pause = kesto_playback_pause;
    static constexpr auto resume = kesto_playback_resume;
    static constexpr auto stop = kesto_playback_stop;
    static constexpr auto free = kesto_playback_free;
};
struct RecordingFunctions {
    using Handle = kesto_recording;
    static constexpr auto create = kesto_recording_create;
    static constexpr auto start = kesto_recording_start;
    static constexpr auto volume = kesto_recording_volume;
    static constexpr auto mute = kesto_recording_mute;
    static constexpr auto route = kesto_recording_route;
    static constexpr auto format = kesto_recording_format;
    static constexpr auto pause = kesto_recording_pause;
    static constexpr auto resume = kesto_recording_resume;
    static constexpr auto stop = kesto_recording_stop;
    static constexpr auto free = kesto_recording_free;
};

// What a playback and a recording have in common. Any thread, real-time ones too; but not while it is made, moved or
// destroyed. It may outlive its client: its calls then return Closed.
template <typename Functions> class Stream {
public:
    // Not started, and not of any client: every call returns Closed.
    Stream() noexcept = default;
    // For the application, such as "org.example.player". Reports nothing before the start. `status` returns whether it
    // could be made.
    Stream(const Client& client, const char* application, ServiceType type) noexcept
        : status_(Functions::create(client.get(), application, static_cast<kesto_service_type>(type), &stream_))
    {
    }
    Stream(Stream&& other) noexcept
        : stream_(std::exchange(other.stream_, nullptr)),
          status_(std::exchange(other.status_, KESTO_CLOSED))
    {
    }
    Stream& operator=(Stream&& other) noexcept
    {
        std::swap(stream_, other.stream_);
        std::swap(status_, other.status_);
        return *this;
    }
    // Stops it if it is started.
    ~Stream() { Functions::free(stream_); }

    // Ok; InvalidArgument (no application), Closed (the client was not open) or OutOfMemory if it could not be made:
    // every call then returns Closed.
    [[nodiscard]] Status status() const noexcept { return Status(status_); }

    // Begins a session. A null device is the last one that was given, or unknown.
    Status start(const Format& format, const char* device = nullptr) noexcept
    {
        return Status(Functions::start(stream_, &format, device));
    }
    // The same with the last format that was given.
    Status start() noexcept { return Status(Functions::start(stream_, nullptr, nullptr)); }
    // From 0 to 1; more counts as 1. It is 1 until the first call.
    Status volume(double volume) noexcept { return Status(Functions::volume(stream_, volume)); }
    // While muted, the volume counts as 0.
    Status mute(bool muted) noexcept { return Status(Functions::mute(stream_, muted)); }
    // The device, or several joined with ","; null or empty: none.
    Status route(const char* device) noexcept { return Status(Functions::route(stream_, device)); }
    Status format(const Format& format) noexcept { return Status(Functions::format(stream_, &format)); }
    // A pause ends the run, not the session.
    Status pause() noexcept { return Status(Functions::pause(stream_)); }
    Status resume() noexcept { return Status(Functions::resume(stream_)); }
    // Ends the session.
    Status stop() noexcept { return Status(Functions::stop(stream_)); }

    [[nodiscard]] typename Functions::Handle* get() const noexcept { return stream_; }

private:
    typename Functions::Handle* stream_ = nullptr;
    kesto_status status_ = KESTO_CLOSED;
};
} // namespace detail

// What a program plays.
class Playback : public detail::Stream<detail::PlaybackFunctions> {
public:
    using Stream::Stream;
    // The sound had gaps: so many cycles were missed, within so many seconds.
    Status underrun(std::uint64_t cycles, double seconds) noexcept
    {
        return Status(kesto_playback_underrun(get(), cycles, seconds));
    }
};

// What a program records.
class Recording : public detail::Stream<detail::RecordingFunctions> {
public:
    using Stream::Stream;
    // So many cycles of recorded sound were lost, within so many seconds.
    Status overrun(std::uint64_t cycles, double seconds) noexcept
    {
        return Status(kesto_recording_overrun(get(), cycles, seconds));
    }
};

} // namespace kesto

#endif
