// SPDX-License-Identifier: Apache-2.0
// The compressor's memory is given back after each batch: the uplink sleeps most of the time.
#include "kesto-uplink/outbox/Compression.h"

#include <new>
#include <zstd.h>

namespace kesto_uplink {

std::string compressed(std::string_view text)
{
    constexpr int level = 3; // higher ones take several times as long for a few percent
    std::string result(ZSTD_compressBound(text.size()), '\0');
    const std::size_t size = ZSTD_compress(result.data(), result.size(), text.data(), text.size(), level);
    if (ZSTD_isError(size) != 0)
        throw std::bad_alloc(); // nothing else can fail
    result.resize(size);
    result.shrink_to_fit();
    return result;
}

} // namespace kesto_uplink
