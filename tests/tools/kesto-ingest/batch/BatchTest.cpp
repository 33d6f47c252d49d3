// SPDX-License-Identifier: Apache-2.0
// What a batch may hold, and what becomes of a row.
#include "kesto-ingest/batch/Batch.h"

#include "kesto-ingest/batch/Compression.h"
#include "tools/kesto-ingest/Batches.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <rapidjson/document.h>

namespace kesto_ingest {
namespace {

using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using testing::SizeIs;

Batch batchOf(const std::string& lines)
{
    auto batch = readLines(lines);
    EXPECT_TRUE(batch) << batch.error();
    return batch.value_or(Batch());
}

// The row at this place, as it is written for the database.
std::string jsonOf(const Batch& batch, std::size_t place)
{
    return std::string(batch.jsonOf(batch.rows.at(place)));
}

// Why this row is refused behind a good first one; empty if it is not.
std::string reasonOf(const std::string& line)
{
    const Batch batch = batchOf(deviceLine(1, 9) + line + "\n");
    if (batch.badRows.empty())
        return "";
    EXPECT_EQ(batch.badRows[0].line, line);
    return batch.badRows[0].reason;
}

// An event with this in the place of a key and its value.
std::string eventWith(std::string_view instead, std::string_view of)
{
    std::string line = eventLine(5);
    line.pop_back();
    const std::size_t place = line.find(of);
    EXPECT_NE(place, std::string::npos) << of;
    return line.replace(place, of.size(), instead);
}

TEST(Batch, TellsWhoseItIs)
{
    const Batch batch = batchOf(deviceLine(3, 9));
    EXPECT_EQ(batch.device, "0123456789abcdef0123456789abcdef");
    EXPECT_EQ(batch.epoch, "00000000000000000000000000000001");
    EXPECT_EQ(batch.last, 9U);
    EXPECT_THAT(batch.badRows, IsEmpty());
}

// As the report of the device itself finds them.
TEST(Batch, TellsDevicesAndCyclesOfAPayloadItself)
{
    const auto factsOf = [](std::string_view payload) {
        const std::string json = jsonOf(batchOf(deviceLine(3, 9) + eventLine(3, deviceA, payload)), 1);
        const std::size_t begins = json.find("\",\"", json.find("\"payload\":")) + 2;
        return json.substr(begins, json.find("\"session\"") - begins);
    };
    EXPECT_EQ(factsOf(R"({"active_devices":"café","late_cycles":3})"), R"("audio_device":"café","late_cycles":3,)");
    EXPECT_EQ(factsOf(R"({"more":{"active_devices":"inner","late_cycles":9},"list":[{"late_cycles":9}]})"), "");
    EXPECT_EQ(factsOf(R"({"more":{"late_cycles":9},"late_cycles":2.5})"), R"("late_cycles":2.5,)");
    EXPECT_EQ(factsOf(R"({"active_devices":5,"late_cycles":true})"), R"("audio_device":"5","late_cycles":1,)");
    EXPECT_EQ(factsOf(R"({"active_devices":null,"late_cycles":"10-100"})"), "");
    EXPECT_EQ(factsOf(R"({"active_devices":{},"late_cycles":[9]})"), "");
    EXPECT_EQ(factsOf(R"({"active_devices":"a","active_devices":"b"})"), R"("audio_device":"a",)");
    EXPECT_EQ(factsOf(fmt::format(R"({{"active_devices":"{}é"}})", std::string(255, 'x'))),
              fmt::format(R"("audio_device":"{}",)", std::string(255, 'x')));
}

TEST(Batch, BecomesRowsWithTheColumnsOfTheirTables)
{
    const Batch batch = batchOf(deviceLine(3, 9) + eventLine(3) + stretchLine(4) + sessionLine(7, "1795264600.125"));
    ASSERT_THAT(batch.rows, SizeIs(4));
    EXPECT_EQ(batch.rows[0].table, Table::Batches);
    EXPECT_EQ(
        jsonOf(batch, 0),
        R"({"device":"0123456789abcdef0123456789abcdef","epoch":"00000000000000000000000000000001","model":"lamp",)"
        R"("version":"1.2","sent":1795264600.5,"first_id":3,"last_id":9})"
        "\n");
    EXPECT_EQ(batch.rows[1].table, Table::Events);
    EXPECT_EQ(
        jsonOf(batch, 1),
        R"({"device":"0123456789abcdef0123456789abcdef","epoch":"00000000000000000000000000000001","id":3,)"
        R"("time":1795264505.66,"name":"com.quarn.kesto.Error.IssueDetector","payload":"{\"late_cycles\":3}",)"
        R"("late_cycles":3,"session":7,"application":"player","happened_us":1795264505660000,"model":"lamp","version":"1.2"})"
        "\n");
    EXPECT_EQ(batch.rows[2].table, Table::Stretches);
    EXPECT_EQ(jsonOf(batch, 2),
              R"({"device":"0123456789abcdef0123456789abcdef","epoch":"00000000000000000000000000000001","id":4,)"
              R"("recording":0,"microseconds":12500000,"session":7,"audio_device":"headset","channels":2,)"
              R"("volume_millionths":500000,"application":"player","ending":"stopped","began_us":1795264500250000,)"
              R"("model":"lamp","version":"1.2"})"
              "\n");
    EXPECT_EQ(batch.rows[3].table, Table::Sessions);
    EXPECT_EQ(jsonOf(batch, 3),
              R"({"device":"0123456789abcdef0123456789abcdef","epoch":"00000000000000000000000000000001","id":7,)"
              R"("reporter":-5,"application":"player","began":1795264400,"ended":1795264600.125,"model":"lamp",)"
              R"("version":"1.2"})"
              "\n");
    EXPECT_EQ(batch.rows[1].week, 2968U); // 1795264505 s and three days are 2968.8 weeks
}

TEST(Batch, PutsTextsInTheColumnsOfTheirKeys)
{
    std::string stretch = stretchLine(4);
    stretch.replace(stretch.find(R"("application")"), 0, R"("format":"S16LE",)");
    std::string session = sessionLine(7, "");
    session.replace(session.find(R"("application")"), 0, R"("service":"media","process":"mpv",)");
    const Batch batch = batchOf(deviceLine(1, 9) + stretch + session);
    EXPECT_THAT(jsonOf(batch, 1), HasSubstr(R"("audio_device":"headset","format":"S16LE","channels":2,)"));
    EXPECT_THAT(jsonOf(batch, 2), HasSubstr(R"("service":"media","application":"player","process":"mpv","began":)"));
}

TEST(Batch, RoundsMomentsToMicrosecondsAndVolumesToMillionths)
{
    const auto stretchWith = [](std::string_view now) {
        std::string line = stretchLine(4);
        const std::string_view before = R"("began":1795264500.25,"seconds":12.5)";
        line.replace(line.find(before), before.size(), now);
        return line;
    };
    const Batch batch = batchOf(deviceLine(1, 9) + stretchWith(R"("began":1795264505.6600001,"seconds":0.0000015)")
                                + stretchWith(R"("began":0,"seconds":4294967295)")
                                + eventWith(R"("happened":1795264500.1234567,"id":5,)", R"("id":5,)") + "\n"
                                + eventWith(R"("happened":-1,"id":6,)", R"("id":5,)") + "\n"
                                + eventWith(R"("happened":604800,"id":7,)", R"("id":5,)"));
    EXPECT_THAT(batch.badRows, IsEmpty());
    ASSERT_THAT(batch.rows, SizeIs(6));
    EXPECT_THAT(jsonOf(batch, 1), HasSubstr(R"("microseconds":2,)")); // of two that are as near, the even one
    EXPECT_THAT(jsonOf(batch, 1), HasSubstr(R"("began_us":1795264505660000,)"));
    EXPECT_THAT(jsonOf(batch, 2), HasSubstr(R"("microseconds":4294967295000000,)"));
    EXPECT_THAT(jsonOf(batch, 3), HasSubstr(R"("happened_us":1795264500123457,)"));
    EXPECT_THAT(jsonOf(batch, 4), HasSubstr(R"("happened_us":1795264505660000,)")); // no date expresses what it told
    EXPECT_THAT(jsonOf(batch, 5), HasSubstr(R"("happened_us":604800000000,)"));
    EXPECT_EQ(batch.rows[5].week, 1U);
    EXPECT_EQ(batch.rows[1].week, 2968U);
    EXPECT_EQ(batch.rows[2].week, 1'000'000U); // longer than a day

    const auto volume = [](std::string_view text) {
        std::string line = stretchLine(4);
        line.replace(line.find(R"("volume":0.5)"), 12, fmt::format(R"("volume":{})", text));
        const std::string json = jsonOf(batchOf(deviceLine(1, 9) + line), 1);
        const std::size_t place = json.find("volume_millionths") + 19;
        return json.substr(place, json.find(',', place) - place);
    };
    EXPECT_EQ(volume("0.12345649"), "123456");
    EXPECT_EQ(volume("0.9999999"), "1000000");
    EXPECT_EQ(volume("-1"), "0");
    EXPECT_EQ(volume("1e300"), "1000000");
}

TEST(Batch, KeepsPayloadsAsTheyAre)
{
    const std::string payload = R"({ "a": [1.10, 1e2, -0, 0.30000000000000004, true, null, {"b": "\u00e9\n\""}] })";
    const Batch batch = batchOf(deviceLine(1, 9) + eventLine(5, deviceA, payload));
    ASSERT_THAT(batch.rows, SizeIs(2));
    EXPECT_THAT(jsonOf(batch, 1),
                HasSubstr(R"("payload":"{\"a\":[1.10,1e2,-0,0.30000000000000004,true,null,{\"b\":\"é\\n\\\"\"}]}")"));
}

// RapidJSON's own reader finds in the column what it finds in the payload as it came.
TEST(Batch, WritesPayloadsThatAreReadAsTheyCame)
{
    std::string characters;
    for (int code = 0; code < 0x20; ++code)
        characters += fmt::format("\\u{:04x}", code);
    for (const std::string& payload : {
             fmt::format(R"({{"{0}":"{0}","plain":"12345678{0}12345678"}})", characters),
             std::string(R"({"\"":"\\\/","":"","é":"\ud83d\ude00 日本","{[:":["{",":",",","[","\\"]})"),
             std::string(
                 " { \"a\" : [ ] , \t\"b\" : { } , \"c\" : [ [ ] , { } , 1 , -2.5E-7 , true , false , null ] } "),
             std::string(R"({"a":{"payload":{"b":[{},{"c":[[1,2],[3]]}]}},"d":"x"})"),
         }) {
        const std::string json = jsonOf(batchOf(deviceLine(1, 9) + eventLine(5, deviceA, payload)), 1);
        rapidjson::Document row;
        row.Parse(json.data(), json.size());
        ASSERT_FALSE(row.HasParseError()) << json;
        rapidjson::Document came;
        rapidjson::Document written;
        came.Parse(payload.data(), payload.size());
        written.Parse(row["payload"].GetString(), row["payload"].GetStringLength());
        ASSERT_FALSE(came.HasParseError()) << payload;
        EXPECT_TRUE(written == came) << payload << " became " << row["payload"].GetString();
    }
}

