// SPDX-License-Identifier: Apache-2.0
// Publishing through the C++ interface, checked with the service's own reader of the tree.
#include "kesto/channels.hpp"
#include "platform/linux/channels/ChannelTree.h"
#include "sdk/Allocations.h"
#include "sdk/Process.h"
#include "support/TemporaryDirectory.h"

#include <cerrno>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <gmock/gmock.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

namespace {

namespace fs = std::filesystem;
using kesto::Status;
using std::chrono::milliseconds;
using support::namesIn;
using support::permissionsOf;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

class PublisherTest : public testing::Test {
protected:
    explicit PublisherTest(kesto::PublisherOptions options = {})
    {
        options.root = root;
        EXPECT_EQ(publisher.open(options), Status::Ok);
    }

    [[nodiscard]] platform::ChannelReading read() const { return platform::ChannelTree(root).read({{}}).value(); }
    // The value of the only channel.
    [[nodiscard]] std::int64_t value() const
    {
        const auto reading = read();
        EXPECT_THAT(reading.problems, IsEmpty());
        EXPECT_THAT(reading.channels, SizeIs(1));
        return reading.channels.empty() ? -1 : reading.channels[0].value;
    }
    // Whether the publisher's thread writes that value in time.
    [[nodiscard]] bool waitForValue(std::int64_t expected) const
    {
        const auto end = std::chrono::steady_clock::now() + std::chrono::seconds(10);
        while (value() != expected && std::chrono::steady_clock::now() < end)
            std::this_thread::yield();
        return value() == expected;
    }

