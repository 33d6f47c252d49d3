// SPDX-License-Identifier: Apache-2.0
// The results of a trace, as a table and for programs.
#include "end_to_end/Kestod.h"
#include "tools/kesto/Tool.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

namespace kesto_tool {
namespace {

using testing::HasSubstr;
using testing::Not;
using testing::StartsWith;

class TraceCommand : public testing::Test {
protected:
    [[nodiscard]] std::string write(const std::string& text) const
    {
        support::writeFile(path, text);
        return path;
    }
    [[nodiscard]] std::string writeRecords(const std::string& records) const
    {
        return write(R"({"project":"KestoReporting","version":4,"records":[)" + records + "]}");
    }
    static std::string record(const std::string& name, double value)
    {
        return R"({"name":")" + name + R"(","value":)" + std::to_string(value) + R"(,"unit":"ns"})";
    }

    const support::TemporaryDirectory directory;
    const std::string path = directory.path() / "tracing_results.qdj";
    Tool tool{directory.path()};
};

TEST_F(TraceCommand, ShowsATableAndAHistogramOfEachName)
{
    std::string records = record("one", 42);
    for (int number = 0; number < 98; ++number)
        records += "," + record("mix", 180'000 + number * 100);
    records += "," + record("mix", 1'500'000) + "," + record("mix", 2'500'000'000);
    EXPECT_EQ(tool.print({"trace", writeRecords(records)}), R"(KestoReporting, version 4: 101 values

   COUNT        MIN     MEDIAN        90%        99%        MAX  NAME
       1      42 ns      42 ns      42 ns      42 ns      42 ns  one
     100     180 µs   184.9 µs   188.9 µs     1.5 ms      2.5 s  mix

one
  42 to 42 ns        1 ████████████████████████████████████████

mix
      180 to     181 µs       10 ████████████████████████████████████████
      181 to     182 µs       10 ████████████████████████████████████████
      182 to     183 µs       10 ████████████████████████████████████████
      183 to     184 µs       10 ████████████████████████████████████████
      184 to     185 µs       10 ████████████████████████████████████████
      185 to     186 µs       10 ████████████████████████████████████████
      186 to     187 µs       10 ████████████████████████████████████████
      187 to     188 µs       10 ████████████████████████████████████████
      188 to     189 µs       10 ████████████████████████████████████████
      189 to     190 µs        8 ████████████████████████████████
      190 to 2500000 µs        2 ████████
)");
}

TEST_F(TraceCommand, FitsTheTerminal)
{
    const std::string file = writeRecords(record(std::string(100, 'n'), 1) + "," + record(std::string(100, 'n'), 2));
    tool.setVariable("COLUMNS=80");
    const std::string shown = tool.print({"trace", file});
    std::istringstream lines(shown);
    for (std::string line; std::getline(lines, line);)
        EXPECT_LE(std::ranges::count_if(line, [](char byte) { return (byte & 0xC0) != 0x80; }), 80) << line;
    EXPECT_THAT(shown, HasSubstr("nnn…\n"));
}

TEST_F(TraceCommand, KeepsControlCharactersFromTheTerminal)
{
    const std::string shown = tool.print(
        {"trace",
         write(
             R"({"project":"P\u001b[2J","version":4,"records":[{"name":"a\u001b]0;x\u0007\n\u009b","value":1,"unit":"\u001b"}]})")});
    EXPECT_THAT(shown, StartsWith("P?[2J, version 4: 1 value\n"));
    EXPECT_THAT(shown, HasSubstr("  a?]0;x???\n"));
    for (const char* control : {"\x1B", "\a", "\u009b"})
        EXPECT_THAT(shown, Not(HasSubstr(control)));
}

TEST_F(TraceCommand, SaysWhenNothingWasMeasured)
{
    EXPECT_EQ(tool.print({"trace", writeRecords("")}), "KestoReporting, version 4: 0 values\n");
    EXPECT_EQ(tool.print({"trace", "--json", path}), "");
    EXPECT_EQ(tool.print({"trace", writeRecords(R"({"name":"a","value":null,"unit":"ns"})")}),
              "KestoReporting, version 4: 0 values\n1 left out: without a value\n");
}

TEST_F(TraceCommand, PrintsAnObjectANameForPrograms)
{
    const std::string file = writeRecords(record("a\\u001b", 1) + "," + record("b", 5) + "," + record("b", 15));
    EXPECT_EQ(
        tool.print({"trace", "--json", file}),
        R"({"name":"a\u001B","unit":"ns","count":1,"minimum":1,"median":1,"percentile90":1,"percentile99":1,)"
        R"("maximum":1,"histogram":[{"lower":1,"upper":1,"count":1}]})"
        "\n"
        R"({"name":"b","unit":"ns","count":2,"minimum":5,"median":5,"percentile90":15,"percentile99":15,)"
        R"("maximum":15,"histogram":[{"lower":5,"upper":6,"count":1},{"lower":6,"upper":7,"count":0},)"
        R"({"lower":7,"upper":8,"count":0},{"lower":8,"upper":9,"count":0},{"lower":9,"upper":10,"count":0},)"
        R"({"lower":10,"upper":11,"count":0},{"lower":11,"upper":12,"count":0},{"lower":12,"upper":13,"count":0},)"
        R"({"lower":13,"upper":14,"count":0},{"lower":14,"upper":15,"count":0},{"lower":15,"upper":16,"count":1}]})"
        "\n");
}

TEST_F(TraceCommand, SaysWhatIsMissingBesideTheTableAndEndsWithAStatusOfItsOwn)
{
    const auto withMark = [&](const std::string& mark) {
        return write(R"({"project":"KestoReporting","version":4,"records":[)" + record("one", 42) + "]," + mark + "}");
    };
    EXPECT_THAT(tool.print({"trace", withMark(R"("lostEvents":0,"lostIntervals":0,"lostPoints":0,"lostValues":0)")}),
                StartsWith("KestoReporting, version 4: 1 value\n\n"));
    for (const auto& [mark, sentence] :
         {std::pair(
              R"("lostEvents":1840)",
              "up to 1840 events were lost: intervals may be missing, and others span the loss, longer than any that "
              "happened"),
          std::pair(R"("lostIntervals":2)",
                    "2 points of the parameters file were not measured: there were too many events or values"),
          std::pair(R"("lostPoints":7)", "7 traces and points of the parameters file were not read: it has too many"),
          std::pair(R"("lostValues":9)", "9 values are missing: the file would have been too large"),
          std::pair(R"("problem":"no\u001btrace")", "no?trace")}) {
        const Finished shown = tool.run({"trace", withMark(mark)});
        EXPECT_EQ(shown.status, 3);
        EXPECT_EQ(shown.errors, "");
        EXPECT_THAT(shown.output,
                    StartsWith(std::string("KestoReporting, version 4: 1 value\nINCOMPLETE: ") + sentence + "\n\n"));
        const Finished json = tool.run({"trace", "--json", path});
        EXPECT_EQ(json.status, 3);
        EXPECT_EQ(json.errors, std::string("kesto: INCOMPLETE: ") + sentence + "\n");
        EXPECT_THAT(json.output, StartsWith(R"({"name":"one",)"));
    }
}

TEST_F(TraceCommand, SaysWhatToDoWithoutAFile)
{
    const Finished finished = tool.run({"trace"});
    EXPECT_NE(finished.status, 0);
    EXPECT_THAT(finished.errors, StartsWith("name a results file, or record a trace: kesto trace record --help\n"));
}

TEST_F(TraceCommand, FailsOnWhatIsNotAResultsFile)
{
    const auto expectFailure = [this](const std::string& file, const std::string& reason) {
        const Finished finished = tool.run({"trace", file});
        EXPECT_EQ(finished.status, 1);
        EXPECT_EQ(finished.output, "");
        EXPECT_EQ(finished.errors, "kesto: " + reason + "\n");
    };
    const auto expectUnread = [&](const std::string& file, const std::string& reason) {
        expectFailure(file, "cannot read " + file + ": " + reason);
    };
    expectUnread(directory.path() / "missing", "No such file or directory");
    expectUnread(directory.path(), "it is not a regular file");
    const std::string pipe = directory.path() / "pipe";
    ASSERT_EQ(::mkfifo(pipe.c_str(), 0600), 0);
    expectUnread(pipe, "it is not a regular file");
    const auto expectNoResults = [&](const std::string& file, const std::string& reason) {
        expectFailure(file, file + " is not a results file of a trace: " + reason);
    };
    expectNoResults(write("[]"), "it is not an object");
    expectNoResults(writeRecords("1"), "its record 1 is not a name, a value and a unit");
    expectNoResults(write(R"({"project":"P","version":4,"records":[],"lostEvents":"many"})"),
                    "its \"lostEvents\" is of another kind");
    expectNoResults(write(R"({"records":[)"), "not JSON: Invalid value. (at byte 13)");
}

} // namespace
} // namespace kesto_tool
