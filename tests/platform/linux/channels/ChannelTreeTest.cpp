// SPDX-License-Identifier: Apache-2.0
// A correct channel tree, and hostile ones.
#include "platform/linux/channels/ChannelTree.h"
#include "platform/linux/channels/ChannelFile.h"
#include "platform/linux/channels/Unhurried.h"
#include "support/TemporaryDirectory.h"

#include <algorithm>
#include <chrono>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

namespace platform {
namespace {

namespace fs = std::filesystem;
using testing::ElementsAre;
using testing::Eq;
using testing::Field;
using testing::IsEmpty;
using testing::Optional;
using testing::SizeIs;

auto isChannel(std::string_view name, std::int64_t value)
{
    return testing::AllOf(Field(&ReportingChannel::name, Optional(std::string(name))),
                          Field(&ReportingChannel::value, Eq(value)));
}

class ChannelTreeTest : public testing::Test {
protected:
    // "driver/group/subgroup/channel".
    void publish(const fs::path& place, std::string_view text)
    {
        fs::create_directories((root / place).parent_path());
        support::writeFile(root / place, text);
    }
    [[nodiscard]] ChannelReading read(const ChannelSelection& selection = {}) const
    {
        return ChannelTree(root, {.time = unhurried}).read({selection}).value();
    }
    // The problem of a wrong file beside a correct one.
    std::string_view onlyProblem()
    {
        publish("amp/Tx/-/right", "simple\n1\n");
        const ChannelReading reading = read();
        EXPECT_THAT(reading.channels, ElementsAre(isChannel("right", 1)));
        EXPECT_THAT(reading.problems, SizeIs(1));
        return reading.problems.empty() ? "" : reading.problems[0].reason;
    }

