// SPDX-License-Identifier: Apache-2.0
// A file may hold millions of records, so the parser's events fill the series directly, without values in between.
#include "kesto/trace/TraceResultsFile.h"

#include <fmt/format.h>
#include <map>
#include <optional>
#include <rapidjson/error/en.h>
#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>
#include <utility>

namespace {

constexpr unsigned deepest = 32; // of ignored members
constexpr unsigned parseFlags =
    rapidjson::kParseIterativeFlag | rapidjson::kParseValidateEncodingFlag | rapidjson::kParseFullPrecisionFlag;

// Receives RapidJSON's events. Unknown members are ignored.
class ResultsBuilder {
public:
    bool Null() { return scalar({.kind = Kind::Null}); }
    bool Bool(bool /*value*/) { return scalar({}); }
    bool Int(int value) { return Double(value); }
    bool Uint(unsigned value) { return Double(value); }
    bool Int64(std::int64_t value) { return Double(static_cast<double>(value)); }
    bool Uint64(std::uint64_t value) { return Double(static_cast<double>(value)); }
    bool Double(double value) { return scalar({.kind = Kind::Number, .number = value}); }
    static bool RawNumber(const char* /*text*/, rapidjson::SizeType /*size*/, bool /*copy*/) { return false; }
    bool String(const char* text, rapidjson::SizeType size, bool /*copy*/)
    {
        return scalar({.kind = Kind::Text, .text = {text, size}});
    }

    bool Key(const char* text, rapidjson::SizeType size, bool /*copy*/)
    {
        key_.assign(text, size);
        return true;
    }

    bool StartObject()
    {
        if (depth_ == inRecords && isInRecords_)
            record_ = {};
        else if (depth_ != outside && !mayBeContainer())
            return false;
        return enter();
    }
    bool EndObject(rapidjson::SizeType /*count*/)
    {
        --depth_;
        return depth_ != inRecords || !isInRecords_ || add();
    }

    bool StartArray()
    {
        if (depth_ == outside)
            return fail("it is not an object");
        if (depth_ == inDocument && key_ == "records")
            isInRecords_ = hasRecords_ = true;
        else if ((depth_ == inRecords && isInRecords_) || !mayBeContainer())
            return wrongRecord();
        return enter();
    }
    bool EndArray(rapidjson::SizeType /*count*/)
    {
        if (--depth_ == inDocument)
            isInRecords_ = false;
        return true;
    }

    // The error if parsing ended early.
    [[nodiscard]] const std::string& problem() const { return problem_; }
    // The result after the whole text was parsed.
    [[nodiscard]] std::expected<TraceResultsFile, std::string> finish()
    {
        for (const auto& [isThere, key] :
             {std::pair{project_.has_value(), "project"}, {version_.has_value(), "version"}, {hasRecords_, "records"}})
            if (!isThere)
                return std::unexpected(fmt::format("it has no \"{}\"", key));
        file_.project = *std::move(project_);
        file_.version = *version_;
        return std::move(file_);
    }

private:
    // Depths of the format.
    static constexpr unsigned outside = 0;
    static constexpr unsigned inDocument = 1;
    static constexpr unsigned inRecords = 2;
    static constexpr unsigned inRecord = 3;

    enum class Kind : std::uint8_t { Other, Null, Number, Text };
    struct Scalar {
        Kind kind = Kind::Other;
        double number = 0;
        std::string_view text = {};
    };
    struct Record {
        std::string name;
        std::string unit;
        std::optional<double> value;
        bool hasName = false;
        bool hasUnit = false;
        bool hasValue = false;
    };

    bool fail(std::string problem)
    {
        problem_ = std::move(problem);
        return false;
    }
    bool wrongRecord()
    {
        return problem_.empty() ? fail(fmt::format("its record {} is not a name, a value and a unit", records_ + 1))
                                : false;
    }

    bool enter() { return ++depth_ <= deepest || fail("it is nested too deep"); }

