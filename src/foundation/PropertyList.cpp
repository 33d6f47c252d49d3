// Tells the forms apart; each has a reader of its own.
#include "foundation/PropertyList.h"

#include "foundation/Format.h"
#include "foundation/PropertyListReader.h"

namespace foundation {

std::expected<Value, PropertyListFailure> readPropertyList(std::string_view bytes, const PropertyListLimits& limits)
{
    using enum PropertyListError;
    if (bytes.empty())
        return std::unexpected(PropertyListFailure{Malformed, "there are no bytes"});
    if (bytes.size() > limits.bytes)
        return std::unexpected(PropertyListFailure{TooLarge, format("more than {} bytes", limits.bytes)});
    return bytes.starts_with("bplist") ? readBinaryPropertyList(bytes, limits) : readXmlPropertyList(bytes, limits);
}

bool appendUtf8(std::uint32_t character, std::string& out)
{
    const auto lead = [&](std::uint32_t mark, unsigned shift) {
        out.push_back(static_cast<char>(mark | character >> shift));
    };
    const auto follow = [&](unsigned shift) { out.push_back(static_cast<char>(0x80 | (character >> shift & 0x3F))); };
    const bool isSurrogate = character >= 0xD800 && character <= 0xDFFF;
    if (isSurrogate || character > 0x10FFFF)
        return false;
    if (character < 0x80)
        lead(0, 0);
    else if (character < 0x800)
        lead(0xC0, 6);
    else if (character < 0x10000)
        lead(0xE0, 12);
    else {
        lead(0xF0, 18);
        follow(12);
    }
    if (character >= 0x800)
        follow(6);
    if (character >= 0x80)
        follow(0);
    return true;
}

} // namespace foundation