    const support::TemporaryDirectory directory;
    const std::string root = directory / "channels";
    kesto::Publisher publisher;
};

// --- from the first file to the last

TEST_F(PublisherTest, WritesNothingBeforeThereIsAChannel)
{
    EXPECT_FALSE(fs::exists(root));
}

TEST_F(PublisherTest, TellsWhereItsTreeIs)
{
    EXPECT_EQ(publisher.root(), root);
    EXPECT_EQ(kesto::Publisher().root(), "");
    EXPECT_EQ(kesto_publisher_root(nullptr), nullptr);
}

TEST_F(PublisherTest, ShowsAChannelAsSoonAsItIsCreated)
{
    kesto::SimpleChannel channel;
    ASSERT_EQ(channel.create(publisher, {"amp<0>", "Haptics", "Stats", "Over Temp_Count"}), Status::Ok);
    const auto channels = read().channels;
    ASSERT_THAT(channels, SizeIs(1));
    EXPECT_EQ(channels[0].driver, "amp<0>");
    EXPECT_EQ(channels[0].group, "Haptics");
    EXPECT_EQ(channels[0].subgroup, "Stats");
    EXPECT_EQ(channels[0].name, "Over Temp_Count");
    EXPECT_EQ(channels[0].value, 0);
}

TEST_F(PublisherTest, HasNoGroupWhereNoneIsGiven)
{
    kesto::SimpleChannel channel;
    ASSERT_EQ(channel.create(publisher, {"amp", "", "", "a"}), Status::Ok);
    EXPECT_TRUE(fs::exists(root + "/amp/-/-/a"));
    EXPECT_EQ(read().channels.at(0).group, std::nullopt);
}

TEST_F(PublisherTest, ShowsWhatEachKindHoldsOnceItIsFlushed)
{
    kesto::SimpleChannel simple;
    kesto::HistogramChannel histogram;
    kesto::StateChannel state;
    ASSERT_EQ(simple.create(publisher, {"amp", "Tx", "", "simple"}), Status::Ok);
    ASSERT_EQ(histogram.create(publisher, {"amp", "Tx", "", "histogram"}, "ms", {0, 10, 20}), Status::Ok);
    ASSERT_EQ(state.create(publisher, {"amp", "Tx", "", "state"}, {"Idle", "Running"}), Status::Ok);
    EXPECT_EQ(simple.set(40), Status::Ok);
    EXPECT_EQ(simple.add(2), Status::Ok);
    EXPECT_EQ(histogram.record(12), Status::Ok);
    EXPECT_EQ(state.enter(1), Status::Ok);
    EXPECT_EQ(publisher.flush(), Status::Ok);
    const auto channels = read().channels;
    ASSERT_THAT(channels, SizeIs(3));
    EXPECT_EQ(channels[0].unit, "ms");
    EXPECT_EQ(channels[0].buckets[1].hits, 1);
    EXPECT_EQ(channels[1].value, 42);
    EXPECT_EQ(channels[2].states[0].name, "Idle");
    EXPECT_EQ(channels[2].states[1].transitions, 1U);
}

TEST_F(PublisherTest, ShowsByItselfWhatHasChanged)
{
    kesto::SimpleChannel channel;
    ASSERT_EQ(channel.create(publisher, {"amp", "Tx", "", "a"}), Status::Ok);
    for (int round = 1; round <= 3; ++round) {
        channel.add(1);
        EXPECT_TRUE(waitForValue(round));
    }
}

TEST_F(PublisherTest, RemovesAChannelsFileAndItsFoldersWithIt)
{
    kesto::SimpleChannel first;
    ASSERT_EQ(first.create(publisher, {"amp", "Tx", "MCA", "a"}), Status::Ok);
    {
        kesto::SimpleChannel second;
        ASSERT_EQ(second.create(publisher, {"amp", "Tx", "", "b"}), Status::Ok);
    }
    EXPECT_THAT(namesIn(root + "/amp/Tx"), ElementsAre("MCA"));
    first.destroy();
    EXPECT_FALSE(first.isCreated());
    EXPECT_THAT(namesIn(root), IsEmpty());
    EXPECT_TRUE(fs::exists(root));
}

TEST_F(PublisherTest, RemovesAllItsFilesWhenItGoes)
{
    kesto_channel* channel = nullptr;
    const kesto_channel_name name{"amp", "Tx", nullptr, "a"};
    ASSERT_EQ(kesto_channel_create_simple(publisher.get(), &name, &channel), KESTO_OK);
    publisher = kesto::Publisher();
    EXPECT_THAT(namesIn(root), IsEmpty());
}

TEST_F(PublisherTest, LeavesWhatIsNotItsOwn)
{
    fs::create_directories(root + "/amp/Tx/-");
    std::ofstream(root + "/amp/Tx/-/other") << "simple\n1\n";
    {
        kesto::SimpleChannel channel;
        ASSERT_EQ(channel.create(publisher, {"amp", "Tx", "", "a"}), Status::Ok);
    }
    EXPECT_THAT(namesIn(root + "/amp/Tx/-"), ElementsAre("other"));
}

TEST_F(PublisherTest, TakesAChannelAnewAfterItWasDestroyed)
{
    kesto::SimpleChannel channel;
    ASSERT_EQ(channel.create(publisher, {"amp", "Tx", "", "a"}), Status::Ok);
    channel.add(7);
    ASSERT_EQ(channel.create(publisher, {"amp", "Tx", "", "a"}), Status::Ok);
    EXPECT_EQ(value(), 0);
}

// --- files

TEST_F(PublisherTest, LeavesNoFileButTheChannels)
{
    kesto::SimpleChannel channel;
    ASSERT_EQ(channel.create(publisher, {"amp", "Tx", "", "a"}), Status::Ok);
    for (int round = 0; round < 10; ++round) {
        channel.add(1);
        ASSERT_EQ(publisher.flush(), Status::Ok);
    }
    EXPECT_THAT(namesIn(root + "/amp/Tx/-"), ElementsAre("a"));
    EXPECT_EQ(publisher.statistics().files_failed, 0U);
    EXPECT_GE(publisher.statistics().files_written, 11U);
}

TEST_F(PublisherTest, ShowsReadersWholeFiles)
{
    kesto::HistogramChannel channel;
    std::vector<std::int64_t> bounds;
    for (std::int64_t bound = 0; bound <= 100; ++bound)
        bounds.push_back(bound);
    ASSERT_EQ(channel.create(publisher, {"amp", "Tx", "", "a"}, "", bounds), Status::Ok);
    std::atomic<bool> isDone = false;
    std::thread writer([&] {
        for (int round = 0; !isDone; ++round) {
            channel.record(round % 100);
            EXPECT_EQ(publisher.flush(), Status::Ok);
        }
    });
    std::int64_t last = 0;
    for (int look = 0; look < 500; ++look) {
        const auto reading = read();
        EXPECT_THAT(reading.problems, IsEmpty());
        ASSERT_THAT(reading.channels, SizeIs(1));
        EXPECT_GE(reading.channels[0].buckets[0].hits, last);
        last = reading.channels[0].buckets[0].hits;
    }
    isDone = true;
    writer.join();
}

TEST_F(PublisherTest, LetsOthersReadDespiteTheUmask)
{
    const mode_t before = ::umask(077);
    kesto::SimpleChannel channel;
    const Status created = channel.create(publisher, {"amp", "Tx", "MCA", "a"});
    ::umask(before);
    ASSERT_EQ(created, Status::Ok);
    for (const char* folder : {"", "/amp", "/amp/Tx", "/amp/Tx/MCA"})
        EXPECT_EQ(permissionsOf(root + folder), 0755U) << folder;
    EXPECT_EQ(permissionsOf(root + "/amp/Tx/MCA/a"), 0644U);
}

TEST_F(PublisherTest, PutsItsFilesBackWhenTheTreeWasCleared)
{
    kesto::SimpleChannel channel;
    ASSERT_EQ(channel.create(publisher, {"amp", "Tx", "", "a"}), Status::Ok);
    fs::remove_all(root);
    channel.add(5);
    EXPECT_EQ(publisher.flush(), Status::Ok);
    EXPECT_EQ(value(), 5);
}

TEST_F(PublisherTest, ReplacesALinkAndNotWhatItLeadsTo)
{
    std::ofstream(directory / "precious") << "kept";
    fs::create_directories(root + "/amp/Tx/-");
    fs::create_symlink(directory / "precious", root + "/amp/Tx/-/a");
    kesto::SimpleChannel channel;
    ASSERT_EQ(channel.create(publisher, {"amp", "Tx", "", "a"}), Status::Ok);
    EXPECT_FALSE(fs::is_symlink(root + "/amp/Tx/-/a"));
    std::string kept;
    std::ifstream(directory / "precious") >> kept;
    EXPECT_EQ(kept, "kept");
}

TEST_F(PublisherTest, EntersNoFolderThroughALink)
{
    fs::create_directories(directory / "elsewhere");
    fs::create_directories(root);
    fs::create_directory_symlink(directory / "elsewhere", root + "/amp");
    kesto::SimpleChannel channel;
    EXPECT_EQ(channel.create(publisher, {"amp", "Tx", "", "a"}), Status::SystemError);
    EXPECT_EQ(errno, ENOTDIR);
    EXPECT_FALSE(channel.isCreated());
    EXPECT_THAT(namesIn(directory / "elsewhere"), IsEmpty());
}

TEST_F(PublisherTest, EntersNoFolderOfAnotherUser)
{
    constexpr uid_t nobody = 65534;
    fs::create_directories(root + "/amp");
    if (::geteuid() != 0 || ::chown((root + "/amp").c_str(), nobody, nobody) != 0)
        GTEST_SKIP() << "only root can give folders away";
    kesto::SimpleChannel channel;
    EXPECT_EQ(channel.create(publisher, {"amp", "Tx", "", "a"}), Status::SystemError);
    EXPECT_EQ(errno, EPERM);
    EXPECT_THAT(namesIn(root + "/amp"), IsEmpty());
}

TEST_F(PublisherTest, TellsWhyItMayNotWriteAndNotWhatCameAfterThat)
{
    constexpr uid_t nobody = 65534;
    if (::geteuid() != 0)
        GTEST_SKIP() << "only root can become another user";
    fs::create_directories(root + "/amp");
    fs::permissions(directory.path(), fs::perms(0755));
    kesto::SimpleChannel channel;
    ASSERT_EQ(::seteuid(nobody), 0);
    for (const char* driver : {"amp", "codec"}) {
        EXPECT_EQ(channel.create(publisher, {driver, "Tx", "", "a"}), Status::SystemError);
        EXPECT_EQ(errno, EACCES) << driver;
    }
    ASSERT_EQ(::seteuid(0), 0);
}

TEST_F(PublisherTest, SaysThatAFileCannotBeWrittenAndTriesAgain)
{
    kesto::SimpleChannel channel;
    ASSERT_EQ(channel.create(publisher, {"amp", "Tx", "", "a"}), Status::Ok);
    fs::remove_all(root);
    std::ofstream(root) << "a file in its place";
    channel.add(5);
    EXPECT_EQ(publisher.flush(), Status::SystemError);
    EXPECT_EQ(errno, ENOTDIR);
    EXPECT_GE(publisher.statistics().files_failed, 1U);
    fs::remove(root);
    EXPECT_EQ(publisher.flush(), Status::Ok);
    EXPECT_EQ(value(), 5);
}

TEST_F(PublisherTest, CannotCreateAChannelWhereItsFileCannotBe)
{
    std::ofstream(root) << "a file in its place";
    kesto::SimpleChannel channel;
    EXPECT_EQ(channel.create(publisher, {"amp", "Tx", "", "a"}), Status::SystemError);
    EXPECT_FALSE(channel.isCreated());
    fs::remove(root);
    EXPECT_EQ(channel.create(publisher, {"amp", "Tx", "", "a"}), Status::Ok);
}

// --- names

TEST_F(PublisherTest, MakesNamesOfFilesOfAnyNames)
{
    kesto::SimpleChannel channel;
    ASSERT_EQ(channel.create(publisher, {"../../amp", "a/b", ".hidden", "line\nbreak\x7F"}), Status::Ok);
    EXPECT_TRUE(fs::exists(root + "/_._.._amp/a_b/_hidden/line_break_")) << *read().channels.at(0).driver;
    ASSERT_EQ(channel.create(publisher, {"..", "µ", "", "."}), Status::Ok);
    EXPECT_TRUE(fs::exists(root + "/_./µ/-/_"));
}

TEST_F(PublisherTest, RefusesNamesThatNoChannelCanHave)
{
    const std::string longest(255, 'n');
    kesto::SimpleChannel channel;
    EXPECT_EQ(channel.create(publisher, {"", "Tx", "", "a"}), Status::InvalidArgument);
    EXPECT_EQ(channel.create(publisher, {"amp", "Tx", "", ""}), Status::InvalidArgument);
    EXPECT_EQ(channel.create(publisher, {"amp", "-", "", "a"}), Status::InvalidArgument);
    EXPECT_EQ(channel.create(publisher, {"amp", "Tx", "-", "a"}), Status::InvalidArgument);
    EXPECT_EQ(channel.create(publisher, {"amp\xFF", "Tx", "", "a"}), Status::InvalidUtf8);
    EXPECT_EQ(channel.create(publisher, {longest + "n", "Tx", "", "a"}), Status::TooLarge);
    EXPECT_FALSE(fs::exists(root)) << "nothing of it was written";
    EXPECT_EQ(channel.create(publisher, {longest, longest, longest, longest}), Status::Ok);
    EXPECT_EQ(read().channels.at(0).name, longest);
}

TEST_F(PublisherTest, RefusesHistogramsThatCannotBe)
{
    const kesto::ChannelName name{"amp", "Tx", "", "a"};
    kesto::HistogramChannel channel;
    EXPECT_EQ(channel.create(publisher, name, "", {}), Status::InvalidArgument);
    EXPECT_EQ(channel.create(publisher, name, "", {1}), Status::InvalidArgument);
    EXPECT_EQ(channel.create(publisher, name, "", {1, 1}), Status::InvalidArgument);
    EXPECT_EQ(channel.create(publisher, name, "", {1, 3, 2}), Status::InvalidArgument);
    EXPECT_EQ(channel.create(publisher, name, "m\xFF", {1, 2}), Status::InvalidUtf8);
    EXPECT_EQ(channel.create(publisher, name, std::string(KESTO_LONGEST_STATE_NAME + 1, 'm'), {1, 2}),
              Status::TooLarge);
    std::vector<std::int64_t> bounds;
    for (std::int64_t bound = 0; bound <= KESTO_MOST_BUCKETS; ++bound)
        bounds.push_back(bound);
    EXPECT_EQ(channel.create(publisher, name, "", bounds), Status::Ok);
    bounds.push_back(KESTO_MOST_BUCKETS + 1);
    EXPECT_EQ(channel.create(publisher, name, "", bounds), Status::TooLarge);
    EXPECT_EQ(kesto_channel_create_histogram(publisher.get(), nullptr, nullptr, nullptr, 2, nullptr),
              KESTO_INVALID_ARGUMENT);
}

TEST_F(PublisherTest, RefusesStatesThatCannotBe)
{
    const kesto::ChannelName name{"amp", "Tx", "", "a"};
    kesto::StateChannel channel;
    EXPECT_EQ(channel.create(publisher, name, {}), Status::InvalidArgument);
    EXPECT_EQ(channel.create(publisher, name, {"On"}, 1), Status::InvalidArgument);
    EXPECT_EQ(channel.create(publisher, name, {"On", ""}), Status::InvalidArgument);
    EXPECT_EQ(channel.create(publisher, name, {"On", nullptr}), Status::InvalidArgument);
    EXPECT_EQ(channel.create(publisher, name, {"On", "On"}), Status::InvalidArgument);
    EXPECT_EQ(channel.create(publisher, name, {"On\xFF"}), Status::InvalidUtf8);
    EXPECT_EQ(channel.create(publisher, name, std::vector<const char*>(KESTO_MOST_STATES + 1, "On")), Status::TooLarge);
    EXPECT_EQ(channel.create(publisher, name, {"Low Power", "On\n"}), Status::Ok);
    EXPECT_EQ(channel.enter(2), Status::InvalidArgument);
    EXPECT_EQ(read().channels.at(0).states.at(0).name, "Low Power");
    EXPECT_EQ(read().channels.at(0).states.at(1).name, "On_");
}

// --- arguments

TEST_F(PublisherTest, TakesNoNullForAnything)
{
    kesto_channel* channel = nullptr;
    const kesto_channel_name name{"amp", nullptr, nullptr, "a"};
    EXPECT_EQ(kesto_publisher_open(nullptr, nullptr), KESTO_INVALID_ARGUMENT);
    EXPECT_EQ(kesto_publisher_flush(nullptr), KESTO_INVALID_ARGUMENT);
    EXPECT_EQ(kesto_channel_create_simple(nullptr, &name, &channel), KESTO_INVALID_ARGUMENT);
    EXPECT_EQ(kesto_channel_create_simple(publisher.get(), nullptr, &channel), KESTO_INVALID_ARGUMENT);
    EXPECT_EQ(kesto_channel_create_simple(publisher.get(), &name, nullptr), KESTO_INVALID_ARGUMENT);
    EXPECT_EQ(channel, nullptr);
    EXPECT_EQ(kesto_channel_add(nullptr, 1), KESTO_INVALID_ARGUMENT);
    EXPECT_EQ(kesto_channel_set(nullptr, 1), KESTO_INVALID_ARGUMENT);
    EXPECT_EQ(kesto_channel_record(nullptr, 1), KESTO_INVALID_ARGUMENT);
    EXPECT_EQ(kesto_channel_enter(nullptr, 1), KESTO_INVALID_ARGUMENT);
    kesto_channel_destroy(nullptr);
    kesto_publisher_free(nullptr);
    kesto_publisher_get_statistics(publisher.get(), nullptr, 8);
    kesto_publisher_statistics statistics{7, 7};
    kesto_publisher_get_statistics(nullptr, &statistics, sizeof statistics);
    EXPECT_EQ(statistics.files_written, 0U);
}

TEST_F(PublisherTest, TakesNoChangeForChannelsThatWereNotCreated)
{
    kesto::SimpleChannel channel;
    EXPECT_EQ(channel.add(1), Status::InvalidArgument);
    kesto::Publisher closed;
    EXPECT_EQ(channel.create(closed, {"amp", "", "", "a"}), Status::InvalidArgument);
    EXPECT_EQ(closed.flush(), Status::InvalidArgument);
}

TEST_F(PublisherTest, TakesSoManyChannels)
{
    std::vector<kesto_channel*> channels;
    for (int index = 0; index <= KESTO_MOST_CHANNELS; ++index) {
        const std::string channelName = std::to_string(index);
        const kesto_channel_name name{"amp", "Tx", nullptr, channelName.c_str()};
        kesto_channel* channel = nullptr;
        const kesto_status status = kesto_channel_create_simple(publisher.get(), &name, &channel);
        ASSERT_EQ(status, index < KESTO_MOST_CHANNELS ? KESTO_OK : KESTO_TOO_LARGE) << index;
    }
    EXPECT_THAT(read().channels, SizeIs(KESTO_MOST_CHANNELS));
}

TEST(PublisherOptions, AreOfAVersion)
{
    kesto_publisher* publisher = nullptr;
    const kesto_publisher_options none{};
    EXPECT_EQ(kesto_publisher_open(&none, &publisher), KESTO_INVALID_ARGUMENT);
    EXPECT_EQ(publisher, nullptr);
}

// --- real time, threads, forks

TEST_F(PublisherTest, AllocatesNothingWhereItIsChanged)
{
    kesto::SimpleChannel simple;
    kesto::HistogramChannel histogram;
    kesto::StateChannel state;
    ASSERT_EQ(simple.create(publisher, {"amp", "Tx", "", "simple"}), Status::Ok);
    ASSERT_EQ(histogram.create(publisher, {"amp", "Tx", "", "histogram"}, "ms", {0, 10, 20}), Status::Ok);
    ASSERT_EQ(state.create(publisher, {"amp", "Tx", "", "state"}, {"Idle", "Running"}), Status::Ok);
    const std::size_t before = sdk_test::allocations();
    for (std::size_t round = 0; round < 1000; ++round) {
        simple.add(1);
        histogram.record(static_cast<std::int64_t>(round));
        state.enter(round % 2);
    }
    EXPECT_EQ(sdk_test::allocations(), before);
}

TEST_F(PublisherTest, TakesChangesAndChannelsFromManyThreadsAtOnce)
{
    kesto::SimpleChannel shared;
    ASSERT_EQ(shared.create(publisher, {"amp", "Tx", "", "shared"}), Status::Ok);
    std::vector<std::thread> threads;
    for (int thread = 0; thread < 4; ++thread)
        threads.emplace_back([&, thread] {
            for (int round = 0; round < 50; ++round) {
                kesto::SimpleChannel own;
                EXPECT_EQ(own.create(publisher, {"amp", "Tx", "own", std::to_string(thread)}), Status::Ok);
                own.add(1);
                shared.add(1);
                EXPECT_EQ(publisher.flush(), Status::Ok);
            }
        });
    for (std::thread& thread : threads)
        thread.join();
    EXPECT_EQ(publisher.flush(), Status::Ok);
    EXPECT_EQ(value(), 200);
}

TEST_F(PublisherTest, BelongsToTheProcessThatOpenedIt)
{
    kesto::SimpleChannel channel;
    ASSERT_EQ(channel.create(publisher, {"amp", "Tx", "", "a"}), Status::Ok);
    const pid_t child = ::fork();
    if (child == 0) {
        kesto_publisher_free(publisher.get());
        ::_exit(0);
    }
    int status = -1;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
    EXPECT_EQ(value(), 0) << "the file is still there";
    channel.add(3);
    EXPECT_TRUE(waitForValue(3));
}

// --- how often

class RarePublisherTest : public PublisherTest {
protected:
    RarePublisherTest() : PublisherTest({"", std::chrono::hours(1), milliseconds::max()}) { }
};

TEST_F(RarePublisherTest, WritesAFileNoMoreOftenThanItsInterval)
{
    kesto::SimpleChannel channel;
    ASSERT_EQ(channel.create(publisher, {"amp", "Tx", "", "a"}), Status::Ok);
    for (int round = 0; round < 10'000; ++round)
        channel.add(1);
    EXPECT_LE(publisher.statistics().files_written, 3U) << "its first file, and at most one round on its way";
    EXPECT_EQ(publisher.flush(), Status::Ok);
    EXPECT_EQ(value(), 10'000);
}

TEST_F(RarePublisherTest, EndsAtOnceThoughItsThreadRests)
{
    kesto::SimpleChannel channel;
    ASSERT_EQ(channel.create(publisher, {"amp", "Tx", "", "a"}), Status::Ok);
    channel.add(1);
    ASSERT_TRUE(waitForValue(1)) << "from here on it rests for an hour";
    channel.destroy();
    publisher = kesto::Publisher();
    EXPECT_THAT(namesIn(root), IsEmpty());
}

class FreshPublisherTest : public PublisherTest {
protected:
    FreshPublisherTest() : PublisherTest({"", milliseconds(1), milliseconds(1)}) { }
};

TEST_F(FreshPublisherTest, ShowsTheGrowingTimeOfAStateWithoutACall)
{
    kesto::StateChannel channel;
    ASSERT_EQ(channel.create(publisher, {"amp", "Tx", "", "a"}, {"Idle"}), Status::Ok);
    const auto residency = [&] { return read().channels.at(0).states.at(0).residency; };
    const auto end = std::chrono::steady_clock::now() + std::chrono::seconds(10);
    while (residency() < 20 && std::chrono::steady_clock::now() < end)
        std::this_thread::yield();
    EXPECT_GE(residency(), 20U);
    EXPECT_EQ(read().channels.at(0).states.at(0).transitions, 1U);
}

} // namespace
