// SPDX-License-Identifier: Apache-2.0
// The ledger in its file: it goes on after the process, however that ended.
#include "platform/linux/store/LedgerFile.h"

#include "ledger/Ledger.h"
#include "platform/linux/store/ManualClock.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeLog.h"

#include <csignal>
#include <cstring>
#include <fstream>
#include <gmock/gmock.h>
#include <memory>
#include <optional>
#include <sys/wait.h>
#include <thread>

namespace platform {
namespace {

using ledger::Counter;
using ledger::Ledger;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

namespace fs = std::filesystem;

class LedgerFileTest : public testing::Test {
protected:
    [[nodiscard]] LedgerFile open() { return {temporary.path(), clock, ProviderLog(log)}; }
    [[nodiscard]] std::vector<std::string> messages()
    {
        std::vector<std::string> messages;
        for (const auto& line : log.take())
            messages.push_back(line.message);
        return messages;
    }

    support::TemporaryDirectory temporary;
    const fs::path path = temporary.path() / "analytics.ledger";
    support::ManualClock clock;
    support::FakeLog log;
};

TEST_F(LedgerFileTest, BeginsAnEmptyLedger)
{
    LedgerFile file = open();
    const Ledger ledger(file.image());
    EXPECT_EQ(ledger.account().began, clock.secondsSince1970());
    EXPECT_THAT(ledger.account().counts, testing::Each(0));
    EXPECT_EQ(fs::file_size(path), sizeof(ledger::LedgerImage));
    EXPECT_THAT(messages(), IsEmpty());
}

TEST_F(LedgerFileTest, GoesOnWhereItEnded)
{
    {
        LedgerFile file = open();
        Ledger(file.image()).count(Counter::Recorded, 5);
    }
    LedgerFile file = open();
    EXPECT_EQ(Ledger(file.image()).account()[Counter::Recorded], 5U);
}

TEST_F(LedgerFileTest, AKilledProcessLeavesAllThatItPosted)
{
    int channel[2] = {};
    ASSERT_EQ(::pipe(channel), 0);
    const pid_t process = ::fork();
    if (process == 0) {
        LedgerFile file = open();
        Ledger ledger(file.image());
        for (std::uint64_t number = 1;; ++number) {
            ledger::Tally tally;
            tally.add(Counter::Events, 3);
            tally.add(Counter::Kept, 2);
            tally.add(Counter::Unwanted, 1);
            ledger.post(tally);
            if (::write(channel[1], &number, sizeof number) != sizeof number)
                std::_Exit(1);
        }
    }
    ::close(channel[1]);
    std::uint64_t posted = 0;
    while (posted < 1000)
        ASSERT_EQ(::read(channel[0], &posted, sizeof posted), static_cast<ssize_t>(sizeof posted));
    ::kill(process, SIGKILL);
    ::waitpid(process, nullptr, 0);
    while (::read(channel[0], &posted, sizeof posted) > 0) { }
    ::close(channel[0]);

    LedgerFile file = open();
    const ledger::Account account = Ledger(file.image()).account();
    EXPECT_GE(account[Counter::Events], 3 * posted);
    EXPECT_LE(account[Counter::Events], 3 * (posted + 1));
    EXPECT_EQ(account[Counter::Events], account[Counter::Kept] + account[Counter::Unwanted]);
}

TEST_F(LedgerFileTest, AFileOfAnotherVersionIsReplacedWithItsCounts)
{
    {
        LedgerFile file = open();
        Ledger(file.image()).count(Counter::Recorded, 5);
        file.image().paths[0] = 'D';
    }
    LedgerFile file = open();
    EXPECT_TRUE(file.image().canGoOn());
    EXPECT_EQ(Ledger(file.image()).account()[Counter::Recorded], 5U);
    LedgerFile other = open();
    EXPECT_THAT(messages(), ElementsAre(HasSubstr("Resource temporarily unavailable")))
        << "the new file is locked, too";
}

TEST_F(LedgerFileTest, AFileThatIsNotALedgerIsReplaced)
{
    for (const std::size_t size : {std::size_t{0}, std::size_t{100}, sizeof(ledger::LedgerImage)}) {
        std::ofstream(path, std::ios::trunc) << std::string(size, 'x');
        LedgerFile file = open();
        EXPECT_THAT(Ledger(file.image()).account().counts, testing::Each(0)) << size;
    }
    EXPECT_THAT(messages(), IsEmpty());
}

TEST_F(LedgerFileTest, ASecondServiceCountsOnlyForItself)
{
    LedgerFile first = open();
    LedgerFile second = open();
    Ledger(second.image()).count(Counter::Recorded);
    EXPECT_EQ(Ledger(first.image()).account()[Counter::Recorded], 0U);
    EXPECT_EQ(Ledger(second.image()).account()[Counter::Recorded], 1U);
    EXPECT_THAT(messages(),
                ElementsAre("the ledger cannot be kept in " + path.native()
                            + ": Resource temporarily unavailable; what the service counts ends with it: "
                              "let its user write there"));
}

TEST_F(LedgerFileTest, WithoutADirectoryItCountsInMemory)
{
    LedgerFile file(temporary.path() / "missing", clock, ProviderLog(log));
    Ledger ledger(file.image());
    ledger.count(Counter::Recorded);
    EXPECT_EQ(ledger.account()[Counter::Recorded], 1U);
    EXPECT_THAT(messages(), ElementsAre(HasSubstr("No such file or directory")));
}

// --- A file that goes while the ledger counts in it

class LedgerFileInPlaceTest : public LedgerFileTest {
protected:
    void lookAgain()
    {
        clock.advance(1);
        file.keepInPlace(ledger);
    }
    // As another program sees it.
    [[nodiscard]] std::optional<ledger::Account> accountInFile() const
    {
        const std::string bytes = support::readFile(path);
        const auto image = std::make_unique<ledger::LedgerImage>();
        if (bytes.size() != sizeof *image)
            return std::nullopt;
        std::memcpy(image.get(), bytes.data(), sizeof *image);
        return accountIn(*image);
    }
    [[nodiscard]] std::uint64_t countedInFile(Counter counter) const
    {
        const auto account = accountInFile();
        return account ? (*account)[counter] : 0;
    }
    void post(Counter counter, std::uint64_t number)
    {
        ledger::Tally tally;
        tally.add(counter, {.user = 7, .process = "player", .application = ""}, number);
        ledger.post(tally);
    }

