// SPDX-License-Identifier: Apache-2.0
// The stream gives a pseudonym to the credential that used it first. Confirmations of an epoch only grow. Each dead
// letter has a reason.
#include "kesto-ingest/stream/Owners.h"

#include "kesto-ingest/stream/Confirmations.h"
#include "kesto-ingest/stream/DeadLetters.h"
#include "kesto-ingest/stream/Subjects.h"
#include "tools/kesto-ingest/Batches.h"
#include "tools/kesto-ingest/stream/FakeStream.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace kesto_ingest {
namespace {

using testing::ElementsAre;
using testing::SizeIs;

TEST(CredentialOf, IsTheLastTokenOfTheSubject)
{
    EXPECT_EQ(credentialOf("kesto.events.device-1_A"), "device-1_A");
    EXPECT_EQ(credentialOf("kesto.events.a.b"), "");
    EXPECT_EQ(credentialOf("kesto.events."), "");
    EXPECT_EQ(credentialOf("kesto.stored.a"), "");
}

TEST(Owners, TheFirstKeepsThePseudonym)
{
    FakeStream stream;
    Owners owners(stream);
    EXPECT_EQ(owners.claim("d", "one"), "one");
    EXPECT_EQ(owners.claim("d", "two"), "one");
    EXPECT_EQ(Owners(stream).claim("d", "two"), "one") << "another copy";
    EXPECT_EQ(stream.entries["kesto.owner.d"].payload, "one");
}

// A stream in which another copy is always faster by one question.
class RacingStream : public FakeStream {
public:
    [[nodiscard]] std::expected<std::vector<PutAnswer>, std::string> put(std::span<const Put> asked) override
    {
        if (std::exchange(isFaster, false)) {
            const Put first{.subject = asked[0].subject, .payload = other, .after = asked[0].after};
            static_cast<void>(FakeStream::put({&first, 1}));
        }
        return FakeStream::put(asked);
    }
    std::string other;
    bool isFaster = true;
};

TEST(Owners, TwoCopiesAgree)
{
    RacingStream stream;
    stream.other = "two";
    EXPECT_EQ(Owners(stream).claim("d", "one"), "two");
}

TEST(Owners, NobodyOwnsWhatCannotBeAsked)
{
    FakeStream stream;
    Owners owners(stream);
    stream.isAway = true;
    EXPECT_FALSE(owners.claim("d", "one"));
    stream.isAway = false;
    EXPECT_EQ(owners.claim("d", "two"), "two");
}

bool tell(Confirmations& confirmations, std::string_view epoch, std::uint64_t id)
{
    const Confirmation confirmation{.credential = "one", .device = "d", .epoch = std::string(epoch), .id = id};
    return confirmations.tell({&confirmation, 1}).has_value();
}

TEST(Confirmations, GoForwardWithinAnEpoch)
{
    FakeStream stream;
    Confirmations confirmations(stream);
    Confirmations others(stream);
    const auto told = [&] { return stream.entries["kesto.stored.one.d"].payload; };
    EXPECT_TRUE(tell(confirmations, "e1", 10));
    EXPECT_EQ(told(), R"({"epoch":"e1","id":10})");
    EXPECT_TRUE(tell(confirmations, "e1", 7));
    EXPECT_EQ(told(), R"({"epoch":"e1","id":10})");
    EXPECT_TRUE(tell(others, "e1", 8));
    EXPECT_EQ(told(), R"({"epoch":"e1","id":10})");
    EXPECT_TRUE(tell(others, "e2", 3));
    EXPECT_EQ(told(), R"({"epoch":"e2","id":3})");
    EXPECT_TRUE(tell(confirmations, "e2", 4)) << "after the other copy";
    EXPECT_EQ(told(), R"({"epoch":"e2","id":4})");
}

TEST(Confirmations, TellSeveralDevicesAtOnce)
{
    FakeStream stream;
    const std::vector<Confirmation> several = {{"one", "d", "e1", 1}, {"two", "x", "e3", 2}, {"one", "d", "e2", 3}};
    EXPECT_TRUE(Confirmations(stream).tell(several));
    EXPECT_EQ(stream.entries["kesto.stored.one.d"].payload, R"({"epoch":"e2","id":3})");
    EXPECT_EQ(stream.entries["kesto.stored.two.x"].payload, R"({"epoch":"e3","id":2})");
    EXPECT_EQ(stream.puts, 2);
}

TEST(Confirmations, KeepTheLargestOfAnEpoch)
{
    FakeStream stream;
    const std::vector<Confirmation> several = {{"one", "d", "e1", 9}, {"one", "d", "e1", 4}};
    EXPECT_TRUE(Confirmations(stream).tell(several));
    EXPECT_EQ(stream.entries["kesto.stored.one.d"].payload, R"({"epoch":"e1","id":9})");
}

TEST(Confirmations, ARepeatedBatchDoesNotBringAnOldEpochBack)
{
    FakeStream stream;
    Confirmations confirmations(stream);
    EXPECT_TRUE(tell(confirmations, "e2", 3));
    const Confirmation old{.credential = "one", .device = "d", .epoch = "e1", .id = 70, .isRepeated = true};
    EXPECT_TRUE(confirmations.tell({&old, 1}));
    EXPECT_EQ(stream.entries["kesto.stored.one.d"].payload, R"({"epoch":"e2","id":3})");
    const std::vector<Confirmation> together = {{"one", "d", "e2", 5}, old};
    EXPECT_TRUE(confirmations.tell(together));
    EXPECT_EQ(stream.entries["kesto.stored.one.d"].payload, R"({"epoch":"e2","id":5})");
}

TEST(Confirmations, DoNotPassAFasterCopy)
{
    RacingStream stream;
    stream.other = R"({"epoch":"e1","id":20})";
    Confirmations confirmations(stream);
    EXPECT_TRUE(tell(confirmations, "e1", 10));
    EXPECT_EQ(stream.entries["kesto.stored.one.d"].payload, R"({"epoch":"e1","id":20})");
}

Delivery deliveryOf(const std::string& subject)
{
    return {.subject = subject, .edition = "1", .payload = "bytes", .sequence = 42, .isRepeated = false, .message = {}};
}

TEST(DeadLetters, TellTheReasonOfEachRow)
{
    FakeStream stream;
    const std::vector<DeadRow> rows = {{"too \"long\"", "{\n}"}, {"caf\xc3", "\xff"}};
    EXPECT_EQ(putRowsAside(stream, deliveryOf("kesto.events.one"), rows, [] { }), 0U);
    ASSERT_THAT(stream.letters, SizeIs(1));
    EXPECT_EQ(stream.letters[0].subject, "kesto.dead.one");
    EXPECT_EQ(stream.letters[0].payload,
              "{\"reason\":\"too \\\"long\\\"\",\"row\":\"{\\n}\"}\n"
              "{\"reason\":\"caf?\",\"row\":\"?\"}\n");
    EXPECT_EQ(stream.letters[0].headers, (Headers{{"Nats-Msg-Id", "KESTO:42:0"}, {"Kesto-Sequence", "42"}}));
}

TEST(DeadLetters, AreSplitAndCut)
{
    FakeStream stream;
    const std::string line(100'000, 'x');
    const std::vector<DeadRow> rows(9, DeadRow{"long", line});
    int calls = 0;
    EXPECT_EQ(putRowsAside(stream, deliveryOf("kesto.events.one"), rows, [&calls] { ++calls; }), 0U);
    EXPECT_EQ(calls, 2);
    ASSERT_THAT(stream.letters, SizeIs(2));
    // A row of 64 KiB and 27 bytes around it; eight of them would pass 512 KiB.
    EXPECT_EQ(stream.letters[0].payload.size(), 7U * (64 * 1024 + 27));
    EXPECT_EQ(stream.letters[1].payload.size(), 2U * (64 * 1024 + 27));
    EXPECT_EQ(stream.letters[1].headers["Nats-Msg-Id"], "KESTO:42:1");
}

TEST(DeadLetters, AreCutToWhatTheStreamTakes)
{
    FakeStream stream;
    Delivery delivery = deliveryOf("kesto.events.one");
    const std::string payload(900'000, 'x');
    delivery.payload = payload;
    EXPECT_EQ(putBatchAside(stream, delivery, std::string(5000, 'r')), 0U);
    ASSERT_THAT(stream.letters, SizeIs(1));
    EXPECT_EQ(stream.letters[0].payload.size(), 524288U);
    EXPECT_EQ(stream.letters[0].headers["Kesto-Reason"].size(), 1000U);
    const std::string controls(100'000, '\1');
    const std::vector<DeadRow> rows(4, DeadRow{"six times as long", controls});
    EXPECT_EQ(putRowsAside(stream, delivery, rows, [] { }), 0U);
    for (const auto& letter : stream.letters)
        EXPECT_LE(letter.payload.size(), 524288U);
}

TEST(DeadLetters, CountThoseThatAreTooLarge)
{
    FakeStream stream;
    stream.largestLetter = 4;
    EXPECT_EQ(putBatchAside(stream, deliveryOf("kesto.events.one"), "r"), 1U);
    const std::vector<DeadRow> rows = {{"r", "x"}};
    EXPECT_EQ(putRowsAside(stream, deliveryOf("kesto.events.one"), rows, [] { }), 1U);
    EXPECT_THAT(stream.letters, SizeIs(0));
}

TEST(DeadLetters, KeepAWholeBatchAsItCame)
{
    FakeStream stream;
    EXPECT_EQ(putBatchAside(stream, deliveryOf("kesto.events.a.b"), "bad\r\nInjected: yes"), 0U);
    ASSERT_THAT(stream.letters, SizeIs(1));
    EXPECT_EQ(stream.letters[0].subject, "kesto.dead.unknown");
    EXPECT_EQ(stream.letters[0].payload, "bytes");
    EXPECT_EQ(stream.letters[0].headers["Kesto-Reason"], "bad??Injected: yes");
}

} // namespace
} // namespace kesto_ingest
