#include "platform/linux/TomlFile.h"

#include "platform/linux/SmallFile.h"

#include <chrono>
#include <sstream>

#define TOML_EXCEPTIONS 0
#define TOML_ENABLE_FORMATTERS 0
#include <toml++/toml.h>

namespace platform {

using foundation::Array;
using foundation::Date;
using foundation::Dictionary;
using foundation::Value;

namespace {

Date dateOf(const toml::date& date, const toml::time& time, const toml::time_offset& offset)
{
    using namespace std::chrono;
    const sys_days day = year(date.year) / month(date.month) / std::chrono::day(date.day);
    const auto moment = day + hours(time.hour) + minutes(time.minute) + seconds(time.second)
        + nanoseconds(time.nanosecond) - minutes(offset.minutes);
    return {duration<double>(moment.time_since_epoch()).count()};
}

Value valueOf(const toml::node& node);

Dictionary dictionaryOf(const toml::table& table)
{
    Dictionary::Entries entries;
    entries.reserve(table.size());
    for (const auto& [key, node] : table)
        entries.push_back({key.str(), valueOf(node)});
    return entries;
}

Array arrayOf(const toml::array& array)
{
    std::vector<Value> values;
    values.reserve(array.size());
    for (const toml::node& node : array)
        values.push_back(valueOf(node));
    return values;
}

Value valueOf(const toml::node& node)
{
    switch (node.type()) {
    case toml::node_type::string: return node.as_string()->get();
    case toml::node_type::integer: return node.as_integer()->get();
    case toml::node_type::floating_point: return node.as_floating_point()->get();
    case toml::node_type::boolean: return node.as_boolean()->get();
    case toml::node_type::date: return dateOf(node.as_date()->get(), {}, {});
    case toml::node_type::date_time: {
        const toml::date_time& moment = node.as_date_time()->get();
        return dateOf(moment.date, moment.time, moment.offset.value_or(toml::time_offset()));
    }
    case toml::node_type::time: return (std::ostringstream() << node.as_time()->get()).str();
    case toml::node_type::array: return arrayOf(*node.as_array());
    case toml::node_type::table: return dictionaryOf(*node.as_table());
    case toml::node_type::none: break;
    }
    return {};
}

} // namespace

std::expected<Dictionary, TomlError> parseToml(std::string_view text)
{
    const toml::parse_result result = toml::parse(text);
    if (result)
        return dictionaryOf(result.table());
    const toml::parse_error& error = result.error();
    const toml::source_position where = error.source().begin;
    return std::unexpected(TomlError{where.line, where.column, std::string(error.description())});
}

bool TomlFile::reload()
{
    Content content = readSmallFile(path_, largest);
    if (!content && content.error() == std::errc::no_such_file_or_directory)
        content = std::string(); // says as much as an empty file
    if (content == seen_)
        return false;
    seen_ = std::move(content);
    if (!seen_) {
        log_.error("{} cannot be read: {}; what it said before stays in force", path_.native(),
                   seen_.error().message());
        return false;
    }
    auto parsed = parseToml(*seen_);
    if (!parsed) {
        const TomlError& error = parsed.error();
        log_.error("{}:{}:{}: {}; what the file said before stays in force until this is corrected", path_.native(),
                   error.line, error.column, error.reason);
        return false;
    }
    return setValues(std::move(*parsed));
}

bool TomlFile::setValues(Dictionary values)
{
    const bool changed = values != values_;
    values_ = std::move(values);
    return changed;
}

} // namespace platform
