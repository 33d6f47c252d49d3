// SPDX-License-Identifier: Apache-2.0
// The pages of an SQLite database that may be damaged, read without SQLite: from its write-ahead log where the log has
// a newer one, otherwise from the database itself.
//
// SQLite stops reading a log at the first frame that is not whole. Each frame's checksum goes on from that of the frame
// before it, which the log holds too; so here every frame is checked by itself, and one that is damaged costs only its
// own page.
#pragma once

#include "platform/linux/files/FileDescriptor.h"

#include <cstdint>
#include <filesystem>
#include <span>
#include <unordered_map>
#include <vector>

namespace platform {

// A big-endian number in the file, 1 to 8 bytes long.
[[nodiscard]] std::uint64_t bigEndian(std::span<const std::byte> bytes) noexcept;

// One thread at a time.
class DatabasePages {
public:
    // Opens the database and, if there is one, its log, whose name ends in "-wal". There are no pages if the database
    // is not a regular file that can be opened.
    explicit DatabasePages(const std::filesystem::path& path);

    // Pages have the numbers 1 to `count`.
    [[nodiscard]] std::uint32_t count() const noexcept { return count_; }
    [[nodiscard]] std::size_t size() const noexcept { return size_; } // of a page, in bytes
    // The bytes of a page that hold content; others are at its end.
    [[nodiscard]] std::size_t usableSize() const noexcept { return size_ - reserved_; }
    // Reads the page into `page`. False if there is no such page, or the disk fails.
    [[nodiscard]] bool read(std::uint32_t number, std::vector<std::byte>& page) const;

private:
    [[nodiscard]] bool readHeader();
    [[nodiscard]] std::size_t guessSize() const;
    void readLog();

    FileDescriptor database_;
    FileDescriptor log_;
    std::size_t size_ = 4096;
    std::size_t reserved_ = 0;
    std::uint32_t count_ = 0;
    std::unordered_map<std::uint32_t, std::uint64_t> inLog_; // the place of a page's last committed content
};

} // namespace platform
