// SPDX-License-Identifier: Apache-2.0
// The input of one connection: bytes in order of arrival, which it cuts into frames and decodes.
#pragma once

#include "foundation/cbor/Cbor.h"
#include "foundation/values/Value.h"
#include "ledger/Counter.h"
#include "platform/linux/connection/FrameReader.h"

#include <cstddef>
#include <expected>
#include <optional>
#include <string>
#include <string_view>

namespace platform {

// One thread at a time.
class ConnectionInput {
public:
    struct Frame {
        foundation::Array array;
        std::size_t size; // of its encoding
        std::size_t memory; // that the array takes at most
    };

    // What is wrong with a frame, and where it is counted.
    struct Refusal {
        std::string reason;
        ledger::Counter counter;
    };

    // The bytes must stay valid until all their frames were taken.
    void feed(std::string_view bytes) { reader_.feed(bytes); }
    // The next frame, or nothing until it is complete. After a refusal the input ends.
    [[nodiscard]] std::expected<std::optional<Frame>, Refusal> next();
    // Whether only a part of a frame has come.
    [[nodiscard]] bool isInsideFrame() const { return reader_.isInsideFrame(); }
    // The memory of that part.
    [[nodiscard]] std::size_t heldBytes() const { return reader_.heldBytes(); }

private:
    FrameReader reader_;
    foundation::CborDecoder decoder_;
};

} // namespace platform
