// SPDX-License-Identifier: Apache-2.0
// Fuzzes the reading of damaged databases: no bytes may crash it or keep it for long. The input is the database and,
// from the place on that its last two bytes name, the log.
#include "platform/linux/damage/DatabaseRows.h"

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>
#include <string_view>

namespace {

// Files of this process.
class Place {
public:
    Place()
    {
        std::string pattern = std::filesystem::temp_directory_path() / "kesto-fuzz-XXXXXX";
        if (::mkdtemp(pattern.data()) == nullptr)
            std::abort();
        path_ = pattern;
    }
    ~Place() { std::filesystem::remove_all(path_); }
    Place(const Place&) = delete;
    Place& operator=(const Place&) = delete;

    [[nodiscard]] std::filesystem::path write(const char* name, std::string_view bytes) const
    {
        const auto file = path_ / name;
        std::ofstream(file, std::ios::binary | std::ios::trunc) << bytes;
        return file;
    }

private:
    std::filesystem::path path_;
};

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    static const Place place;
    std::string_view bytes(reinterpret_cast<const char*>(data), size);
    std::size_t divided = bytes.size();
    if (bytes.size() >= 2) {
        divided = data[size - 2] * std::size_t{256} + data[size - 1];
        bytes.remove_suffix(2);
        divided = std::min(divided, bytes.size());
    }
    const auto file = place.write("database", bytes.substr(0, divided));
    static_cast<void>(place.write("database-wal", bytes.substr(divided)));
    platform::DatabaseRows rows{platform::DatabasePages(file)};
    for (std::uint32_t page = 1; page <= rows.pageCount() && page < 1000; ++page)
        if (rows.goTo(page))
            while (const platform::StoredRow* row = rows.next())
                for (const platform::StoredValue& value : row->values)
                    if (const auto* text = std::get_if<std::string_view>(&value);
                        text != nullptr && text->size() > row->size)
                        std::abort();
    return 0;
}