// Also where eight bytes are looked at together.
TEST(Batch, EscapesTextsWhereverTheyNeedIt)
{
    for (std::size_t before = 0; before < 18; ++before) {
        const std::string plain(before, 'x');
        const auto applicationOf = [&plain](std::string_view escape) {
            const Batch batch = batchOf(deviceLine(1, 9) + eventWith(fmt::format("{}{}y", plain, escape), "player"));
            const std::string json = jsonOf(batch, 1);
            const std::size_t begin = json.find("\"application\":") + 14;
            return json.substr(begin, json.find(",\"happened_us\"") - begin);
        };
        EXPECT_EQ(applicationOf(R"(\")"), "\"" + plain + R"(\"y")");
        EXPECT_EQ(applicationOf(R"(\\)"), "\"" + plain + R"(\\y")");
        EXPECT_EQ(applicationOf(R"(\n)"), "\"" + plain + R"(\u000ay")");
        EXPECT_EQ(applicationOf(R"(\u001f)"), "\"" + plain + R"(\u001fy")");
        EXPECT_EQ(applicationOf(" !#[]\x7fé"), "\"" + plain + " !#[]\x7féy\"");
    }
    EXPECT_EQ(reasonOf(eventWith("\x1f", "player")).substr(0, 24), "it is no JSON from byte ");
}

