// SPDX-License-Identifier: Apache-2.0
// Cuts a byte stream into frames: a 4-byte little-endian length, then that many bytes.
//
// A frame that arrives whole is returned where it lies, without a copy; the reader keeps only a frame that the end of a
// read cuts off. The memory grows with the bytes that really came, never with the length that a peer claims, and is
// freed with the frame. So ten thousand idle peers that each announced a large frame cost next to nothing. The reader
// uses no sockets, so that it can be tested and fuzzed alone.
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
    TooLong // the announced frame is larger than `longestFrame`
};

// Appends the head and the frame. The frame is at most `longestFrame` long.
void appendFrame(std::string_view frame, std::string& out);

// Each stream has one reader. One thread at a time.
class FrameReader {
public:
    // Gives the next piece of the stream. The bytes must stay in place until `next` finds no further frame. Feed again
    // only then.
    void feed(std::string_view bytes) noexcept;

    // The next whole frame, valid until the next call, or nothing while a part is missing. After an error the stream
    // cannot be read further.
    [[nodiscard]] std::expected<std::optional<std::string_view>, FrameError> next();

    // Whether the stream stands inside a frame or its head.
    [[nodiscard]] bool isInsideFrame() const noexcept { return !cutOff_.empty(); }

    // The number of bytes that it keeps.
    [[nodiscard]] std::size_t heldBytes() const noexcept { return cutOff_.capacity(); }

private:
    void takeOver(std::size_t wanted);
    [[nodiscard]] std::expected<std::optional<std::string_view>, FrameError> completeCutOff();

    std::string_view fed_;
    std::string cutOff_; // a frame that is not complete, with its head
    bool cutOffIsDone_ = false; // that frame was completed and returned
};

} // namespace platform
