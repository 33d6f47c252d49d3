// Values that RapidCheck makes up: of every kind, nested, with keys that repeat and text of all lengths of UTF-8.
#pragma once

#include "foundation/Value.h"

#include <gtest/gtest.h>
#include <ostream>
#include <rapidcheck.h>
#include <string>
#include <utility>
#include <vector>

namespace foundation {

// How failures show values.
inline void PrintTo(const Value& value, std::ostream* out)
{
    *out << value.text();
}
inline void showValue(const Value& value, std::ostream& out)
{
    out << value.text();
}

} // namespace foundation

namespace generated {

inline rc::Gen<std::string> text()
{
    const auto characters = rc::gen::element<std::string>("a", "B", "_", " ", "\"", "\\", "\n", std::string(1, '\0'),
                                                          "é", "€", "😀", "a longer piece of plain text");
    return rc::gen::map(rc::gen::container<std::vector<std::string>>(characters), [](const auto& pieces) {
        std::string whole;
        for (const std::string& piece : pieces)
            whole += piece;
        return whole;
    });
}

// Few different ones, so that they repeat.
inline rc::Gen<foundation::String> key()
{
    return rc::gen::map(
        rc::gen::weightedOneOf<std::string>(
            {{9, rc::gen::map(rc::gen::inRange(0, 40), [](int n) { return "key" + std::to_string(n); })}, {1, text()}}),
        [](const std::string& characters) { return foundation::String(characters); });
}

// Finite ones only: what is not a number equals nothing, not even its own copy.
inline rc::Gen<foundation::Number> number()
{
    using foundation::Number;
    const auto toNumber = [](auto value) { return Number(value); };
    return rc::gen::oneOf(
        rc::gen::map(rc::gen::arbitrary<bool>(), toNumber), rc::gen::map(rc::gen::arbitrary<std::int64_t>(), toNumber),
        rc::gen::map(rc::gen::arbitrary<std::uint64_t>(), toNumber),
        rc::gen::map(rc::gen::arbitrary<float>(), toNumber), rc::gen::map(rc::gen::arbitrary<double>(), toNumber),
        rc::gen::map(rc::gen::inRange(-70'000, 70'000), toNumber));
}

inline rc::Gen<foundation::Value> scalar()
{
    using foundation::Value;
    return rc::gen::oneOf(
        rc::gen::just(Value()), rc::gen::map(number(), [](foundation::Number given) { return Value(given); }),
        rc::gen::map(text(), [](const std::string& characters) { return Value(characters); }),
        rc::gen::map(rc::gen::string<std::string>(),
                     [](const std::string& bytes) { return Value(foundation::Data{foundation::String(bytes)}); }),
        rc::gen::map(rc::gen::arbitrary<double>(), [](double seconds) { return Value(foundation::Date{seconds}); }));
}

inline rc::Gen<foundation::Value> value(int depth = 3);

inline rc::Gen<foundation::DictionaryEntry> entry(int depth)
{
    return rc::gen::construct<foundation::DictionaryEntry>(key(), value(depth));
}

inline rc::Gen<foundation::Dictionary::Entries> entries(int depth = 2)
{
    return rc::gen::container<foundation::Dictionary::Entries>(entry(depth));
}

inline rc::Gen<foundation::Value> value(int depth)
{
    using foundation::Value;
    if (depth == 0)
        return scalar();
    const auto fewer = [](auto gen) { return rc::gen::scale(0.5, std::move(gen)); };
    return rc::gen::weightedOneOf<Value>(
        {{3, scalar()},
         {1,
          rc::gen::map(
              fewer(rc::gen::container<std::vector<Value>>(rc::gen::lazy([depth] { return value(depth - 1); }))),
              [](std::vector<Value> values) { return Value(foundation::Array(std::move(values))); })},
         {1,
          rc::gen::map(
              fewer(rc::gen::lazy([depth] { return entries(depth - 1); })),
              [](foundation::Dictionary::Entries given) { return Value(foundation::Dictionary(std::move(given))); })}});
}

} // namespace generated
