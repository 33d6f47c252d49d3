// SPDX-License-Identifier: Apache-2.0
// Which calls ring, and when: the promise that sending makes no system call while a session is started.
#include "calls/Mailbox.h"

#include <gtest/gtest.h>
#include <poll.h>
#include <sys/eventfd.h>

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

} // namespace
