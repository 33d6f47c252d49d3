// SPDX-License-Identifier: Apache-2.0
// Compiled once for all tests, because the library's templates take longer to compile than a test that uses them.
#include "session/GeneratedMessages.h"

#include <cstdint>
#include <limits>
#include <string>
#include <utility>
#include <vector>

namespace generated {
namespace {

const std::vector<foundation::Value>& oddValues()
{
    using foundation::Value;
    static const std::vector<Value> values{Value(),
                                           Value("x"),
                                           Value(""),
                                           Value("0"),
                                           Value("1"),
                                           Value("0.5 of it"),
                                           Value("yes"),
                                           Value(foundation::Array{1, "a"}),
                                           Value(foundation::Dictionary{{"a", 1}}),
                                           Value(foundation::Data{"1"}),
                                           Value(foundation::Date{1}),
                                           Value(std::numeric_limits<double>::quiet_NaN()),
                                           Value(std::numeric_limits<double>::infinity()),
                                           Value(1e300),
                                           Value(std::uint64_t{1} << 63)};
    return values;
}

// One of these, and now and then an unusual one.
rc::Gen<foundation::Value> valueAmong(std::vector<foundation::Value> usual)
{
    return rc::gen::weightedOneOf<foundation::Value>(
        {{9, rc::gen::elementOf(std::move(usual))}, {1, rc::gen::elementOf(oddValues())}});
}

// The form of a message's time, and its distance from the message before.
struct Time {
    enum class Form { None, Double, Float, Integer, Text, Odd };
    Form form;
    double later;
    foundation::Value odd;
};

rc::Gen<Time> time()
{
    using enum Time::Form;
    return rc::gen::construct<Time>(
        rc::gen::weightedElement<Time::Form>({{8, Double}, {1, Float}, {1, Integer}, {1, Text}, {1, None}, {1, Odd}}),
        rc::gen::element(0.0, 0.25, 0.5, 0.6, 1.0, 2.0, 2.0, 2.0000001, 2.5, 30.0, 20'000.0, -1.0, -5.0),
        rc::gen::elementOf(oddValues()));
}

foundation::Value timeValue(const Time& time, double now)
{
    switch (time.form) {
    case Time::Form::Float: return static_cast<float>(now);
    case Time::Form::Integer: return static_cast<std::int64_t>(now);
    case Time::Form::Text: return " +" + std::to_string(now) + " s";
    case Time::Form::Odd: return time.odd;
    default: return now;
    }
}

struct TimedPayload {
    Time time;
    foundation::Dictionary::Entries entries;
};

rc::Gen<TimedPayload> message()
{
    return rc::gen::exec([] {
        TimedPayload message{*time(), {}};
        const auto maybe = [&](int percent, const char* key, std::vector<foundation::Value> usual) {
            if (*rc::gen::inRange(0, 100) < percent)
                message.entries.push_back({key, *valueAmong(std::move(usual))});
        };
        maybe(50, "session_output_running", {true, true, true, false, 1, 0, 1.0, 0.0, 0.3});
        maybe(10, "session_duration", {1.5, 0});
        maybe(25, "session_selected_format", {"unknown", "lpcm", "aac"});
        maybe(25, "active_devices", {"unknown", "Speaker", "Headphones"});
        maybe(25, "spatializationEnabled", {true, false, 1, 0, 1.0});
        maybe(25, "spatial-audio-accessory-feature", {true, false, 1, 0});
        maybe(25, "ringerstate", {true, false, 0, 1, 2, 1.0F});
        maybe(60, "PomoSessionVolume", {0.0, 0.03125, 0.3, 0.5, 0.5F, 0.75, 1, true, 1.5, -1});
        maybe(25, "mChannelsPerFrame", {2, 6});
        maybe(25, "key", {"value"});
        return message;
    });
}

rc::Gen<Messages> payloads()
{
    return rc::gen::map(rc::gen::container<std::vector<TimedPayload>>(message()),
                        [](const std::vector<TimedPayload>& messages) {
                            Messages payloads;
                            double now = 10;
                            for (const TimedPayload& message : messages) {
                                now += message.time.later;
                                auto entries = message.entries;
                                if (message.time.form != Time::Form::None)
                                    entries.push_back({"kestoreporting_timestamp", timeValue(message.time, now)});
                                payloads.emplace_back(std::move(entries));
                            }
                            return payloads;
                        });
}

} // namespace

rc::Gen<std::vector<Messages>> manyPayloads(std::size_t count)
{
    return rc::gen::container<std::vector<Messages>>(count, payloads());
}

} // namespace generated
