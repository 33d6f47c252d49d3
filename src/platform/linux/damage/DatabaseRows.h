// SPDX-License-Identifier: Apache-2.0
// The rows of an SQLite database that may be damaged, page by page.
//
// SQLite finds a row only through the pages above it, so that a damaged one takes everything below along. But a page
// with rows says so in its first byte, and its rows are whole in themselves, except for long ones, which go on in
// further pages. So this reads the rows of every page that still is one. Which table they belong to only those other
// pages would say; the reader of the rows must know it by their values.
//
// No client can forge a page with rows: its bytes are written behind the number of the next page, and that begins with
// zero.
#pragma once

#include "platform/linux/damage/DatabasePages.h"

#include <cstdint>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

namespace platform {

struct StoredBytes { // a BLOB
    std::string_view bytes;
};
using StoredValue = std::variant<std::monostate, std::int64_t, double, std::string_view, StoredBytes>; // first: NULL

// The values are valid until the next row is read.
struct StoredRow {
    std::int64_t number = 0; // the rowid; a column that is its alias has the value NULL
    std::uint64_t size = 0; // of its values, in bytes
    std::vector<StoredValue> values;
};

// One thread at a time.
class DatabaseRows {
public:
    explicit DatabaseRows(DatabasePages pages) : pages_(std::move(pages)) { }

    [[nodiscard]] std::uint32_t pageCount() const noexcept { return pages_.count(); }
    // Reads a page, and goes to the first of its rows. False if the page holds no rows of a table: another kind of page
    // or rubbish.
    [[nodiscard]] bool goTo(std::uint32_t page);
    // The next row of the page that is whole: its bytes are all there, and its texts are UTF-8. Null at the end.
    [[nodiscard]] const StoredRow* next();

private:
    [[nodiscard]] bool readRow(std::size_t place);
    [[nodiscard]] bool readPayload(std::size_t place, std::uint64_t size);
    [[nodiscard]] bool readValues();

    DatabasePages pages_;
    std::vector<std::byte> page_;
    std::size_t places_ = 0; // of the rows' places, on the page
    std::size_t placesEnd_ = 0;
    std::vector<std::byte> overflow_;
    std::string payload_;
    StoredRow row_;
};

} // namespace platform
