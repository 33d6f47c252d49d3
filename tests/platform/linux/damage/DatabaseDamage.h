// SPDX-License-Identifier: Apache-2.0
// Makes databases with SQL, and damages files as a bad disk or a careless hand does.
#pragma once

#include <cstdint>
#include <filesystem>
#include <fstream>
#include <random>
#include <set>
#include <sqlite3.h>
#include <stdexcept>
#include <string>

namespace support {

inline constexpr std::uint64_t pageSize = 4096; // if not given

// A connection of its own, which writes. As long as it is open, the log keeps what it wrote.
class Writer {
public:
    explicit Writer(const std::filesystem::path& path)
    {
        if (::sqlite3_open(path.c_str(), &connection_) != SQLITE_OK)
            throw std::runtime_error(::sqlite3_errmsg(connection_));
    }
    ~Writer() { ::sqlite3_close(connection_); }
    Writer(const Writer&) = delete;
    Writer& operator=(const Writer&) = delete;

    void execute(const std::string& sql)
    {
        if (::sqlite3_exec(connection_, sql.c_str(), nullptr, nullptr, nullptr) != SQLITE_OK)
            throw std::runtime_error(::sqlite3_errmsg(connection_));
    }

private:
    sqlite3* connection_ = nullptr;
};

inline std::uint64_t pagesIn(const std::filesystem::path& path, std::uint64_t size = pageSize)
{
    return std::filesystem::file_size(path) / size;
}

// `random` makes the same bytes with every standard library.
inline std::string rubbish(std::mt19937& random, std::size_t size)
{
    std::string bytes;
    while (bytes.size() < size)
        bytes += static_cast<char>(random() >> 24);
    return bytes;
}

inline void overwrite(const std::filesystem::path& path, std::uint64_t place, const std::string& bytes)
{
    std::fstream file(path, std::ios::in | std::ios::out | std::ios::binary);
    file.seekp(static_cast<std::streamoff>(place));
    file.write(bytes.data(), static_cast<std::streamsize>(bytes.size()));
}

// The first page has the number 1.
inline void overwritePage(const std::filesystem::path& path, std::uint64_t page, std::mt19937& random,
                          std::uint64_t size = pageSize)
{
    overwrite(path, (page - 1) * size, rubbish(random, size));
}

// Overwrites so many pages. Returns their numbers.
inline std::set<std::uint64_t> overwriteRandomPages(const std::filesystem::path& path, std::size_t count,
                                                    std::mt19937& random, std::uint64_t size = pageSize)
{
    std::set<std::uint64_t> pages;
    while (pages.size() < count)
        pages.insert(1 + random() % pagesIn(path, size));
    for (const std::uint64_t page : pages)
        overwritePage(path, page, random, size);
    return pages;
}

} // namespace support
