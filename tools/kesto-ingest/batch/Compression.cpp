// SPDX-License-Identifier: Apache-2.0
// libzstd checks the frame; this file checks its size, and that nothing stands behind it.
#include "kesto-ingest/batch/Compression.h"

#include <fmt/format.h>
#include <zstd.h>

namespace kesto_ingest {

std::expected<std::string, std::string> decompress(std::string_view bytes, std::size_t largest)
{
    const auto size = ZSTD_getFrameContentSize(bytes.data(), bytes.size());
    if (size == ZSTD_CONTENTSIZE_ERROR)
        return std::unexpected("it is not compressed with zstd");
    if (size == ZSTD_CONTENTSIZE_UNKNOWN)
        return std::unexpected("its frame does not tell the size of the content");
    if (size > largest)
        return std::unexpected(fmt::format("it has {} bytes; {} are the most", size, largest));
    if (ZSTD_findFrameCompressedSize(bytes.data(), bytes.size()) != bytes.size())
        return std::unexpected("it is not one whole frame of zstd");
    std::string content(size, '\0');
    const std::size_t written = ZSTD_decompress(content.data(), content.size(), bytes.data(), bytes.size());
    if (ZSTD_isError(written) != 0)
        return std::unexpected(fmt::format("it cannot be decompressed: {}", ZSTD_getErrorName(written)));
    if (written != content.size())
        return std::unexpected("it is shorter than its frame says");
    return content;
}

} // namespace kesto_ingest