TEST(Batch, PutsAsideWrongRowsOnly)
{
    const Batch batch = batchOf(deviceLine(1, 9) + "nonsense\n" + eventLine(5) + "\n" + eventLine(6, deviceB));
    EXPECT_THAT(batch.rows, SizeIs(2));
    ASSERT_THAT(batch.badRows, SizeIs(2));
    EXPECT_EQ(batch.badRows[0].reason, "it is no JSON from byte 1 on: Invalid value.");
    EXPECT_EQ(batch.badRows[1].reason, "the first row is of another device or epoch");
}

TEST(Batch, NamesWhatIsWrongWithARow)
{
    EXPECT_EQ(reasonOf("[]"), "it is no JSON object");
    EXPECT_EQ(reasonOf("7"), "it is no JSON object");
    EXPECT_EQ(reasonOf("{}"), "it has no kind");
    EXPECT_EQ(reasonOf(R"({"kind":"noise"})"), "there are no rows of kind noise");
    EXPECT_EQ(reasonOf(R"({"kind":"event","kind":"event"})"), "the key kind is there twice");
    EXPECT_EQ(reasonOf(eventWith(R"("session":7,)", R"("id":5,)")), "the key session is there twice");
    EXPECT_EQ(reasonOf(eventWith("", R"("id":5,)")), "the key id is missing");
    EXPECT_EQ(reasonOf(eventWith(R"("id":5.5,)", R"("id":5,)")), "id is not an integer from 0 to 2^63 - 1");
    EXPECT_EQ(reasonOf(eventWith(R"("id":-5,)", R"("id":5,)")), "id is not an integer from 0 to 2^63 - 1");
    EXPECT_EQ(reasonOf(eventWith(R"("id":9223372036854775808,)", R"("id":5,)")),
              "id is not an integer from 0 to 2^63 - 1");
    EXPECT_EQ(reasonOf(eventWith(R"("time":-1)", R"("time":1795264505.66)")),
              "time is not a number of seconds from 0 to 2^32 - 1");
    EXPECT_EQ(reasonOf(eventWith(R"("time":"1")", R"("time":1795264505.66)")),
              "time is not a number of seconds from 0 to 2^32 - 1");
    EXPECT_EQ(reasonOf(eventWith(R"("payload":[])", R"("payload":{"late_cycles":3})")), "payload is not an object");
    EXPECT_THAT(reasonOf(eventWith(R"("happened":1e400,"id":5,)", R"("id":5,)")), HasSubstr("Number too big"));
    EXPECT_EQ(reasonOf(eventWith("0123456789ABCDEF", "0123456789abcdef")),
              "device is not 32 hexadecimal digits, in lower case");
    EXPECT_EQ(reasonOf(eventWith(std::string(16 * 1024 + 1, 'x'), "com.quarn.kesto.Error.IssueDetector")),
              "name is not a text of at most 16384 bytes");
    EXPECT_EQ(reasonOf(std::string(deviceLine(1, 9), 0, deviceLine(1, 9).size() - 1)),
              "only the first row is of kind device");
    EXPECT_EQ(reasonOf(std::string("{\"kind\":\"event\"}\0x", 18)), "it is no JSON: it has a NUL");
    EXPECT_EQ(reasonOf(eventWith("\xff", "player")), "it is no UTF-8");
    EXPECT_THAT(reasonOf(eventWith(R"(\ud800)", "player")), HasSubstr("surrogate"));
    EXPECT_EQ(reasonOf(R"({"kind":"event","payload":)" + std::string(48, '[')),
              "its objects and lists are nested deeper than 48");
}

