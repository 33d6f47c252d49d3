// SPDX-License-Identifier: Apache-2.0
// The writer is a head and the bytes behind it. The reader is one pass over foreign bytes, without look-ahead: it
// recurses only into containers, which are counted, and trusts no length before the bytes are there.
#include "foundation/cbor/Cbor.h"

#include "foundation/cbor/CborHead.h"

#include <algorithm>
#include <array>
#include <bit>
#include <cmath>
#include <cstring>
#include <limits>

namespace foundation {
namespace {

using Head = CborHead;
using Major = CborMajor;
using enum CborHead::Simple;

constexpr char breakByte = '\xFF';
constexpr std::uint64_t epochDateTag = 1;

// The longest head: the first byte and a number of 64 bits.
constexpr std::size_t longestHead = 9;

template <typename Integer> char* putBigEndian(Integer value, char* place) noexcept
{
    if constexpr (std::endian::native == std::endian::little)
        value = std::byteswap(value);
    std::memcpy(place, &value, sizeof value);
    return place + sizeof value;
}

// Writes the shortest head; returns where it ends.
char* putHead(Major major, std::uint64_t argument, char* place) noexcept
{
    const auto put = [major, &place](unsigned additional) {
        *place++ = static_cast<char>(static_cast<unsigned>(major) << 5 | additional);
    };
    if (argument < 24) {
        put(static_cast<unsigned>(argument));
        return place;
    }
    if (argument <= std::numeric_limits<std::uint8_t>::max()) {
        put(24);
        return putBigEndian(static_cast<std::uint8_t>(argument), place);
    }
    if (argument <= std::numeric_limits<std::uint16_t>::max()) {
        put(25);
        return putBigEndian(static_cast<std::uint16_t>(argument), place);
    }
    if (argument <= std::numeric_limits<std::uint32_t>::max()) {
        put(26);
        return putBigEndian(static_cast<std::uint32_t>(argument), place);
    }
    put(27);
    return putBigEndian(argument, place);
}

// Appends the bytes that `put` writes to its argument, at most `most`; `put` returns the end of its bytes. This changes
// the string once, and not once for each byte.
template <typename Put> void append(std::size_t most, std::string& out, Put put)
{
    out.resize_and_overwrite(out.size() + most, [&put, before = out.size()](char* bytes, std::size_t) {
        return static_cast<std::size_t>(put(bytes + before) - bytes);
    });
}

void appendHead(Major major, std::uint64_t argument, std::string& out)
{
    append(longestHead, out, [&](char* place) { return putHead(major, argument, place); });
}

// How many bytes the shortest head takes.
std::size_t headSize(std::uint64_t argument) noexcept
{
    if (argument < 24)
        return 1;
    if (argument <= std::numeric_limits<std::uint8_t>::max())
        return 2;
    if (argument <= std::numeric_limits<std::uint16_t>::max())
        return 3;
    return argument <= std::numeric_limits<std::uint32_t>::max() ? 5 : longestHead;
}

// Writes the parts of an encoding to memory, or only counts their bytes: so the size is known before memory is
// allocated for it.
struct Place {
    char* at;

    void head(Major major, std::uint64_t argument) noexcept { at = putHead(major, argument, at); }
    void bytes(std::string_view bytes) noexcept { at += bytes.copy(at, bytes.size()); }
    template <typename Integer> void bigEndian(Integer value) noexcept { at = putBigEndian(value, at); }
};
struct Size {
    std::size_t count = 0;

