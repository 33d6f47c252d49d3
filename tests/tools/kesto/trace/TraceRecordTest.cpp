// SPDX-License-Identifier: Apache-2.0
// A program that a real service measures with a real kernel trace; and the errors if no trace is available.
#include "end_to_end/Kestod.h"
#include "platform/linux/trace/RealTracefs.h"
#include "tools/kesto/Tool.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace kesto_tool {
namespace {

using testing::AllOf;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::StartsWith;

std::string point(const std::string& name, const std::string& type, const std::string& begin, const std::string& end)
{
    return "<dict><key>Name</key><string>" + name + "</string><key>Type</key><string>" + type
        + "</string><key>KTraceCodeBegin</key><string>" + begin + "</string><key>KTraceCodeEnd</key><string>" + end
        + "</string></dict>";
}

std::string parametersWith(const std::string& points)
{
    return "<plist version=\"1.0\"><dict><key>Children</key><array><dict><key>Name</key><string>emitter</string>"
           "<key>Children</key><array>"
        + points + "</array></dict></array></dict></plist>";
}

const std::string step = point("step", "Interval", "21040010", "21040014");

class TraceRecord : public testing::Test {
protected:
    static constexpr std::string_view noTrace = "this machine does not let this user trace";

    void SetUp() override
    {
        std::filesystem::create_directory(path("home"));
        support::writeFile(path("home/steps.plist"), parametersWith(step));
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
                       {"trace", "record", "--socket", kestod.socketPath(), "--params", path("home/steps.plist")});
        further.emplace_back("--");
        further.insert(further.end(), command.begin(), command.end());
        return tool.run(further);
    }
    // Of a program that emits.
    [[nodiscard]] Finished recordEmitter(const Tool::Arguments& further, Tool::Arguments words) const
    {
        words.insert(words.begin(), KESTO_MEASURED_PROGRAM);
        return record(further, words);
    }
    void expectNothingIsRun(const Finished& finished, const std::string& reason) const
    {
        EXPECT_EQ(finished.status, 1);
        EXPECT_EQ(finished.output, "");
        EXPECT_THAT(finished.errors, AllOf(StartsWith("kesto: "), HasSubstr(reason)));
        EXPECT_FALSE(std::filesystem::exists(path("touched")));
    }

    // Starts a service that traces; false if this machine cannot trace.
    [[nodiscard]] bool startTracingService()
    {
        if (tracefs.problem())
            return false;
        enable();
        kestod.startAndAwait();
        static_cast<void>(record({}, {"true"}));
        kestod.awaitLog();
        return !kestod.log().contains("the kernel trace is not available: ");
    }
    [[nodiscard]] std::vector<std::string> namesInTraces() const { return support::namesIn(path("logs/Audio/Traces")); }

    const support::RealTracefs tracefs; // before the service, which must find it
    end_to_end::Kestod kestod;
    Tool tool{kestod.directory()};
};

TEST_F(TraceRecord, ShowsWhatAProgramEmitsAndPassesItsStatusOn)
{
    if (!startTracingService())
        GTEST_SKIP() << noTrace;
    const std::string copy = path("copy.qdj");
    // Words that the tool must pass on unchanged, even if they look like its own options.
    const Finished finished =
        recordEmitter({"--output", copy}, {"7", "5", "[a,b]", "", "--", "--params", "record", "trace", "{}"});
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

    expectNothingIsRun(record({"--results", path("elsewhere.qdj")}, {"touch", path("touched")}),
                       "the service has written no results to " + path("elsewhere.qdj"));
}

// --- parameters

TEST_F(TraceRecord, MeasuresByAFileThatTheServiceCannotRead)
{
    kestod.hide(path("home"));
    if (!startTracingService())
        GTEST_SKIP() << noTrace;
    const Finished finished = recordEmitter({}, {"7", "0"});
    EXPECT_EQ(finished.status, 0) << finished.errors;
    EXPECT_EQ(finished.errors, "");
    EXPECT_THAT(finished.output, HasSubstr("version 4: 7 values\n"));
    EXPECT_THAT(namesInTraces(), ElementsAre("tracing_results.qdj")) << "the copy is gone";
}

TEST_F(TraceRecord, RemovesTheCopyOfAKilledRecording)
{
    const std::string left = path("logs/Audio/Traces/.kesto-0123456789abcdef.plist");
    std::filesystem::create_directories(path("logs/Audio/Traces"));
    support::writeFile(left, "copy");
    expectNothingIsRun(record({}, {"touch", path("touched")}), "");
    EXPECT_FALSE(std::filesystem::exists(left));
}

