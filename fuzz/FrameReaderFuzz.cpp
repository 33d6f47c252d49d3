// SPDX-License-Identifier: Apache-2.0
// A client's bytes, in pieces as the socket may deliver them. For all cuts the reader must yield the same frames, up to
// the same error; it must not hold more than it got; and decoding the frames must end, with one decoder that keeps its
// state from frame to frame.
//
// The first byte of the input chooses the cuts, the rest is the stream.
#include "foundation/cbor/Cbor.h"
#include "platform/linux/connection/FrameReader.h"

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <string>
#include <string_view>
#include <vector>

namespace {

using platform::FrameReader;

void require(bool holds)
{
    if (!holds)
        std::abort();
}

struct Outcome {
    std::vector<std::string> frames;
    bool isBroken = false;
    bool endsInsideFrame = false;
    friend bool operator==(const Outcome&, const Outcome&) = default;
};

// Takes the complete frames; false after an error.
bool takeFrames(FrameReader& reader, std::vector<std::string>& frames)
{
    while (true) {
        const auto frame = reader.next();
        if (!frame)
            return false;
        if (!*frame)
            return true;
        require((*frame)->size() <= platform::longestFrame);
        frames.emplace_back(**frame);
    }
}

// Pieces of so many bytes, each a copy of its own, so that reading beyond one is noticed.
Outcome read(std::string_view stream, std::size_t pieceSize)
{
    Outcome outcome;
    FrameReader reader;
    for (std::size_t taken = 0; taken < stream.size(); taken += pieceSize) {
        const std::vector<char> piece(stream.begin() + static_cast<std::ptrdiff_t>(taken),
                                      stream.begin()
                                          + static_cast<std::ptrdiff_t>(std::min(taken + pieceSize, stream.size())));
        reader.feed({piece.data(), piece.size()});
        if (!takeFrames(reader, outcome.frames)) {
            outcome.isBroken = true;
            return outcome;
        }
        require(reader.heldBytes() <= 64 + 2 * (taken + piece.size()));
    }
    outcome.endsInsideFrame = reader.isInsideFrame();
    return outcome;
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    if (size == 0)
        return 0;
    const std::string_view stream(reinterpret_cast<const char*>(data) + 1, size - 1);
    const Outcome whole = read(stream, stream.size() + 1);
    require(read(stream, 1 + data[0] % 64) == whole);

    foundation::CborDecoder decoder;
    for (const std::string& frame : whole.frames) {
        if (!decoder.decode(frame))
            break; // where the connection ends
    }
    return 0;
}
