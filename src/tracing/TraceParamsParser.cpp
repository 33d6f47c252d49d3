// SPDX-License-Identifier: Apache-2.0
// A nested value of a wrong kind counts as empty, so that reading goes on after a failure.
//
// The codes and the type of a point are kept for the next points, which override only the values that they have: a
// level, which has no end code, ends with the event of the interval before it.
#include "tracing/TraceParamsParser.h"

#include "foundation/plist/PropertyList.h"
#include "foundation/text/Format.h"
#include "platform/Platform.h"
#include "utility/LogCategories.h"

#include <algorithm>
#include <charconv>
#include <expected>
#include <filesystem>
#include <limits>

namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::PropertyListLimits;
using foundation::Value;

// The value, or the text of its error.
template <typename Kind> using Expected = std::expected<Kind, std::string>;

std::string_view nameOf(Value::Kind kind)
{
    switch (kind) {
    case Value::Kind::Null: return "nothing";
    case Value::Kind::Number: return "a number";
    case Value::Kind::String: return "a string";
    case Value::Kind::Array: return "an array";
    case Value::Kind::Dictionary: return "a dictionary";
    case Value::Kind::Data: return "data";
    case Value::Kind::Date: return "a date";
    }
    return "something else";
}

// Null when the key is missing.
Value valueAt(const Dictionary& dictionary, std::string_view key)
{
    const Value* const value = dictionary.find(key);
    return value == nullptr ? Value() : *value;
}

Expected<Array> arrayAt(const Dictionary& dictionary, std::string_view key)
{
    const Value value = valueAt(dictionary, key);
    if (auto array = value.array())
        return *std::move(array);
    return std::unexpected(foundation::format("\"{}\" holds {}, not an array", key, nameOf(value.kind())));
}

Expected<Dictionary> asDictionary(const Value& value)
{
    if (auto dictionary = value.dictionary())
        return *std::move(dictionary);
    return std::unexpected(foundation::format("it is {}, not a dictionary", nameOf(value.kind())));
}

// The value as text; empty if it is missing.
std::string textAt(const Dictionary& dictionary, std::string_view key)
{
    const Value value = valueAt(dictionary, key);
    return value.isNull() ? std::string() : value.text();
}

// The same as a C string, which a NUL ends.
std::string cStringAt(const Dictionary& dictionary, std::string_view key)
{
    std::string text = textAt(dictionary, key);
    text.resize(std::min(text.find('\0'), text.size()));
    return text;
}

// The number at the start of the text, behind blanks and "0x": 0 if it is missing, the greatest number if it is out of
// range.
std::uint32_t scanHexadecimal(std::string_view text)
{
    text.remove_prefix(std::min(text.find_first_not_of(" \t\n\v\f\r"), text.size()));
    if (text.starts_with("0x") || text.starts_with("0X"))
        text.remove_prefix(2);
    std::uint32_t code = 0;
    const auto scanned = std::from_chars(text.data(), text.data() + text.size(), code, 16);
    return scanned.ec == std::errc::result_out_of_range ? std::numeric_limits<std::uint32_t>::max() : code;
}

std::uint32_t codeAt(const Dictionary& dictionary, std::string_view key)
{
    return scanHexadecimal(textAt(dictionary, key));
}

// One run of the parser.
class Loading {
public:
    std::unique_ptr<TraceParams> load(const std::filesystem::path& path) { return interpret(readPropertyList(path)); }

    std::unique_ptr<TraceParams> interpret(const Value& list)
    {
        const Dictionary root = list.dictionary().value_or(Dictionary());
        if (const auto traces = arrayAt(root, TraceParamChildrenNodes); !traces)
            fail(foundation::format("Failed to load Trace Parameter Array with error: {}", traces.error()));
        else
            loadTraces(*traces);
        if (params_->leftOut > 0)
            KESTO_LOG(KestoReportingTraceCategory(), Error,
                      "Left out {} traces and trace points: no more than {} are read", params_->leftOut,
                      TraceParamsParser::mostTracesAndPoints);
        return std::move(params_);
    }

private:
    Value readPropertyList(const std::filesystem::path& path)
    {
        const auto bytes = platform::current().fileSystem.readFile(path, PropertyListLimits().bytes);
        if (!bytes)
            failReading(bytes.error().message());
        const auto read = foundation::readPropertyList(bytes ? *bytes : std::string_view());
        if (!read)
            failReading(read.error().text);
        Value value = read.value_or(Value());
        if (value.isNull())
            fail("No valid input found in plist.");
        return value;
    }

