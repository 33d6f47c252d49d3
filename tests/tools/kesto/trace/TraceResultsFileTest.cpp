// SPDX-License-Identifier: Apache-2.0
// Results files as the service's writer makes them, and other texts.
#include "kesto/trace/TraceResultsFile.h"

#include "platform/linux/diagnostics/LinuxFileSystem.h"
#include "platform/linux/trace/LinuxPerformanceWriter.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeLog.h"

#include <cmath>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace {

using platform::PerformanceUnit;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

// The tool reads everything that the service writes.
class WrittenTraceResults : public testing::Test {
protected:
    void write(const std::vector<std::pair<std::string, double>>& records)
    {
        const auto file = writer.open(path, "KestoReporting", 4);
        for (const auto& [name, value] : records)
            file->write(name, value, PerformanceUnit::Nanoseconds);
    }
    [[nodiscard]] TraceResultsFile read() const
    {
        const auto results = parseTraceResults(support::readFile(path));
        EXPECT_TRUE(results) << results.error();
        return results.value_or(TraceResultsFile());
    }

    support::TemporaryDirectory directory;
    const std::filesystem::path path = directory.path() / "results";
    support::FakeLog log;
    platform::LinuxFileSystem files{directory.path()};
    platform::LinuxPerformanceWriter writer{files, platform::ProviderLog(log)};
};

TEST_F(WrittenTraceResults, ArePutTogetherByName)
{
    write({{"mix", 5}, {"mix", 3}, {"render", 18'446'744'073'709'551'615.0}, {"mix", 9.5}});
    const TraceResultsFile results = read();
    EXPECT_EQ(results.project, "KestoReporting");
    EXPECT_EQ(results.version, 4);
    EXPECT_EQ(results.withoutValue, 0U);
    ASSERT_THAT(results.series, SizeIs(2));
    EXPECT_EQ(results.series[0].name, "mix");
    EXPECT_EQ(results.series[0].unit, "ns");
    EXPECT_THAT(results.series[0].values, ElementsAre(5, 3, 9.5));
    EXPECT_EQ(results.series[1].name, "render");
    EXPECT_THAT(results.series[1].values, ElementsAre(18'446'744'073'709'551'615.0));
}

TEST_F(WrittenTraceResults, MayBeNone)
{
    write({});
    EXPECT_THAT(read().series, IsEmpty());
}

TEST_F(WrittenTraceResults, TellWhatIsMissingInThem)
{
    write({{"mix", 1}});
    const TraceResultsFile complete = read();
    EXPECT_EQ(complete.lostEvents, 0);
    EXPECT_EQ(complete.lostValues, 0);
    EXPECT_EQ(complete.problem, "");

    platform::LinuxPerformanceWriter small(files, platform::ProviderLog(log), 1);
    auto file = small.open(path, "KestoReporting", 4);
    file->remark("lostEvents", 1840);
    file->remark("lostIntervals", 2);
    file->remark("lostPoints", 3);
    file->remark("problem", "none");
    file->write("mix", 1, PerformanceUnit::Nanoseconds);
    file.reset();
    const TraceResultsFile results = read();
    EXPECT_EQ(results.lostEvents, 1840);
    EXPECT_EQ(results.lostIntervals, 2);
    EXPECT_EQ(results.lostPoints, 3);
    EXPECT_EQ(results.lostValues, 1);
    EXPECT_EQ(results.problem, "none");
}

TEST_F(WrittenTraceResults, MayHaveAnyName)
{
    write({{"", 1}, {"\x1B[2J\n\"ä\"", 2}, {std::string("a\0b", 3), 3}});
    const TraceResultsFile results = read();
    ASSERT_THAT(results.series, SizeIs(3));
    EXPECT_EQ(results.series[0].name, "");
    EXPECT_EQ(results.series[1].name, "\x1B[2J\n\"ä\"");
    EXPECT_EQ(results.series[2].name, std::string("a\0b", 3));
}

TEST_F(WrittenTraceResults, MayBeWithoutAValue)
{
    write({{"mix", NAN}, {"mix", 1}, {"never", INFINITY}});
    const TraceResultsFile results = read();
    EXPECT_EQ(results.withoutValue, 2U);
    ASSERT_THAT(results.series, SizeIs(1));
    EXPECT_THAT(results.series[0].values, ElementsAre(1));
}