TEST(Batch, TakesWhatIsAllowed)
{
    EXPECT_EQ(reasonOf(eventWith(R"("happened":-1e300,"id":9223372036854775807,)", R"("id":5,)")), "");
    EXPECT_EQ(reasonOf(eventWith(R"("session":null)", R"("session":7)")), "");
    EXPECT_EQ(reasonOf(eventWith(R"("time":4294967295)", R"("time":1795264505.66)")), "");
    EXPECT_EQ(reasonOf(eventWith(std::string(16 * 1024, 'x'), "player")), "");
}

TEST(Batch, IgnoresKeysThatItDoesNotKnow)
{
    std::string more;
    for (int key = 0; key < 100; ++key)
        more += fmt::format(R"("new {}":{{"a":[1,{{"id":9}}]}},)", key);
    const Batch batch = batchOf(deviceLine(1, 9) + eventWith(more + R"("colour":7,"colour":7,"id":5,)", R"("id":5,)"));
    ASSERT_THAT(batch.rows, SizeIs(2));
    EXPECT_EQ(jsonOf(batch, 1), jsonOf(batchOf(deviceLine(1, 9) + eventLine(5)), 1));
}

// As a device sends them whose rules turn a number into a range, and a text into a hash.
TEST(Batch, LeavesOutOptionalValuesThatDoNotFit)
{
    std::string stretch = stretchLine(4);
    stretch.replace(stretch.find(R"("channels":2,"volume":0.5)"), 25, R"("channels":"2..4","volume":"0..1")");
    std::string session = sessionLine(7, "1795264600.125");
    session.replace(session.find("-5"), 2, R"("9f86d081884c7d65")");
    const Batch batch =
        batchOf(deviceLine(3, 9) + stretch + session + eventWith(R"("happened":"1","id":5,)", R"("id":5,)") + "\n"
                + eventWith(std::string(16 * 1024 + 1, 'x'), "player"));
    EXPECT_THAT(batch.badRows, IsEmpty());
    ASSERT_THAT(batch.rows, SizeIs(5));
    EXPECT_THAT(jsonOf(batch, 1), HasSubstr(R"("audio_device":"headset","application":"player","ending":"stopped")"));
    EXPECT_THAT(jsonOf(batch, 2), HasSubstr(R"("id":7,"application":"player","began":1795264400,)"));
    EXPECT_THAT(jsonOf(batch, 3), Not(HasSubstr(R"("happened":)")));
    EXPECT_THAT(jsonOf(batch, 4), Not(HasSubstr("application")));
}

