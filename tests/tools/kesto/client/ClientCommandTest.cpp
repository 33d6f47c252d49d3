// SPDX-License-Identifier: Apache-2.0
// Every operation of a real service from a shell.
#include "end_to_end/Kestod.h"
#include "end_to_end/WireClient.h"
#include "tools/kesto/Tool.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <utility>

namespace kesto_tool {
namespace {

using testing::ElementsAre;
using testing::EndsWith;
using testing::Field;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::SizeIs;
using testing::StartsWith;

std::vector<std::string> lines(const std::string& text)
{
    std::vector<std::string> all;
    for (std::size_t begin = 0; begin < text.size();) {
        const std::size_t end = std::min(text.find('\n', begin), text.size());
        all.push_back(text.substr(begin, end - begin));
        begin = end + 1;
    }
    return all;
}

std::string answer(int call, const std::string& operation, const std::string& values)
{
    return R"({"call":)" + std::to_string(call) + R"(,"operation":")" + operation + R"(","error":null,"values":)"
        + values + "}";
}

class ClientCommand : public testing::Test {
protected:
    void SetUp() override { kestod.startAndAwait(); }

    // With --wait, to bound the time for a missing answer.
    [[nodiscard]] Finished run(const std::string& input) const
    {
        return tool.run({"client", "--wait", "20", "--socket", kestod.socketPath()}, input);
    }
    // The answers of a successful run.
    [[nodiscard]] std::vector<std::string> answers(const std::string& input) const
    {
        const Finished finished = run(input);
        EXPECT_EQ(finished.status, 0);
        EXPECT_EQ(finished.errors, "");
        return lines(finished.output);
    }

