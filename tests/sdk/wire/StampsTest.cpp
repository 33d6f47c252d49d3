// SPDX-License-Identifier: Apache-2.0
// The wire's own decoder reads the stamps, which must have the shortest encoding.
#include "wire/Stamps.h"

#include "foundation/cbor/Cbor.h"
#include "kesto/kesto.hpp"
#include "wire/MessageEncoder.h"

#include <gtest/gtest.h>

namespace {

using foundation::Dictionary;
using libkesto::Moment;
using libkesto::Stamps;

// The entries as a map.
std::string encoded(const Stamps& stamps)
{
    std::string bytes;
    foundation::appendCborMapHead(stamps.entryCount(), bytes);
    return bytes.append(stamps.entries());
}

std::string encoded(const Dictionary& dictionary)
{
    std::string bytes;
    foundation::appendCbor(dictionary, bytes);
    return bytes;
}

TEST(StampsTest, AreTheTwoTimesOfAMomentInTheShortestEncoding)
{
    EXPECT_EQ(encoded(Stamps({1'767'225'600.25, 86'523.4}, true, true)),
              encoded(Dictionary{{"kestoreporting_timestamp", 1'767'225'600.25}, {"systemuptime_sec", 86'523}}));
    for (const std::int64_t uptime :
         {0LL, 23LL, 24LL, 255LL, 256LL, 65'535LL, 65'536LL, 4'294'967'295LL, 4'294'967'296LL})
        EXPECT_EQ(encoded(Stamps({1, static_cast<double>(uptime)}, true, true)),
                  encoded(Dictionary{{"kestoreporting_timestamp", 1.0}, {"systemuptime_sec", uptime}}));
}

TEST(StampsTest, HoldTheUptimeInWholeSeconds)
{
    EXPECT_EQ(encoded(Stamps({0, 43.49}, false, true)), encoded(Dictionary{{"systemuptime_sec", 43}}));
    EXPECT_EQ(encoded(Stamps({0, 43.5}, false, true)), encoded(Dictionary{{"systemuptime_sec", 44}}));
}

TEST(StampsTest, AreOnlyThoseThatAreAskedFor)
{
    EXPECT_EQ(encoded(Stamps({2.5, 3}, true, false)), encoded(Dictionary{{"kestoreporting_timestamp", 2.5}}));
    EXPECT_EQ(encoded(Stamps({2.5, 3}, false, false)), encoded(Dictionary{}));
    EXPECT_EQ(encoded(Stamps()), encoded(Dictionary{}));
}

TEST(StampsTest, AreNeverLongerThanTheRoomThatIsCountedForThem)
{
    EXPECT_EQ(Stamps({-1e300, 9e18}, true, true).entries().size(), 61U);
    EXPECT_LE(61U, Stamps::longest);
}

// ---- Which of them a message lacks ----

class MissingStampsTest : public testing::Test {
protected:
    // The stamps that the message lacks, as a map.
    std::string missing() const { return encoded(message_.get()->encoder.missingStamps({2.5, 3})); }

    const std::string both_ = encoded(Dictionary{{"kestoreporting_timestamp", 2.5}, {"systemuptime_sec", 3}});
    const std::string onlyUptime_ = encoded(Dictionary{{"systemuptime_sec", 3}});
    const std::string onlyTimestamp_ = encoded(Dictionary{{"kestoreporting_timestamp", 2.5}});
    kesto::Message message_;
};

TEST_F(MissingStampsTest, AreBothInAnEmptyMessage)
{
    EXPECT_EQ(missing(), both_);
}

TEST_F(MissingStampsTest, AreNotThoseThatTheMessageHas)
{
    message_.add("kestoreporting_timestamp", 1.0);
    EXPECT_EQ(missing(), onlyUptime_);
    message_.clear().add("systemuptime_sec", 1);
    EXPECT_EQ(missing(), onlyTimestamp_);
    message_.add("kestoreporting_timestamp", 1.0);
    EXPECT_EQ(missing(), encoded(Dictionary{}));
    message_.clear();
    EXPECT_EQ(missing(), both_) << "a cleared message has none";
}

TEST_F(MissingStampsTest, AreNotThoseWhoseKeyComesWithItsValue)
{
    kesto_message_add_double(message_.get(), "kestoreporting_timestamp", 1.0);
    kesto_message_add_int64(message_.get(), "systemuptime_sec", 1);
    EXPECT_EQ(missing(), encoded(Dictionary{}));
}

TEST_F(MissingStampsTest, AreThoseThatOnlyAContainerInTheMessageHas)
{
    message_.beginDictionary("inner").add("kestoreporting_timestamp", 1.0).add("systemuptime_sec", 1).end();
    EXPECT_EQ(missing(), both_);
}

TEST_F(MissingStampsTest, AreThoseWhoseKeyOnlyBeginsTheSame)
{
    message_.add("kestoreporting_timestamp_", 1.0).add("systemuptime", 1);
    EXPECT_EQ(missing(), both_);
}

} // namespace
