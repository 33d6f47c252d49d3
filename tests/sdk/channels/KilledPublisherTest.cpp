// SPDX-License-Identifier: Apache-2.0
// The files of a killed publisher: the service ignores them, and the next publisher removes them.
#include "kesto/channels.hpp"
#include "platform/linux/channels/ChannelTree.h"
#include "support/TemporaryDirectory.h"
#include "support/Victim.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <filesystem>
#include <gmock/gmock.h>
#include <sched.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

namespace fs = std::filesystem;
using kesto::Status;
using support::Victim;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::UnorderedElementsAre;

// Processes that pass it go on at the same moment.
class Barrier {
public:
    Barrier() { EXPECT_EQ(::pipe(ends_.data()), 0); }
    ~Barrier() { ::close(ends_[0]); }
    Barrier(const Barrier&) = delete;
    Barrier& operator=(const Barrier&) = delete;

    // Waits until it is open. Call it once in a forked process.
    [[nodiscard]] bool pass() const
    {
        char byte = 0;
        return ::close(ends_[1]) == 0 && ::read(ends_[0], &byte, 1) == 0;
    }
    // Call it once, in the process that made it.
    void open() const { EXPECT_EQ(::close(ends_[1]), 0); }

private:
    std::array<int, 2> ends_{};
};

class KilledPublisherTest : public testing::Test {
protected:
    KilledPublisherTest() { fs::create_directory(root); }

    // Publishes channels, which are groups, subgroups and names of the driver "amp"; it never ends.
    [[nodiscard]] bool publish(const std::vector<std::array<std::string, 3>>& names) const
    {
        static kesto::Publisher publisher; // static: it lives as long as the process
        static std::vector<kesto::SimpleChannel> channels;
        kesto::PublisherOptions options;
        options.root = root;
        bool isRight = publisher.isOpen() || publisher.open(options) == Status::Ok;
        for (const auto& [group, subgroup, name] : names)
            isRight =
                channels.emplace_back().create(publisher, {"amp", group, subgroup, name}) == Status::Ok && isRight;
        return isRight;
    }
    [[nodiscard]] Victim publisher(const std::vector<std::array<std::string, 3>>& names) const
    {
        return Victim([this, names] { return publish(names); });
    }
    // Of the channels as the service sees them.
    [[nodiscard]] std::vector<std::string> channels() const
    {
        const auto reading = platform::ChannelTree(root).read({{}}).value();
        EXPECT_THAT(reading.problems, IsEmpty());
        std::vector<std::string> names;
        for (const auto& channel : reading.channels)
            names.push_back(*channel.name);
        return names;
    }
    // Every file below the root, hidden ones too.
    [[nodiscard]] std::vector<std::string> files() const
    {
        std::vector<std::string> names;
        for (const auto& entry : fs::recursive_directory_iterator(root))
            if (entry.symlink_status().type() != fs::file_type::directory)
                names.push_back(entry.path().lexically_relative(root));
        std::ranges::sort(names);
        return names;
    }
    [[nodiscard]] static std::string ownerOf(const fs::path& file)
    {
        const std::string text = support::readFile(file);
        return text.substr(text.find(' ') + 1, 16);
    }

    const support::TemporaryDirectory directory;
    const fs::path root = directory.path() / "channels";
};

TEST_F(KilledPublisherTest, ItsChannelsAreNotThereAnyMore)
{
    Victim first = publisher({{"Tx", "", "late cycles"}, {"Speaker", "dock", "state"}});
    const Victim second = publisher({{"Tx", "", "cycles"}});
    EXPECT_THAT(channels(), UnorderedElementsAre("late cycles", "state", "cycles"));
    first.kill();
    EXPECT_THAT(channels(), ElementsAre("cycles"));
}

TEST_F(KilledPublisherTest, FilesOfThoseWhoKnowNothingOfItStayWhatTheyWere)
{
    Victim killed = publisher({{"Tx", "", "a"}, {"Tx", "", "b"}});
    support::writeFile(root / "amp/Tx/-/by hand", "simple\n1\n");
    killed.kill();
    EXPECT_THAT(channels(), ElementsAre("by hand"));
    support::replaceFile(root / "amp/Tx/-/b", "simple\n2\n");
    EXPECT_THAT(channels(), ElementsAre("b", "by hand"));
    const Victim next = publisher({{"Rx", "", "c"}});
    EXPECT_THAT(channels(), UnorderedElementsAre("b", "by hand", "c"));
}

