// SPDX-License-Identifier: Apache-2.0
// The binary form: objects in any order, a table of where each begins, and at the end a trailer that says where the
// table is. Containers name their elements by their numbers in the table.
//
// So an object may be part of several others, and of itself. The reader refuses an object that contains itself. It
// reads a shared object again at each reference and counts it each time, so that a few bytes cannot become a billion
// objects. It makes only text and data once and shares them, but counts their bytes at each reference, too.
//
// The reader checks that every place lies within the file before it reads there.
#include "foundation/plist/PropertyListReader.h"
#include "foundation/text/Format.h"

#include <algorithm>
#include <bit>
#include <cmath>
#include <vector>

namespace foundation {
namespace {

using enum PropertyListError;

// The number of up to 8 bytes; of more bytes, the lower 64 bits.
std::uint64_t bigEndian(std::string_view bytes) noexcept
{
    std::uint64_t value = 0;
    for (const char byte : bytes)
        value = value << 8 | static_cast<std::uint8_t>(byte);
    return value;
}

class BinaryPropertyListReader : private PropertyListReader {
public:
    BinaryPropertyListReader(std::string_view bytes, const PropertyListLimits& limits)
        : PropertyListReader(limits),
          bytes_(bytes),
          contentLeft_(limits.content)
    {
    }

    std::expected<Value, PropertyListFailure> read()
    {
        const std::uint64_t top = readTrailer();
        if (!failed() && !spendObjects(1))
            failWith(TooManyObjects, tooManyObjects());
        return outcome(failed() ? Value() : readObject(top, limits_.depth));
    }

private:
    struct Object {
        std::uint64_t number;
        std::uint64_t offset; // in the file
        std::string_view rest; // from the first unread byte to the end of all objects
    };

    Value fail(const Object& object, PropertyListError error, std::string_view what)
    {
        return failWith(error, format("object {} at byte {}: {}", object.number, object.offset, what));
    }
    std::uint64_t failInTrailer(PropertyListError error, std::string_view what)
    {
        failWith(error, format("trailer: {}", what));
        return 0;
    }
    [[nodiscard]] std::string tooManyObjects() const { return format("more than {} objects", limits_.objects); }

    // Returns the number of the root object.
    std::uint64_t readTrailer()
    {
        constexpr std::size_t headerSize = 8;
        constexpr std::size_t trailerSize = 32;
        if (!bytes_.starts_with("bplist0")) {
            failWith(Unsupported, "header: a binary property list of another version");
            return 0;
        }
        if (bytes_.size() < headerSize + trailerSize)
            return failInTrailer(Malformed, "the file ends before it");
        const std::string_view body = bytes_.substr(0, bytes_.size() - trailerSize);
        const std::string_view trailer = bytes_.substr(body.size());
        const auto isWidth = [](std::size_t width) { return width >= 1 && width <= sizeof(std::uint64_t); };
        offsetSize_ = bigEndian(trailer.substr(6, 1));
        referenceSize_ = bigEndian(trailer.substr(7, 1));
        if (!isWidth(offsetSize_) || !isWidth(referenceSize_))
            return failInTrailer(Malformed, "offsets or references of no or more than 8 bytes");
        const std::uint64_t count = bigEndian(trailer.substr(8, 8));
        const std::uint64_t table = bigEndian(trailer.substr(24, 8));
        if (count > limits_.objects)
            return failInTrailer(TooManyObjects, tooManyObjects());
        if (table < headerSize || table > body.size() || count > (body.size() - table) / offsetSize_)
            return failInTrailer(Malformed, "an offset table that does not lie within the file");
        objects_ = body.substr(0, table);
        offsets_ = body.substr(table, count * offsetSize_);
        isOpen_.resize(count);
        leaves_.resize(count);
        return bigEndian(trailer.substr(16, 8));
    }