TEST_F(TraceRecord, DoesNotRunTheProgramWhenTheServiceCannotBeGivenItsParameters)
{
    kestod.hide(path("home"));
    if (!startTracingService())
        GTEST_SKIP() << noTrace;
    std::filesystem::permissions(path("logs/Audio/Traces"), std::filesystem::perms(0755));
    tool.giveUpRights();
    const Finished finished = record({}, {"touch", path("touched")});
    expectNothingIsRun(finished, "Reading from plist file failed with error: No such file or directory");
    EXPECT_THAT(finished.errors,
                AllOf(HasSubstr(path("home/steps.plist")), HasSubstr("cannot write " + path("logs/Audio/Traces/")),
                      HasSubstr("Permission denied")));
}

TEST_F(TraceRecord, DoesNotRunTheProgramForATraceThatIsNotOfTheKernel)
{
    support::writeFile(path("home/steps.plist"),
                       "<plist><dict><key>Children</key><array><dict><key>TraceType</key><string>OSSignpost</string>"
                       "<key>Children</key><array>"
                           + step + "</array></dict></array></dict></plist>");
    expectNothingIsRun(record({}, {"touch", path("touched")}), "home/steps.plist asks for a trace of signposts");
}

TEST_F(TraceRecord, SaysBeforeTheProgramRunsWhatWillNotBeMeasured)
{
    if (!startTracingService())
        GTEST_SKIP() << noTrace;
    support::writeFile(path("home/steps.plist"),
                       parametersWith(step + point("again", "Intervall", "1", "2")
                                      + point("far", "Interval", "0x21050000", "21040014")
                                      + point("beat", "Impulse", "21040010", "")));
    const std::string warning = "kesto: warning: " + path("home/steps.plist") + ": ";
    const Finished finished = record({}, {"sh", "-c", "echo running >&2"});
    EXPECT_EQ(finished.status, 0);
    EXPECT_EQ(finished.errors,
              warning
                  + "point 2, \"again\": its type is not Interval, Impulse or Level, so it counts as one like the "
                    "point before it\n"
                  + warning
                  + "point 3, \"far\": measures nothing, because the code 0x21050000 is not from 0x21040000 to "
                    "0x2104408a\n"
                  + warning
                  + "point 4, \"beat\": measures nothing, because it begins and ends with one code\nrunning\n");

    support::writeFile(path("home/steps.plist"), parametersWith(""));
    const Finished without = record({}, {"true"});
    EXPECT_EQ(without.status, 0);
    EXPECT_EQ(without.errors, warning + "it has no points, so nothing will be measured\n");
}

// --- results

TEST_F(TraceRecord, SaysThatResultsAreIncompleteAndEndsWithAStatusOfItsOwn)
{
    if (!startTracingService())
        GTEST_SKIP() << noTrace;
    std::string points;
    for (int number = 0; number < 1030; ++number)
        points += step;
    support::writeFile(path("home/steps.plist"), parametersWith(points));
    const std::string missing = "7 traces and points of the parameters file";
    const Finished finished = recordEmitter({}, {"2", "0"});
    EXPECT_EQ(finished.status, 3);
    EXPECT_THAT(finished.errors, HasSubstr(missing));
    EXPECT_THAT(finished.output, AllOf(HasSubstr("version 4: 2046 values\nINCOMPLETE: "), HasSubstr(missing)));
    EXPECT_EQ(recordEmitter({}, {"2", "5"}).status, 5) << "the program's status comes first";
}

TEST_F(TraceRecord, DoesNotRunTheProgramWhenItCouldNotReadTheResults)
{
    if (!startTracingService())
        GTEST_SKIP() << noTrace;
    std::filesystem::permissions(path("logs"), std::filesystem::perms(0750));
    tool.giveUpRights();
    expectNothingIsRun(record({}, {"touch", path("touched")}),
                       "cannot read " + path("logs/Audio/Traces/tracing_results.qdj") + ": Permission denied");
}

TEST_F(TraceRecord, ShowsTheResultsAlsoWhenNoCopyCanBeKept)
{
    if (!startTracingService())
        GTEST_SKIP() << noTrace;
    const Finished finished = recordEmitter({"--output", path("missing/copy.qdj")}, {"7", "0"});
    EXPECT_EQ(finished.status, 1);
    EXPECT_EQ(finished.errors, "kesto: cannot write " + path("missing/copy.qdj") + ": No such file or directory\n");
    EXPECT_THAT(finished.output, AllOf(HasSubstr("version 4: 7 values\n"), HasSubstr("  step\n")));
    const Finished device = recordEmitter({"--output", "/dev/stderr"}, {"1", "0"});
    EXPECT_EQ(device.status, 0);
    EXPECT_THAT(device.errors, StartsWith("{\"project\":\"KestoReporting\""));
}

// --- missing traces

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
    support::writeFile(path("home/steps.plist"), "<plist><dict>\n<key>");
    expectNothingIsRun(record({}, {"touch", path("touched")}), "steps.plist is not a parameters file: line 2");
    std::filesystem::remove(path("home/steps.plist"));
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