    void head(Major, std::uint64_t argument) noexcept { count += headSize(argument); }
    void bytes(std::string_view bytes) noexcept { count += bytes.size(); }
    template <typename Integer> void bigEndian(Integer) noexcept { count += sizeof(Integer); }
};

template <typename Out> void putBytes(Major major, std::string_view bytes, Out& out) noexcept
{
    out.head(major, bytes.size());
    out.bytes(bytes);
}

template <typename Out> void putSimple(Head::Simple simple, Out& out) noexcept
{
    const char byte = static_cast<char>(static_cast<unsigned>(Major::Simple) << 5 | simple);
    out.bytes({&byte, 1});
}

template <typename Out> void put(Number number, Out& out) noexcept
{
    switch (number.kind()) {
    case Number::Kind::Boolean: return putSimple(number.booleanValue() ? True : False, out);
    case Number::Kind::Float32:
        putSimple(Float32, out);
        return out.bigEndian(std::bit_cast<std::uint32_t>(static_cast<float>(number.doubleValue())));
    case Number::Kind::Float64:
        putSimple(Float64, out);
        return out.bigEndian(std::bit_cast<std::uint64_t>(number.doubleValue()));
    case Number::Kind::Unsigned64: return out.head(Major::Unsigned, *number.exactly<std::uint64_t>());
    case Number::Kind::Signed64: break;
    }
    const std::int64_t value = number.int64Value();
    if (value >= 0)
        out.head(Major::Unsigned, static_cast<std::uint64_t>(value));
    else
        out.head(Major::Negative, ~static_cast<std::uint64_t>(value));
}

template <typename Out> void put(const Dictionary& dictionary, Out& out) noexcept;

template <typename Out> void put(const Value& value, Out& out) noexcept
{
    switch (value.kind()) {
    case Value::Kind::Null: return putSimple(Null, out);
    case Value::Kind::Number: return put(*value.number(), out);
    case Value::Kind::String: return putBytes(Major::Text, value.stringView(), out);
    case Value::Kind::Dictionary: return put(*value.dictionary(), out);
    case Value::Kind::Data: return putBytes(Major::Bytes, value.data()->bytes, out);
    case Value::Kind::Date: out.head(Major::Tag, epochDateTag); return put(Number(value.date()->secondsSince1970), out);
    case Value::Kind::Array: break;
    }
    const Array array = *value.array();
    out.head(Major::Array, array.size());
    for (const Value& element : array)
        put(element, out);
}

template <typename Out> void put(const Dictionary& dictionary, Out& out) noexcept
{
    out.head(Major::Map, dictionary.size());
    for (const auto& [key, value] : dictionary) {
        putBytes(Major::Text, key, out);
        put(value, out);
    }
}

template <typename Item> std::size_t sizeOf(const Item& item) noexcept
{
    Size size;
    put(item, size);
    return size.count;
}

template <typename Item> char* putAt(const Item& item, char* place) noexcept
{
    Place out{place};
    put(item, out);
    return out.at;
}

float widenHalf(std::uint16_t half) noexcept // RFC 8949, appendix D
{
    const int exponent = half >> 10 & 0x1F;
    const int mantissa = half & 0x3FF;
    const float magnitude = exponent == 0 ? std::ldexp(static_cast<float>(mantissa), -24)
        : exponent != 31                  ? std::ldexp(static_cast<float>(mantissa + 1024), exponent - 25)
        : mantissa == 0                   ? std::numeric_limits<float>::infinity()
                                          : std::numeric_limits<float>::quiet_NaN();
    return (half & 0x8000) != 0 ? -magnitude : magnitude;
}

} // namespace

std::string_view description(CborError error) noexcept
{
    switch (error) {
    case CborError::Truncated: return "the CBOR item is not complete";
    case CborError::TrailingBytes: return "bytes follow the CBOR item";
    case CborError::TooDeep: return "the CBOR item is nested too deep";
    case CborError::Malformed: return "not well-formed CBOR";
    case CborError::InvalidUtf8: return "text is not valid UTF-8";
    case CborError::KeyNotText: return "a map key is not text";
    case CborError::Unsupported: return "a CBOR item of a type that messages do not have";
    case CborError::IntegerOutOfRange: return "an integer is out of range";
    }
    return "unknown error";
}

void appendCborInteger(std::uint64_t value, std::string& out)
{
    appendHead(Major::Unsigned, value, out);
}

void appendCborText(std::string_view text, std::string& out)
{
    append(longestHead + text.size(), out, [text](char* place) {
        Place end{place};
        putBytes(Major::Text, text, end);
        return end.at;
    });
}

void appendCborArrayHead(std::uint64_t count, std::string& out)
{
    appendHead(Major::Array, count, out);
}

void appendCborMapHead(std::uint64_t count, std::string& out)
{
    appendHead(Major::Map, count, out);
}

void appendCborArray(std::span<const std::int64_t> integers, std::string& out)
{
    append(longestHead * (integers.size() + 1), out, [integers](char* place) {
        place = putHead(Major::Array, integers.size(), place);
        for (const std::int64_t integer : integers) {
            const auto bits = static_cast<std::uint64_t>(integer);
            place = integer >= 0 ? putHead(Major::Unsigned, bits, place) : putHead(Major::Negative, ~bits, place);
        }
        return place;
    });
}

void appendCbor(const Dictionary& dictionary, std::string& out)
{
    append(sizeOf(dictionary), out, [&](char* place) { return putAt(dictionary, place); });
}

void appendCbor(const Value& value, std::string& out)
{
    append(sizeOf(value), out, [&](char* place) { return putAt(value, place); });
}

std::size_t cborSize(const Dictionary& dictionary) noexcept
{
    return sizeOf(dictionary);
}

char* putCbor(const Dictionary& dictionary, char* place) noexcept
{
    return putAt(dictionary, place);
}

namespace {

// The keys of a map that is being read. As long as they equal those of an earlier shape, no key is made.
class MapKeys {
public:
    [[nodiscard]] bool empty() const { return taken_ == 0 && own_.empty(); }