TEST(Batch, TakesPayloadsThatAreAsDeepAsDevicesSendThem)
{
    std::string payload = R"({"deep":)" + std::string(39, '[') + std::string(39, ']') + "}";
    EXPECT_EQ(reasonOf(eventWith("\"payload\":" + payload, R"("payload":{"late_cycles":3})")), "");
}

TEST(Batch, HasShortLabels)
{
    std::string first = deviceLine(1, 9);
    first.replace(first.find("lamp"), 4, std::string(128, 'x'));
    EXPECT_THAT(jsonOf(batchOf(first), 0), HasSubstr("\"model\":\"" + std::string(128, 'x') + "\""));
    first.insert(first.find("xxx"), "x");
    EXPECT_THAT(jsonOf(batchOf(first), 0), Not(HasSubstr("model")));
}

TEST(Batch, IsRefusedIfItsRowsBecomeTooLarge)
{
    std::string lines = deviceLine(1, 9);
    lines.replace(lines.find("lamp"), 4, std::string(128, 'x'));
    const std::string large =
        eventWith(R"("application":")" + std::string(16 * 1024, 'x') + '"', R"("application":"player")") + "\n";
    for (int row = 0; row < 2100; ++row)
        lines += large;
    EXPECT_EQ(readLines(lines).error(), "its rows become more than 33554432 bytes");
}