TEST_F(KilledPublisherTest, TheNextPublisherOfTheDriverClearsAwayWhatItLeft)
{
    Victim killed = publisher({{"Tx", "", "a"}, {"Speaker", "dock", "state"}, {"", "MCA", "b"}});
    const std::string owner = ownerOf(root / "amp/Tx/-/a");
    killed.kill();
    support::writeFile(root / "amp/Speaker/dock" / (".kesto-" + owner + ".tmp"), "sim");
    support::writeFile(root / "amp/Speaker/dock/.kesto-0123456789abcdef.tmp", "of a publisher that ended long ago");
    support::writeFile(root / "amp/.kesto-0123456789abcdef.owner", "");
    const Victim next = publisher({{"Rx", "", "c"}});
    EXPECT_THAT(files(), ElementsAre("amp/.kesto-" + ownerOf(root / "amp/Rx/-/c") + ".owner", "amp/Rx/-/c"));
    EXPECT_FALSE(fs::exists(root / "amp/Speaker")) << "its folders are removed, too";
}

TEST_F(KilledPublisherTest, TheNextPublisherLeavesAloneWhatIsNotItsToClear)
{
    const Victim living = publisher({{"Tx", "", "a"}});
    Victim killed = publisher({{"Tx", "", "b"}});
    const std::string owner = ownerOf(root / "amp/Tx/-/a");
    killed.kill();
    const std::vector<std::string> others{"amp/Tx/-/.kesto-" + owner + ".tmp",
                                          "amp/Tx/-/.kesto-1.tmp",
                                          "amp/Tx/-/.new",
                                          "amp/Tx/-/by hand",
                                          "amp/README",
                                          "amp/.kesto-x.owner"};
    for (const std::string& other : others)
        support::writeFile(root / other, "simple\n1\n");
    fs::create_directories(directory.path() / "elsewhere/-");
    fs::copy(root / "amp/Tx/-/b", directory.path() / "elsewhere/-/b");
    fs::create_directory_symlink(directory.path() / "elsewhere", root / "amp/Rx");
    fs::create_symlink(root / "amp/Tx/-/b", root / "amp/Tx/-/link");
    fs::create_directories(root / "amp/Tx/-/folder/deeper");
    const Victim next = publisher({{"Tx", "", "c"}});
    std::vector<std::string> expected = others;
    for (const char* name : {"amp/Tx/-/a", "amp/Tx/-/c", "amp/Tx/-/link", "amp/Rx"})
        expected.emplace_back(name);
    for (const std::string& each : {owner, ownerOf(root / "amp/Tx/-/c")})
        expected.push_back("amp/.kesto-" + each + ".owner");
    EXPECT_THAT(files(), testing::UnorderedElementsAreArray(expected));
    EXPECT_TRUE(fs::exists(directory.path() / "elsewhere/-/b"));
    EXPECT_TRUE(fs::exists(root / "amp/Tx/-/folder/deeper"));
}

TEST_F(KilledPublisherTest, FilesOfOtherUsersAreNotCleared)
{
    constexpr uid_t nobody = 65534;
    Victim killed = publisher({{"Tx", "", "a"}, {"Tx", "", "b"}});
    killed.kill();
    if (::geteuid() != 0 || ::chown((root / "amp/Tx/-/a").c_str(), nobody, nobody) != 0)
        GTEST_SKIP() << "only root can give files away";
    const Victim next = publisher({{"Tx", "", "c"}});
    EXPECT_TRUE(fs::exists(root / "amp/Tx/-/a"));
    EXPECT_FALSE(fs::exists(root / "amp/Tx/-/b"));
    EXPECT_THAT(channels(), ElementsAre("c"));
}

TEST_F(KilledPublisherTest, LivesInAnotherNamespaceOfProcessesToo)
{
    if (::geteuid() != 0)
        GTEST_SKIP() << "only root can make a namespace in any case";
    const pid_t outer = ::fork();
    if (outer == 0) { // its children are in the new namespace
        if (::unshare(CLONE_NEWPID) != 0)
            ::_exit(errno == EPERM ? 2 : 1);
        Victim contained([this] { return ::getpid() == 1 && publish({{"Tx", "", "a"}}); });
        const bool wasThere = channels() == std::vector<std::string>{"a"};
        contained.kill();
        ::_exit(wasThere && channels().empty() ? 0 : 1);
    }
    int status = 0;
    ASSERT_EQ(::waitpid(outer, &status, 0), outer);
    if (WEXITSTATUS(status) == 2)
        GTEST_SKIP() << "a namespace cannot be made here";
    EXPECT_EQ(status, 0);
}

