// SPDX-License-Identifier: Apache-2.0
// The report of a fleet for one of its devices is that device's own report, to the last digit.
//
// Made-up weeks lie in a real event store. The uplink's outbox makes batches of them, the ingest's code makes rows of
// these, and a real database adds them up.
#include "support/weeks/WeeksFile.h"
#include "tools/kesto/report/fleet/Fleet.h"
#include "tools/kesto/report/weeks/Figures.h"

#include <ctime>
#include <fmt/chrono.h>
#include <fmt/format.h>
#include <fmt/ranges.h>
#include <set>

namespace kesto_tool {
namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;

const std::string unitA = "0123456789abcdef0123456789abcdef";
const std::string unitB = "fedcba9876543210fedcba9876543210";

// What a fleet cannot know.
const std::set<std::string, std::less<>> ofDeviceOnly{"running", "overlapping", "process_id", "user"};

// What a device's own report does not have.
const std::set<std::string, std::less<>> ofFleetOnly{
    "units",  "units_compared", "hours_of_units", "faults_an_hour_of_units",
    "models", "versions",       "worst_units",    "unit"};

// What of the device's report the fleet's does not have, or has otherwise; a line each. Numbers are compared as text.
std::string differences(const std::string& place, const Value& own, const Value& ofFleet)
{
    std::string text;
    if (const auto dictionary = own.dictionary()) {
        const auto other = ofFleet.dictionary().value_or(Dictionary());
        for (const auto& [key, value] : *dictionary) {
            const Value* const found = other.find(key.view());
            if (ofDeviceOnly.contains(key.view()))
                text += found == nullptr ? "" : fmt::format("{}: the fleet has {}\n", place, key.view());
            else
                text += found == nullptr ? fmt::format("{}: the fleet lacks {}\n", place, key.view())
                                         : differences(place + "/" + std::string(key.view()), value, *found);
        }
        for (const auto& [key, value] : other)
            if (!ofFleetOnly.contains(key.view()) && dictionary->find(key.view()) == nullptr)
                text += fmt::format("{}: only the fleet has {}\n", place, key.view());
        return text;
    }
    if (const auto array = own.array()) {
        const auto other = ofFleet.array().value_or(Array());
        if (array->size() != other.size())
            text += fmt::format("{}: {} and {} entries\n", place, array->size(), other.size());
        for (std::size_t index = 0; index < std::min(array->size(), other.size()); ++index)
            text += differences(fmt::format("{}[{}]", place, index), (*array)[index], other[index]);
        return text;
    }
    return own.text() == ofFleet.text() ? "" : fmt::format("{}: {} and {}\n", place, own.text(), ofFleet.text());
}

class EqualReports : public FleetReports, public testing::WithParamInterface<std::size_t> {
protected:
    // A store of what nothing plays any more at the end: what still runs has not left.
    [[nodiscard]] std::filesystem::path makeStore(const std::string& name, std::uint32_t seed)
    {
        weeks::Weeks made = weeks::makeWeeks({.seed = seed, .sessions = 300, .midnights = days.midnights});
        std::erase_if(made.stretches, [](const weeks::Stretch& each) { return each.ending == weeks::Ending::None; });
        for (std::size_t index = 0; index < made.stretches.size(); index += 3)
            if (made.stretches[index].volume)
                made.stretches[index].volume = 0.5; // many a length then has no nearest microsecond
        const auto store = directory / name;
        weeks::writeWeeks(made, store);
        return store;
    }

    void expectEqual(const std::filesystem::path& store, const std::string& unit, Tool::Arguments arguments) const
    {
        arguments.emplace_back("--json");
        Tool::Arguments ofDevice = arguments;
        ofDevice.insert(ofDevice.begin(), {"report", "--database", store.native()});
        const Dictionary own = dictionaryOf(tool.print(ofDevice));
        EXPECT_GT(own.find("seconds")->asDouble(), 3600);
        arguments.insert(arguments.end(), {"--unit", unit});
        EXPECT_EQ(differences("", own, dictionaryOf(print(arguments))), "")
            << fmt::format("{}", fmt::join(arguments, " "));
    }

    const ZoneDays& days = zonesWithDays()[GetParam()];
};

TEST_P(EqualReports, AreEqualToTheLastDigit)
{
    tool.setVariable(std::string("TZ=") + days.zone);
    const auto storeA = makeStore("a.sqlite3", 5);
    const auto storeB = makeStore("b.sqlite3", 6);
    send(storeA, unitA, 1);
    send(storeB, unitB, 2); // as after answers that were lost
    const auto at = [this](std::size_t day, double secondsLater) {
        const auto moment = static_cast<std::time_t>(days.midnights[day] + secondsLater);
        return fmt::format("{:%Y-%m-%dT%H:%M:%S}Z", fmt::gmtime(moment));
    };
    const Tool::Arguments whole{"--since", at(0, 0), "--until", at(days.midnights.size() - 1, 0)};
    const auto with = [](Tool::Arguments arguments, const Tool::Arguments& more) {
        arguments.insert(arguments.end(), more.begin(), more.end());
        return arguments;
    };
    for (const auto& [store, unit] : {std::pair(storeA, unitA), std::pair(storeB, unitB)}) {
        expectEqual(store, unit, whole);
        expectEqual(store, unit, with(whole, {"--recording"}));
    }
    for (const char* const figure : {"sessions", "faults", "vanished"}) {
        const auto of = [&](const Tool::Arguments& more) { return json(with(whole, more)).find(figure)->asDouble(); };
        EXPECT_EQ(of({}), of({"--unit", unitA}) + of({"--unit", unitB})) << figure;
    }
    expectEqual(storeA, unitA, {"--since", at(3, 4711), "--until", at(9, 1234)});
    expectEqual(storeB, unitB, with(whole, {"--day-starts", "04:30"}));
    expectEqual(storeB, unitB, with(whole, {"--utc"}));
    expectEqual(storeB, unitB, with(whole, {"--device", "*analog*"}));
    expectEqual(storeA, unitA, with(whole, {"--application", "org.example.[BMC]*", "--device", "[^b]*"}));
    expectEqual(storeA, unitA, with(whole, {"--application", "*.M?sic"}));
}

INSTANTIATE_TEST_SUITE_P(Zones, EqualReports, testing::Values(0U, 1U, 2U));

} // namespace
} // namespace kesto_tool