TEST(Batch, IsRefusedIfTooManyRowsAreWrong)
{
    std::string lines = deviceLine(1, 9);
    for (int row = 0; row < 1000; ++row)
        lines += "x\n";
    EXPECT_THAT(readLines(lines).value().badRows, SizeIs(1000));
    EXPECT_EQ(readLines(lines + "{}\n").error(),
              "more than 1000 of its rows are wrong; of the first, it is no JSON from byte 0 on: Invalid value.");
}

TEST(Batch, CountsWeeksFromMonday)
{
    for (const auto& [time, week] : {std::pair("345599", 0U), std::pair("345600", 1U), std::pair("950399", 1U)}) {
        const Batch batch = batchOf(deviceLine(1, 9) + eventWith(time, "1795264505.66"));
        ASSERT_THAT(batch.rows, SizeIs(2));
        EXPECT_EQ(batch.rows[1].week, week) << time;
    }
}

TEST(Batch, IsRefusedWithoutAGoodFirstRow)
{
    EXPECT_EQ(readLines("").error(), "it is empty");
    EXPECT_EQ(readLines("\n\n").error(), "it is empty");
    EXPECT_EQ(readLines(eventLine(1)).error(), "its first row is not of kind device");
    EXPECT_EQ(readLines("{}\n").error(), "its first row is wrong: it has no kind");
    EXPECT_EQ(readLines(deviceLine(5, 4)).error(), "its first row names a range that ends before it begins");
}

TEST(Compression, GivesBackTheContent)
{
    EXPECT_EQ(decompress(compressed("content"), 7), "content");
    EXPECT_EQ(decompress(compressed(""), 7), "");
}

TEST(Compression, RefusesWhatIsNotOneWholeFrameWithinTheBound)
{
    const std::string frame = compressed(std::string(1000, 'x'));
    EXPECT_EQ(decompress(frame, 999).error(), "it has 1000 bytes; 999 are the most");
    EXPECT_EQ(decompress("nonsense", 999).error(), "it is not compressed with zstd");
    EXPECT_EQ(decompress("", 999).error(), "it is not compressed with zstd");
    EXPECT_EQ(decompress(frame + frame, 1000).error(), "it is not one whole frame of zstd");
    EXPECT_EQ(decompress(frame.substr(0, frame.size() - 1), 1000).error(), "it is not one whole frame of zstd");
    std::string damaged = frame;
    damaged.back() = static_cast<char>(damaged.back() ^ 0x7f);
    EXPECT_FALSE(decompress(damaged, 1000));
}

TEST(Compression, RefusesFramesThatDoNotTellTheirSize)
{
    const std::unique_ptr<ZSTD_CCtx, decltype(&ZSTD_freeCCtx)> context(ZSTD_createCCtx(), ZSTD_freeCCtx);
    ZSTD_CCtx_setParameter(context.get(), ZSTD_c_contentSizeFlag, 0);
    std::string bytes(100, '\0');
    bytes.resize(ZSTD_compress2(context.get(), bytes.data(), bytes.size(), "content", 7));
    EXPECT_EQ(decompress(bytes, 999).error(), "its frame does not tell the size of the content");
}

TEST(Batch, IsRefusedIfItIsTooLarge)
{
    EXPECT_EQ(readBatch(std::string(512 * 1024 + 1, 'x')).error(),
              "it has 524289 compressed bytes; 524288 are the most");
    EXPECT_EQ(readBatch(compressed(std::string(8 * 1024 * 1024 + 1, '\n'))).error(),
              "it has 8388609 bytes; 8388608 are the most");
    EXPECT_EQ(readBatch(compressed(deviceLine(1, 9)))->last, 9U);
}

} // namespace
} // namespace kesto_ingest