    // Expects the keys of the shape at this place; if the map has other keys, their shape replaces it there.
    void expect(Reference<DictionaryShape>& place)
    {
        place_ = &place;
        expected_ = place;
    }

    // Whether this is the next expected key; if so, takes it.
    bool takeExpected(std::string_view key)
    {
        if (!own_.empty() || !expected_ || taken_ == expected_->keys().size() || expected_->keys()[taken_] != key)
            return false;
        ++taken_;
        return true;
    }

    void add(String key)
    {
        leaveExpected();
        own_.push_back(std::move(key));
    }

    // The dictionary of these keys and as many values.
    Dictionary dictionary(std::span<Value> values) &&
    {
        if (empty())
            return {};
        if (own_.empty() && taken_ == expected_->keys().size())
            return {std::move(expected_), values};
        leaveExpected();
        Dictionary dictionary(std::move(own_), values);
        if (dictionary.shape()->isSmall())
            *place_ = dictionary.shape();
        return dictionary;
    }

private:
    void leaveExpected()
    {
        if (own_.empty() && taken_ != 0)
            own_.assign(expected_->keys().begin(), expected_->keys().begin() + static_cast<std::ptrdiff_t>(taken_));
    }

    Reference<DictionaryShape>* place_ = nullptr;
    Reference<DictionaryShape> expected_;
    std::size_t taken_ = 0; // of the expected keys
    std::vector<String> own_; // all of them, once one was not expected
};

// The elements of the containers that are being read, one container after the other. Each thread has one vector; one
// for each decoder would cost memory for every client.
std::vector<Value>& unfinishedValues()
{
    thread_local std::vector<Value> values;
    return values;
}

} // namespace

// Reads one item after the other. The first error empties the rest, so that every loop ends; `readAll` returns this
// error.
class CborReader {
public:
    CborReader(std::string_view bytes, CborDecoder& decoder) : rest_(bytes), decoder_(decoder)
    {
        values_.clear(); // left by a reading that ran out of memory
    }

    std::expected<Value, CborError> readAll(unsigned maximumDepth)
    {
        Value value = readItem(maximumDepth);
        if (constexpr std::size_t mostRoomKept = 4096; values_.capacity() > mostRoomKept)
            values_ = std::vector<Value>();
        if (error_)
            return std::unexpected(*error_);
        if (!rest_.empty())
            return std::unexpected(CborError::TrailingBytes);
        return value;
    }
    [[nodiscard]] std::size_t heads() const noexcept { return heads_; }

private:
    void fail(CborError error) noexcept
    {
        if (!error_)
            error_ = error;
        rest_ = {};
    }

    Value refuse(CborError error) noexcept
    {
        fail(error);
        return {};
    }

    std::string_view take(std::uint64_t count) noexcept
    {
        if (rest_.size() < count) {
            fail(CborError::Truncated);
            return {};
        }
        const std::string_view taken = rest_.substr(0, count);
        rest_.remove_prefix(taken.size());
        return taken;
    }

