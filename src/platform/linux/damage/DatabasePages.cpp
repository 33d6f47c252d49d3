// SPDX-License-Identifier: Apache-2.0
// The layout of both files is SQLite's: https://sqlite.org/fileformat2.html.
#include "platform/linux/damage/DatabasePages.h"

#include <algorithm>
#include <array>
#include <bit>
#include <fcntl.h>
#include <string_view>
#include <sys/stat.h>
#include <unistd.h>

namespace platform {
namespace {

using Bytes = std::span<const std::byte>;

constexpr std::size_t databaseHeaderSize = 100;
constexpr std::size_t logHeaderSize = 32;
constexpr std::size_t frameHeaderSize = 24;
constexpr std::size_t smallestUsableSize = 480;
constexpr std::byte leafOfTable{0x0D};

FileDescriptor openRegularFile(const std::filesystem::path& path)
{
    FileDescriptor file(::open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    struct stat status = {};
    return file && ::fstat(file.get(), &status) == 0 && S_ISREG(status.st_mode) ? std::move(file) : FileDescriptor();
}

bool readAt(const FileDescriptor& file, std::uint64_t place, std::span<std::byte> bytes)
{
    while (!bytes.empty()) {
        const ssize_t count = ::pread(file.get(), bytes.data(), bytes.size(), static_cast<off_t>(place));
        if (count <= 0)
            return false;
        place += static_cast<std::uint64_t>(count);
        bytes = bytes.subspan(static_cast<std::size_t>(count));
    }
    return true;
}

std::uint64_t sizeOf(const FileDescriptor& file)
{
    struct stat status = {};
    return ::fstat(file.get(), &status) == 0 ? static_cast<std::uint64_t>(status.st_size) : 0;
}

bool isPageSize(std::size_t size)
{
    return std::has_single_bit(size) && size >= 512 && size <= 65536;
}

struct Checksum {
    std::uint32_t first = 0;
    std::uint32_t second = 0;
    friend bool operator==(const Checksum&, const Checksum&) = default;
};

Checksum storedAt(Bytes bytes)
{
    return {static_cast<std::uint32_t>(bigEndian(bytes.first(4))),
            static_cast<std::uint32_t>(bigEndian(bytes.subspan(4, 4)))};
}

// Goes on from `sum` with a multiple of 8 bytes.
Checksum checksum(Checksum sum, Bytes bytes, bool isBigEndian)
{
    const auto word = [&](std::size_t place) {
        const auto big = static_cast<std::uint32_t>(bigEndian(bytes.subspan(place, 4)));
        return isBigEndian ? big : __builtin_bswap32(big);
    };
    for (std::size_t place = 0; place + 8 <= bytes.size(); place += 8) {
        sum.first += word(place) + sum.second;
        sum.second += word(place + 4) + sum.first;
    }
    return sum;
}

} // namespace

std::uint64_t bigEndian(std::span<const std::byte> bytes) noexcept
{
    std::uint64_t number = 0;
    for (const std::byte byte : bytes)
        number = number << 8 | std::to_integer<std::uint64_t>(byte);
    return number;
}

DatabasePages::DatabasePages(const std::filesystem::path& path)
    : database_(openRegularFile(path)),
      log_(openRegularFile(std::filesystem::path(path).concat("-wal")))
{
    if (!database_)
        return;
    if (!readHeader())
        size_ = guessSize();
    count_ = static_cast<std::uint32_t>(sizeOf(database_) / size_);
    if (log_)
        readLog();
}

bool DatabasePages::readHeader()
{
    std::vector<std::byte> header(databaseHeaderSize);
    constexpr std::string_view magic("SQLite format 3\0", 16);
    if (!readAt(database_, 0, header)
        || !std::ranges::equal(magic, Bytes(header).first(magic.size()), {},
                               [](char each) { return static_cast<std::byte>(each); }))
        return false;
    std::size_t size = bigEndian(Bytes(header).subspan(16, 2));
    size = size == 1 ? 65536 : size;
    const auto reserved = std::to_integer<std::size_t>(header[20]);
    if (!isPageSize(size) || size < reserved + smallestUsableSize)
        return false;
    size_ = size;
    reserved_ = reserved;
    return true;
}

// The service makes databases with pages of 8192 bytes, and once made them with pages of 4096: then more pages with
// rows begin between those of 8192 bytes.
std::size_t DatabasePages::guessSize() const
{
    constexpr std::size_t smaller = 4096;
    std::array<std::size_t, 2> found = {}; // at even multiples, and at odd ones
    std::array<std::byte, 1> first = {};
    for (std::uint64_t page = 1; readAt(database_, page * smaller, first); ++page)
        if (first[0] == leafOfTable)
            ++found[page % 2];
    return 2 * found[1] > found[0] ? smaller : 2 * smaller;
}

void DatabasePages::readLog()
{
    std::vector<std::byte> header(logHeaderSize);
    if (!readAt(log_, 0, header))
        return;
    const std::uint64_t magic = bigEndian(Bytes(header).first(4));
    const bool isBigEndian = (magic & 1) != 0;
    if ((magic & ~1ULL) != 0x377f0682 || bigEndian(Bytes(header).subspan(8, 4)) != size_
        || checksum({}, Bytes(header).first(24), isBigEndian) != storedAt(Bytes(header).subspan(24)))
        return;
    const Bytes salts = Bytes(header).subspan(16, 8);
    Checksum before = storedAt(Bytes(header).subspan(24));
    std::vector<std::byte> frame(frameHeaderSize + size_);
    std::unordered_map<std::uint32_t, std::uint64_t> uncommitted;
    for (std::uint64_t place = logHeaderSize; readAt(log_, place, frame); place += frame.size()) {
        const Bytes bytes = frame;
        const Checksum stored = storedAt(bytes.subspan(16));
        const Checksum actual =
            checksum(checksum(before, bytes.first(8), isBigEndian), bytes.subspan(frameHeaderSize), isBigEndian);
        before = stored;
        if (actual != stored || !std::ranges::equal(bytes.subspan(8, 8), salts))
            continue;
        uncommitted.insert_or_assign(static_cast<std::uint32_t>(bigEndian(bytes.first(4))), place + frameHeaderSize);
        const auto pagesAfterCommit = static_cast<std::uint32_t>(bigEndian(bytes.subspan(4, 4)));
        if (pagesAfterCommit == 0)
            continue;
        count_ = pagesAfterCommit;
        uncommitted.merge(inLog_);
        inLog_ = std::exchange(uncommitted, {});
    }
}

bool DatabasePages::read(std::uint32_t number, std::vector<std::byte>& page) const
{
    page.resize(size_);
    if (number == 0 || number > count_)
        return false;
    if (const auto found = inLog_.find(number); found != inLog_.end())
        return readAt(log_, found->second, page);
    return readAt(database_, (number - 1ULL) * size_, page);
}

} // namespace platform
