// SPDX-License-Identifier: Apache-2.0
// The credential that uses a pseudonym first keeps it; what a device is told never goes back; dead letters tell why.
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
    EXPECT_TRUE(putRowsAside(stream, deliveryOf("kesto.events.one"), rows));
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
    EXPECT_TRUE(putRowsAside(stream, deliveryOf("kesto.events.one"), rows));
    ASSERT_THAT(stream.letters, SizeIs(2));
    // A row of 64 KiB and 27 bytes around it; eight of them reach 512 KiB.
    EXPECT_EQ(stream.letters[0].payload.size(), 8U * (64 * 1024 + 27));
    EXPECT_EQ(stream.letters[1].payload.size(), 64U * 1024 + 27);
    EXPECT_EQ(stream.letters[1].headers["Nats-Msg-Id"], "KESTO:42:1");
}

TEST(DeadLetters, KeepAWholeBatchAsItCame)
{
    FakeStream stream;
    EXPECT_TRUE(putBatchAside(stream, deliveryOf("kesto.events.a.b"), "bad\r\nInjected: yes"));
    ASSERT_THAT(stream.letters, SizeIs(1));
    EXPECT_EQ(stream.letters[0].subject, "kesto.dead.unknown");
    EXPECT_EQ(stream.letters[0].payload, "bytes");
    EXPECT_EQ(stream.letters[0].headers["Kesto-Reason"], "bad??Injected: yes");
}

} // namespace
} // namespace kesto_ingest
