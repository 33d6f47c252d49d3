// Cuts a byte stream into frames: a 4-byte little-endian length, then that many bytes.
//
// Frames that arrive whole are handed out where they lie, without a copy; only what is cut off by the end of
// a read is kept. What is kept grows with the bytes that really came, never with the length that a peer
// claims, and goes back when the frame is done: ten thousand idle peers that each announced a large
// frame cost next to nothing. No sockets here, so that it can be tested and fuzzed by itself.
#pragma once

#include <cstddef>
#include <cstdint>
#include <expected>
#include <optional>
#include <string>
#include <string_view>

namespace platform {

constexpr std::size_t frameHeadSize = 4;
constexpr std::size_t longestFrame = 1024 * 1024; // without the head

enum class FrameError : std::uint8_t {
    TooLong // a frame is announced that is larger than `longestFrame`
};

// Appends the head and the frame. The frame is at most `longestFrame` long.
void appendFrame(std::string_view frame, std::string& out);

// One reader a stream, used by one thread at a time.
class FrameReader {
public:
    // Gives the next piece of the stream. The bytes must stay where they are until `next` found nothing more,
    // which must have happened before more is fed.
    void feed(std::string_view bytes) noexcept;

    // The next whole frame, valid until the next call; nothing when the rest of it has yet to come. After an
    // error the stream cannot be read any further.
    [[nodiscard]] std::expected<std::optional<std::string_view>, FrameError> next();

    // Whether the stream stands inside a frame, or inside the head of one.
    [[nodiscard]] bool isInsideFrame() const noexcept { return !cutOff_.empty(); }

    // The bytes that it holds on to.
    [[nodiscard]] std::size_t heldBytes() const noexcept { return cutOff_.capacity(); }

private:
    void takeOver(std::size_t wanted);
    [[nodiscard]] std::expected<std::optional<std::string_view>, FrameError> completeCutOff();

    std::string_view fed_;
    std::string cutOff_; // the beginning of a frame whose end was not there yet, from its head on
    bool cutOffIsDone_ = false; // it was completed and handed out
};

} // namespace platform
