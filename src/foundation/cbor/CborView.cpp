// SPDX-License-Identifier: Apache-2.0
// The slower functions: sizes of containers, and values that have to be built.
#include "foundation/cbor/CborView.h"

#include "foundation/cbor/Cbor.h"

namespace foundation {

// Without recursion: counts the items that remain.
std::size_t CborItem::nestedSizeAt(const char* place) noexcept
{
    std::size_t size = 0;
    for (std::uint64_t pending = 1; pending != 0; --pending) {
        const auto [head, headSize] = headAt(place + size);
        size += headSize;
        switch (head.major) {
        case CborMajor::Bytes:
        case CborMajor::Text: size += head.argument; break;
        case CborMajor::Array: pending += head.argument; break;
        case CborMajor::Map: pending += 2 * head.argument; break;
        case CborMajor::Tag: ++pending; break;
        default: break;
        }
    }
    return size;
}

Value CborItem::value() const
{
    if (const auto plain = number())
        return *plain;
    constexpr unsigned anyDepth = 1000;
    CborDecoder decoder;
    return decoder.decode(bytes_, anyDepth).value_or(Value());
}

} // namespace foundation
