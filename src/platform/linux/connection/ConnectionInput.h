// What one connection reads: bytes as they come, cut into frames and decoded.
#pragma once

#include "foundation/cbor/Cbor.h"
#include "foundation/values/Value.h"
#include "platform/Connection.h"
#include "platform/linux/connection/FrameReader.h"

#include <cstddef>
#include <expected>
#include <optional>
#include <string_view>

namespace platform {

// One thread at a time.
class ConnectionInput {
public:
    struct Frame {
        foundation::Array array;
        std::size_t size; // of its encoding
    };

    // The bytes are valid until all their frames were taken.
    void feed(std::string_view bytes) { reader_.feed(bytes); }
    // The next frame; nothing when it is not complete; or what is wrong with it, after which there are no more.
    [[nodiscard]] std::expected<std::optional<Frame>, Connection::Violation> next();
    // Whether a part of a frame came, and its end did not.
    [[nodiscard]] bool isInsideFrame() const { return reader_.isInsideFrame(); }

private:
    FrameReader reader_;
    foundation::CborDecoder decoder_;
};

} // namespace platform
