// SPDX-License-Identifier: Apache-2.0
// Correct and wrong trace-parameters files, in both encodings: their content and the log lines.
#include "tracing/TraceParamsParser.h"

#include "foundation/plist/PropertyListWriter.h"
#include "support/TestPlatform.h"

#include <filesystem>
#include <gmock/gmock.h>

namespace {

using enum platform::LogLevel;
using foundation::Array;
using foundation::Dictionary;
using foundation::Value;
using testing::AllOf;
using testing::Contains;
using testing::Each;
using testing::ElementsAre;
using testing::Field;
using testing::IsEmpty;
using testing::Not;
using testing::Property;
using testing::SizeIs;

auto Says(platform::LogLevel level, std::string_view message)
{
    return support::IsLine(level, "kert", std::string(message));
}

const std::string missing = "\"Children\" holds nothing, not an array";

Dictionary point(std::string_view name, std::string_view type, std::string_view begin, std::string_view end = "")
{
    return {{"Name", name}, {"Type", type}, {"KTraceCodeBegin", begin}, {"KTraceCodeEnd", end}};
}

Dictionary trace(const Value& name, const Value& points)
{
    return {{"Name", name}, {"Children", points}};
}

Dictionary file(const Value& traces)
{
    return {{"Children", traces}};
}

TraceDataParams ofUnknownType(TraceDataParams point)
{
    point.isTypeKnown = false;
    return point;
}

class TraceParamsFile : public testing::Test {
protected:
    static constexpr std::string_view path = "/traces.plist";

    std::unique_ptr<TraceParams> load(std::string_view bytes)
    {
        platform.log.clear();
        platform.fileSystem.files.insert_or_assign(path, std::string(bytes));
        return TraceParamsParser(std::string(path)).loadTraceParams();
    }
    // A file with that root, in both encodings, which must have the same content.
    TraceParams read(const Value& root)
    {
        const auto binary = load(support::binaryPropertyList(root));
        const auto saidOfBinary = messages();
        const auto xml = load(support::xmlPropertyList(root));
        EXPECT_EQ(saidOfBinary, messages());
        EXPECT_EQ(binary->name, xml->name);
        EXPECT_EQ(binary->traceType, xml->traceType);
        EXPECT_EQ(binary->traceDataParams, xml->traceDataParams);
        return *xml;
    }
    // A file with one trace with these points.
    std::vector<TraceDataParams> readPoints(Array points)
    {
        return read(file(Array{trace("T", points)})).traceDataParams;
    }

    [[nodiscard]] std::vector<support::LogLine> lines() const { return platform.log.lines(); }
    [[nodiscard]] std::vector<support::LogLine> errors() const
    {
        auto found = lines();
        std::erase_if(found, [](const support::LogLine& line) { return line.level != Error; });
        return found;
    }
    [[nodiscard]] std::vector<std::string> messages() const
    {
        std::vector<std::string> found;
        for (const support::LogLine& line : lines())
            found.push_back(line.message);
        return found;
    }

