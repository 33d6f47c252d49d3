// The CBOR decoder reads what any process on the machine may send. Whatever the bytes, it must end with a value
// or an error; and a value that it gave must survive its own encoding, byte for byte the second time.
#include "foundation/Cbor.h"

#include <cstdint>
#include <cstdlib>
#include <string>

namespace {

void require(bool holds)
{
    if (!holds)
        std::abort();
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    static foundation::CborDecoder decoder; // as on a connection: it remembers keys from earlier frames
    const auto decoded = decoder.decode({reinterpret_cast<const char*>(data), size});
    if (!decoded)
        return 0;
    std::string encoded;
    foundation::appendCbor(*decoded, encoded);
    const auto again = decoder.decode(encoded);
    require(again.has_value());
    std::string reencoded;
    foundation::appendCbor(*again, reencoded);
    require(encoded == reencoded); // stronger than equality of the values, which NaN never has

    static_cast<void>(decoded->text()); // what a log line or the store would write of it
    return 0;
}