TEST(TraceResultsText, KeepsUnitsApart)
{
    const auto results = parseTraceResults(
        R"({"records":[{"unit":"ns","value":1,"name":"a"},{"name":"a","value":2,"unit":"B"},
            {"name":"a","value":-3,"unit":"ns"}],"version":5,"project":"Other"})");
    ASSERT_TRUE(results) << results.error();
    EXPECT_EQ(results->project, "Other");
    EXPECT_EQ(results->version, 5);
    ASSERT_THAT(results->series, SizeIs(2));
    EXPECT_EQ(results->series[0].unit, "ns");
    EXPECT_THAT(results->series[0].values, ElementsAre(1, -3));
    EXPECT_EQ(results->series[1].unit, "B");
}

TEST(TraceResultsText, MayHaveUnknownMembers)
{
    const auto results = parseTraceResults(
        R"({"x":[{"name":1},[[]],"records"],"project":"P","y":{"records":[7],"project":2},"version":4,"z":null,"records":[
            {"name":"a","extra":{"name":[1],"value":"b"},"value":1,"more":[true],"unit":"ns","last":false}]})");
    ASSERT_TRUE(results) << results.error();
    ASSERT_THAT(results->series, SizeIs(1));
    EXPECT_THAT(results->series[0].values, ElementsAre(1));
}

std::string problemOf(const std::string& text)
{
    const auto results = parseTraceResults(text);
    return results ? "none" : results.error();
}

TEST(TraceResultsText, IsRefusedWithTheReasonWhenItIsMalformed)
{
    EXPECT_EQ(problemOf(""), "not JSON: The document is empty. (at byte 1)");
    EXPECT_EQ(problemOf("[]"), "it is not an object");
    EXPECT_EQ(problemOf("5"), "it is not an object");
    EXPECT_EQ(problemOf("null"), "it is not an object");
    EXPECT_EQ(problemOf("{}"), "it has no \"project\"");
    EXPECT_EQ(problemOf(R"({"project":"P"})"), "it has no \"version\"");
    EXPECT_EQ(problemOf(R"({"project":"P","version":4})"), "it has no \"records\"");
    EXPECT_EQ(problemOf(R"({"project":4})"), "its \"project\" is of another kind");
    EXPECT_EQ(problemOf(R"({"project":{}})"), "its \"project\" is of another kind");
    EXPECT_EQ(problemOf(R"({"version":"4"})"), "its \"version\" is of another kind");
    EXPECT_EQ(problemOf(R"({"version":[4]})"), "its \"version\" is of another kind");
    EXPECT_EQ(problemOf(R"({"records":{}})"), "its \"records\" is of another kind");
    EXPECT_EQ(problemOf(R"({"records":null})"), "its \"records\" is of another kind");
    EXPECT_EQ(problemOf(R"({"project":"P","version":4,"records":[]} x)"),
              "not JSON: The document root must not be followed by other values. (at byte 42)");
    EXPECT_EQ(problemOf("{\"project\":\"\xFF\"}"), "not JSON: Invalid encoding in string. (at byte 13)");
}

TEST(TraceResultsText, IsRefusedWithTheNumberOfAMalformedRecord)
{
    const std::string right = R"({"name":"a","value":1,"unit":"ns"})";
    for (const char* wrong : {"1", "null", "[]", "{}", R"({"name":"a","value":1})", R"({"name":"a","unit":"ns"})",
                              R"({"value":1,"unit":"ns"})", R"({"name":1,"value":1,"unit":"ns"})",
                              R"({"name":"a","value":"1","unit":"ns"})", R"({"name":"a","value":true,"unit":"ns"})",
                              R"({"name":"a","value":1,"unit":null})", R"({"name":["a"],"value":1,"unit":"ns"})",
                              R"({"name":"a","value":{},"unit":"ns"})"})
        EXPECT_EQ(problemOf(R"({"project":"P","version":4,"records":[)" + right + "," + wrong + "]}"),
                  "its record 2 is not a name, a value and a unit")
            << wrong;
}

TEST(TraceResultsText, IsRefusedWhenItIsCutOffAnywhere)
{
    const std::string whole = R"({"project":"P","version":4,"records":[{"name":"a","value":1,"unit":"ns"}]})";
    ASSERT_EQ(problemOf(whole), "none");
    for (std::size_t size = 0; size < whole.size(); ++size)
        EXPECT_NE(problemOf(whole.substr(0, size)), "none") << size;
}

TEST(TraceResultsText, IsRefusedWhenItIsNestedTooDeep)
{
    const auto nested = [](std::size_t depth) {
        return R"({"project":"P","version":4,"records":[],"x":)" + std::string(depth, '[') + std::string(depth, ']')
            + "}";
    };
    EXPECT_EQ(problemOf(nested(31)), "none");
    EXPECT_EQ(problemOf(nested(32)), "it is nested too deep");
    EXPECT_EQ(problemOf(nested(1'000'000)), "it is nested too deep");
}

} // namespace