TEST_F(KilledPublisherTest, TwoPublishersThatFollowAtTheSameMomentBothHaveTheirChannels)
{
    constexpr int rounds = 100;
    const std::vector<std::array<std::string, 3>> left{{"Tx", "", "a"}, {"Tx", "", "b"}};
    const std::vector<std::array<std::string, 3>> right{{"Tx", "", "c"}, {"Rx", "", "d"}};
    std::vector<std::array<std::string, 3>> all = left;
    all.insert(all.end(), right.begin(), right.end());
    for (int round = 0; round < rounds && !HasFailure(); ++round) {
        publisher(all).kill();
        const Barrier barrier;
        const Victim one(Victim::Unawaited(), [&] { return barrier.pass() && publish(left); });
        const Victim other(Victim::Unawaited(), [&] { return barrier.pass() && publish(right); });
        barrier.open();
        one.expectSuccess();
        other.expectSuccess();
        EXPECT_THAT(channels(), UnorderedElementsAre("a", "b", "c", "d")) << "in round " << round;
        EXPECT_THAT(files(),
                    UnorderedElementsAre("amp/Tx/-/a", "amp/Tx/-/b", "amp/Tx/-/c", "amp/Rx/-/d",
                                         "amp/.kesto-" + ownerOf(root / "amp/Tx/-/a") + ".owner",
                                         "amp/.kesto-" + ownerOf(root / "amp/Tx/-/c") + ".owner"));
    }
}

// --- the living publisher

TEST_F(KilledPublisherTest, APublisherThatEndsLeavesNothing)
{
    kesto::PublisherOptions options;
    options.root = root;
    kesto::Publisher own;
    ASSERT_EQ(own.open(options), Status::Ok);
    {
        kesto::SimpleChannel a;
        kesto::SimpleChannel b;
        ASSERT_EQ(a.create(own, {"amp", "Tx", "", "a"}), Status::Ok);
        ASSERT_EQ(b.create(own, {"codec", "Tx", "", "b"}), Status::Ok);
        EXPECT_THAT(channels(), ElementsAre("a", "b"));
        a.destroy();
        EXPECT_THAT(channels(), ElementsAre("b"));
        EXPECT_FALSE(fs::exists(root / "amp"));
    }
    EXPECT_THAT(files(), IsEmpty());
    EXPECT_TRUE(fs::is_empty(root));
}

TEST_F(KilledPublisherTest, APublisherIsSeenByOtherUsersDespiteItsUmask)
{
    constexpr uid_t nobody = 65534;
    if (::geteuid() != 0)
        GTEST_SKIP() << "only root can become another user";
    for (const fs::path& path : {directory.path(), root})
        fs::permissions(path, fs::perms::all);
    const Victim living([this] {
        ::umask(0777);
        return ::seteuid(nobody) == 0 && publish({{"Tx", "", "a"}});
    });
    EXPECT_EQ(::seteuid(nobody - 1), 0);
    const auto seen = channels();
    EXPECT_EQ(::seteuid(0), 0);
    EXPECT_THAT(seen, ElementsAre("a"));
}

TEST_F(KilledPublisherTest, APublisherClaimsItsFilesAnewWhenItsOwnerFileWasRemoved)
{
    kesto::PublisherOptions options;
    options.root = root;
    kesto::Publisher own;
    kesto::SimpleChannel channel;
    ASSERT_EQ(own.open(options), Status::Ok);
    ASSERT_EQ(channel.create(own, {"amp", "Tx", "", "a"}), Status::Ok);
    fs::remove(root / "amp" / (".kesto-" + ownerOf(root / "amp/Tx/-/a") + ".owner"));
    EXPECT_THAT(channels(), IsEmpty());
    channel.add(1);
    ASSERT_EQ(own.flush(), Status::Ok);
    EXPECT_THAT(channels(), ElementsAre("a"));

    fs::rename(root / "amp", directory.path() / "moved");
    fs::remove_all(directory.path() / "moved");
    fs::create_directories(root / "amp/Tx/-");
    channel.add(1);
    ASSERT_EQ(own.flush(), Status::Ok);
    EXPECT_THAT(channels(), ElementsAre("a"));
}

// The administrator may have made all folders and given only the last one to this user.
TEST_F(KilledPublisherTest, APublisherThatMayNotClaimItsFilesWritesThemAllTheSame)
{
    constexpr uid_t nobody = 65534;
    fs::permissions(directory.path(), fs::perms::all);
    fs::create_directories(root / "amp/Tx/-");
    if (::geteuid() != 0 || ::chown((root / "amp/Tx/-").c_str(), nobody, nobody) != 0)
        GTEST_SKIP() << "only root can give folders away";
    Victim killed([this] { return ::seteuid(nobody) == 0 && publish({{"Tx", "", "a"}}); });
    EXPECT_THAT(files(), ElementsAre("amp/Tx/-/a"));
    killed.kill();
    EXPECT_THAT(channels(), ElementsAre("a")) << "the lock cannot be checked";
}

} // namespace
