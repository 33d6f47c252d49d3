// SPDX-License-Identifier: Apache-2.0
// Which calls ring, and when: the promise that sending makes no system call while a session is started. And that the
// thread always wakes up for what many threads put at the same time.
#include "calls/Mailbox.h"

#include <atomic>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <thread>
#include <vector>

namespace {

using libkesto::CallHead;
using libkesto::Mailbox;

class MailboxTest : public testing::Test {
protected:
    bool send() { return mailbox_.putMessage(message_, {}, "entries"); }
    bool call(kesto_operation operation) { return mailbox_.putCall({.operation = operation}); }
    bool play(kesto_operation operation, bool usesKeptRoom = true)
    {
        return mailbox_.putStreamRecord(operation, "record", "device", "encoding", usesKeptRoom);
    }

    // Whether a call has rung since the last check.
    bool hasRung()
    {
        pollfd doorbell{mailbox_.doorbell(), POLLIN, 0};
        ::poll(&doorbell, 1, 0);
        eventfd_t rings = 0;
        return doorbell.revents != 0 && eventfd_read(mailbox_.doorbell(), &rings) == 0;
    }

    void takeAll()
    {
        while (mailbox_.front())
            mailbox_.popFront();
    }

    const CallHead message_{.operation = KESTO_OPERATION_SEND};
    Mailbox mailbox_{4096, libkesto::Doorbell::makeDescriptor()};
};

TEST_F(MailboxTest, MessagesDoNotRingWhileTheThreadIsAwake)
{
    EXPECT_TRUE(send());
    EXPECT_FALSE(hasRung());
}

TEST_F(MailboxTest, TheFirstMessageWakesAThreadThatSleepsAndOthersDoNotRingAgain)
{
    ASSERT_TRUE(mailbox_.fallAsleep());
    EXPECT_TRUE(send());
    EXPECT_TRUE(hasRung());
    EXPECT_TRUE(send());
    EXPECT_FALSE(hasRung());
}

TEST_F(MailboxTest, TheThreadDoesNotFallAsleepOverWhatWasPut)
{
    EXPECT_TRUE(send());
    EXPECT_FALSE(mailbox_.fallAsleep());
    EXPECT_TRUE(send());
    EXPECT_FALSE(hasRung()) << "it is awake again";
}

TEST_F(MailboxTest, CallsRingInAnyCase)
{
    EXPECT_TRUE(call(KESTO_OPERATION_CREATE_SESSION));
    EXPECT_TRUE(hasRung());
    EXPECT_TRUE(call(KESTO_OPERATION_CREATE_SESSION));
    EXPECT_TRUE(hasRung());
}

TEST_F(MailboxTest, MessagesBehindAStartDoNotRingThoughTheThreadStillSleeps)
{
    ASSERT_TRUE(mailbox_.fallAsleep());
    EXPECT_TRUE(call(KESTO_OPERATION_START_SESSION));
    EXPECT_TRUE(hasRung()) << "the start itself does";
    EXPECT_TRUE(send());
    EXPECT_FALSE(hasRung());

    mailbox_.wakeUp(false);
    takeAll();
    ASSERT_TRUE(mailbox_.fallAsleep());
    EXPECT_TRUE(send());
    EXPECT_TRUE(hasRung()) << "once the start is taken, a sleeping thread is woken";
}

TEST_F(MailboxTest, AStartThatFindsNoRoomRingsForThoseWhoCountedOnIt)
{
    while (call(KESTO_OPERATION_STOP_SESSION)) { }
    hasRung();
    EXPECT_FALSE(call(KESTO_OPERATION_START_SESSION));
    EXPECT_TRUE(hasRung());
    takeAll();
    ASSERT_TRUE(mailbox_.fallAsleep());
    EXPECT_TRUE(send());
    EXPECT_TRUE(hasRung()) << "it is not counted as under way";
}

TEST_F(MailboxTest, RecordsOfStreamsRingOnlyIfTheThreadSleeps)
{
    EXPECT_TRUE(play(libkesto::streamStart));
    EXPECT_TRUE(play(libkesto::streamOperation));
    EXPECT_FALSE(hasRung());
    takeAll();
    ASSERT_TRUE(mailbox_.fallAsleep());
    EXPECT_TRUE(play(libkesto::streamOperation));
    EXPECT_TRUE(hasRung());
    EXPECT_TRUE(play(libkesto::streamOperation));
    EXPECT_FALSE(hasRung());
}

TEST_F(MailboxTest, MessagesWakeAThreadThatSleepsAfterItHasTakenTheStartOfAStream)
{
    EXPECT_TRUE(play(libkesto::streamStart));
    takeAll();
    ASSERT_TRUE(mailbox_.fallAsleep());
    EXPECT_TRUE(send());
    EXPECT_TRUE(hasRung());
}

TEST_F(MailboxTest, MessagesWakeAThreadThatSleepsAfterTheStartOfAStreamFoundNoRoom)
{
    while (play(libkesto::streamOperation)) { }
    EXPECT_FALSE(play(libkesto::streamStart));
    takeAll();
    ASSERT_TRUE(mailbox_.fallAsleep());
    EXPECT_TRUE(send());
    EXPECT_TRUE(hasRung());
}

TEST_F(MailboxTest, OnlySomeRecordsOfStreamsUseTheRoomOfCalls)
{
    while (play(libkesto::streamOperation, false)) { }
    EXPECT_FALSE(send());
    EXPECT_TRUE(play(libkesto::streamOperation, true));
    EXPECT_TRUE(call(KESTO_OPERATION_STOP_SESSION));
}

TEST_F(MailboxTest, CallsFindRoomWhenMessagesDoNotAnyMore)
{
    while (send()) { }
    EXPECT_TRUE(call(KESTO_OPERATION_STOP_SESSION));
    EXPECT_FALSE(send());
}

// Rounds in which each caller puts once, while the thread falls asleep because it finds nothing, and only the doorbell
// wakes it. A caller and the thread that missed each other would leave it asleep over what is in the queue. The thread
// looks more or less often before it falls asleep, so that the rounds differ.
TEST_F(MailboxTest, TheThreadWakesUpForAllThatManyThreadsPut)
{
    constexpr int callers = 2;
    constexpr int rounds = 20'000;
    const auto put = [this](int number) {
        switch (number % 8) {
        case 0: return call(KESTO_OPERATION_START_SESSION);
        case 2: return play(libkesto::streamStart);
        case 4: return call(KESTO_OPERATION_STOP_SESSION);
        case 6: return play(libkesto::streamOperation);
        default: return send();
        }
    };
    std::atomic<int> round = 0;
    std::atomic<int> refused = 0;
    std::vector<std::jthread> threads;
    for (int caller = 0; caller < callers; ++caller)
        threads.emplace_back([&, caller] {
            for (int number = 1; number <= rounds; ++number) {
                for (int looks = 0; round < number; ++looks)
                    if (looks > 1'000)
                        std::this_thread::yield();
                refused += put(number + caller) ? 0 : 1;
            }
        });

    int overslept = 0;
    for (int number = 1; number <= rounds; ++number) {
        round = number;
        for (int taken = 0; taken < callers;) {
            for (int looks = number % 20; looks >= 0; --looks)
                for (; mailbox_.front(); ++taken)
                    mailbox_.popFront();
            if (taken == callers || !mailbox_.fallAsleep())
                continue;
            pollfd doorbell{mailbox_.doorbell(), POLLIN, 0};
            const bool hasRung = ::poll(&doorbell, 1, overslept == 0 ? 10'000 : 1) > 0;
            overslept += hasRung ? 0 : 1;
            mailbox_.wakeUp(hasRung);
        }
    }
    EXPECT_EQ(overslept, 0);
    EXPECT_EQ(refused, 0);
}

} // namespace
