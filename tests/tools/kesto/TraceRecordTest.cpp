// A program that is measured while it runs, by a real service and a real kernel trace; and what is said where there is
// none to be had.
#include "end_to_end/Kestod.h"
#include "platform/linux/RealTracefs.h"
#include "tools/kesto/Tool.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace kesto_tool {
namespace {

using testing::AllOf;
using testing::HasSubstr;
using testing::StartsWith;

constexpr std::string_view parameters = R"(<plist version="1.0"><dict><key>Children</key><array><dict>
    <key>Name</key><string>emitter</string><key>Children</key><array><dict>
    <key>Name</key><string>step</string><key>Type</key><string>Interval</string>
    <key>KTraceCodeBegin</key><string>21040010</string><key>KTraceCodeEnd</key><string>21040014</string>
    </dict></array></dict></array></dict></plist>)";

class TraceRecord : public testing::Test {
protected:
    void SetUp() override
    {
        support::writeFile(path("steps.plist"), parameters);
        tool.setVariable("LOGS_DIRECTORY=" + path("logs"));
    }
    [[nodiscard]] std::string path(const char* name) const { return kestod.directory() / name; }
    void enable() const
    {
        support::writeFile(kestod.directory() / "configuration" / "feature-flags.toml", "[Sonalis]\nTracing = true\n");
    }
    [[nodiscard]] Finished record(Tool::Arguments further, const Tool::Arguments& command) const
    {
        further.insert(further.begin(),
                       {"trace", "record", "--socket", kestod.socketPath(), "--params", path("steps.plist")});
        further.emplace_back("--");
        further.insert(further.end(), command.begin(), command.end());
        return tool.run(further);
    }
    // Of a program that emits.
    [[nodiscard]] Finished recordEmitter(const Tool::Arguments& further, Tool::Arguments words) const
    {
        words.insert(words.begin(), KESTO_TRACE_EMITTER);
        return record(further, words);
    }
    void expectNothingIsRun(const Finished& finished, const std::string& reason) const
    {
        EXPECT_EQ(finished.status, 1);
        EXPECT_EQ(finished.output, "");
        EXPECT_THAT(finished.errors, AllOf(StartsWith("kesto: "), HasSubstr(reason)));
        EXPECT_FALSE(std::filesystem::exists(path("touched")));
    }

    const support::RealTracefs tracefs; // before the service, which is to see it
    end_to_end::Kestod kestod;
    Tool tool{kestod.directory()};
};

TEST_F(TraceRecord, ShowsWhatAProgramEmitsAndPassesItsStatusOn)
{
    if (tracefs.problem())
        GTEST_SKIP() << *tracefs.problem();
    enable();
    kestod.startAndAwait();
    const std::string copy = path("copy.qdj");
    // Words as they are, whatever they look like to the tool.
    const Finished finished =
        recordEmitter({"--output", copy}, {"7", "5", "[a,b]", "", "--", "--params", "record", "trace", "{}"});
    if (finished.status == 1 && kestod.log().contains("there is no kernel trace: "))
        GTEST_SKIP() << "this machine lets nobody trace";
    EXPECT_EQ(finished.status, 5) << finished.errors;
    EXPECT_EQ(finished.errors, "");
    EXPECT_THAT(finished.output,
                StartsWith("<[a,b]><><--><--params><record><trace><{}>\nKestoReporting, version 4: 7 values\n"));
    EXPECT_THAT(finished.output, HasSubstr("  step\n"));
    EXPECT_THAT(tool.print({"trace", "--json", copy}), StartsWith(R"({"name":"step","unit":"ns","count":7,)"));

    const Finished again = recordEmitter({}, {"0", "0"});
    EXPECT_EQ(again.status, 0) << again.errors;
    EXPECT_EQ(again.output, "\nKestoReporting, version 4: 0 values\n");

    EXPECT_EQ(record({}, {"sh", "-c", "kill -9 $$"}).status, 137);
    const Finished unknown = record({}, {"/nonexistent/program"});
    EXPECT_EQ(unknown.status, 127);
    EXPECT_EQ(unknown.errors, "kesto: /nonexistent/program cannot be run: No such file or directory\n");
    EXPECT_EQ(unknown.output, "");

    const Finished elsewhere = record({"--results", path("elsewhere.qdj")}, {"true"});
    EXPECT_EQ(elsewhere.status, 1);
    EXPECT_THAT(elsewhere.errors, HasSubstr("the service has written no results to " + path("elsewhere.qdj")));
}

TEST_F(TraceRecord, DoesNotRunTheProgramWhenTheServiceDoesNotTrace)
{
    kestod.startAndAwait(); // the feature is off
    expectNothingIsRun(record({}, {"touch", path("touched")}), "the service does not trace. Either the feature is off");
}

TEST_F(TraceRecord, DoesNotRunTheProgramWithoutAService)
{
    expectNothingIsRun(record({}, {"touch", path("touched")}), "is kestod running?");
}

TEST_F(TraceRecord, DoesNotRunTheProgramWithoutParameters)
{
    support::writeFile(path("steps.plist"), "<plist><dict>\n<key>");
    expectNothingIsRun(record({}, {"touch", path("touched")}), "steps.plist is no parameters file: line 2");
    std::filesystem::remove(path("steps.plist"));
    expectNothingIsRun(record({}, {"touch", path("touched")}), "steps.plist: No such file or directory");
}

TEST_F(TraceRecord, IsRefusedWithAWrongCommandLine)
{
    for (const Tool::Arguments& arguments : {Tool::Arguments{"trace"},
                                             {"trace", "record", "--", "true"},
                                             {"trace", "record", "--params", "x"},
                                             {"trace", "a", "b"},
                                             {"trace", "--json", "record", "--params", "x", "--", "true"}}) {
        const Finished finished = tool.run(arguments);
        EXPECT_EQ(finished.status, 2) << finished.errors;
        EXPECT_EQ(finished.output, "");
    }
}

} // namespace
} // namespace kesto_tool
