// SPDX-License-Identifier: Apache-2.0
// What a report says to people in few words.
#include "foundation/text/Format.h"
#include "foundation/text/LocalTime.h"
#include "ledger/Report.h"

namespace ledger {
namespace {

using foundation::Dictionary;
using foundation::format;

const foundation::Value* find(const Dictionary& report, std::string_view path)
{
    const std::size_t dot = path.find('.');
    const foundation::Value* value = report.find(path.substr(0, dot));
    if (dot == std::string_view::npos || value == nullptr)
        return value;
    const auto group = value->dictionary(); // a part of the report, so what is found in it stays valid
    return group ? find(*group, path.substr(dot + 1)) : nullptr;
}

// "nothing lost", or how much, and why most of it.
std::string lossText(const Dictionary& counts)
{
    const CounterRow* main = nullptr;
    for (const CounterRow& row : counterRows())
        if (row.meaning == Meaning::Loss && numberIn(counts, row.path) > (main ? numberIn(counts, main->path) : 0))
            main = &row;
    if (main == nullptr)
        return "nothing lost";
    return format("{} lost: {}; see kesto status", groupedText(lossesIn(counts)), main->reason);
}

} // namespace

std::string groupedText(std::uint64_t number)
{
    std::string text = std::to_string(number);
    for (std::size_t place = text.size(); place > 3; place -= 3)
        text.insert(place - 3, 1, ',');
    return text;
}

std::string countedText(std::uint64_t number, std::string_view one)
{
    return format("{} {}{}", groupedText(number), one, number == 1 ? "" : "s");
}

std::uint64_t numberIn(const Dictionary& report, std::string_view path)
{
    const foundation::Value* value = find(report, path);
    return value == nullptr ? 0 : value->exactly<std::uint64_t>().value_or(0);
}

std::uint64_t lossesIn(const Dictionary& counts)
{
    std::uint64_t losses = 0;
    for (const CounterRow& row : counterRows())
        if (row.meaning == Meaning::Loss)
            losses += numberIn(counts, row.path);
    return losses;
}

std::string statusLine(const Dictionary& report, double secondsSince1970)
{
    const foundation::Value* sinceStart = find(report, "sinceStart");
    const Dictionary counts = sinceStart ? sinceStart->dictionary().value_or(Dictionary()) : Dictionary();
    const auto countedIn = [&](std::string_view path, std::string_view one) {
        return countedText(numberIn(report, path), one);
    };
    return format("{}, {}; {} and {} in the minute to {}; {}", countedIn("now.connections", "connection"),
                  countedIn("now.sessions", "session"), countedIn("rates.deliveries", "message"),
                  countedIn("rates.events", "event"), foundation::localTimeText(secondsSince1970, "{:%H:%M:%S}"),
                  lossText(counts));
}

} // namespace ledger
