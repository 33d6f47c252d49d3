// SPDX-License-Identifier: Apache-2.0
// Text that grows piece by piece, compared with plain concatenation, also where memory is reallocated.
#include "foundation/text/StringBuilder.h"

#include "foundation/values/Value.h"

#include <gtest/gtest.h>
#include <rapidcheck/gtest.h>
#include <string>
#include <vector>

namespace {

using foundation::String;
using foundation::StringBuilder;

RC_GTEST_PROP(StringBuilder, JoinsWhatIsAppended, (const std::vector<std::string>& pieces))
{
    StringBuilder builder;
    std::string expected;
    for (const auto& piece : pieces) {
        builder.append(piece);
        builder.append(',');
        expected += piece + ',';
    }
    const String built = std::move(builder).finish();
    RC_ASSERT(built.view() == expected);
    RC_ASSERT(foundation::Value(built) == foundation::Value(expected));
}

RC_GTEST_PROP(StringBuilder, RepeatsWhatStandsLast, (const std::string& before, const std::string& last))
{
    for (const std::size_t times : {0, 1, 2, 3, 100, 10'000}) {
        StringBuilder builder;
        builder.append(before);
        builder.append(last);
        builder.repeatLast(last.size(), times);
        builder.append("!?");
        builder.dropLast();
        std::string expected = before;
        for (std::size_t time = 0; time <= times; ++time)
            expected += last;
        RC_ASSERT(std::move(builder).finish().view() == expected + '!');
    }
}

TEST(StringBuilder, GivesTheEmptyStringWhenNothingWasAppended)
{
    EXPECT_TRUE(StringBuilder().finish().isSameObject(String()));
    StringBuilder builder;
    builder.append("");
    EXPECT_TRUE(std::move(builder).finish().isSameObject(String()));
}

TEST(StringBuilder, BeginsAnewWhenItIsFinished)
{
    StringBuilder builder;
    builder.append("first");
    const String first = std::move(builder).finish();
    builder.append("second");
    const String second = std::move(builder).finish();
    EXPECT_EQ(first, std::string_view("first"));
    EXPECT_EQ(second, std::string_view("second"));
}

TEST(StringBuilder, GrowsToAnyLength)
{
    StringBuilder builder;
    std::string expected;
    for (int number = 0; number < 1'000'000; ++number) {
        const std::string text = std::to_string(number);
        builder.append(text);
        expected += text;
    }
    EXPECT_TRUE(std::move(builder).finish().view() == expected);
}

TEST(StringBuilder, CanBeMovedAndUsedOn)
{
    StringBuilder builder;
    builder.append("one");
    StringBuilder other = std::move(builder);
    other.append(" and two");
    builder = StringBuilder();
    builder.append("three");
    EXPECT_EQ(std::move(other).finish(), std::string_view("one and two"));
    EXPECT_EQ(std::move(builder).finish(), std::string_view("three"));
}

} // namespace
