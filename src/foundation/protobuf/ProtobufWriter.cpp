// SPDX-License-Identifier: Apache-2.0
// A field is its tag and then its value: the writer appends both in one step on the string.
#include "foundation/protobuf/ProtobufWriter.h"

#include "foundation/protobuf/ProtobufReader.h"

#include <cassert>

namespace foundation {
namespace {

[[maybe_unused]] constexpr std::uint32_t highestField = (1U << 29) - 1;
[[maybe_unused]] constexpr std::size_t longestText = (std::size_t{1} << 31) - 1;

char* putVarint(std::uint64_t value, char* place) noexcept
{
    for (; value >= 0x80; value >>= 7)
        *place++ = static_cast<char>(value | 0x80);
    *place++ = static_cast<char>(value);
    return place;
}

char* putTag(std::uint32_t field, ProtobufWireType wireType, char* place) noexcept
{
    assert(field >= 1 && field <= highestField);
    return putVarint(std::uint64_t{field} << 3 | static_cast<unsigned>(wireType), place);
}

} // namespace

void ProtobufWriter::writeVarint(std::uint32_t field, std::uint64_t value)
{
    const std::size_t before = out_.size();
    out_.resize_and_overwrite(before + longestHead, [&](char* bytes, std::size_t) {
        return putVarint(value, putTag(field, ProtobufWireType::Varint, bytes + before)) - bytes;
    });
}

void ProtobufWriter::writeString(std::uint32_t field, std::string_view text)
{
    assert(text.size() <= longestText);
    const std::size_t before = out_.size();
    out_.resize_and_overwrite(before + longestHead + text.size(), [&](char* bytes, std::size_t) {
        char* const begin = putVarint(text.size(), putTag(field, ProtobufWireType::LengthDelimited, bytes + before));
        return begin + text.copy(begin, text.size()) - bytes;
    });
}

} // namespace foundation
