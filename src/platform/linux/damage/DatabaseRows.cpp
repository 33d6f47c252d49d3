// SPDX-License-Identifier: Apache-2.0
// The layout is SQLite's: https://sqlite.org/fileformat2.html. Every number of the file is foreign: it is compared with
// what is there before it is used.
#include "platform/linux/damage/DatabaseRows.h"

#include "foundation/values/String.h"

#include <algorithm>
#include <array>
#include <bit>
#include <optional>
#include <span>

namespace platform {
namespace {

using Bytes = std::span<const std::byte>;

constexpr std::size_t databaseHeaderSize = 100; // on the first page, before its own header
constexpr std::size_t pageHeaderSize = 8;
constexpr std::byte leafOfTable{0x0D};

// Takes a number of 1 to 9 bytes, of which each but the last says by its highest bit that more follow.
std::optional<std::uint64_t> takeNumber(Bytes& bytes)
{
    std::uint64_t number = 0;
    for (std::size_t count = 0; count < 9 && count < bytes.size(); ++count) {
        const auto byte = std::to_integer<std::uint64_t>(bytes[count]);
        const bool isNinth = count == 8;
        number = isNinth ? number << 8 | byte : number << 7 | (byte & 0x7F);
        if (isNinth || (byte & 0x80) == 0) {
            bytes = bytes.subspan(count + 1);
            return number;
        }
    }
    return std::nullopt;
}

std::int64_t signedNumber(Bytes bytes)
{
    const std::size_t unused = 64 - 8 * bytes.size();
    return static_cast<std::int64_t>(bigEndian(bytes) << unused) >> unused;
}

// The size of a value by its type in the file; none for types that are not in use.
std::optional<std::uint64_t> sizeOfValue(std::uint64_t type)
{
    constexpr std::array<std::uint64_t, 10> sizes = {0, 1, 2, 3, 4, 6, 8, 8, 0, 0};
    if (type < sizes.size())
        return sizes[type];
    return type < 12 ? std::nullopt : std::optional((type - 12) / 2);
}

StoredValue valueOf(std::uint64_t type, Bytes bytes)
{
    const std::string_view text(reinterpret_cast<const char*>(bytes.data()), bytes.size());
    switch (type) {
    case 0: return std::monostate();
    case 7: return std::bit_cast<double>(bigEndian(bytes));
    case 8: return std::int64_t{0};
    case 9: return std::int64_t{1};
    default: break;
    }
    if (type < 8)
        return signedNumber(bytes);
    return type % 2 == 0 ? StoredValue(StoredBytes{text}) : StoredValue(text);
}

} // namespace

bool DatabaseRows::goTo(std::uint32_t page)
{
    places_ = placesEnd_ = 0;
    const std::size_t header = page == 1 ? databaseHeaderSize : 0;
    if (!pages_.read(page, page_) || page_[header] != leafOfTable)
        return false;
    const std::size_t rows = bigEndian(Bytes(page_).subspan(header + 3, 2));
    places_ = header + pageHeaderSize;
    placesEnd_ = places_ + 2 * rows;
    if (placesEnd_ > pages_.usableSize())
        placesEnd_ = places_;
    return places_ < placesEnd_;
}

const StoredRow* DatabaseRows::next()
{
    while (places_ < placesEnd_) {
        const std::size_t place = bigEndian(Bytes(page_).subspan(places_, 2));
        places_ += 2;
        if (place >= placesEnd_ && place < pages_.usableSize() && readRow(place))
            return &row_;
    }
    return nullptr;
}

bool DatabaseRows::readRow(std::size_t place)
{
    const Bytes page = Bytes(page_).first(pages_.usableSize());
    Bytes bytes = page.subspan(place);
    const auto size = takeNumber(bytes);
    const auto number = size ? takeNumber(bytes) : size;
    if (!number || *size > std::uint64_t{pages_.count()} * pages_.size())
        return false;
    row_.number = static_cast<std::int64_t>(*number);
    row_.size = *size;
    return readPayload(page.size() - bytes.size(), *size) && readValues();
}

// Of a payload that is too long for the page, the beginning is on the page and the rest in a chain of further pages.
bool DatabaseRows::readPayload(std::size_t place, std::uint64_t size)
{
    const std::size_t usable = pages_.usableSize();
    const std::size_t longestOnPage = usable - 35;
    std::uint64_t onPage = size;
    if (size > longestOnPage) {
        const std::size_t shortest = (usable - 12) * 32 / 255 - 23;
        onPage = shortest + (size - shortest) % (usable - 4);
        onPage = onPage <= longestOnPage ? onPage : shortest;
    }
    const bool goesOn = onPage < size;
    if (place + onPage + (goesOn ? 4 : 0) > usable)
        return false;
    const auto append = [this](Bytes bytes) {
        payload_.append(reinterpret_cast<const char*>(bytes.data()), bytes.size());
    };
    payload_.clear();
    append(Bytes(page_).subspan(place, onPage));
    std::uint64_t following = goesOn ? bigEndian(Bytes(page_).subspan(place + onPage, 4)) : 0;
    while (payload_.size() < size) {
        if (following > pages_.count() || !pages_.read(static_cast<std::uint32_t>(following), overflow_))
            return false;
        append(Bytes(overflow_).subspan(4, std::min<std::uint64_t>(usable - 4, size - payload_.size())));
        following = bigEndian(Bytes(overflow_).first(4));
    }
    return following == 0; // the last page of a chain says that it is the last
}

bool DatabaseRows::readValues()
{
    row_.values.clear();
    const Bytes payload = std::as_bytes(std::span(payload_));
    Bytes types = payload;
    const auto headerSize = takeNumber(types);
    if (!headerSize || *headerSize > payload.size() || *headerSize < payload.size() - types.size())
        return false;
    Bytes values = payload.subspan(*headerSize);
    types = types.first(types.size() - values.size());
    while (!types.empty()) {
        const auto type = takeNumber(types);
        const auto size = type ? sizeOfValue(*type) : type;
        if (!size || *size > values.size())
            return false;
        row_.values.push_back(valueOf(*type, values.first(*size)));
        const auto* text = std::get_if<std::string_view>(&row_.values.back());
        if (text != nullptr && !foundation::isValidUtf8(*text))
            return false;
        values = values.subspan(*size);
    }
    return values.empty();
}

} // namespace platform
