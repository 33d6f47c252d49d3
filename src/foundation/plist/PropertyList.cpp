// SPDX-License-Identifier: Apache-2.0
// Recognises the form; each form has a reader of its own. XML in UTF-16 becomes UTF-8 before it is read.
#include "foundation/plist/PropertyList.h"

#include "foundation/plist/PropertyListReader.h"
#include "foundation/text/Format.h"

namespace foundation {
namespace {

// The order of the bytes of XML in UTF-16: from its byte order mark or else from its first character, "<". Nothing for
// other files.
std::optional<std::endian> utf16Order(std::string_view bytes)
{
    using namespace std::string_view_literals;
    if (bytes.starts_with("\xFE\xFF"sv) || bytes.starts_with("\0<"sv))
        return std::endian::big;
    if (bytes.starts_with("\xFF\xFE"sv) || bytes.starts_with("<\0"sv))
        return std::endian::little;
    return std::nullopt;
}

std::expected<Value, PropertyListFailure> readXml(std::string_view bytes, const PropertyListLimits& limits)
{
    const auto order = utf16Order(bytes);
    const auto text = order ? utf8FromUtf16(bytes, *order) : std::nullopt;
    return readXmlPropertyList(text ? *text : bytes, limits);
}

} // namespace

std::expected<Value, PropertyListFailure> readPropertyList(std::string_view bytes, const PropertyListLimits& limits)
{
    using enum PropertyListError;
    if (bytes.empty())
        return std::unexpected(PropertyListFailure{Malformed, "the file is empty"});
    if (bytes.size() > limits.bytes)
        return std::unexpected(PropertyListFailure{TooLarge, format("more than {} bytes", limits.bytes)});
    return bytes.starts_with("bplist") ? readBinaryPropertyList(bytes, limits) : readXml(bytes, limits);
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

std::optional<std::string> utf8FromUtf16(std::string_view bytes, std::endian order)
{
    if (bytes.size() % 2 != 0)
        return std::nullopt;
    const auto byteAt = [bytes](std::size_t at) {
        return static_cast<std::uint32_t>(static_cast<std::uint8_t>(bytes[at]));
    };
    const std::size_t high = order == std::endian::big ? 0 : 1;
    const auto unitAt = [&](std::size_t at) { return byteAt(at + high) << 8 | byteAt(at + 1 - high); };
    std::string text;
    for (std::size_t at = 0; at < bytes.size(); at += 2) {
        std::uint32_t character = unitAt(at);
        const bool isFirstOfPair = (character & 0xFC00) == 0xD800;
        if (isFirstOfPair && at + 2 < bytes.size() && (unitAt(at + 2) & 0xFC00) == 0xDC00) {
            at += 2;
            character = 0x10000 + ((character & 0x3FF) << 10 | (unitAt(at) & 0x3FF));
        }
        if (!appendUtf8(character, text))
            return std::nullopt;
    }
    return text;
}

} // namespace foundation