    // Whether the member at this place may be a container: only an unknown member may.
    bool mayBeContainer()
    {
        if (isInRecords_ && depth_ == inRecord && (key_ == "name" || key_ == "value" || key_ == "unit"))
            return wrongRecord();
        if (depth_ == inDocument
            && (key_ == "project" || key_ == "version" || key_ == "records" || key_ == "problem"
                || lossAt(key_) != nullptr))
            return fail(fmt::format("its \"{}\" is of another kind", key_));
        return true;
    }

    bool scalar(const Scalar& value)
    {
        if (depth_ == outside)
            return fail("it is not an object");
        if (depth_ == inDocument)
            return documentMember(value);
        if (isInRecords_ && depth_ == inRecords)
            return wrongRecord();
        return !isInRecords_ || depth_ != inRecord || recordMember(value) || wrongRecord();
    }

    bool documentMember(const Scalar& value)
    {
        if (key_ == "project" && value.kind == Kind::Text)
            project_ = value.text;
        else if (key_ == "version" && value.kind == Kind::Number)
            version_ = value.number;
        else if (key_ == "problem" && value.kind == Kind::Text)
            file_.problem = value.text;
        else if (double* const loss = lossAt(key_); loss != nullptr && value.kind == Kind::Number)
            *loss = value.number;
        else
            return mayBeContainer(); // an unknown member
        return true;
    }

    // The count of that name; null for other keys.
    double* lossAt(std::string_view key)
    {
        for (const auto& [name, loss] : {std::pair("lostEvents", &file_.lostEvents),
                                         {"lostIntervals", &file_.lostIntervals},
                                         {"lostPoints", &file_.lostPoints},
                                         {"lostValues", &file_.lostValues}})
            if (key == name)
                return loss;
        return nullptr;
    }

    bool recordMember(const Scalar& value)
    {
        if (key_ == "name") {
            record_.name = value.text;
            return record_.hasName = value.kind == Kind::Text;
        }
        if (key_ == "unit") {
            record_.unit = value.text;
            return record_.hasUnit = value.kind == Kind::Text;
        }
        if (key_ == "value") {
            if (value.kind == Kind::Number)
                record_.value = value.number;
            return record_.hasValue = value.kind == Kind::Number || value.kind == Kind::Null;
        }
        return true;
    }

    bool add()
    {
        if (!record_.hasName || !record_.hasUnit || !record_.hasValue)
            return wrongRecord();
        ++records_;
        if (record_.value)
            seriesOfRecord().values.push_back(*record_.value);
        else
            ++file_.withoutValue;
        return true;
    }

    // Values of one name come in a row.
    TraceSeries& seriesOfRecord()
    {
        std::vector<TraceSeries>& all = file_.series;
        if (!all.empty() && all[last_].name == record_.name && all[last_].unit == record_.unit)
            return all[last_];
        const auto [place, isNew] = places_.try_emplace({record_.name, record_.unit}, all.size());
        last_ = place->second;
        if (isNew)
            all.push_back({.name = record_.name, .unit = record_.unit, .values = {}});
        return all[last_];
    }

    TraceResultsFile file_;
    std::optional<std::string> project_;
    std::optional<double> version_;
    std::map<std::pair<std::string, std::string>, std::size_t> places_; // of series, by name and unit
    std::size_t last_ = 0;
    std::size_t records_ = 0;
    Record record_;
    std::string key_;
    unsigned depth_ = outside;
    bool isInRecords_ = false;
    bool hasRecords_ = false;
    std::string problem_;
};

} // namespace

std::expected<TraceResultsFile, std::string> parseTraceResults(std::string_view text)
{
    ResultsBuilder builder;
    rapidjson::MemoryStream stream(text.data(), text.size());
    const rapidjson::ParseResult result = rapidjson::Reader().Parse<parseFlags>(stream, builder);
    if (!builder.problem().empty())
        return std::unexpected(builder.problem());
    if (result.IsError())
        return std::unexpected(
            fmt::format("not JSON: {} (at byte {})", rapidjson::GetParseError_En(result.Code()), result.Offset() + 1));
    return builder.finish();
}
