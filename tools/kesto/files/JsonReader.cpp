// SPDX-License-Identifier: Apache-2.0
// RapidJSON reports each piece and keeps none: this file builds the values, without recursion, so that it can refuse a
// text of any depth.
#include "kesto/files/JsonReader.h"

#include <fmt/format.h>
#include <rapidjson/error/en.h>
#include <rapidjson/filereadstream.h>
#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>
#include <utility>
#include <vector>

namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;

constexpr unsigned deepest = 40; // the service accepts 32 levels from its clients, and adds a few around them
constexpr unsigned parseFlags =
    rapidjson::kParseIterativeFlag | rapidjson::kParseValidateEncodingFlag | rapidjson::kParseFullPrecisionFlag;

// Receives RapidJSON's events, and passes on each complete value of the given depth. At depth 1 these are the elements
// of a list, and the text must be a list.
class ValueBuilder {
public:
    using Visit = std::function<bool(Value value)>;

    ValueBuilder(unsigned depth, const Visit& visit) : visitDepth_(depth), visit_(visit) { }

    [[nodiscard]] bool isStoppedByVisit() const { return isStoppedByVisit_; }
    [[nodiscard]] bool isTooDeep() const { return depth_ > deepest; }

    bool Null() { return add({}); }
    bool Bool(bool value) { return add(value); }
    bool Int(int value) { return add(value); }
    bool Uint(unsigned value) { return add(std::int64_t{value}); }
    bool Int64(std::int64_t value) { return add(value); }
    bool Uint64(std::uint64_t value) { return add(value); }
    bool Double(double value) { return add(value); }
    static bool RawNumber(const char* /*text*/, rapidjson::SizeType /*size*/, bool /*copy*/) { return false; }
    bool String(const char* text, rapidjson::SizeType size, bool /*copy*/) { return add(std::string_view(text, size)); }
    bool Key(const char* text, rapidjson::SizeType size, bool /*copy*/)
    {
        values_.emplace_back(std::string_view(text, size));
        return true;
    }

    bool StartObject() { return depth_ >= visitDepth_ && StartArray(); }
    bool EndObject(rapidjson::SizeType count)
    {
        Dictionary::Entries entries;
        entries.reserve(count);
        for (std::size_t place = values_.size() - 2 * std::size_t{count}; place < values_.size(); place += 2)
            entries.push_back({*values_[place].string(), std::move(values_[place + 1])});
        values_.resize(values_.size() - 2 * std::size_t{count});
        --depth_;
        return add(Dictionary(std::move(entries)));
    }

    bool StartArray() { return ++depth_ <= deepest; }
    bool EndArray(rapidjson::SizeType count)
    {
        if (--depth_ < visitDepth_)
            return true; // its elements were visited
        const auto first = values_.end() - static_cast<std::ptrdiff_t>(count);
        Array array({std::move_iterator(first), std::move_iterator(values_.end())});
        values_.resize(values_.size() - count);
        return add(std::move(array));
    }

private:
    bool add(Value value)
    {
        if (depth_ == visitDepth_) {
            isStoppedByVisit_ = !visit_(std::move(value));
            return !isStoppedByVisit_;
        }
        values_.push_back(std::move(value));
        return depth_ > visitDepth_;
    }

    const unsigned visitDepth_;
    const Visit& visit_;
    unsigned depth_ = 0;
    bool isStoppedByVisit_ = false;
    std::vector<Value> values_; // those that are not in a container yet; keys, too
};

} // namespace

std::optional<Value> parseJson(std::string_view text)
{
    std::optional<Value> whole;
    const ValueBuilder::Visit keep = [&](Value value) {
        whole = std::move(value);
        return true;
    };
    ValueBuilder builder(0, keep);
    rapidjson::MemoryStream stream(text.data(), text.size());
    return rapidjson::Reader().Parse<parseFlags>(stream, builder).IsError() ? std::nullopt : whole;
}

std::expected<void, std::string> forEachJsonElement(std::FILE* file, const std::function<bool(Value)>& visit)
{
    std::vector<char> buffer(std::size_t{64} * 1024);
    rapidjson::FileReadStream stream(file, buffer.data(), buffer.size());
    ValueBuilder builder(1, visit);
    const rapidjson::ParseResult result = rapidjson::Reader().Parse<parseFlags>(stream, builder);
    if (!result.IsError() || builder.isStoppedByVisit())
        return {};
    if (builder.isTooDeep())
        return std::unexpected("it is nested too deep");
    if (result.Code() == rapidjson::kParseErrorTermination)
        return std::unexpected("it is not a list");
    return std::unexpected(
        fmt::format("not JSON: {} (at byte {})", rapidjson::GetParseError_En(result.Code()), result.Offset() + 1));
}
