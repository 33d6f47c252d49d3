// SPDX-License-Identifier: Apache-2.0
// Property lists come from files that any client may name. For all bytes, reading must end with a failure and its text
// or with a value within the limits; and that value must survive its encoding like any other.
#include "foundation/cbor/Cbor.h"
#include "foundation/plist/PropertyList.h"

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <string>

namespace {

using foundation::Value;

void require(bool holds)
{
    if (!holds)
        std::abort();
}

struct Measure {
    std::size_t objects = 0;
    std::size_t content = 0;
    unsigned depth = 0;
};

void measure(const Value& value, unsigned depth, Measure& all)
{
    ++all.objects;
    if (value.kind() == Value::Kind::String)
        require(foundation::isValidUtf8(value.stringView()));
    if (const auto data = value.data())
        all.content += data->bytes.view().size();
    all.content += value.stringView().size();
    const bool isContainer = value.kind() == Value::Kind::Array || value.kind() == Value::Kind::Dictionary;
    all.depth = std::max(all.depth, isContainer ? depth + 1 : depth);
    if (const auto array = value.array())
        for (const Value& element : *array)
            measure(element, depth + 1, all);
    if (const auto dictionary = value.dictionary())
        for (const auto& [key, element] : *dictionary) {
            measure(key, depth + 1, all);
            measure(element, depth + 1, all);
        }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    // Small, so that inputs of a fuzzer's size reach them.
    constexpr foundation::PropertyListLimits limits{.bytes = 65536, .depth = 16, .objects = 1024, .content = 8192};
    const std::string_view bytes(reinterpret_cast<const char*>(data), size);
    const auto read = foundation::readPropertyList(bytes, limits);
    if (!read) {
        require(!read.error().text.empty() && foundation::isValidUtf8(read.error().text));
        return 0;
    }
    Measure all;
    measure(*read, 0, all);
    require(size <= limits.bytes && all.objects <= limits.objects && all.depth <= limits.depth);
    // The key of a UID's dictionary is not in the file. The file bounds text in XML; two bytes of UTF-16 may become
    // three.
    constexpr std::size_t uidKey = std::string_view("CF$UID").size();
    require(all.content <= std::max(limits.content + all.objects * uidKey, size + size / 2));

    std::string encoded;
    foundation::appendCbor(*read, encoded);
    foundation::CborDecoder decoder;
    const auto decoded = decoder.decode(encoded);
    require(decoded.has_value());
    std::string reencoded;
    foundation::appendCbor(*decoded, reencoded);
    require(encoded == reencoded); // stronger than equality of the values, which NaN never has

    static_cast<void>(read->text()); // as a log line would write it
    return 0;
}
