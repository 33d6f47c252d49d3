#include "foundation/CborView.h"

#include "foundation/Cbor.h"

namespace foundation {
namespace {

// The first byte's upper three bits, and what stands for a value of its own there.
enum Major { Bytes = 2, Text = 3, List = 4, Map = 5, Tag = 6, Simple = 7 };
constexpr std::uint64_t null = 22;

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
        case Bytes:
        case Text: size += head.argument; break;
        case List: pending += head.argument; break;
        case Map: pending += 2 * head.argument; break;
        case Tag: ++pending; break;
        default: break;
        }
    }
    return size;
}

} // namespace

Value::Kind CborItem::kind() const noexcept
{
    const Head head = headOf(bytes_);
    switch (head.major) {
    case Bytes: return Value::Kind::Data;
    case Text: return Value::Kind::String;
    case List: return Value::Kind::Array;
    case Map: return Value::Kind::Dictionary;
    case Tag: return Value::Kind::Date;
    case Simple: return head.size == 1 && head.argument == null ? Value::Kind::Null : Value::Kind::Number;
    default: return Value::Kind::Number;
    }
}

std::string_view CborItem::string() const noexcept
{
    return bytes_.substr(headOf(bytes_).size);
}

Value CborItem::value() const
{
    constexpr unsigned anyDepth = 1000;
    CborDecoder decoder;
    return decoder.decode(bytes_, anyDepth).value_or(Value());
}

void CborItem::appendText(std::string& out) const
{
    if (kind() == Value::Kind::String)
        out += string();
    else
        value().appendText(out);
}

CborItems::CborItems(std::string_view container) : items_(container.substr(headOf(container).size)) { }

void CborItems::Iterator::readItem()
{
    item_ = CborItem(rest_.empty() ? rest_ : rest_.substr(0, itemSize(rest_)));
    rest_.remove_prefix(item_.bytes().size());
}

} // namespace foundation
