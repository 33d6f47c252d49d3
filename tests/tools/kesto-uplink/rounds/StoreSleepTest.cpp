// SPDX-License-Identifier: Apache-2.0
// Sleep on real files. The order of events is what is tested, never how long something takes.
#include "kesto-uplink/rounds/StoreSleep.h"
#include "support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <chrono>
#include <future>

namespace uplink_test {
namespace {

using kesto_uplink::StoreSleep;
using namespace std::chrono_literals;

TEST(StoreSleep, whatChangedBeforeItLookedIsNews)
{
    const support::TemporaryDirectory directory;
    StoreSleep sleep(directory / "store");
    support::writeFile(directory / "store", "1");
    EXPECT_TRUE(sleep.sleep(0));
    EXPECT_TRUE(sleep.untilNews());
}

TEST(StoreSleep, itSleepsUntilTheStoreChanges)
{
    const support::TemporaryDirectory directory;
    StoreSleep sleep(directory / "store");
    support::writeFile(directory / "store", "1");
    EXPECT_TRUE(sleep.untilNews());
    auto news = std::async(std::launch::async, [&sleep] { return sleep.untilNews(); });
    EXPECT_EQ(news.wait_for(50ms), std::future_status::timeout); // all that was before is old
    support::writeFile(directory / "store", "2");
    EXPECT_TRUE(news.get());
}

TEST(StoreSleep, theEndEndsEachSleep)
{
    const support::TemporaryDirectory directory;
    StoreSleep sleep(directory / "store");
    auto nap = std::async(std::launch::async, [&sleep] { return sleep.sleep(1e9); });
    sleep.end();
    EXPECT_FALSE(nap.get());
    EXPECT_FALSE(sleep.untilNews());
    EXPECT_FALSE(sleep.sleep(0));
}

TEST(StoreSleep, withoutAFolderItLooksAgainAfterEachInterval)
{
    const support::TemporaryDirectory directory;
    StoreSleep sleep(directory / "later" / "store");
    EXPECT_TRUE(sleep.untilNews());
    std::filesystem::create_directory(directory / "later");
    EXPECT_TRUE(sleep.untilNews()); // it begins to watch
    auto news = std::async(std::launch::async, [&sleep] { return sleep.untilNews(); });
    EXPECT_EQ(news.wait_for(50ms), std::future_status::timeout);
    support::writeFile(directory / "later" / "store", "1");
    EXPECT_TRUE(news.get());
}

} // namespace
} // namespace uplink_test