    support::TestPlatform platform;
};

// --- correct files

TEST_F(TraceParamsFile, HoldsATraceWithItsPointsInOrder)
{
    const TraceParams params = read(file(Array{Dictionary{
        {"Name", "Audio"},
        {"TraceType", "ktrace"},
        {"IsCritical", true},
        {"Children",
         Array{Dictionary{{"Name", "IO"},
                          {"Type", "Interval"},
                          {"KTraceCodeBegin", "21040000"},
                          {"KTraceCodeEnd", "0x21040004"},
                          {"EventsMatchedBy", "Thread"}},
               Dictionary{{"Name", "Start"},
                          {"Type", "Interval"},
                          {"KTraceCodeBegin", "21040008"},
                          {"KTraceCodeEnd", "2104000C"},
                          {"EventsMatchedBy", "Process"}}}},
    }}));
    EXPECT_EQ(params.name, "Audio");
    EXPECT_EQ(params.traceType, TraceParams::kernelTrace);
    EXPECT_THAT(params.traceDataParams,
                ElementsAre(TraceDataParams("IO", 1, 0x21040000, 0x21040004, true),
                            TraceDataParams("Start", 1, 0x21040008, 0x2104000C, false)));
    EXPECT_THAT(lines(),
                ElementsAre(Says(Info, "Loading tracepoint : 553910272 and 553910276 \n finished parsing."),
                            Says(Info, "Loading tracepoint : 553910280 and 553910284 \n finished parsing.")));
    EXPECT_THAT(lines(), Each(Field(&support::LogLine::name, "TraceParamsParser")));
}

TEST_F(TraceParamsFile, WithTwoTracesIsOneRecordUnderTheNameOfTheFirst)
{
    const TraceParams params = read(file(Array{trace("A", Array{point("a", "Interval", "1", "2")}),
                                               trace("B", Array{point("b", "Interval", "3", "4")})}));
    EXPECT_EQ(params.name, "A");
    EXPECT_THAT(params.traceDataParams,
                ElementsAre(TraceDataParams("a", 1, 1, 2, false), TraceDataParams("b", 1, 3, 4, false)));
    EXPECT_THAT(errors(), IsEmpty());
}

TEST_F(TraceParamsFile, WithASignpostTraceIsOneWhereverItStands)
{
    const auto typeOf = [this](std::initializer_list<Value> types) {
        std::vector<Value> traces;
        for (const Value& type : types)
            traces.emplace_back(trace("T", Array()).with("TraceType", type));
        return read(file(Array(traces))).traceType;
    };
    EXPECT_EQ(typeOf({"ktrace"}), TraceParams::kernelTrace);
    EXPECT_EQ(typeOf({"OSSignpost"}), TraceParams::signpostTrace);
    EXPECT_EQ(typeOf({"ktrace", "OSSignpost"}), TraceParams::signpostTrace);
    EXPECT_EQ(typeOf({"OSSignpost", "ktrace"}), TraceParams::signpostTrace);
    EXPECT_EQ(typeOf({"ossignpost", "OSSignpost ", 1, Array{"OSSignpost"}}), TraceParams::kernelTrace);
    EXPECT_EQ(read(file(Array{trace("T", Array())})).traceType, TraceParams::kernelTrace);
}

TEST_F(TraceParamsFile, GivesAnImpulseItsBeginCodeAsItsEndCode)
{
    EXPECT_THAT(readPoints({point("i", "Impulse", "2104000c")}),
                ElementsAre(TraceDataParams("i", 0, 0x2104000C, 0x2104000C, false)));
    const auto points = readPoints({point("a", "Interval", "1", "2"), point("i", "Impulse", "3", "4")});
    EXPECT_EQ(points.back().endCode, 3U);
    EXPECT_THAT(lines(), Contains(Says(Info, "Loading tracepoint : 3 and 2 \n finished parsing.")));
}

TEST_F(TraceParamsFile, EndsALevelWithTheEndOfTheIntervalBefore)
{
    EXPECT_THAT(readPoints({point("first", "Level", "1", "9"), point("a", "Interval", "2", "3"),
                            point("i", "Impulse", "4"), point("then", "Level", "5", "9")}),
                ElementsAre(TraceDataParams("first", 2, 1, 0, false), TraceDataParams("a", 1, 2, 3, false),
                            TraceDataParams("i", 0, 4, 4, false), TraceDataParams("then", 2, 5, 3, false)));
    const TraceParams params = read(
        file(Array{trace("A", Array{point("a", "Interval", "1", "2")}), trace("B", Array{point("l", "Level", "3")})}));
    EXPECT_EQ(params.traceDataParams.back().endCode, 2U) << "also that of an earlier trace";
}

TEST_F(TraceParamsFile, KeepsNothingFromOneReadingToTheNext)
{
    const TraceParamsParser parser((std::string(path)));
    platform.fileSystem.files[path] = support::xmlPropertyList(
        file(Array{trace("A", Array{point("l", "Level", "3"), point("a", "Interval", "1", "2")})}));
    EXPECT_EQ(parser.loadTraceParams()->traceDataParams.front().endCode, 0U);
    EXPECT_EQ(parser.loadTraceParams()->traceDataParams.front().endCode, 0U);
}

TEST_F(TraceParamsFile, MatchesByThreadOnlyWhereItSaysSo)
{
    const auto byThread = [this](const Value& matchedBy) {
        return readPoints({point("a", "Interval", "1", "2").with("EventsMatchedBy", matchedBy)}).front().matchByThread;
    };
    EXPECT_TRUE(byThread("Thread"));
    for (const Value& other : {Value("Process"), Value("thread"), Value(""), Value(1), Value(Array{"Thread"})})
        EXPECT_FALSE(byThread(other)) << other.text();
    EXPECT_FALSE(readPoints({point("a", "Interval", "1", "2")}).front().matchByThread);
}

TEST_F(TraceParamsFile, HasCodesThatAreScannedAsHexadecimal)
{
    const auto code = [this](const Value& text) {
        return readPoints({Dictionary{{"Type", "Impulse"}, {"KTraceCodeBegin", text}}}).front().beginCode;
    };
    EXPECT_EQ(code("2104000c"), 0x2104000CU);
    EXPECT_EQ(code("2104000C"), 0x2104000CU);
    EXPECT_EQ(code("0x2104000c"), 0x2104000CU);
    EXPECT_EQ(code("0X2104000c"), 0x2104000CU);
    EXPECT_EQ(code(" \n\t2104000c"), 0x2104000CU);
    EXPECT_EQ(code("21 04"), 0x21U) << "up to the first character that is not a digit";
    EXPECT_EQ(code("ffffffff"), 0xFFFFFFFFU);
    EXPECT_EQ(code("0000000000001"), 1U);
    EXPECT_EQ(code("100000000"), 0xFFFFFFFFU) << "the greatest number";
    for (const std::string_view none : {"", "x", "0x", "-1", "+1", "g1"})
        EXPECT_EQ(code(none), 0U) << none;
    EXPECT_EQ(code(21), 0x21U) << "a number's text";
}

TEST_F(TraceParamsFile, HasZeroForCodesThatAreMissing)
{
    EXPECT_THAT(readPoints({point("a", "Interval", "1", "2"), Dictionary{{"Name", "b"}, {"Type", "Interval"}}}),
                ElementsAre(TraceDataParams("a", 1, 1, 2, false), TraceDataParams("b", 1, 0, 0, false)));
    EXPECT_THAT(errors(), IsEmpty());
}

TEST_F(TraceParamsFile, SaysCodesAsSignedNumbers)
{
    readPoints({point("a", "Interval", "ffffffff", "80000000")});
    EXPECT_THAT(lines(), ElementsAre(Says(Info, "Loading tracepoint : -1 and -2147483648 \n finished parsing.")));
}

TEST_F(TraceParamsFile, HasNamesOfAnyKindOfValue)
{
    EXPECT_EQ(read(file(Array{trace(7, Array())})).name, "7");
    EXPECT_EQ(read(file(Array{trace(true, Array())})).name, "1");
    EXPECT_EQ(read(file(Array{trace("Größe 😀", Array())})).name, "Größe 😀");
    EXPECT_EQ(readPoints({Dictionary{{"Name", 7}, {"Type", "Level"}}}).front().name, "7");
    EXPECT_EQ(readPoints({Dictionary{{"Type", "Level"}}}).front().name, "");
}

TEST_F(TraceParamsFile, HasNamesThatEndAtTheFirstNul)
{
    const auto params = load(support::binaryPropertyList(
        file(Array{trace(std::string_view("\0A", 2), Array{point(std::string_view("a\0b", 3), "Level", "1")}),
                   trace(std::string_view("B\0C", 3), Array())})));
    EXPECT_EQ(params->name, "B") << "text that ends at its beginning is empty";
    EXPECT_EQ(params->traceDataParams.front().name, "a");
    EXPECT_THAT(errors(), ElementsAre(Says(Error, "Description not found in the plist file")));
}

TEST_F(TraceParamsFile, IsUnderstoodAlsoWithoutAPlatform)
{
    platform::uninstall();
    const auto params =
        TraceParamsParser::paramsOf(file(Array{trace("A", Array{point("a", "Interval", "1", "2")}), 7}));
    EXPECT_THAT(params->traceDataParams, ElementsAre(TraceDataParams("a", 1, 1, 2, false)));
    EXPECT_EQ(params->problem,
              "Failed to load Trace Parameter dictionary with error : it is a number, not a dictionary");
}

// --- wrong files

TEST_F(TraceParamsFile, NamesTheFirstThingThatIsWrongWithIt)
{
    const auto problem = [this](const Value& root) { return read(root).problem; };
    EXPECT_EQ(TraceParamsParser("/missing").loadTraceParams()->problem,
              "Reading from plist file failed with error: No such file or directory");
    EXPECT_EQ(load("<plist>")->problem,
              "Reading from plist file failed with error: line 1: not well-formed XML: Start-end tags mismatch");
    EXPECT_EQ(load(support::binaryPropertyList(Value()))->problem, "No valid input found in plist.");
    EXPECT_EQ(problem(Array()), "Failed to load Trace Parameter Array with error: " + missing);
    EXPECT_EQ(problem(file(Array{trace("A", Array{point("a", "", "")}), "B"})),
              "Failed to load Trace Parameter dictionary with error : it is a string, not a dictionary");
    EXPECT_EQ(problem(file(Array{trace("A", "x"), "B"})),
              "Failed to read the Trace Points from the plist file with error: \"Children\" holds a string, not an "
              "array");
    EXPECT_EQ(problem(file(Array{trace("A", Array{1})})),
              "Failed to read Trace Point from Trace Points dictionary. Failed with error: it is a number, not a "
              "dictionary");
    EXPECT_EQ(problem(file(Array{trace("", Array{point("a", "", "")})})), "") << "the rest is still read";
}

TEST_F(TraceParamsFile, IsTakenFromTheCurrentDirectoryUnlessItsPathIsAbsolute)
{
    const std::string list = support::xmlPropertyList(file(Array{trace("here", Array())}));
    platform.fileSystem.files[std::filesystem::current_path() / "folder/traces.plist"] = list;
    const TraceParamsParser relative("folder/traces.plist");
    EXPECT_EQ(relative.traceParamsFile(), "folder/traces.plist");
    EXPECT_EQ(relative.loadTraceParams()->name, "here");
    EXPECT_EQ(TraceParamsParser("/folder/traces.plist").loadTraceParams()->name, "");
    platform.fileSystem.files["/folder/traces.plist"] = list;
    EXPECT_EQ(TraceParamsParser("/folder/traces.plist").loadTraceParams()->name, "here");
}

void expectEmpty(const TraceParams& params)
{
    EXPECT_EQ(params.name, "");
    EXPECT_EQ(params.traceType, 0);
    EXPECT_THAT(params.traceDataParams, IsEmpty());
}

TEST_F(TraceParamsFile, ThatIsMissingIsSaidAndYieldsAnEmptyRecord)
{
    expectEmpty(*TraceParamsParser("/missing").loadTraceParams());
    EXPECT_THAT(lines(),
                ElementsAre(Says(Error, "Reading from plist file failed with error: No such file or directory"),
                            Says(Error, "Reading from plist file failed with error: the file is empty"),
                            Says(Error, "No valid input found in plist."),
                            Says(Error, "Failed to load Trace Parameter Array with error: " + missing)));
}

TEST_F(TraceParamsFile, ThatIsTooLargeIsNotRead)
{
    expectEmpty(*load(std::string((1 << 20) + 1, ' ')));
    EXPECT_THAT(lines(), Contains(Says(Error, "Reading from plist file failed with error: File too large")));
}

TEST_F(TraceParamsFile, ThatIsNotAPropertyListIsReported)
{
    for (const auto& [bytes, why] :
         {std::pair("<plist>\n<dict><key>Children</key>\n</dict></plist>",
                    "line 2: the last key of the dictionary has no value"),
          std::pair("bplist00", "trailer: the file ends before it"), std::pair("", "the file is empty")}) {
        expectEmpty(*load(bytes));
        EXPECT_THAT(lines(),
                    ElementsAre(Says(Error, std::string("Reading from plist file failed with error: ") + why),
                                Says(Error, "No valid input found in plist."),
                                Says(Error, "Failed to load Trace Parameter Array with error: " + missing)));
    }
}

TEST_F(TraceParamsFile, ThatHoldsNothingIsNotValidInput)
{
    expectEmpty(*load(support::binaryPropertyList(Value())));
    EXPECT_THAT(lines(),
                ElementsAre(Says(Error, "No valid input found in plist."),
                            Says(Error, "Failed to load Trace Parameter Array with error: " + missing)));
}

TEST_F(TraceParamsFile, ThatIsNotADictionaryHasNoTraces)
{
    for (const Value& root : {Value(Array{trace("A", Array())}), Value("text"), Value(7), Value(Dictionary())}) {
        expectEmpty(read(root));
        EXPECT_THAT(lines(), ElementsAre(Says(Error, "Failed to load Trace Parameter Array with error: " + missing)));
    }
}

TEST_F(TraceParamsFile, WhoseTracesAreNotAnArrayHasNone)
{
    const auto said = [this](const Value& traces) {
        expectEmpty(read(file(traces)));
        return messages();
    };
    const std::string text = "Failed to load Trace Parameter Array with error: \"Children\" holds ";
    EXPECT_THAT(said("A"), ElementsAre(text + "a string, not an array"));
    EXPECT_THAT(said(7), ElementsAre(text + "a number, not an array"));
    EXPECT_THAT(said(Dictionary()), ElementsAre(text + "a dictionary, not an array"));
    EXPECT_THAT(said(foundation::Data()), ElementsAre(text + "data, not an array"));
    EXPECT_THAT(said(foundation::Date()), ElementsAre(text + "a date, not an array"));
    EXPECT_THAT(said(Array()), IsEmpty());
    EXPECT_THAT(errors(), IsEmpty());
}

TEST_F(TraceParamsFile, WithATraceThatIsNotADictionaryGoesOnBehindIt)
{
    const TraceParams params = read(file(Array{"A", trace("B", Array{point("b", "Interval", "1", "2")}), Array{}}));
    EXPECT_EQ(params.name, "B");
    EXPECT_THAT(params.traceDataParams, SizeIs(1));
    EXPECT_THAT(
        lines(),
        ElementsAre(
            Says(Error, "Failed to load Trace Parameter dictionary with error : it is a string, not a dictionary"),
            Says(Error, "Description not found in the plist file"),
            Says(Error, "Failed to read the Trace Points from the plist file with error: " + missing),
            Says(Info, "Loading tracepoint : 1 and 2 \n finished parsing."),
            Says(Error, "Failed to load Trace Parameter dictionary with error : it is an array, not a dictionary"),
            Says(Error, "Failed to read the Trace Points from the plist file with error: " + missing)));
}

TEST_F(TraceParamsFile, WithoutANameTakesThatOfTheNextTraceThatHasOne)
{
    const TraceParams params = read(file(Array{Dictionary{{"Children", Array()}}, trace("", Array()),
                                               trace("C", Array()), trace("", Array()), trace("D", Array())}));
    EXPECT_EQ(params.name, "C");
    EXPECT_THAT(lines(),
                ElementsAre(Says(Error, "Description not found in the plist file"),
                            Says(Error, "Description not found in the plist file")));
}

TEST_F(TraceParamsFile, WhosePointsAreNotAnArrayGoesOnWithTheNextTrace)
{
    const TraceParams params = read(file(Array{trace("A", "none"), trace("B", Array{point("b", "Level", "1")})}));
    EXPECT_THAT(params.traceDataParams, SizeIs(1));
    EXPECT_THAT(errors(),
                ElementsAre(Says(Error,
                                 "Failed to read the Trace Points from the plist file with error: \"Children\" "
                                 "holds a string, not an array")));
}

TEST_F(TraceParamsFile, WithAPointOfUnknownTypeHoldsItWithWhatThePointBeforeHad)
{
    EXPECT_THAT(
        readPoints({point("first", "interval", "8", "9"), point("a", "Interval", "1", "2"),
                    point("b", "Signpost", "3", "4").with("EventsMatchedBy", "Thread"), Dictionary{{"Name", "c"}}}),
        ElementsAre(ofUnknownType({"first", 0, 0, 0, false}), TraceDataParams("a", 1, 1, 2, false),
                    ofUnknownType({"b", 1, 1, 2, true}), ofUnknownType({"c", 1, 1, 2, false})));
    EXPECT_THAT(lines(),
                ElementsAre(Says(Error, "TracePointType field not recognized or is empty."),
                            Says(Info, "Loading tracepoint : 0 and 0 \n finished parsing."),
                            Says(Info, "Loading tracepoint : 1 and 2 \n finished parsing."),
                            Says(Error, "TracePointType field not recognized or is empty."),
                            Says(Info, "Loading tracepoint : 1 and 2 \n finished parsing."),
                            Says(Error, "TracePointType field not recognized or is empty."),
                            Says(Info, "Loading tracepoint : 1 and 2 \n finished parsing.")));
}

TEST_F(TraceParamsFile, WithAPointThatIsNotADictionaryHoldsOneWithoutAName)
{
    EXPECT_THAT(readPoints({point("a", "Interval", "1", "2"), "b"}),
                ElementsAre(TraceDataParams("a", 1, 1, 2, false), ofUnknownType({"", 1, 1, 2, false})));
    EXPECT_THAT(lines(),
                ElementsAre(Says(Info, "Loading tracepoint : 1 and 2 \n finished parsing."),
                            Says(Error,
                                 "Failed to read Trace Point from Trace Points dictionary. Failed with error: "
                                 "it is a string, not a dictionary"),
                            Says(Error, "TracePointType field not recognized or is empty."),
                            Says(Info, "Loading tracepoint : 1 and 2 \n finished parsing.")));
}

TEST_F(TraceParamsFile, LeavesOutTracesAndPointsBeyondTheMost)
{
    constexpr std::size_t most = TraceParamsParser::mostTracesAndPoints;
    const auto pointsRead = [this](std::size_t points, std::size_t furtherTraces) {
        std::vector<Value> traces(furtherTraces, trace("further", Array()));
        traces.insert(traces.begin(), trace("T", Array(std::vector<Value>(points, point("p", "Level", "1")))));
        const TraceParams params = read(file(Array(traces)));
        return std::pair(params.traceDataParams.size(), params.leftOut);
    };
    EXPECT_EQ(pointsRead(most - 1, 0), std::pair(most - 1, 0UZ));
    EXPECT_THAT(errors(), IsEmpty());
    EXPECT_EQ(pointsRead(most + 1, 5), std::pair(most - 1, 7UZ));
    EXPECT_THAT(errors(), ElementsAre(Says(Error, "Left out 7 traces and trace points: no more than 1024 are read")));
}

TEST_F(TraceParamsFile, WithASignpostTraceBeyondTheMostIsOneAllTheSame)
{
    constexpr std::size_t most = TraceParamsParser::mostTracesAndPoints;
    std::vector<Value> traces(most, trace("T", Array()));
    EXPECT_EQ(read(file(Array(traces))).traceType, TraceParams::kernelTrace);
    traces.emplace_back(trace("further", Array()).with("TraceType", "OSSignpost"));
    traces.emplace_back("no trace");
    const TraceParams params = read(file(Array(traces)));
    EXPECT_EQ(params.traceType, TraceParams::signpostTrace);
    EXPECT_EQ(params.leftOut, 2U);
}

// --- the record

TEST(TraceDataParamsRecord, TakesTheEndCodeUnlessItIsAnImpulse)
{
    EXPECT_EQ(TraceDataParams("a", TraceDataParams::impulse, 1, 2, true).endCode, 1U);
    EXPECT_EQ(TraceDataParams("a", TraceDataParams::interval, 1, 2, true).endCode, 2U);
    EXPECT_EQ(TraceDataParams("a", TraceDataParams::level, 1, 2, true).endCode, 2U);
    EXPECT_EQ(TraceDataParams("a", 77, 1, 2, true).endCode, 2U);
}

TEST(TraceParamsWords, AreThoseOfTheFiles)
{
    EXPECT_EQ(TraceParamChildrenNodes, "Children");
    EXPECT_EQ(TraceDataDescription, "Name");
    EXPECT_EQ(TraceDataType, "TraceType");
    EXPECT_EQ(TraceDataTypekTrace, "ktrace");
    EXPECT_EQ(TraceDataTypeOSSignpost, "OSSignpost");
    EXPECT_EQ(TraceDataIsCritical, "IsCritical");
    EXPECT_EQ(TraceDataChildrenNodes, "Children");
    EXPECT_EQ(TracePointDescription, "Name");
    EXPECT_EQ(TracePointType, "Type");
    EXPECT_EQ(TracePointTypeInterval, "Interval");
    EXPECT_EQ(TracePointTypeImpulse, "Impulse");
    EXPECT_EQ(TracePointTypeLevel, "Level");
    EXPECT_EQ(TracePointBeginCode, "KTraceCodeBegin");
    EXPECT_EQ(TracePointEndCode, "KTraceCodeEnd");
    EXPECT_EQ(TracePointEventsMatchedBy, "EventsMatchedBy");
    EXPECT_EQ(TracePointEventsMatchedByThread, "Thread");
    EXPECT_EQ(TracePointEventsMatchedByProcess, "Process");
}

} // namespace
