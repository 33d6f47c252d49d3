// SPDX-License-Identifier: Apache-2.0
// Any process on the machine may send bytes to the CBOR decoder. For all bytes, and after all earlier frames, it must
// end with a value or an error; and a decoded value must survive its own encoding, byte for byte the second time.
#include "foundation/cbor/Cbor.h"

#include <cstdint>
#include <cstdlib>
#include <string>

namespace {

void require(bool holds)
{
    if (!holds)
        std::abort();
}

std::string encodedOf(const foundation::Value& value)
{
    std::string encoded;
    foundation::appendCbor(value, encoded);
    return encoded;
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    static foundation::CborDecoder decoder; // as on a connection: it remembers keys and shapes from earlier frames
    const std::string_view bytes(reinterpret_cast<const char*>(data), size);
    const auto decoded = decoder.decode(bytes);
    const auto decodedFresh = foundation::CborDecoder().decode(bytes);
    require(decoded.has_value() == decodedFresh.has_value());
    if (!decoded)
        return 0;
    const std::string encoded = encodedOf(*decoded);
    require(encoded == encodedOf(*decodedFresh)); // stronger than equality of the values, which NaN never has
    const auto again = decoder.decode(encoded);
    require(again.has_value());
    require(encoded == encodedOf(*again));

    static_cast<void>(decoded->text()); // as a log line or the store would write it
    return 0;
}
