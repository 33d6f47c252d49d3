#include "foundation/CborView.h"

#include "foundation/Cbor.h"

#include <array>
#include <cstdint>

namespace foundation {
namespace {

struct Head {
    int major;
    std::size_t size;
    std::uint64_t argument;
};

Head headOf(std::string_view bytes) noexcept
{
    const auto first = static_cast<std::uint8_t>(bytes.front());
    const unsigned additional = first & 0x1FU;
    if (additional < 24)
        return {first >> 5, 1, additional};
    const std::size_t argumentSize = std::size_t{1} << (additional - 24);
    std::uint64_t argument = 0;
    for (std::size_t index = 1; index <= argumentSize; ++index)
        argument = argument << 8 | static_cast<std::uint8_t>(bytes[index]);
    return {first >> 5, 1 + argumentSize, argument};
}

std::size_t itemSize(std::string_view bytes) noexcept
{
    std::size_t size = 0;
    for (std::uint64_t pending = 1; pending != 0; --pending) {
        const Head head = headOf(bytes.substr(size));
        size += head.size;
        switch (head.major) {
        case 2:
        case 3: size += head.argument; break; // bytes, text
        case 4: pending += head.argument; break; // array
        case 5: pending += 2 * head.argument; break; // map
        case 6: ++pending; break; // a tag and its item
        default: break;
        }
    }
    return size;
}

} // namespace

void CborItem::appendText(std::string& out) const
{
    const Head head = headOf(bytes_);
    if (head.major == 3)
        out += bytes_.substr(head.size);
    else
        value().appendText(out);
}

Value CborItem::value() const
{
    constexpr unsigned anyDepth = 1000;
    CborDecoder decoder;
    return decoder.decode(bytes_, anyDepth).value_or(Value());
}

CborMap::CborMap(std::string_view encoded) : entries_(encoded.substr(headOf(encoded).size)) { }

void CborMap::Iterator::readEntry()
{
    if (rest_.empty()) {
        atEnd_ = true;
        return;
    }
    const Head key = headOf(rest_);
    entry_.key = rest_.substr(key.size, key.argument);
    rest_.remove_prefix(key.size + key.argument);
    entry_.value = CborItem(rest_.substr(0, itemSize(rest_)));
    rest_.remove_prefix(entry_.value.bytes().size());
}

} // namespace foundation
