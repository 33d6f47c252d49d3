// SPDX-License-Identifier: Apache-2.0
// Another implementation as the other side: libcbor reads the encoder's bytes, and the decoder reads libcbor's.
#include "foundation/cbor/Cbor.h"

#include "foundation/values/GeneratedValues.h"

#include <cbor.h>
#include <cstdlib>
#include <gtest/gtest.h>
#include <memory>
#include <rapidcheck/gtest.h>
#include <string>
#include <string_view>

namespace foundation {
namespace {

struct Release {
    void operator()(cbor_item_t* item) const { cbor_decref(&item); }
};
using Item = std::unique_ptr<cbor_item_t, Release>;

cbor_data bytesOf(std::string_view text)
{
    return reinterpret_cast<cbor_data>(text.data());
}

Item integerItem(bool negative, std::uint64_t argument)
{
    Item item(argument <= 0xFF             ? cbor_build_uint8(static_cast<std::uint8_t>(argument))
                  : argument <= 0xFFFF     ? cbor_build_uint16(static_cast<std::uint16_t>(argument))
                  : argument <= 0xFFFFFFFF ? cbor_build_uint32(static_cast<std::uint32_t>(argument))
                                           : cbor_build_uint64(argument));
    if (negative)
        cbor_mark_negint(item.get());
    return item;
}

Item numberItem(Number number)
{
    switch (number.kind()) {
    case Number::Kind::Boolean: return Item(cbor_build_bool(number.booleanValue()));
    case Number::Kind::Float32: return Item(cbor_build_float4(static_cast<float>(number.doubleValue())));
    case Number::Kind::Float64: return Item(cbor_build_float8(number.doubleValue()));
    case Number::Kind::Unsigned64: return integerItem(false, *number.exactly<std::uint64_t>());
    case Number::Kind::Signed64: break;
    }
    const std::int64_t value = number.int64Value();
    return integerItem(value < 0, static_cast<std::uint64_t>(value < 0 ? -1 - value : value));
}

// A value, built by libcbor's own functions.
Item itemOf(const Value& value)
{
    switch (value.kind()) {
    case Value::Kind::Null: return Item(cbor_new_null());
    case Value::Kind::Number: return numberItem(*value.number());
    case Value::Kind::String: {
        const String text = *value.string();
        return Item(cbor_build_stringn(text.view().data(), text.view().size()));
    }
    case Value::Kind::Data: {
        const Data data = *value.data();
        return Item(cbor_build_bytestring(bytesOf(data.bytes), data.bytes.view().size()));
    }
    case Value::Kind::Date: {
        const Item seconds(cbor_build_float8(value.date()->secondsSince1970));
        return Item(cbor_build_tag(1, seconds.get()));
    }
    case Value::Kind::Array: {
        const Array values = *value.array();
        Item array(cbor_new_definite_array(values.size()));
        for (const Value& element : values) {
            const Item item = itemOf(element);
            EXPECT_TRUE(cbor_array_push(array.get(), item.get()));
        }
        return array;
    }
    case Value::Kind::Dictionary: break;
    }
    const Dictionary dictionary = *value.dictionary();
    Item map(cbor_new_definite_map(dictionary.size()));
    for (const auto& entry : dictionary) {
        const Item key = itemOf(entry.key);
        const Item element = itemOf(entry.value);
        EXPECT_TRUE(cbor_map_add(map.get(), {key.get(), element.get()}));
    }
    return map;
}

std::string written(const Item& item)
{
    unsigned char* buffer = nullptr;
    std::size_t size = 0;
    const std::size_t length = cbor_serialize_alloc(item.get(), &buffer, &size);
    std::string bytes(reinterpret_cast<const char*>(buffer), length);
    std::free(buffer);
    return bytes;
}

RC_GTEST_PROP(CborWithLibcbor, WritesTheSameBytes, ())
{
    const Value value = *generated::value();
    const std::string theirs = written(itemOf(value));
    std::string ours;
    appendCbor(value, ours);
    RC_ASSERT(ours == theirs);
}

RC_GTEST_PROP(CborWithLibcbor, WhatItWritesWeRead, ())
{
    const Value value = *generated::value();
    CborDecoder decoder;
    const auto read = decoder.decode(written(itemOf(value)));
    RC_ASSERT(read.has_value());
    RC_ASSERT(*read == value);
}

RC_GTEST_PROP(CborWithLibcbor, WhatWeWriteItReads, ())
{
    std::string ours;
    appendCbor(*generated::value(), ours);
    cbor_load_result result{};
    const Item item(cbor_load(bytesOf(ours), ours.size(), &result));
    RC_ASSERT(item != nullptr);
    RC_ASSERT(result.error.code == CBOR_ERR_NONE);
    RC_ASSERT(result.read == ours.size());
    RC_ASSERT(written(item) == ours); // libcbor keeps the width of every head
}

// libcbor is more tolerant than the decoder, so the opposite test would fail.
RC_GTEST_PROP(CborWithLibcbor, WhatWeReadItReadsToo, (const std::string& bytes))
{
    CborDecoder decoder;
    if (bytes.empty() || !decoder.decode(bytes))
        return;
    cbor_load_result result{};
    const Item item(cbor_load(bytesOf(bytes), bytes.size(), &result));
    RC_ASSERT(item != nullptr);
    RC_ASSERT(result.read == bytes.size());
}

} // namespace
} // namespace foundation
