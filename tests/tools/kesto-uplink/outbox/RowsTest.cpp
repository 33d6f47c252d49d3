// SPDX-License-Identifier: Apache-2.0
// The lines of each kind of row, to the letter.
#include "kesto-uplink/outbox/Rows.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>

namespace kesto_uplink {
namespace {

constexpr double infinity = std::numeric_limits<double>::infinity();

using Action = Rule::Action;

Identity identity()
{
    return {.pseudonym = "00112233445566778899aabbccddeeff", .hashKey = "key"};
}

UplinkConfiguration configuration()
{
    UplinkConfiguration result;
    result.allowed.events = {{.names = "com.quarn.kesto.*",
                              .rules = {{.key = "HostApplicationDisplayID", .action = Action::Keep},
                                        {.key = "latency", .action = Action::Keep}}}};
    return result;
}

const std::string epoch = "ffffffffffffffff0000000000000000";
const std::string player = "org.example.player";
constexpr const char* begin =
    R"({"device":"00112233445566778899aabbccddeeff","epoch":"ffffffffffffffff0000000000000000",)";

TEST(Rows, WritesAnEvent)
{
    Rows rows(configuration(), identity());
    EXPECT_EQ(rows.event({.id = 7,
                          .time = 1700000000.25,
                          .name = "com.quarn.kesto.Playback.Start",
                          .payload = R"({"HostApplicationDisplayID":"a\"b","latency":0.1,"secret":1})",
                          .session = 3,
                          .happened = 1699999999.5},
                         epoch, &player),
              std::string(begin)
                  + R"("kind":"event","id":7,"time":1700000000.25,"name":"com.quarn.kesto.Playback.Start","session":3,)"
                    R"("happened":1699999999.5,"application":"a\"b",)"
                    R"("payload":{"HostApplicationDisplayID":"a\"b","latency":0.1}})"
                    "\n");
    EXPECT_EQ(rows.event({.id = 8, .time = 5, .name = "com.quarn.kesto.x", .payload = "{}"}, epoch, nullptr),
              std::string(begin)
                  + R"("kind":"event","id":8,"time":5,"name":"com.quarn.kesto.x","payload":{}})"
                    "\n");
}

TEST(Rows, NamesTheApplicationOfTheSessionIfThatMayLeave)
{
    const StoredEvent event{.id = 8, .time = 5, .name = "com.quarn.kesto.x", .payload = "{}", .session = 3};
    Rows silent(configuration(), identity());
    EXPECT_THAT(silent.event(event, epoch, &player).value(), testing::Not(testing::HasSubstr("application")));
    UplinkConfiguration telling = configuration();
    telling.allowed.sessions = std::vector<Rule>{{.key = "application", .action = Action::Keep}};
    Rows rows(telling, identity());
    EXPECT_THAT(rows.event(event, epoch, &player).value(), testing::HasSubstr(R"("application":"org.example.player")"));
}

