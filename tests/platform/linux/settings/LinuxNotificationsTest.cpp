// SPDX-License-Identifier: Apache-2.0
// System notifications as files: which changes post a name, and the states.
#include "platform/linux/settings/LinuxNotifications.h"

#include "platform/linux/queues/LinuxWorkQueues.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeLog.h"

#include <condition_variable>
#include <fcntl.h>
#include <future>
#include <gtest/gtest.h>
#include <mutex>
#include <sys/stat.h>
#include <thread>

namespace platform {
namespace {

namespace fs = std::filesystem;

constexpr std::string_view ringer = "com.quarn.halden.ringerstate";
constexpr std::chrono::seconds patience(20);

// Gathers the posts of one name and lets a test wait for the next one. Its handler may outlive it.
class Posts {
public:
    [[nodiscard]] Notifications::Handler handler() const
    {
        return [state = state_](std::int32_t token) {
            const std::scoped_lock lock(state->lock);
            state->tokens.push_back(token);
            state->arrived.notify_all();
        };
    }
    [[nodiscard]] bool waitForMoreThan(std::size_t count) const
    {
        std::unique_lock lock(state_->lock);
        return state_->arrived.wait_for(lock, patience, [&] { return state_->tokens.size() > count; });
    }
    [[nodiscard]] std::vector<std::int32_t> tokens() const
    {
        const std::scoped_lock lock(state_->lock);
        return state_->tokens;
    }

private:
    struct State {
        std::mutex lock;
        std::condition_variable arrived;
        std::vector<std::int32_t> tokens;
    };
    std::shared_ptr<State> state_ = std::make_shared<State>();
};

class LinuxNotificationsTest : public testing::Test {
protected:
    void write(std::string_view name, std::string_view text) const { support::writeFile(directory_ / name, text); }
    void replace(std::string_view name, std::string_view text) const { support::replaceFile(directory_ / name, text); }

    Notifications::Registration registerName(std::string_view name, Posts& posts)
    {
        return notifications_.registerNotification(name, queue_, posts.handler());
    }

    // Returns after all earlier posts were handled: the watcher reports in order, and the queue runs in order.
    void settle()
    {
        Posts fence;
        (void)registerName("fence", fence);
        write("fence", "0");
        ASSERT_TRUE(fence.waitForMoreThan(0));
        std::promise<void> done;
        queue_->submit([&] { done.set_value(); });
        ASSERT_EQ(done.get_future().wait_for(patience), std::future_status::ready);
    }