    end_to_end::Kestod kestod;
    Tool tool{kestod.directory()};
};

class ListeningClientCommand : public ClientCommand {
protected:
    void SetUp() override
    {
        ClientCommand::SetUp();
        witness.emplace(kestod.socketPath());
    }
    std::optional<end_to_end::WireClient> witness; // connected, and so the service listens
};

TEST_F(ListeningClientCommand, CallsEveryOperation)
{
    EXPECT_THAT(answers(R"(["create", 42]
["setServiceType", "longformaudio", 42]
["getServiceName", 42]
["setConfiguration", {"HostApplicationDisplayID": "org.example.player"}, 42]
["start", 42]
["send", {"PomoSessionVolume": 0.5, "list": [1, -1, true, null], "inner": {"a": "ü"}}, "Playback", "Start", [42]]
["validate", 42]
["getAllReporters"]
["stop", 42]
["destroy", 42]
["getAllReporters"]
)"),
                ElementsAre(answer(1, "createReportingSession", "[true]"), answer(2, "setServiceType", "[true]"),
                            answer(3, "getServiceNameForReporterID", "[7]"), answer(4, "setConfiguration", "[true]"),
                            answer(6, "sendMessage", "[]"),
                            answer(7, "reporterID", R"([{"reporterID":42,"serviceType":7}])"),
                            answer(8, "getAllReporters", "[[42]]"), answer(5, "startReportingSessionForID", "[true]"),
                            answer(9, "stopReportingSessionForID", "[true]"),
                            answer(10, "destroyReportingSession", "[true]"), answer(11, "getAllReporters", "[[]]")));
    const auto events = kestod.events("com.quarn.longformaudio.Playback.Start");
    ASSERT_THAT(events, SizeIs(1));
    EXPECT_EQ(events[0].payload,
              R"({"PomoSessionVolume":0.5,"list":[1,-1,true,null],"inner":{"a":"ü"},)"
              R"("HostApplicationDisplayID":"org.example.player"})");
}

TEST_F(ListeningClientCommand, KnowsTheOperationsByTheirFullNamesToo)
{
    EXPECT_THAT(answers(R"(["createReportingSession", 1]
["getServiceNameForReporterID", 1]
["startReportingSessionForID", 1]
["sendMessage", {}, "Playback", "Start", [1]]
["reporterID", 1]
["stopReportingSessionForID", 1]
["destroyReportingSession", 1]
)"),
                SizeIs(7));
}

TEST_F(ListeningClientCommand, TakesCategoriesTypesAndServicesByNameOrNumber)
{
    std::vector<std::string> names;
    const auto sent = [&](const std::string& category, const std::string& type) {
        EXPECT_THAT(answers("[\"send\", {\"a\": 1}, " + category + ", " + type + ", null]\n"), SizeIs(1));
        const std::size_t before = std::exchange(names, {}).size();
        for (const auto& event : kestod.events("com.quarn.kesto.*[^e]")) // not those of uptime
            names.push_back(event.name);
        return names.size() == before + 1 ? names.back() : "nothing";
    };
    EXPECT_EQ(sent("\"Volume\"", "\"Stop\""), "com.quarn.kesto.Volume.Stop");
    EXPECT_EQ(sent("14", "\"Stop\""), "com.quarn.kesto.Volume.Stop");
    EXPECT_EQ(sent("\"DSP_Playback\"", "\"Start\""), "com.quarn.kesto.DSP_Playback.Start");
    EXPECT_EQ(sent("268435460", "1"), "com.quarn.kesto.DSP_Playback.Start");
    EXPECT_EQ(sent("4294967295", "65535"), "com.quarn.kesto.Undefined.Unknown");
}

TEST_F(ListeningClientCommand, PrintsBothAnswersForTheServiceTypeOfNobody)
{
    EXPECT_THAT(answers("[\"getServiceName\", 0]\n"),
                ElementsAre(answer(1, "getServiceNameForReporterID", "[65535]"),
                            answer(1, "getServiceNameForReporterID", "[65535]")));
}

TEST_F(ListeningClientCommand, DoesNotWaitForASessionThatStaysStarted)
{
    EXPECT_THAT(answers("[\"create\", 1]\n[\"start\", 1]\n"), ElementsAre(HasSubstr("createReportingSession")));
}

TEST_F(ListeningClientCommand, AnswersWhileMoreIsStillToCome)
{
    const auto client = tool.start({"client", "--socket", kestod.socketPath()});
    client->write("[\"create\", 1]\n");
    EXPECT_EQ(client->waitForOutput("\n"), answer(1, "createReportingSession", "[true]") + "\n");
    client->write("[\"getAllReporters\"]\n");
    EXPECT_THAT(client->waitForOutput("getAllReporters"), HasSubstr("[[1]]"));
    client->closeInput();
    EXPECT_EQ(client->wait(), 0);
}

TEST_F(ListeningClientCommand, EndsTheServiceAndTakesThatForSuccess)
{
    EXPECT_THAT(answers("[\"kill\"]\n"), IsEmpty());
    EXPECT_EQ(kestod.exitStatus(), 2);
}

TEST_F(ListeningClientCommand, FindsTheSocketInTheEnvironment)
{
    tool.setVariable("KESTO_SOCKET=" + kestod.socketPath().native());
    EXPECT_EQ(tool.print({"client"}, "[\"getAllReporters\"]\n"), answer(1, "getAllReporters", "[[]]") + "\n");
}

TEST_F(ListeningClientCommand, ReadsAMillionBytesInALineAndALastLineWithoutItsEnd)
{
    const std::string large(1'000'000, 'x');
    EXPECT_THAT(answers("\r\n  \n[\"send\", {\"large\": \"" + large + "\"}, 4, 1, null]"),
                ElementsAre(answer(1, "sendMessage", "[]")));
    EXPECT_THAT(kestod.events("com.quarn.kesto.Playback.Start"),
                ElementsAre(Field(&end_to_end::StoreRow::payload, StartsWith("{\"large\":\"" + large))));
}

// --- wrong lines

struct WrongCall {
    std::string name;
    std::string line;
    std::string reason;
};

void PrintTo(const WrongCall& line, std::ostream* out)
{
    *out << line.name;
}

class WrongClientLine : public ListeningClientCommand, public testing::WithParamInterface<WrongCall> { };

TEST_P(WrongClientLine, IsToldWithItsNumberAndTheOthersAreCarriedOut)
{
    const Finished finished = run("[\"create\", 1]\n\n" + GetParam().line + "\n[\"getAllReporters\"]\n");
    EXPECT_EQ(finished.status, 1);
    EXPECT_THAT(finished.errors, StartsWith("kesto client: line 3: "));
    EXPECT_THAT(finished.errors, HasSubstr(GetParam().reason));
    EXPECT_THAT(lines(finished.errors), SizeIs(1));
    EXPECT_THAT(lines(finished.output),
                ElementsAre(answer(1, "createReportingSession", "[true]"), answer(2, "getAllReporters", "[[1]]")));
}

INSTANTIATE_TEST_SUITE_P(
    OfEveryKind, WrongClientLine,
    testing::Values(
        WrongCall{"NoJson", "create 1", "not JSON: Invalid value. (at character 1)"},
        WrongCall{"HalfALine", "[\"create\", 1", "not JSON"},
        WrongCall{"TwoCalls", "[\"kill\"] [\"kill\"]", "not JSON"}, WrongCall{"NotUtf8", "[\"\xFF\"]", "not JSON"},
        WrongCall{"NoArray", "{\"create\": 1}", "a call is an array"},
        WrongCall{"AnEmptyArray", "[]", "a call is an array"}, WrongCall{"NoOperation", "[1, 1]", "a call is an array"},
        WrongCall{"AnUnknownOperation", "[\"play\", 1]", "unknown operation \"play\"; there are create"},
        WrongCall{"TooFewArguments", "[\"create\"]", "create takes 1 arguments, not 0"},
        WrongCall{"TooManyArguments", "[\"getAllReporters\", 1]", "getAllReporters takes 0 arguments, not 1"},
        WrongCall{"AReporterThatIsText", "[\"create\", \"1\"]", "argument 1 of create is not a reporter ID"},
        WrongCall{"AReporterThatIsAFraction", "[\"start\", 1.5]", "argument 1 of start is not a reporter ID"},
        WrongCall{"AReporterThatIsTooLarge", "[\"stop\", 9223372036854775808]",
                  "argument 1 of stop is not a reporter ID"},
        WrongCall{"AnUnknownServiceType", "[\"setServiceType\", \"jazz\", 1]", "argument 1 of setServiceType"},
        WrongCall{"AServiceTypeThatIsTooLarge", "[\"setServiceType\", 65536, 1]", "argument 1 of setServiceType"},
        WrongCall{"AnUnknownCategory", "[\"send\", {}, \"Jazz\", 1, null]", "argument 2 of send is not a category"},
        WrongCall{"ANegativeCategory", "[\"send\", {}, -1, 1, null]", "argument 2 of send is not a category"},
        WrongCall{"AnUnknownType", "[\"send\", {}, 4, \"Begin\", null]", "argument 3 of send is not an event type"},
        WrongCall{"AMessageThatIsNone", "[\"send\", [], 4, 1, null]", "argument 1 of send is not a message"},
        WrongCall{"AMessageThatIsTooDeep",
                  "[\"send\", {\"a\": " + std::string(40, '[') + std::string(40, ']') + "}, 4, 1, null]",
                  "argument 1 of send is not a message"},
        WrongCall{"AConfigurationThatIsNone", "[\"setConfiguration\", null, 1]", "argument 1 of setConfiguration"},
        WrongCall{"AListOfReportersThatIsNone", "[\"send\", {}, 4, 1, 1]", "argument 4 of send is not a list"},
        WrongCall{"AReporterInTheListThatIsText", "[\"send\", {}, 4, 1, [\"1\"]]", "argument 4 of send is not a list"},
        WrongCall{"ALineThatNeverEnds", std::string(9 * 1024 * 1024, ' ') + "[\"kill\"]", "longer than 8388608 bytes"}),
    [](const auto& line) { return line.param.name; });

// --- failures of the connection

TEST(ClientWithoutAService, SaysThatNobodyIsThere)
{
    const support::TemporaryDirectory directory;
    const Tool tool(directory.path());
    const std::string socket = directory.path() / "none";
    const Finished finished = tool.runShell("echo '[\"getAllReporters\"]' | $kesto client --socket " + socket);
    EXPECT_EQ(finished.status, 1);
    EXPECT_EQ(finished.output, "");
    EXPECT_THAT(finished.errors, HasSubstr(socket));
    EXPECT_THAT(finished.errors, HasSubstr("is kestod running?"));
    EXPECT_THAT(lines(finished.errors), SizeIs(1));
    EXPECT_EQ(tool.run({"client", "--socket", std::string(200, 'x')}).status, 1) << "a path that no socket can have";
}

TEST_F(ListeningClientCommand, SaysThatTheServiceIsGone)
{
    const auto client = tool.start({"client", "--socket", kestod.socketPath()});
    client->write("[\"create\", 1]\n");
    ASSERT_THAT(client->waitForOutput("\n"), EndsWith("}\n"));
    kestod.kill();
    client->closeInput();
    const auto status = client->wait();
    // The tool may notice the loss before or after the end of the input.
    if (client->errors().empty())
        EXPECT_EQ(status, 0);
    else {
        EXPECT_EQ(status, 1);
        EXPECT_THAT(client->errors(), HasSubstr("is kestod running?"));
    }
}

TEST_F(ListeningClientCommand, WaitsForAnswersNoLongerThanItIsTold)
{
    const pid_t service = kestod.process();
    ::kill(service, SIGSTOP);
    const Finished finished =
        tool.run({"client", "--wait", "0.1", "--socket", kestod.socketPath()}, "[\"getAllReporters\"]\n");
    ::kill(service, SIGCONT);
    EXPECT_EQ(finished.status, 1);
    EXPECT_EQ(finished.errors, "kesto client: 1 answers did not come within 0.1 s\n");
}

} // namespace
} // namespace kesto_tool
