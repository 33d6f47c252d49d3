// SPDX-License-Identifier: Apache-2.0
// Clients that break the protocol: each ends its own connection, with one logged line, and touches nothing else.
#include "end_to_end/Kestod.h"
#include "end_to_end/WireClient.h"

#include <functional>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace end_to_end {
namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;

struct BadInput {
    std::string name;
    std::function<void(WireClient&)> send;
    std::string reason; // in the log
};

void PrintTo(const BadInput& input, std::ostream* out)
{
    *out << input.name;
}

class BadInputTest : public testing::TestWithParam<BadInput> { };

Value nested(unsigned depth)
{
    Value value(1);
    for (unsigned level = 0; level < depth; ++level)
        value = Value(Array{value});
    return value;
}

TEST_P(BadInputTest, EndsThatConnectionWithOneLineAndNoOther)
{
    Kestod kestod({}, {{"KESTO_LOG", "default"}});
    kestod.start();
    WireClient good(kestod.socketPath());
    good.ask(Create, 1);
    good.ask(SendMessage, Dictionary{{"before", 1}}, 4, 1, Array{1});

    WireClient bad(kestod.socketPath());
    bad.ask(Create, 2);
    GetParam().send(bad);
    EXPECT_TRUE(bad.isClosed());
    ASSERT_TRUE(kestod.waitForLog(GetParam().reason)) << GetParam().reason;
    kestod.awaitLog();
    EXPECT_EQ(kestod.countInLog(GetParam().reason), 1U);

    EXPECT_EQ(good.ask(SendMessage, Dictionary{{"after", 1}}, 4, 2, Array{1}),
              (Array{
                  3,
                  Value(),
              }));
    EXPECT_EQ(kestod.events("com.quarn.kesto.Playback.*").size(), 2U);
}

INSTANTIATE_TEST_SUITE_P(
    OfEveryKind, BadInputTest,
    testing::Values(
        BadInput{"AFrameThatIsTooLong",
                 [](WireClient& client) { client.sendBytes(std::string("\x01\x00\x10\x00", 4)); },
                 "a frame is longer than 1048576 bytes"},
        BadInput{"AFrameThatIsTooDeep", [](WireClient& client) { client.sendFrame(nested(33)); },
                 "the CBOR item is nested too deep"},
        BadInput{"BytesThatAreNotCbor", [](WireClient& client) { client.sendFrameBytes("\xFF\xFF"); },
                 "not well-formed CBOR"},
        BadInput{"AnItemThatIsCutShort", [](WireClient& client) { client.sendFrameBytes("\x83\x01"); },
                 "the CBOR item is not complete"},
        BadInput{"TwoItemsInAFrame", [](WireClient& client) { client.sendFrameBytes("\x01\x01"); },
                 "bytes follow the CBOR item"},
        BadInput{"AnEmptyFrame", [](WireClient& client) { client.sendFrameBytes(""); },
                 "the CBOR item is not complete"},
        BadInput{"AFrameThatIsNotAnArray", [](WireClient& client) { client.sendFrame(Dictionary{{"a", 1}}); },
                 "a frame is not an array"},
        BadInput{"TextThatIsNotUtf8", [](WireClient& client) { client.sendFrameBytes("\x83\x01\x09\x61\xFF"); },
                 "text is not valid UTF-8"},
        BadInput{"AMapKeyThatIsNotText",
                 [](WireClient& client) { client.sendFrameBytes("\x84\x01\x04\xA1\x01\x01\x01"); },
                 "a map key is not text"},
        BadInput{"AnIntegerBelowAllRanges",
                 [](WireClient& client) { client.sendFrameBytes("\x83\x01\x09\x3B\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF"); },
                 "an integer is out of range"},
        BadInput{"AnUnknownMethod", [](WireClient& client) { client.sendFrame(Array{1, 99}); }, "unknown method 99"},
        BadInput{"MethodZero", [](WireClient& client) { client.sendFrame(Array{1, 0}); }, "unknown method 0"},
        BadInput{"ACallWithoutAMethod", [](WireClient& client) { client.sendFrame(Array{1}); }, "a call is an array"},
        BadInput{"ANegativeCallNumber", [](WireClient& client) { client.sendFrame(Array{-1, 10}); }, "a call's number"},
        BadInput{"ARequestForTheStatusWithAWrongNumber",
                 [](WireClient& client) { client.sendFrame(Array{-1, "status"}); }, "a call's number"},
        BadInput{"TooFewArguments", [](WireClient& client) { client.sendFrame(Array{1, 1}); },
                 "createReportingSession takes 1 arguments, not 0"},
        BadInput{"TooManyArguments", [](WireClient& client) { client.sendFrame(Array{1, 10, 1}); },
                 "getAllReporters takes 0 arguments, not 1"},
        BadInput{"AServiceTypeOutOfRange", [](WireClient& client) { client.sendFrame(Array{1, 2, 65536, 2}); },
                 "setServiceType: argument service type is not an integer from 0 to 65535"},
        BadInput{"AReporterIDThatIsTrue", [](WireClient& client) { client.sendFrame(Array{1, 1, true}); },
                 "createReportingSession: argument reporter ID"},
        BadInput{"AReporterIDThatIsAFloat", [](WireClient& client) { client.sendFrame(Array{1, 1, 2.0}); },
                 "createReportingSession: argument reporter ID"},
        BadInput{"AMessageThatIsNotAMap", [](WireClient& client) { client.sendFrame(Array{1, 6, "text", 4, 1, null}); },
                 "sendMessage: argument message is not a map"},
        BadInput{"AListOfReportersThatIsAMap",
                 [](WireClient& client) { client.sendFrame(Array{1, 6, Dictionary{}, 4, 1, Dictionary{}}); },
                 "sendMessage: argument reporter IDs"},
        BadInput{"AReporterInTheListThatIsText",
                 [](WireClient& client) { client.sendFrame(Array{1, 6, Dictionary{}, 4, 1, Array{1, "2"}}); },
                 "sendMessage: argument reporter IDs"}),
    [](const auto& input) { return input.param.name; });

TEST(HalfAFrameTest, ThenTheEndIsAnInterruption)
{
    Kestod kestod({}, {{"KESTO_LOG", "default"}});
    kestod.start();
    WireClient client(kestod.socketPath());
    client.ask(Create, 1);
    client.sendBytes(std::string("\x10\x00\x00\x00\x83", 5));
    client.close();
    EXPECT_TRUE(kestod.waitForLog("the stream ends inside a frame"));
    EXPECT_TRUE(kestod.waitForLog("interruptionHandler: connection exited"));
    EXPECT_TRUE(kestod.waitForLog("invalidationHandler: connection exited"));
}

} // namespace
} // namespace end_to_end