    support::TemporaryDirectory temporary_;
    const fs::path directory_ = temporary_.path() / "notifications";
    support::FakeLog log_;
    ConfigurationWatcher watcher_{temporary_.path() / "configuration", ProviderLog(log_)};
    LinuxWorkQueues queues_;
    std::shared_ptr<WorkQueue> queue_ = queues_.makeSerialQueue("test", {});
    LinuxNotifications notifications_{directory_, watcher_, ProviderLog(log_)};
};

TEST_F(LinuxNotificationsTest, MakesItsDirectory)
{
    EXPECT_TRUE(fs::is_directory(directory_));
}

TEST_F(LinuxNotificationsTest, PostsANameWhoseFileIsReplacedOrWrittenWithTheSameState)
{
    Posts posts;
    const auto registration = registerName(ringer, posts);
    replace(ringer, "1");
    ASSERT_TRUE(posts.waitForMoreThan(0));
    replace(ringer, "1");
    ASSERT_TRUE(posts.waitForMoreThan(1));
    EXPECT_EQ(notifications_.state(registration.token), 1U);
}

TEST_F(LinuxNotificationsTest, PostsANameWhoseFileIsTouchedWithoutBeingOpened)
{
    Posts posts;
    write(ringer, "1");
    settle();
    (void)registerName(ringer, posts);
    ASSERT_EQ(::utimensat(AT_FDCWD, (directory_ / ringer).c_str(), nullptr, 0), 0);
    settle();
    EXPECT_EQ(posts.tokens().size(), 1U);
}

TEST_F(LinuxNotificationsTest, PostsNothingWhenTheDirectoryItselfIsTouched)
{
    write(ringer, "1");
    settle();
    Posts posts;
    (void)registerName(ringer, posts);
    ASSERT_EQ(::utimensat(AT_FDCWD, directory_.c_str(), nullptr, 0), 0);
    settle();
    EXPECT_TRUE(posts.tokens().empty());
}

TEST_F(LinuxNotificationsTest, PostsNothingWhenOtherDirectoriesComeAndGo)
{
    const auto watch = watcher_.watch("preferences", [](std::string_view) { });
    write(ringer, "1");
    settle();
    Posts posts;
    (void)registerName(ringer, posts);
    fs::create_directories(temporary_.path() / "configuration" / "preferences");
    settle();
    fs::remove_all(temporary_.path() / "configuration");
    settle();
    settle(); // changes of directories are reported after other changes that came with them
    EXPECT_TRUE(posts.tokens().empty());
}

TEST_F(LinuxNotificationsTest, MissesNothingWhileOtherDirectoriesComeAndGo)
{
    const auto watch = watcher_.watch("preferences", [](std::string_view) { });
    Posts posts;
    (void)registerName(ringer, posts);
    constexpr std::size_t times = 200;
    for (std::size_t time = 0; time < times; ++time) {
        fs::create_directories(temporary_.path() / "configuration" / "preferences");
        replace(ringer, "1");
        fs::remove_all(temporary_.path() / "configuration");
        replace(ringer, "0");
    }
    settle();
    EXPECT_EQ(posts.tokens().size(), 2 * times);
}

TEST_F(LinuxNotificationsTest, DoesNotPostWhenAFileVanishes)
{
    write(ringer, "1");
    Posts posts;
    (void)registerName(ringer, posts);
    settle();
    const auto before = posts.tokens().size();
    fs::remove(directory_ / ringer);
    settle();
    EXPECT_EQ(posts.tokens().size(), before);
}

TEST_F(LinuxNotificationsTest, HasNoStateWithoutAFileOrWithGarbageInIt)
{
    Posts posts;
    const auto token = registerName(ringer, posts).token;
    EXPECT_EQ(notifications_.state(token).error(), LinuxNotifications::noState);
    for (const std::string_view garbage : {"", " ", "one", "1x", "-1", "1 2", "18446744073709551616"}) {
        write(ringer, garbage);
        EXPECT_FALSE(notifications_.state(token)) << garbage;
    }
    write(ringer, "7" + std::string(63, ' '));
    EXPECT_EQ(notifications_.state(token), 7U);
    write(ringer, "7" + std::string(64, ' '));
    EXPECT_FALSE(notifications_.state(token)) << "longer than a state may be";
    write(ringer, " 18446744073709551615\r\n");
    EXPECT_EQ(notifications_.state(token), 18446744073709551615U);
}

TEST_F(LinuxNotificationsTest, ReadsNoStateFromAPipeOrADirectory)
{
    Posts posts;
    const auto token = registerName(ringer, posts).token;
    ASSERT_EQ(::mkfifo((directory_ / ringer).c_str(), 0600), 0);
    EXPECT_FALSE(notifications_.state(token)); // and does not wait for a writer
    fs::remove(directory_ / ringer);
    fs::create_directory(directory_ / ringer);
    EXPECT_FALSE(notifications_.state(token));
}

TEST_F(LinuxNotificationsTest, RefusesNamesThatCouldLeaveTheDirectory)
{
    Posts posts;
    for (const std::string_view name : {"", ".", "..", "../x", "a/b", ".hidden"})
        EXPECT_EQ(registerName(name, posts).status, LinuxNotifications::invalidName) << name;
    EXPECT_EQ(registerName(std::string(256, 'a'), posts).status, LinuxNotifications::invalidName);
    EXPECT_EQ(registerName(std::string(255, 'a'), posts).status, 0U);
    EXPECT_EQ(notifications_.state(0).error(), LinuxNotifications::unknownToken);
    EXPECT_EQ(notifications_.state(99).error(), LinuxNotifications::unknownToken);
}

TEST_F(LinuxNotificationsTest, PostsByHandForChangesOutsideItsOwnFiles)
{
    Posts posts;
    const auto registration = registerName("com.quarn.kesto.reporting", posts);
    notifications_.post("com.quarn.kesto.reporting");
    notifications_.post("somebody.elses");
    settle();
    EXPECT_EQ(posts.tokens(), std::vector{registration.token});
}

TEST_F(LinuxNotificationsTest, PostsByHandWithoutADirectoryToo)
{
    LinuxNotifications none({}, watcher_, ProviderLog(log_));
    Posts posts;
    const auto registration = none.registerNotification(ringer, queue_, posts.handler());
    EXPECT_EQ(registration.status, 0U);
    EXPECT_EQ(none.state(registration.token).error(), LinuxNotifications::noState);
    none.post(ringer);
    EXPECT_TRUE(posts.waitForMoreThan(0));
}

TEST_F(LinuxNotificationsTest, DoesNotLetOthersWriteDespiteTheUmask)
{
    const mode_t umask = ::umask(0);
    const LinuxNotifications open(temporary_.path() / "open", watcher_, ProviderLog(log_));
    ::umask(umask);
    constexpr auto others = fs::perms::group_write | fs::perms::others_write;
    EXPECT_EQ(fs::status(temporary_.path() / "open").permissions() & others, fs::perms::none);
}

TEST_F(LinuxNotificationsTest, SaysWhyTheDirectoryIsMissing)
{
    support::writeFile(temporary_.path() / "file", "");
    const LinuxNotifications broken(temporary_.path() / "file", watcher_, ProviderLog(log_));
    ASSERT_EQ(log_.lines().size(), 1U);
    EXPECT_EQ(log_.lines()[0].level, LogLevel::Error);
    EXPECT_TRUE(log_.lines()[0].message.contains("File exists")) << log_.lines()[0].message;
}

TEST_F(LinuxNotificationsTest, PostsTheNamesOfFilesThatComeWithTheirDirectory)
{
    Posts posts;
    (void)registerName(ringer, posts);
    fs::create_directory(temporary_.path() / "prepared");
    support::writeFile(temporary_.path() / "prepared" / ringer, "1");
    fs::rename(directory_, temporary_.path() / "old");
    fs::rename(temporary_.path() / "prepared", directory_);
    EXPECT_TRUE(posts.waitForMoreThan(0));
}

TEST_F(LinuxNotificationsTest, GoesOnWhenItsDirectoryIsMadeAnew)
{
    Posts posts;
    (void)registerName(ringer, posts);
    fs::remove_all(directory_);
    fs::create_directory(directory_);
    for (int attempt = 0; attempt < 1000 && posts.tokens().empty(); ++attempt) {
        replace(ringer, "1"); // until the new directory is watched
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    EXPECT_FALSE(posts.tokens().empty());
}

} // namespace
} // namespace platform
