// SPDX-License-Identifier: Apache-2.0
// Compiled once for all tests, because the library's templates take longer to compile than a test that uses them.
#include "foundation/values/GeneratedValues.h"

#include <cstdint>
#include <utility>
#include <vector>

namespace generated {

rc::Gen<std::string> text()
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

rc::Gen<foundation::String> key()
{
    return rc::gen::map(
        rc::gen::weightedOneOf<std::string>(
            {{9, rc::gen::map(rc::gen::inRange(0, 40), [](int n) { return "key" + std::to_string(n); })}, {1, text()}}),
        [](const std::string& characters) { return foundation::String(characters); });
}

rc::Gen<foundation::Number> number()
{
    using foundation::Number;
    const auto toNumber = [](auto value) { return Number(value); };
    return rc::gen::oneOf(
        rc::gen::map(rc::gen::arbitrary<bool>(), toNumber), rc::gen::map(rc::gen::arbitrary<std::int64_t>(), toNumber),
        rc::gen::map(rc::gen::arbitrary<std::uint64_t>(), toNumber),
        rc::gen::map(rc::gen::arbitrary<float>(), toNumber), rc::gen::map(rc::gen::arbitrary<double>(), toNumber),
        rc::gen::map(rc::gen::inRange(-70'000, 70'000), toNumber));
}

rc::Gen<foundation::Value> scalar()
{
    using foundation::Value;
    return rc::gen::oneOf(
        rc::gen::just(Value()), rc::gen::map(number(), [](foundation::Number given) { return Value(given); }),
        rc::gen::map(text(), [](const std::string& characters) { return Value(characters); }),
        rc::gen::map(rc::gen::string<std::string>(),
                     [](const std::string& bytes) { return Value(foundation::Data{foundation::String(bytes)}); }),
        rc::gen::map(rc::gen::arbitrary<double>(), [](double seconds) { return Value(foundation::Date{seconds}); }));
}

namespace {

rc::Gen<foundation::DictionaryEntry> entry(int depth)
{
    return rc::gen::construct<foundation::DictionaryEntry>(key(), value(depth));
}

} // namespace

rc::Gen<foundation::Dictionary::Entries> entries(int depth)
{
    return rc::gen::container<foundation::Dictionary::Entries>(entry(depth));
}

rc::Gen<foundation::Value> value(int depth)
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