    void failReading(std::string_view why)
    {
        fail(foundation::format("Reading from plist file failed with error: {}", why));
    }

    // Keeps only the first problem, which usually explains the others.
    void fail(std::string problem)
    {
        KESTO_LOG(KestoReportingTraceCategory(), Error, "{}", problem);
        if (params_->problem.empty())
            params_->problem = std::move(problem);
    }

    template <typename Load> void loadEach(const Array& values, Load load)
    {
        for (const Value& value : values) {
            if (loaded_ == TraceParamsParser::mostTracesAndPoints) {
                ++params_->leftOut;
                continue;
            }
            ++loaded_;
            load(value);
        }
    }

    // One signpost trace decides for the whole file, so all are asked, also those that are left out.
    void loadTraces(const Array& traces)
    {
        if (std::ranges::any_of(traces, isSignpostTrace))
            params_->traceType = TraceParams::signpostTrace;
        loadEach(traces, [this](const Value& trace) { loadTrace(trace); });
    }

    static bool isSignpostTrace(const Value& value)
    {
        return textAt(value.dictionary().value_or(Dictionary()), TraceDataType) == TraceDataTypeOSSignpost;
    }

    void loadTrace(const Value& value)
    {
        const auto read = asDictionary(value);
        if (!read)
            fail(foundation::format("Failed to load Trace Parameter dictionary with error : {}", read.error()));
        const Dictionary trace = read.value_or(Dictionary());

        if (params_->name.empty()) {
            params_->name = cStringAt(trace, TraceDataDescription);
            if (params_->name.empty())
                KESTO_LOG(KestoReportingTraceCategory(), Error, "Description not found in the plist file");
        }

        if (const auto points = arrayAt(trace, TraceDataChildrenNodes); !points)
            fail(foundation::format("Failed to read the Trace Points from the plist file with error: {}",
                                    points.error()));
        else
            loadEach(*points, [this](const Value& point) { loadTracePoint(point); });
    }

    void loadTracePoint(const Value& value)
    {
        const auto read = asDictionary(value);
        if (!read)
            fail(foundation::format("Failed to read Trace Point from Trace Points dictionary. Failed with error: {}",
                                    read.error()));
        const Dictionary point = read.value_or(Dictionary());

        const bool byThread = textAt(point, TracePointEventsMatchedBy) == TracePointEventsMatchedByThread;
        const bool isTypeKnown = takeTypeAndCodes(point);
        params_->traceDataParams.emplace_back(cStringAt(point, TracePointDescription), type_, begin_, end_, byThread)
            .isTypeKnown = isTypeKnown;
        KESTO_LOG(KestoReportingTraceCategory(), Info, "Loading tracepoint : {} and {} \n finished parsing.",
                  static_cast<std::int32_t>(begin_), static_cast<std::int32_t>(end_));
    }

    // Whether the point's type is known.
    bool takeTypeAndCodes(const Dictionary& point)
    {
        const std::string type = textAt(point, TracePointType);
        if (type == TracePointTypeInterval) {
            type_ = TraceDataParams::interval;
            begin_ = codeAt(point, TracePointBeginCode);
            end_ = codeAt(point, TracePointEndCode);
        } else if (type == TracePointTypeImpulse) {
            type_ = TraceDataParams::impulse;
            begin_ = codeAt(point, TracePointBeginCode);
        } else if (type == TracePointTypeLevel) {
            type_ = TraceDataParams::level;
            begin_ = codeAt(point, TracePointBeginCode);
        } else {
            KESTO_LOG(KestoReportingTraceCategory(), Error, "TracePointType field not recognized or is empty.");
            return false;
        }
        return true;
    }

    std::unique_ptr<TraceParams> params_ = std::make_unique<TraceParams>();
    std::uint32_t type_ = 0;
    std::uint32_t begin_ = 0;
    std::uint32_t end_ = 0;
    std::size_t loaded_ = 0; // traces and points
};

} // namespace

std::unique_ptr<TraceParams> TraceParamsParser::loadTraceParams() const
{
    std::error_code unknown; // without a current directory the file is not found
    return Loading().load(std::filesystem::current_path(unknown) / traceParamsFile_);
}

std::unique_ptr<TraceParams> TraceParamsParser::paramsOf(const foundation::Value& root)
{
    return Loading().interpret(root);
}