    LedgerFile file = open();
    Ledger ledger{file.image()};
};

TEST_F(LedgerFileInPlaceTest, AFileThatStaysIsLeftAlone)
{
    lookAgain();
    ledger.count(Counter::Recorded, 5);
    lookAgain();
    EXPECT_EQ(countedInFile(Counter::Recorded), 5U);
    EXPECT_THAT(messages(), IsEmpty());
    EXPECT_EQ(support::namesIn(temporary.path()), (std::vector<std::string>{"analytics.ledger"}));
}

TEST_F(LedgerFileInPlaceTest, AFileThatIsRemovedIsMadeAnewWithAllCounts)
{
    ledger.count(Counter::Recorded, 5);
    post(Counter::RefusedForSize, 3);
    for (int time = 0; time < 2; ++time) {
        fs::remove(path);
        lookAgain();
        EXPECT_THAT(messages(),
                    ElementsAre(path.native() + " was not in its place; it is made anew with all that was counted"));
        ledger.count(Counter::Recorded, 10);
        post(Counter::RefusedForSize, 100);
    }
    EXPECT_EQ(countedInFile(Counter::Recorded), 25U);
    EXPECT_EQ(countedInFile(Counter::RefusedForSize), 203U);
    EXPECT_EQ(accountInFile()->began, 1'800'000'000);
    EXPECT_EQ(accountInFile()->culprits[0].at(0).count, 203U);
    EXPECT_EQ(ledger.account()[Counter::Recorded], 25U);
    LedgerFile second = open();
    EXPECT_THAT(messages(), ElementsAre(HasSubstr("Resource temporarily unavailable"))) << "it is locked again";
}

TEST_F(LedgerFileInPlaceTest, AFileThatIsReplacedIsReplacedByWhatWasCounted)
{
    ledger.count(Counter::Recorded, 5);
    support::replaceFile(path, "of another");
    lookAgain();
    EXPECT_EQ(countedInFile(Counter::Recorded), 5U);
}

TEST_F(LedgerFileInPlaceTest, AFileInWhichAnotherServiceCountsIsLeftAlone)
{
    fs::remove(path);
    LedgerFile other = open();
    Ledger(other.image()).count(Counter::Recorded, 7);
    lookAgain();
    ledger.count(Counter::Recorded, 1);
    EXPECT_EQ(countedInFile(Counter::Recorded), 7U);
    EXPECT_THAT(messages(), IsEmpty());
}

TEST_F(LedgerFileInPlaceTest, ItLooksOnceASecond)
{
    lookAgain();
    fs::remove(path);
    clock.advance(0.5);
    file.keepInPlace(ledger);
    EXPECT_FALSE(fs::exists(path));
    clock.advance(0.5);
    file.keepInPlace(ledger);
    EXPECT_TRUE(fs::exists(path));
}

TEST_F(LedgerFileInPlaceTest, CountsOfOtherThreadsMeanwhileAreKept)
{
    std::uint64_t counted = 0;
    {
        const std::jthread counting([&](const std::stop_token& stop) {
            for (; !stop.stop_requested(); ++counted)
                ledger.count(Counter::Recorded);
        });
        for (int time = 0; time < 200; ++time) {
            fs::remove(path);
            lookAgain();
        }
    }
    EXPECT_GT(counted, 0U);
    EXPECT_EQ(countedInFile(Counter::Recorded), counted);
}

TEST_F(LedgerFileInPlaceTest, AFileThatCannotBeMadeIsTriedAgainAndSaidOnce)
{
    fs::remove(path);
    fs::create_directory(temporary.path() / "analytics.ledger.new"); // in the way
    lookAgain();
    lookAgain();
    EXPECT_THAT(messages(), ElementsAre(HasSubstr("cannot be made anew: Is a directory")));
    ledger.count(Counter::Recorded, 5);
    fs::remove(temporary.path() / "analytics.ledger.new");
    lookAgain();
    EXPECT_EQ(countedInFile(Counter::Recorded), 5U);
    EXPECT_THAT(messages(), ElementsAre(HasSubstr("is made anew with all that was counted")));
}

TEST_F(LedgerFileTest, AFileThatCouldNotBeMadeAtTheStartIsMadeLater)
{
    LedgerFile file(temporary.path() / "later", clock, ProviderLog(log));
    Ledger ledger(file.image());
    ledger.count(Counter::Recorded, 5);
    fs::create_directory(temporary.path() / "later");
    clock.advance(1);
    file.keepInPlace(ledger);
    LedgerFile other(temporary.path() / "later", clock, ProviderLog(log));
    EXPECT_THAT(messages(),
                ElementsAre(HasSubstr("No such file or directory"), HasSubstr("made anew"),
                            HasSubstr("Resource temporarily unavailable")));
    EXPECT_EQ(fs::file_size(temporary.path() / "later" / "analytics.ledger"), sizeof(ledger::LedgerImage));
}

TEST_F(LedgerFileTest, AFileThatCouldNotBeUsedAtTheStartIsNotReplaced)
{
    std::optional<LedgerFile> first;
    first.emplace(temporary.path(), clock, ProviderLog(log));
    Ledger(first->image()).count(Counter::Recorded, 5);
    LedgerFile second = open();
    Ledger ledger(second.image());
    first.reset();
    clock.advance(1);
    second.keepInPlace(ledger);
    LedgerFile third = open();
    EXPECT_EQ(Ledger(third.image()).account()[Counter::Recorded], 5U);
}

} // namespace
} // namespace platform