    template <typename Integer> std::uint64_t takeBigEndian() noexcept
    {
        const std::string_view bytes = take(sizeof(Integer));
        return bytes.empty() ? 0 : cborBigEndian<Integer>(bytes.data());
    }

    Head readHead() noexcept
    {
        ++heads_;
        if (rest_.empty()) {
            fail(CborError::Truncated);
            return {};
        }
        const auto byte = static_cast<std::uint8_t>(rest_.front());
        rest_.remove_prefix(1);
        Head head{static_cast<Major>(byte >> 5), static_cast<std::uint8_t>(byte & 0x1F), byte & 0x1FU};
        if (head.additional >= 24) // the number follows the first byte
            readArgument(head);
        return head;
    }

    void readArgument(Head& head) noexcept
    {
        const bool mayBeIndefinite = head.major >= Major::Bytes && head.major <= Major::Map;
        switch (head.additional) {
        case 24: head.argument = takeBigEndian<std::uint8_t>(); break;
        case 25: head.argument = takeBigEndian<std::uint16_t>(); break;
        case 26: head.argument = takeBigEndian<std::uint32_t>(); break;
        case 27: head.argument = takeBigEndian<std::uint64_t>(); break;
        case Head::indefiniteLength:
            head.argument = 0;
            if (mayBeIndefinite)
                break;
            [[fallthrough]];
        default: fail(CborError::Malformed);
        }
        if (error_)
            head = Head();
    }

    Value readItem(unsigned depth)
    {
        const Head head = readHead();
        switch (head.major) {
        case Major::Bytes: return Data{String(readBytes(head))};
        case Major::Text: return String(readText(head));
        case Major::Array: return depth == 0 ? refuse(CborError::TooDeep) : readArray(head, depth - 1);
        case Major::Map: return depth == 0 ? refuse(CborError::TooDeep) : readMap(head, depth - 1);
        case Major::Tag: return readTagged(head);
        default: return readScalar(head);
        }
    }

    // A value that its head holds completely: integers and the simple values. Null for all others.
    Value readScalar(const Head& head) noexcept
    {
        if (const auto number = cborNumber(head))
            return *number;
        if (head.major == Major::Negative)
            return refuse(CborError::IntegerOutOfRange);
        if (head.major != Major::Simple || head.additional == Null)
            return {};
        if (head.additional == Float16)
            return widenHalf(static_cast<std::uint16_t>(head.argument));
        const bool wellFormed = head.additional != 24 || head.argument >= 32;
        return refuse(wellFormed ? CborError::Unsupported : CborError::Malformed);
    }

    // Inside an indefinite length: whether the next byte is the break; if so, takes it.
    bool takeBreak() noexcept
    {
        if (!rest_.starts_with(breakByte))
            return false;
        rest_.remove_prefix(1);
        return true;
    }

    // Calls `readElement` as often as the container says, or until its break.
    template <typename ReadElement> void readElements(const Head& head, ReadElement readElement)
    {
        for (std::uint64_t index = 0; head.isIndefinite() ? !takeBreak() : index < head.argument; ++index) {
            readElement();
            if (error_)
                return;
        }
    }

    // The chunks of a string of indefinite length are joined in `chunks_`, which is valid until the next string.
    std::string_view readBytes(const Head& head)
    {
        if (!head.isIndefinite())
            return take(head.argument);
        chunks_.clear();
        readElements(head, [&] {
            const Head chunk = readHead();
            if (chunk.major != head.major || chunk.isIndefinite())
                return fail(CborError::Malformed);
            const std::string_view bytes = take(chunk.argument);
            if (head.major == Major::Text && !isValidUtf8(bytes)) // each chunk alone must be text
                return fail(CborError::InvalidUtf8);
            chunks_ += bytes;
        });
        return chunks_;
    }

    // Whether the bytes that `readBytes` returned for a text are UTF-8. The chunks of an indefinite length have been
    // checked.
    [[nodiscard]] static bool isText(const Head& head, std::string_view bytes) noexcept
    {
        return head.isIndefinite() || isValidUtf8(bytes);
    }