    const support::TemporaryDirectory directory;
    const fs::path root = directory.path() / "channels";
};

// --- existing channels

TEST_F(ChannelTreeTest, TellsWhereAChannelStandsAndWhatItHolds)
{
    publish("SpeakerAmp<0x1a>/Haptics/Stats/Over Temp_Count", "simple\n7\n");
    const auto channels = read().channels;
    ASSERT_THAT(channels, SizeIs(1));
    EXPECT_EQ(channels[0].driver, "SpeakerAmp<0x1a>");
    EXPECT_EQ(channels[0].group, "Haptics");
    EXPECT_EQ(channels[0].subgroup, "Stats");
    EXPECT_EQ(channels[0].name, "Over Temp_Count");
    EXPECT_EQ(channels[0].unit, std::nullopt);
    EXPECT_EQ(channels[0].value, 7);
}

TEST_F(ChannelTreeTest, ReadsADashAsAMissingGroupOrSubgroup)
{
    publish("amp/-/MCA/a", "simple\n1\n");
    publish("amp/Tx/-/b", "simple\n2\n");
    publish("amp/-/-/c", "simple\n3\n");
    const auto channels = read().channels;
    ASSERT_THAT(channels, SizeIs(3));
    EXPECT_EQ(channels[0].group, std::nullopt);
    EXPECT_EQ(channels[0].subgroup, std::nullopt);
    EXPECT_EQ(channels[1].subgroup, "MCA");
    EXPECT_EQ(channels[2].group, "Tx");
    EXPECT_EQ(channels[2].subgroup, std::nullopt);
}

TEST_F(ChannelTreeTest, TakesAnAbsentNameForAny)
{
    publish("amp/Speaker/MCA/a", "simple\n1\n");
    publish("amp/Speaker/-/b", "simple\n2\n");
    publish("codec/Speaker/-/c", "simple\n3\n");
    publish("codec/-/MCA/d", "simple\n4\n");
    publish("codec/Rx/-/e", "simple\n5\n");
    EXPECT_THAT(read({"Speaker", {}}).channels, ElementsAre(isChannel("b", 2), isChannel("a", 1), isChannel("c", 3)));
    EXPECT_THAT(read({{}, "MCA"}).channels, ElementsAre(isChannel("a", 1), isChannel("d", 4)));
    EXPECT_THAT(read({"Speaker", "MCA"}).channels, ElementsAre(isChannel("a", 1)));
    EXPECT_THAT(read({"Tx", {}}).channels, IsEmpty());
    EXPECT_THAT(read().channels, SizeIs(5));
}

TEST_F(ChannelTreeTest, IsReadInTheOrderOfNames)
{
    for (const char* name : {"b", "c", "a", "B"})
        publish(fs::path("amp/Tx/-") / name, "simple\n1\n");
    publish("adc/Tx/-/z", "simple\n1\n");
    EXPECT_THAT(
        read().channels,
        ElementsAre(isChannel("z", 1), isChannel("B", 1), isChannel("a", 1), isChannel("b", 1), isChannel("c", 1)));
}

TEST_F(ChannelTreeTest, HoldsNothingWithoutARoot)
{
    EXPECT_THAT(read().channels, IsEmpty());
    EXPECT_THAT(ChannelTree("").read({{}})->channels, IsEmpty());
    fs::create_directories(root);
    EXPECT_THAT(read().channels, IsEmpty());
    EXPECT_THAT(read().problems, IsEmpty());
}

TEST_F(ChannelTreeTest, SaysWhyItsRootCannotBeRead)
{
    support::writeFile(root, "a file");
    EXPECT_EQ(ChannelTree(root).read({{}}).error(), std::errc::not_a_directory);
}

TEST_F(ChannelTreeTest, MayHaveItsRootBehindALink)
{
    publish("amp/Tx/-/a", "simple\n1\n");
    fs::create_directory_symlink(root, directory.path() / "link");
    EXPECT_THAT(ChannelTree(directory.path() / "link").read({{}})->channels, SizeIs(1));
}

// --- channels that come, go and change

TEST_F(ChannelTreeTest, ShowsWhatIsThereWhenItIsRead)
{
    publish("amp/Tx/-/a", "simple\n1\n");
    publish("amp/Tx/-/b", "simple\n1\n");
    EXPECT_THAT(read().channels, ElementsAre(isChannel("a", 1), isChannel("b", 1)));
    publish("amp/Tx/-/c", "simple\n1\n");
    fs::remove(root / "amp/Tx/-/a");
    support::replaceFile(root / "amp/Tx/-/b", "simple\n2\n");
    EXPECT_THAT(read().channels, ElementsAre(isChannel("b", 2), isChannel("c", 1)));
    fs::remove_all(root / "amp");
    EXPECT_THAT(read().channels, IsEmpty());
}

TEST_F(ChannelTreeTest, LeavesOutNamesThatBeginWithADot)
{
    publish("amp/Tx/-/.kesto-1.tmp", "simple\n1");
    publish("amp/Tx/.hidden/a", "simple\n1\n");
    publish(".amp/Tx/-/a", "simple\n1\n");
    EXPECT_THAT(read().channels, IsEmpty());
    EXPECT_THAT(read().problems, IsEmpty());
}

TEST_F(ChannelTreeTest, LeavesOutFilesInThePlaceOfFolders)
{
    publish("README", "simple\n1\n");
    publish("amp/README", "simple\n1\n");
    publish("amp/Tx/README", "simple\n1\n");
    EXPECT_THAT(read().channels, IsEmpty());
    EXPECT_THAT(read().problems, IsEmpty());
}

// --- an error affects only its channel

TEST_F(ChannelTreeTest, NamesAFileThatIsHalfWritten)
{
    publish("amp/Tx/-/half", "simple\n12");
    EXPECT_EQ(onlyProblem(), "it is not finished");
    EXPECT_EQ(read().problems[0].path, "amp/Tx/-/half");
}

TEST_F(ChannelTreeTest, NamesAnEmptyFile)
{
    publish("amp/Tx/-/empty", "");
    EXPECT_EQ(onlyProblem(), "it is not finished");
}

TEST_F(ChannelTreeTest, NamesAFileThatIsTooLarge)
{
    publish("amp/Tx/-/large", "simple\n" + std::string(largestChannelFile, '1') + "\n");
    EXPECT_EQ(onlyProblem(), "it is too large");
    ASSERT_EQ(::truncate((root / "amp/Tx/-/large").c_str(), off_t{1} << 30), 0);
    EXPECT_EQ(onlyProblem(), "it is too large");
}

TEST_F(ChannelTreeTest, NamesAFolderInThePlaceOfAFileAndDoesNotEnterIt)
{
    publish("amp/Tx/-/folder/deeper/a", "simple\n1\n");
    EXPECT_EQ(onlyProblem(), "it is not a regular file");
}

TEST_F(ChannelTreeTest, FollowsNoLinkInThePlaceOfAFile)
{
    support::writeFile(directory.path() / "secret", "simple\n1\n");
    fs::create_directories(root / "amp/Tx/-");
    fs::create_symlink(directory.path() / "secret", root / "amp/Tx/-/link");
    EXPECT_EQ(onlyProblem(), "it is not a regular file");
}

TEST_F(ChannelTreeTest, FollowsNoLinkInThePlaceOfAFolderAtAnyLevel)
{
    const fs::path outside = directory.path() / "outside";
    fs::create_directories(outside / "a/b/c");
    support::writeFile(outside / "a/b/c/d", "simple\n1\n");
    support::writeFile(outside / "a/b/d", "simple\n1\n");
    support::writeFile(outside / "a/d", "simple\n1\n");
    fs::create_directories(root / "amp/Tx");
    fs::create_directory_symlink(outside / "a", root / "amp/Tx/link");
    fs::create_directory_symlink(outside / "a", root / "amp/link");
    fs::create_directory_symlink(outside / "a", root / "link");
    const ChannelReading reading = read();
    EXPECT_THAT(reading.channels, IsEmpty());
    EXPECT_THAT(reading.problems,
                ElementsAre(Field(&ChannelProblem::path, "amp/Tx/link"), Field(&ChannelProblem::path, "amp/link"),
                            Field(&ChannelProblem::path, "link")));
}

TEST_F(ChannelTreeTest, DoesNotWaitForAPipe)
{
    fs::create_directories(root / "amp/Tx/-");
    ASSERT_EQ(::mkfifo((root / "amp/Tx/-/pipe").c_str(), 0600), 0);
    EXPECT_EQ(onlyProblem(), "it is not a regular file");
}

TEST_F(ChannelTreeTest, DoesNotOpenASocketOrADevice)
{
    fs::create_directories(root / "amp/Tx/-");
    const int socket = ::socket(AF_UNIX, SOCK_STREAM, 0);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    const std::string path = root / "amp/Tx/-/socket";
    ASSERT_LT(path.size(), sizeof address.sun_path);
    path.copy(address.sun_path, path.size());
    ASSERT_EQ(::bind(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    ::close(socket);
    EXPECT_EQ(onlyProblem(), "it is not a regular file");

    constexpr dev_t zero = 0x105; // /dev/zero, from which reading never ends
    if (::mknod((root / "amp/Tx/-/socket2").c_str(), S_IFCHR | 0600, zero) == 0) {
        fs::remove(path);
        EXPECT_EQ(onlyProblem(), "it is not a regular file");
    }
}

TEST_F(ChannelTreeTest, NamesAFileThatItMayNotRead)
{
    constexpr uid_t nobody = 65534;
    publish("amp/Tx/-/closed", "simple\n1\n");
    ASSERT_EQ(::chmod((root / "amp/Tx/-/closed").c_str(), 0), 0);
    ASSERT_EQ(::chmod(directory.path().c_str(), 0755), 0);
    if (::geteuid() == 0) { // root may read everything
        ASSERT_EQ(::seteuid(nobody), 0);
    }
    const ChannelReading reading = read();
    ASSERT_EQ(::seteuid(::getuid()), 0);
    EXPECT_THAT(reading.problems, ElementsAre(Field(&ChannelProblem::reason, Eq("Permission denied"))));
}

TEST_F(ChannelTreeTest, NamesAChannelWhoseNameIsNotUtf8)
{
    publish("amp/Tx/-/\xFF", "simple\n1\n");
    EXPECT_EQ(onlyProblem(), "its name is not UTF-8");
}

// --- limits end every reading

TEST_F(ChannelTreeTest, TakesSoManyChannelsAndCountsTheRest)
{
    for (const char* name : {"a", "b", "c", "d", "e"})
        publish(fs::path("amp/Tx/-") / name, "simple\n1\n");
    const ChannelReading reading = ChannelTree(root, {.channels = 3}).read({{}}).value();
    EXPECT_THAT(reading.channels, ElementsAre(isChannel("a", 1), isChannel("b", 1), isChannel("c", 1)));
    EXPECT_EQ(reading.leftOut.beyondChannels, 2U);
    EXPECT_EQ(reading.leftOut.beyondBytes + reading.leftOut.beyondNames, 0U);
    EXPECT_TRUE(ChannelTree(root, {.channels = 5}).read({{}})->leftOut.isNothing());
}

TEST_F(ChannelTreeTest, TakesSoManyBytesAndCountsTheRest)
{
    std::string large = "histogram\n0 0\n";
    while (large.size() < largestChannelFile / 2)
        large += "1000000000000000000 1000000000000000001 1\n";
    const std::size_t fitting = (ChannelTree::Limits().bytes + large.size() - 1) / large.size();
    for (std::size_t index = 0; index < fitting + 2; ++index)
        publish(fs::path("amp/Tx/-") / std::to_string(index), large);
    EXPECT_THAT(read().channels, SizeIs(fitting));
    EXPECT_EQ(read().leftOut.beyondBytes, 2U);
    EXPECT_EQ(read().leftOut.beyondChannels, 0U);
}

TEST_F(ChannelTreeTest, TakesTheFileInWhichTheBytesEnd)
{
    const std::string text = "simple\n1\n";
    publish("amp/Tx/-/a", text);
    publish("amp/Tx/-/b", text);
    EXPECT_TRUE(ChannelTree(root, {.bytes = text.size() + 1}).read({{}})->leftOut.isNothing());
    EXPECT_EQ(ChannelTree(root, {.bytes = text.size()}).read({{}})->leftOut.beyondBytes, 1U);
}

TEST_F(ChannelTreeTest, SaysWhatIsLeftOutFromTheFirstOn)
{
    const LeftOutChannels each{.beyondDrivers = 1,
                               .beyondFolders = 1,
                               .beyondNames = 1,
                               .beyondChannels = 1,
                               .beyondBytes = 1,
                               .beyondTime = 1};
    EXPECT_THAT(each.inWords({.drivers = 10,
                              .folders = 20,
                              .names = 30,
                              .channels = 40,
                              .bytes = 50,
                              .time = std::chrono::milliseconds(60)}),
                ElementsAre("drivers left out of a sample: at least 1, beyond the 10 names in the channel root that it "
                            "looks at",
                            "folders left out of a sample: 1, beyond the 20 that it opens",
                            "folders left out of a sample, in part or whole: at least 1, beyond the 30 names that it "
                            "looks at",
                            "channels left out of a sample: 1, beyond the 40 that it takes",
                            "channels left out of a sample: 1, beyond the 50 bytes of files that it takes",
                            "folders and channels left out of a sample: at least 1, beyond the 60 ms that it takes"));
    EXPECT_THAT(LeftOutChannels().inWords({}), IsEmpty());
}

TEST_F(ChannelTreeTest, LooksAtSoManyNamesInAllFoldersAndNoMore)
{
    for (const char* name : {".1", ".2", ".3"})
        publish(fs::path("amp/Tx/-") / name, "");
    publish("amp/Tx/-/a", "simple\n1\n");
    publish("amp/Tx/-/b", "simple\n1\n");
    publish("amp/Tx/-/c", "simple\n1\n");
    const auto countWith = [&](std::size_t names) {
        return ChannelTree(root, {.names = names, .time = unhurried}).read({{}})->leftOut.beyondNames;
    };
    constexpr std::size_t all = 3 * 2 + 2 + 6; // "." and "..", the folders, the files
    EXPECT_EQ(countWith(all), 0U);
    EXPECT_EQ(countWith(all - 1), 1U) << "the line says \"at least\"";
    EXPECT_EQ(countWith(1), 1U);
    EXPECT_THAT(ChannelTree(root, {.names = 4}).read({{}})->channels, IsEmpty());
}

// --- shares of users

class ChannelTreeOfSeveralUsersTest : public ChannelTreeTest {
protected:
    void SetUp() override
    {
        if (::geteuid() != 0)
            GTEST_SKIP() << "needs root, to make folders of several users";
    }
    static constexpr uid_t modest = 1000;
    static constexpr uid_t greedy = 1001;

    // Makes a driver's folder with what was published there the user's.
    void giveTo(uid_t user, const fs::path& driver) const
    {
        ASSERT_EQ(::lchown((root / driver).c_str(), user, user), 0);
    }
    void publishAs(uid_t user, const std::string& driver, int count)
    {
        for (int index = 0; index < count; ++index)
            publish(fs::path(driver) / "Tx/-" / std::to_string(index), "simple\n1\n");
        giveTo(user, driver);
    }
    void makeEmptyDrivers(uid_t user, int count) const
    {
        for (int index = 0; index < count; ++index) {
            const std::string driver = "empty " + std::to_string(index);
            fs::create_directories(root / driver);
            giveTo(user, driver);
        }
    }
    static std::size_t countOf(uid_t user, const ChannelReading& reading)
    {
        return static_cast<std::size_t>(std::ranges::count(reading.channels, user, &ReportingChannel::user));
    }
    [[nodiscard]] ChannelReading readWith(ChannelTree::Limits limits) const
    {
        limits.time = unhurried;
        return ChannelTree(root, limits).read({{}}).value();
    }
};

TEST_F(ChannelTreeOfSeveralUsersTest, ManyFoldersOfOneKeepOutNoChannelOfAnother)
{
    makeEmptyDrivers(greedy, 100);
    publishAs(modest, "zither", 20);
    const ChannelReading reading = readWith({.folders = 20, .names = 200});
    EXPECT_EQ(countOf(modest, reading), 20U);
    EXPECT_EQ(reading.leftOut.beyondFolders, 100U - (20 - 3));
    EXPECT_THAT(reading.cutUsers, ElementsAre(greedy));
    EXPECT_TRUE(reading.isWhole) << "all drivers were seen";
}

TEST_F(ChannelTreeOfSeveralUsersTest, ManyChannelsOfOneKeepOutNoChannelOfAnother)
{
    publishAs(greedy, "amp", 500);
    publishAs(modest, "zither", 90);
    const ChannelReading reading = readWith({.channels = 200});
    EXPECT_EQ(countOf(modest, reading), 90U);
    EXPECT_EQ(countOf(greedy, reading), 110U) << "the user with many gets the rest";
    EXPECT_EQ(reading.leftOut.beyondChannels, 390U);
    EXPECT_THAT(reading.cutUsers, ElementsAre(greedy));
}

TEST_F(ChannelTreeOfSeveralUsersTest, BothWithManyHaveHalfEach)
{
    publishAs(greedy, "amp", 500);
    publishAs(modest, "zither", 500);
    const ChannelReading reading = readWith({.channels = 256});
    EXPECT_EQ(countOf(modest, reading), 128U);
    EXPECT_EQ(countOf(greedy, reading), 128U);
    EXPECT_THAT(reading.cutUsers, ElementsAre(modest, greedy));
}

TEST_F(ChannelTreeOfSeveralUsersTest, ManyNamesOfOneKeepOutNoChannelOfAnother)
{
    for (int group = 0; group < 9; ++group)
        for (int index = 0; index < 30; ++index)
            publish("amp/" + std::to_string(group) + "/." + std::to_string(index), "");
    giveTo(greedy, "amp");
    publishAs(modest, "zither", 20);
    const ChannelReading reading = readWith({.names = 100, .namesOfAFolder = 25});
    EXPECT_EQ(countOf(modest, reading), 20U);
    EXPECT_EQ(reading.leftOut.beyondNames, 9U);
    EXPECT_THAT(reading.cutUsers, ElementsAre(greedy));
}

TEST_F(ChannelTreeOfSeveralUsersTest, ManyBytesOfOneKeepOutNoChannelOfAnother)
{
    for (int index = 0; index < 20; ++index)
        publish("amp/Tx/-/" + std::to_string(index), "histogram " + std::string(30'000, 'm') + "\n0 0\n");
    giveTo(greedy, "amp");
    publishAs(modest, "zither", 190);
    const ChannelReading reading = readWith({.bytes = 200'000});
    EXPECT_EQ(countOf(modest, reading), 190U);
    EXPECT_EQ(countOf(greedy, reading), 7U);
    EXPECT_EQ(reading.leftOut.beyondBytes, 13U);
}

// --- time

class SteppingClock {
public:
    // Goes on by a millisecond with each look.
    std::chrono::steady_clock::time_point operator()() { return now_ += std::chrono::milliseconds(1); }

private:
    std::chrono::steady_clock::time_point now_;
};

TEST_F(ChannelTreeTest, TakesSoMuchTimeAndCountsTheRest)
{
    for (int index = 0; index < 200; ++index)
        publish("amp/Tx/-/" + std::to_string(index), "simple\n1\n");
    constexpr int folders = 3;
    constexpr std::size_t filesOfAStep = 32;
    const ChannelTree tree(root, {.time = std::chrono::milliseconds(1 + folders + 2)}, SteppingClock());
    const ChannelReading reading = tree.read({{}}).value();
    EXPECT_THAT(reading.channels, SizeIs(2 * filesOfAStep));
    EXPECT_EQ(reading.leftOut.beyondTime, 200 - 2 * filesOfAStep);
    EXPECT_THAT(reading.cutUsers, ElementsAre(::geteuid()));
}

TEST_F(ChannelTreeTest, LooksForDriversHalfOfTheTime)
{
    for (int index = 0; index < 600; ++index)
        fs::create_directories(root / std::to_string(index));
    const ChannelTree tree(root, {.time = std::chrono::milliseconds(5)}, SteppingClock());
    const ChannelReading reading = tree.read({{}}).value();
    EXPECT_FALSE(reading.isWhole) << "it looks at the time after 256 names each";
    EXPECT_GT(reading.leftOut.beyondTime, 500U);
}

TEST_F(ChannelTreeTest, LooksAtSoManyDriversAndNoMore)
{
    for (int index = 0; index < 10; ++index)
        publish("driver " + std::to_string(index) + "/Tx/-/a", "simple\n1\n");
    const auto readWith = [&](std::size_t drivers) {
        return ChannelTree(root, {.drivers = drivers}).read({{}}).value();
    };
    constexpr std::size_t all = 2 + 10; // "." and ".." too
    EXPECT_TRUE(readWith(all).isWhole);
    EXPECT_THAT(readWith(all).channels, SizeIs(10));
    EXPECT_FALSE(readWith(all - 1).isWhole);
    EXPECT_EQ(readWith(all - 1).leftOut.beyondDrivers, 1U);
}

TEST_F(ChannelTreeTest, OpensSoManyFoldersAndCountsTheRest)
{
    for (int index = 0; index < 10; ++index)
        fs::create_directories(root / std::to_string(index));
    EXPECT_EQ(ChannelTree(root, {.folders = 8}).read({{}})->leftOut.beyondFolders, 2U);
    EXPECT_EQ(ChannelTree(root, {.folders = 2}).read({{}})->leftOut.beyondFolders, 8U);
    EXPECT_TRUE(ChannelTree(root, {.folders = 10}).read({{}})->leftOut.isNothing());
}

TEST_F(ChannelTreeTest, ReadsTheChannelsOfSeveralGroupsTogether)
{
    publish("amp/Speaker/-/a", "simple\n1\n");
    publish("amp/-/MCA/b", "simple\n2\n");
    publish("amp/Speaker/MCA/c", "simple\n3\n");
    publish("amp/Rx/-/d", "simple\n4\n");
    EXPECT_THAT(ChannelTree(root).read({{"Speaker", {}}, {{}, "MCA"}})->channels,
                ElementsAre(isChannel("b", 2), isChannel("a", 1), isChannel("c", 3)));
    EXPECT_THAT(ChannelTree(root).read({})->channels, IsEmpty());
}

} // namespace
} // namespace platform