// Receivers refuse a row whose application is no text, or a long one.
TEST(Rows, TakesTheSessionsApplicationInPlaceOfOneThatIsNone)
{
    UplinkConfiguration telling = configuration();
    telling.allowed.sessions = std::vector<Rule>{{.key = "application", .action = Action::Keep}};
    Rows rows(telling, identity());
    const auto lineOf = [&rows](const std::string& application, const std::string& ofSession = player) {
        return rows
            .event({.id = 8,
                    .name = "com.quarn.kesto.x",
                    .payload = R"({"HostApplicationDisplayID":)" + application + "}"},
                   epoch, &ofSession)
            .value();
    };
    for (const std::string& none : {std::string("7"), std::string("{\"a\":\"b\"}"), std::string("[\"b\"]"),
                                    std::string("null"), "\"" + std::string(16'385, 'a') + "\""})
        EXPECT_EQ(lineOf(none),
                  std::string(begin)
                      + R"("kind":"event","id":8,"time":0,"name":"com.quarn.kesto.x",)"
                        R"("application":"org.example.player","payload":{"HostApplicationDisplayID":)"
                      + none + "}}\n");
    const std::string longest(16'384, 'a');
    EXPECT_THAT(lineOf("\"" + longest + "\""), testing::HasSubstr(R"("application":")" + longest + "\""));
    EXPECT_THAT(lineOf("7", longest + "a"), testing::Not(testing::HasSubstr("application\"")));
}

TEST(Rows, LeavesLongTextsOut)
{
    UplinkConfiguration with = configuration();
    with.allowed.stretches = std::vector<Rule>{{.key = "device", .action = Action::Keep}};
    with.allowed.sessions = std::vector<Rule>{{.key = "service", .action = Action::Keep}};
    const std::string text(16'385, 'a');
    EXPECT_EQ(Rows(with, identity()).stretch({.id = 9, .device = text, .ending = "change"}, epoch, nullptr),
              std::string(begin)
                  + R"("kind":"stretch","id":9,"recording":false,"began":0,"seconds":0,"ending":"change"})"
                    "\n");
    EXPECT_EQ(Rows(with, identity()).session({.id = 3, .service = text}, epoch),
              std::string(begin)
                  + R"("kind":"session","id":3,"began":0})"
                    "\n");
    with.allowed.events[0].names = "*";
    Rows rows(with, identity());
    EXPECT_EQ(rows.event({.id = 1, .name = text, .payload = "{}"}, epoch, nullptr).error(), WhyNot::Unreadable);
    EXPECT_TRUE(rows.event({.id = 1, .name = text.substr(1), .payload = "{}"}, epoch, nullptr));
}

TEST(Rows, WritesTheEdgesOfWholeNumbersAsWholeNumbers)
{
    UplinkConfiguration with = configuration();
    const Rule rule{.key = "reporter", .action = Action::Bucket, .edges = {-2, 9'007'199'254'740'992}};
    with.allowed.sessions = std::vector<Rule>{rule};
    const Rows rows(with, identity());
    EXPECT_THAT(rows.session({.id = 3, .reporter = 9'007'199'254'740'993}, epoch).value(),
                testing::HasSubstr(R"("reporter":9007199254740992,)"));
    EXPECT_THAT(rows.session({.id = 3, .reporter = -1}, epoch).value(), testing::HasSubstr(R"("reporter":-2,)"));
}

TEST(Rows, KeepsTheDigitsOfNumbers)
{
    Rows rows(configuration(), identity());
    const auto payloadOf = [&rows](const std::string& number) {
        const std::string line =
            rows.event({.id = 1, .name = "com.quarn.kesto.x", .payload = R"({"latency":)" + number + "}"}, epoch,
                       nullptr)
                .value();
        return line.substr(line.find("\"latency\":") + 10);
    };
    EXPECT_EQ(payloadOf("0.6"), "0.6}}\n");
    EXPECT_EQ(payloadOf("9007199254740993"), "9007199254740993}}\n");
    EXPECT_EQ(payloadOf("18446744073709551615"), "18446744073709551615}}\n");
    EXPECT_EQ(payloadOf("5e-324"), "5e-324}}\n");
    EXPECT_EQ(payloadOf("0.30000000000000004"), "0.30000000000000004}}\n");
    EXPECT_EQ(payloadOf("[1,2.5,{\"a\":null}]"), "[1,2.5,{\"a\":null}]}}\n");
}

TEST(Rows, KeepsBackWhatItCannotRead)
{
    Rows rows(configuration(), identity());
    const auto why = [&rows](const std::string& payload, double time = 5) {
        return rows.event({.id = 1, .time = time, .name = "com.quarn.kesto.x", .payload = payload}, epoch, nullptr)
            .error();
    };
    for (const char* broken :
         {"", "[]", "1", "null", "{", "{\"a\":}", "{\"a\":1}x", "{\"a\":1e999}", "{\"a\":\"\xFF\"}", "{\"a\":NaN}"})
        EXPECT_EQ(why(broken), WhyNot::Unreadable) << broken;
    EXPECT_EQ(why("{\"latency\":" + std::string(100'000, '[') + std::string(100'000, ']') + "}"), WhyNot::Unreadable);
    EXPECT_EQ(why(std::string(1'000'000, '{')), WhyNot::Unreadable);
    EXPECT_EQ(why("{}", infinity), WhyNot::Unreadable);
    EXPECT_EQ(rows.event({.id = 1, .name = "com.quarn.music.x", .payload = "{"}, epoch, nullptr).error(),
              WhyNot::NotAllowed);
}

TEST(Rows, WritesAStretch)
{
    UplinkConfiguration with = configuration();
    EXPECT_EQ(Rows(with, identity()).stretch({.id = 9}, epoch, &player).error(), WhyNot::NotAllowed);
    const StoredStretch stretch{.id = 9,
                                .isRecording = true,
                                .began = 1000.5,
                                .seconds = 2.25,
                                .device = "speaker",
                                .format = "S16LE/48000/2",
                                .channels = 2,
                                .volume = 0.6,
                                .ending = "change",
                                .session = 3};
    with.allowed.stretches.emplace();
    EXPECT_EQ(Rows(with, identity()).stretch(stretch, epoch, &player),
              std::string(begin)
                  + R"("kind":"stretch","id":9,"recording":true,"began":1000.5,"seconds":2.25,"session":3,)"
                    R"("ending":"change"})"
                    "\n");
    for (const char* column : {"device", "format", "channels", "volume", "application"})
        with.allowed.stretches->push_back({.key = column, .action = Action::Keep});
    EXPECT_EQ(Rows(with, identity()).stretch(stretch, epoch, &player),
              std::string(begin)
                  + R"("kind":"stretch","id":9,"recording":true,"began":1000.5,"seconds":2.25,"session":3,)"
                    R"("device_name":"speaker","format":"S16LE/48000/2","channels":2,"volume":0.6,)"
                    R"("application":"org.example.player","ending":"change"})"
                    "\n");
}

TEST(Rows, WritesASession)
{
    UplinkConfiguration with = configuration();
    with.allowed.sessions.emplace();
    const StoredSession session{.id = 3,
                                .reporter = 42,
                                .service = "longformaudio",
                                .application = player,
                                .process = "player",
                                .began = 1000.5,
                                .ended = 1010};
    EXPECT_EQ(Rows(with, identity()).session(session, epoch),
              std::string(begin)
                  + R"("kind":"session","id":3,"began":1000.5,"ended":1010})"
                    "\n");
    for (const char* column : {"reporter", "service", "process"})
        with.allowed.sessions->push_back({.key = column, .action = Action::Keep});
    with.allowed.sessions->push_back({.key = "application", .action = Action::Drop});
    EXPECT_EQ(Rows(with, identity()).session(session, epoch),
              std::string(begin)
                  + R"("kind":"session","id":3,"reporter":42,"service":"longformaudio","process":"player",)"
                    R"("began":1000.5,"ended":1010})"
                    "\n");
}

TEST(Rows, BeginsABatchWithTheDevice)
{
    UplinkConfiguration with;
    EXPECT_EQ(Rows(with, identity()).device({epoch, 11}, {epoch, 20}, 1700000000.5),
              std::string(begin)
                  + R"("kind":"device","sent":1700000000.5,"first":11,"last":20})"
                    "\n");
    with.model = "speaker 2";
    with.version = "7.1";
    EXPECT_EQ(Rows(with, identity()).device({epoch, 11}, {epoch, 20}, 1700000000.5),
              std::string(begin)
                  + R"("kind":"device","model":"speaker 2","version":"7.1","sent":1700000000.5,"first":11,"last":20})"
                    "\n");
}

} // namespace
} // namespace kesto_uplink
