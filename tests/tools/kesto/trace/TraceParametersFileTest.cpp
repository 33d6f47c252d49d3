// SPDX-License-Identifier: Apache-2.0
// The warnings about a parameters file, and the copy for a service.
#include "kesto/trace/TraceParametersFile.h"

#include "support/TemporaryDirectory.h"
#include "support/Victim.h"

#include <filesystem>
#include <gmock/gmock.h>
#include <optional>
#include <sys/stat.h>
#include <unistd.h>

namespace {

namespace fs = std::filesystem;
using testing::ElementsAre;
using testing::IsEmpty;

TraceDataParams interval(std::uint32_t begin, std::uint32_t end)
{
    return {"a", TraceDataParams::interval, begin, end, false};
}

std::vector<std::string> warningsOfPoint(const TraceDataParams& point)
{
    return warningsOf({.name = "T", .traceDataParams = {point}});
}

TEST(TraceParametersWarnings, AreNoneForPointsThatCanBeMeasured)
{
    EXPECT_THAT(warningsOf({.name = "",
                            .traceDataParams = {interval(0x21040000, 0x2104408A),
                                                interval(0x2104408A, 0x21040000),
                                                {"level", TraceDataParams::level, 0x21040008, 0x2104000C, true}}}),
                IsEmpty());
}

TEST(TraceParametersWarnings, AreGivenForCodesThatAreNotCollected)
{
    const std::string outside = "point 1, \"a\": measures nothing, because the code ";
    const std::string range = " is not from 0x21040000 to 0x2104408a";
    EXPECT_THAT(warningsOfPoint(interval(0x2103FFFF, 0x21040000)), ElementsAre(outside + "0x2103ffff" + range));
    EXPECT_THAT(warningsOfPoint(interval(0x21040000, 0x2104408B)), ElementsAre(outside + "0x2104408b" + range));
    EXPECT_THAT(warningsOfPoint(interval(0x21040000, 0)), ElementsAre(outside + "0x00000000" + range));
    EXPECT_THAT(warningsOfPoint(interval(1, 1)), ElementsAre(outside + "0x00000001" + range));
}

TEST(TraceParametersWarnings, AreGivenForWhatBeginsAndNeverEnds)
{
    EXPECT_THAT(warningsOfPoint({"beat\x1B", TraceDataParams::impulse, 0x21040000, 0, false}),
                ElementsAre("point 1, \"beat?\": measures nothing, because it begins and ends with one code"));
}

TEST(TraceParametersWarnings, NameEachPointByItsPlace)
{
    TraceDataParams unknown = interval(0x21040000, 0x21040004);
    unknown.isTypeKnown = false;
    EXPECT_THAT(warningsOf({.name = "", .traceDataParams = {interval(0x21040000, 0x21040004), unknown}}),
                ElementsAre("point 2, \"a\": its type is not Interval, Impulse or Level, so it counts as one like the "
                            "point before it"));
}

TEST(TraceParametersWarnings, AreGivenForTheFileAsAWhole)
{
    EXPECT_THAT(warningsOf({.name = "", .traceDataParams = {}, .problem = "\"Children\" holds nothing", .leftOut = 7}),
                ElementsAre("\"Children\" holds nothing",
                            "7 traces and points of the parameters file will be left out: no more than 1024 are read",
                            "it has no points, so nothing will be measured"));
}

class TraceParametersCopyTest : public testing::Test {
protected:
    TraceParametersCopyTest() { fs::create_directories(folder); }

    const support::TemporaryDirectory root;
    const fs::path folder = root / "Audio/Traces";
};

TEST_F(TraceParametersCopyTest, IsForAllToReadAndGoesWithItsObject)
{
    fs::path path;
    {
        const mode_t before = ::umask(0777);
        const TraceParametersCopy copy(root.path(), folder, "text");
        ::umask(before);
        path = copy.path();
        EXPECT_EQ(path.parent_path(), folder);
        EXPECT_EQ(support::readFile(path), "text");
        EXPECT_EQ(fs::status(path).permissions(), fs::perms(0644));
        const TraceParametersCopy other(root.path(), folder, "other");
        EXPECT_NE(other.path(), path);
    }
    EXPECT_TRUE(fs::is_empty(folder));
}

TEST_F(TraceParametersCopyTest, IsNotMadeBehindALinkThatOthersPutThere)
{
    fs::create_directory(root / "elsewhere");
    fs::remove(folder);
    fs::create_directory_symlink(root / "elsewhere", folder);
    try {
        const TraceParametersCopy copy(root.path(), folder, "text");
        FAIL() << copy.path();
    } catch (const std::runtime_error& error) {
        EXPECT_THAT(error.what(), testing::StartsWith("cannot write " + folder.native() + "/.kesto-"));
        EXPECT_THAT(error.what(), testing::EndsWith(".plist: Not a directory"));
    }
    EXPECT_TRUE(fs::is_empty(root / "elsewhere"));
}

TEST_F(TraceParametersCopyTest, IsRemovedLaterIfItsProcessWasKilled)
{
    const auto makeCopy = [this] {
        static std::optional<TraceParametersCopy> copy; // of the process that runs this function
        copy.emplace(root.path(), folder, "text");
        return true;
    };
    support::Victim killed(makeCopy);
    const auto left = support::namesIn(folder);
    const support::Victim living(makeCopy);
    const TraceParametersCopy own(root.path(), folder, "text");
    auto expected = support::namesIn(folder);
    ASSERT_THAT(expected, testing::SizeIs(3));
    removeLeftTraceParametersCopies(root.path(), folder);
    EXPECT_EQ(support::namesIn(folder), expected);
    killed.kill();
    EXPECT_EQ(support::namesIn(folder), expected) << "until the next recording";
    removeLeftTraceParametersCopies(root.path(), folder);
    std::erase(expected, left.at(0));
    EXPECT_EQ(support::namesIn(folder), expected);
}

TEST_F(TraceParametersCopyTest, NothingElseIsRemoved)
{
    constexpr uid_t nobody = 65534;
    for (const char* name : {".kesto-0.plist", ".kesto-0123456789abcdef.tmp", "0123456789abcdef.plist"})
        support::writeFile(folder / name, "");
    fs::create_directory(folder / ".kesto-1111111111111111.plist");
    fs::create_symlink(".kesto-0.plist", folder / ".kesto-2222222222222222.plist");
    support::writeFile(folder / ".kesto-3333333333333333.plist", "");
    if (::chown((folder / ".kesto-3333333333333333.plist").c_str(), nobody, nobody) != 0)
        fs::remove(folder / ".kesto-3333333333333333.plist"); // only root can give files away
    const auto before = support::namesIn(folder);
    removeLeftTraceParametersCopies(root.path(), folder);
    EXPECT_EQ(support::namesIn(folder), before);
    removeLeftTraceParametersCopies(root.path(), root / "missing");
}

TEST_F(TraceParametersCopyTest, MayLieInTheRootItself)
{
    const TraceParametersCopy copy(folder, folder, "text");
    EXPECT_EQ(support::readFile(copy.path()), "text");
}

} // namespace
