// SPDX-License-Identifier: Apache-2.0
// How a failure shows a value.
#include "support/PrintValues.h"

#include <gtest/gtest.h>
#include <optional>

namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;

TEST(PrintValues, ShowsTheTextOfEveryKindAndOfThoseInsideOthers)
{
    EXPECT_EQ(testing::PrintToString(Value("x")), "x");
    EXPECT_EQ(testing::PrintToString(Array{1, "x"}), R"([1,"x"])");
    EXPECT_EQ(testing::PrintToString(Dictionary{{"a", Array{1}}}), R"({"a":[1]})");
    EXPECT_EQ(testing::PrintToString(std::vector<Dictionary>{{{"a", 1}}, {}}), R"({ {"a":1}, {} })");
    EXPECT_EQ(testing::PrintToString(std::optional<Dictionary>({{"a", 1}})), R"(({"a":1}))");
}

} // namespace