    Value readObject(std::uint64_t number, unsigned depth)
    {
        constexpr std::uint64_t firstOffset = 8;
        if (number >= leaves_.size())
            return failWith(Malformed, format("object {}: this object does not exist", number));
        Object object{number, bigEndian(offsets_.substr(number * offsetSize_, offsetSize_)), {}};
        if (object.offset < firstOffset || object.offset >= objects_.size())
            return fail(object, Malformed, "that is not a place of objects");
        if (!leaves_[number].isNull())
            return useLeaf(object);
        object.rest = objects_.substr(object.offset);
        const auto marker = static_cast<unsigned>(bigEndian(take(object, 1)));
        return readMarked(object, marker >> 4, marker & 0xF, depth);
    }

    Value readMarked(Object& object, unsigned type, unsigned detail, unsigned depth)
    {
        switch (type) {
        case 0x0: return readSimple(object, detail);
        case 0x1: return readInteger(object, detail);
        case 0x2: return readReal(object, detail);
        case 0x3: return readDate(object, detail);
        case 0x4: return makeLeaf(object, Data{String(take(object, takeCount(object, detail)))});
        case 0x5: return readAscii(object, detail);
        case 0x6: return readUtf16(object, detail);
        case 0x8: return readUid(object, detail, depth);
        case 0xA: return readArray(object, detail, depth);
        case 0xD: return readDictionary(object, detail, depth);
        default: return failForKind(object);
        }
    }

    Value failForKind(const Object& object)
    {
        return fail(object, Unsupported, "a kind of object that property lists do not have");
    }

    // The next `count` times `size` bytes of the object.
    std::string_view take(Object& object, std::uint64_t count, std::size_t size = 1)
    {
        if (count > object.rest.size() / size) {
            fail(object, Malformed, "it reaches beyond the objects");
            return {};
        }
        const std::string_view taken = object.rest.substr(0, count * size);
        object.rest.remove_prefix(taken.size());
        return taken;
    }

    // The length of an object that has one: it is in the marker, or behind it as an integer.
    std::uint64_t takeCount(Object& object, unsigned detail)
    {
        if (detail != 0xF)
            return detail;
        const auto marker = static_cast<unsigned>(bigEndian(take(object, 1)));
        if (marker < 0x10 || marker > 0x13) {
            fail(object, Malformed, "its length is not an integer of at most 64 bits");
            return 0;
        }
        return bigEndian(take(object, std::uint64_t{1} << (marker & 0xF)));
    }

    Value readSimple(const Object& object, unsigned detail)
    {
        switch (detail) {
        case 0x0: return {};
        case 0x8: return false;
        case 0x9: return true;
        default: return failForKind(object);
        }
    }

    // Integers below 8 bytes have no sign; unsigned integers of 64 bits have 16 bytes.
    Value readInteger(Object& object, unsigned detail)
    {
        if (detail > 4)
            return fail(object, InvalidValue, "an integer of more than 16 bytes");
        const std::string_view bytes = take(object, std::uint64_t{1} << detail);
        const std::uint64_t value = bigEndian(bytes);
        const auto asSigned = static_cast<std::int64_t>(value);
        if (bytes.size() <= sizeof value)
            return asSigned;
        const std::uint64_t upper = bigEndian(bytes.substr(0, sizeof value));
        if (upper == 0)
            return propertyListInteger(value);
        if (upper == ~std::uint64_t{0} && asSigned < 0)
            return asSigned;
        return fail(object, InvalidValue, "not an integer of 64 bits");
    }

    Value readReal(Object& object, unsigned detail)
    {
        if (detail == 2)
            return std::bit_cast<float>(static_cast<std::uint32_t>(bigEndian(take(object, sizeof(float)))));
        if (detail == 3)
            return std::bit_cast<double>(bigEndian(take(object, sizeof(double))));
        return fail(object, InvalidValue, "a real number of neither 32 nor 64 bits");
    }

    Value readDate(Object& object, unsigned detail)
    {
        constexpr double secondsFrom1970To2001 = 978307200;
        const auto secondsSince2001 = std::bit_cast<double>(bigEndian(take(object, sizeof(double))));
        if (detail != 3 || !std::isfinite(secondsSince2001))
            return fail(object, InvalidValue, "not a date");
        return Date{secondsSince2001 + secondsFrom1970To2001};
    }

    Value readAscii(Object& object, unsigned detail)
    {
        const std::string_view text = take(object, takeCount(object, detail));
        if (std::ranges::any_of(text, [](char character) { return static_cast<std::uint8_t>(character) >= 0x80; }))
            return fail(object, InvalidText, "a string that is not in ASCII");
        return makeLeaf(object, String(text));
    }