    std::string_view readText(const Head& head)
    {
        const std::string_view text = readBytes(head);
        if (!isText(head, text))
            fail(CborError::InvalidUtf8);
        return text;
    }

    // An expected or remembered key was checked when it came first.
    void readKey(const Head& map, MapKeys& keys)
    {
        const Head head = readHead();
        if (head.major != Major::Text)
            return fail(CborError::KeyNotText);
        const std::string_view key = readBytes(head);
        if (error_)
            return;
        if (keys.empty())
            keys.expect(decoder_.shapeOf(key, map.argument));
        if (keys.takeExpected(key))
            return;
        if (const String* const known = decoder_.find(key))
            return keys.add(*known);
        if (!isText(head, key))
            return fail(CborError::InvalidUtf8);
        keys.add(decoder_.remember(key));
    }

    Value readArray(const Head& head, unsigned depth)
    {
        const std::size_t begin = values_.size();
        readElements(head, [&] { values_.push_back(readItem(depth)); });
        Array array(std::span<Value>(values_).subspan(begin));
        values_.resize(begin);
        return array;
    }

    Value readMap(const Head& head, unsigned depth)
    {
        const std::size_t begin = values_.size();
        MapKeys keys;
        readElements(head, [&] {
            readKey(head, keys);
            if (!error_)
                values_.push_back(readItem(depth));
        });
        Dictionary dictionary = std::move(keys).dictionary(std::span<Value>(values_).subspan(begin));
        values_.resize(begin);
        return dictionary;
    }

    Value readTagged(const Head& head)
    {
        if (head.argument != epochDateTag)
            return refuse(CborError::Unsupported);
        const auto seconds = readScalar(readHead()).number(); // no further tag: tags could nest without end
        if (!seconds || seconds->kind() == Number::Kind::Boolean)
            return refuse(CborError::Malformed);
        return Date{seconds->doubleValue()};
    }

    std::string_view rest_;
    CborDecoder& decoder_;
    std::optional<CborError> error_;
    std::size_t heads_ = 0; // that were read
    std::string chunks_;
    std::vector<Value>& values_ = unfinishedValues();
};

std::expected<Value, CborError> CborDecoder::decode(std::string_view bytes, unsigned maximumDepth)
{
    constexpr std::size_t bytesOfAnItem = 64; // with its object, besides its text
    CborReader reader(bytes, *this);
    auto value = reader.readAll(maximumDepth);
    mostMemory_ = bytes.size() + reader.heads() * bytesOfAnItem;
    return value;
}

namespace {

// Eight characters at a time; the last eight may overlap the eight before.
std::uint64_t hashOf(std::string_view key) noexcept
{
    constexpr std::uint64_t multiplier = 0x9E3779B97F4A7C15; // odd, with well mixed bits
    std::uint64_t hash = key.size();
    const auto add = [&hash](const char* bytes, std::size_t count) {
        std::uint64_t word = 0;
        std::memcpy(&word, bytes, count);
        hash = (hash ^ word) * multiplier;
        hash ^= hash >> 32;
    };
    constexpr std::size_t wordSize = sizeof hash;
    if (key.size() < wordSize) {
        add(key.data(), key.size());
        return hash;
    }
    for (std::size_t at = 0; at + wordSize < key.size(); at += wordSize)
        add(key.data() + at, wordSize);
    add(key.data() + key.size() - wordSize, wordSize);
    return hash;
}

} // namespace

const String* CborDecoder::find(std::string_view key) const
{
    if (key.empty() || keys_.empty())
        return nullptr;
    const String& known = keys_[hashOf(key) % rememberedKeys];
    return known == key ? &known : nullptr;
}

String CborDecoder::remember(std::string_view key)
{
    if (key.empty() || key.size() > longestRememberedKey)
        return key;
    if (keys_.empty())
        keys_.resize(rememberedKeys);
    return keys_[hashOf(key) % rememberedKeys] = String(key);
}

Reference<DictionaryShape>& CborDecoder::shapeOf(std::string_view firstKey, std::uint64_t count)
{
    return shapes_[(hashOf(firstKey) + count) % rememberedShapes];
}

} // namespace foundation