    Value readUtf16(Object& object, unsigned detail)
    {
        const auto text = utf8FromUtf16(take(object, takeCount(object, detail), sizeof(char16_t)), std::endian::big);
        return text ? makeLeaf(object, String(*text)) : fail(object, InvalidText, "a string that is not in UTF-16");
    }

    Value makeLeaf(const Object& object, Value leaf)
    {
        leaves_[object.number] = std::move(leaf);
        return useLeaf(object);
    }

    Value useLeaf(const Object& object)
    {
        const Value& leaf = leaves_[object.number];
        const std::size_t size =
            leaf.kind() == Value::Kind::Data ? leaf.data()->bytes.view().size() : leaf.stringView().size();
        if (size > contentLeft_)
            return fail(object, TooLarge, format("more than {} bytes of text and data", limits_.content));
        contentLeft_ -= size;
        return leaf;
    }

    Value readUid(Object& object, unsigned detail, unsigned depth)
    {
        const std::string_view bytes = take(object, detail + 1);
        if (bytes.size() > sizeof(std::uint64_t))
            return fail(object, InvalidValue, "a UID of more than 64 bits");
        if (!open(object, depth, 2))
            return {};
        isOpen_[object.number] = false;
        return Dictionary{{"CF$UID", propertyListInteger(bigEndian(bytes))}};
    }

    Value readArray(Object& object, unsigned detail, unsigned depth)
    {
        const std::uint64_t count = takeCount(object, detail);
        const std::string_view elements = take(object, count, referenceSize_);
        if (!open(object, depth, count))
            return {};
        std::vector<Value> values;
        values.reserve(count);
        for (std::uint64_t index = 0; index < count && !failed(); ++index)
            values.push_back(readObject(referenceAt(elements, index), depth - 1));
        isOpen_[object.number] = false;
        return Array(std::move(values));
    }

    // All keys stand before all values.
    Value readDictionary(Object& object, unsigned detail, unsigned depth)
    {
        const std::uint64_t count = takeCount(object, detail);
        const std::string_view keys = take(object, count, referenceSize_);
        const std::string_view values = take(object, count, referenceSize_);
        if (!open(object, depth, 2 * count))
            return {};
        Dictionary::Entries entries;
        entries.reserve(count);
        for (std::uint64_t index = 0; index < count && !failed(); ++index) {
            const auto key = readObject(referenceAt(keys, index), depth - 1).string();
            if (!key)
                return fail(object, Malformed, "a key that is not a string");
            entries.push_back({*key, readObject(referenceAt(values, index), depth - 1)});
        }
        isOpen_[object.number] = false;
        return Dictionary(std::move(entries));
    }

    // Whether the container, with so many elements, may be read. It is open until its elements are read.
    bool open(const Object& object, unsigned depth, std::uint64_t elements)
    {
        if (failed())
            return false;
        if (isOpen_[object.number])
            fail(object, Cycle, "a container that contains itself");
        else if (depth == 0)
            fail(object, TooDeep, format("more than {} containers inside each other", limits_.depth));
        else if (!spendObjects(elements))
            fail(object, TooManyObjects, tooManyObjects());
        isOpen_[object.number] = true;
        return !failed();
    }

    [[nodiscard]] std::uint64_t referenceAt(std::string_view references, std::uint64_t index) const
    {
        return bigEndian(references.substr(index * referenceSize_, referenceSize_));
    }

    const std::string_view bytes_;
    std::string_view objects_; // with the header before them, so that offsets count from it
    std::string_view offsets_;
    std::size_t offsetSize_ = 0;
    std::size_t referenceSize_ = 0;
    std::vector<bool> isOpen_; // containers that are being read
    std::vector<Value> leaves_; // text and data that have been read; null for other objects
    std::size_t contentLeft_;
};

} // namespace

std::expected<Value, PropertyListFailure> readBinaryPropertyList(std::string_view bytes,
                                                                 const PropertyListLimits& limits)
{
    return BinaryPropertyListReader(bytes, limits).read();
}

} // namespace foundation
