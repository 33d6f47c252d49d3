// SPDX-License-Identifier: Apache-2.0
// The kernel's statistics of sound cards, from trees that were recorded on cards of several kinds.
#include "platform/linux/channels/SoundCards.h"
#include "support/TemporaryDirectory.h"

#include <gmock/gmock.h>
#include <map>

namespace platform {
namespace {

namespace fs = std::filesystem;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Pair;
using testing::SizeIs;

// "driver/group/subgroup/channel" of each.
std::vector<std::string> namesOf(const std::vector<ReportingChannel>& channels)
{
    std::vector<std::string> names;
    for (const ReportingChannel& channel : channels)
        names.push_back(*channel.driver + '/' + *channel.group + '/' + *channel.subgroup + '/' + *channel.name);
    return names;
}

class SoundCardsTest : public testing::Test {
protected:
    // Uses the recorded tree of such a card.
    void plug(const char* card)
    {
        fs::copy(fs::path(KESTO_RECORDED_SOUND) / card, root,
                 fs::copy_options::recursive | fs::copy_options::copy_symlinks);
    }
    [[nodiscard]] std::vector<ReportingChannel> read(const ChannelSelection& selection = {}) const
    {
        return SoundCards(root).read({selection});
    }
    // The channel of that place, which must exist.
    [[nodiscard]] ReportingChannel channel(const std::string& place) const
    {
        const auto channels = read();
        const auto names = namesOf(channels);
        const auto found = std::ranges::find(names, place);
        EXPECT_NE(found, names.end()) << place;
        return found == names.end() ? ReportingChannel() : channels[static_cast<std::size_t>(found - names.begin())];
    }
    // The only state of a state channel, and its residency.
    [[nodiscard]] std::pair<std::string, std::uint64_t> state(const std::string& place) const
    {
        const ReportingChannel found = channel(place);
        EXPECT_THAT(found.states, SizeIs(1));
        if (found.states.empty())
            return {};
        EXPECT_EQ(found.states[0].transitions, 1U);
        EXPECT_EQ(found.states[0].dutyCycle, 1);
        return {found.states[0].name, found.states[0].residency};
    }

    const support::TemporaryDirectory directory;
    const fs::path root = directory.path() / "asound";
};

TEST_F(SoundCardsTest, AreNoneWhereTheKernelKnowsNone)
{
    EXPECT_THAT(read(), IsEmpty());
    EXPECT_THAT(SoundCards("").read({{}}), IsEmpty());
    fs::create_directories(root);
    support::writeFile(root / "cards", "--- no soundcards ---\n");
    EXPECT_THAT(read(), IsEmpty());
}

TEST_F(SoundCardsTest, OfALaptopPlayAnalogSoundWhileHdmiIsSilent)
{
    plug("hda-laptop");
    EXPECT_THAT(namesOf(read()),
                ElementsAre("PCH/Rx/pcm0c/sub0 hw_ptr", "PCH/Rx/pcm0c/sub0 appl_ptr", "PCH/Tx/pcm0p/sub0 hw_ptr",
                            "PCH/Tx/pcm0p/sub0 appl_ptr", "PCH/Tx/pcm0p/sub0 state", "PCH/Tx/pcm0p/sub0 format",
                            "PCH/Tx/pcm3p/sub0 hw_ptr", "PCH/Tx/pcm3p/sub0 appl_ptr", "PCH/Tx/pcm7p/sub0 hw_ptr",
                            "PCH/Tx/pcm7p/sub0 appl_ptr", "PCH/Tx/pcm8p/sub0 hw_ptr", "PCH/Tx/pcm8p/sub0 appl_ptr",
                            "PCH/Tx/pcm9p/sub0 hw_ptr", "PCH/Tx/pcm9p/sub0 appl_ptr"));
    EXPECT_EQ(channel("PCH/Tx/pcm0p/sub0 hw_ptr").value, 737'280);
    EXPECT_EQ(channel("PCH/Tx/pcm0p/sub0 hw_ptr").unit, "frames");
    EXPECT_EQ(channel("PCH/Tx/pcm0p/sub0 appl_ptr").value, 739'488);
    EXPECT_EQ(channel("PCH/Tx/pcm3p/sub0 hw_ptr").value, 0);
    EXPECT_THAT(state("PCH/Tx/pcm0p/sub0 state"), Pair("RUNNING", 15'368U));
    EXPECT_THAT(state("PCH/Tx/pcm0p/sub0 format"), Pair("S32_LE/48000/2", 15'368U));
}

TEST_F(SoundCardsTest, MayBeAHeadsetThatIsTheSecondCard)
{
    plug("usb-headset");
    EXPECT_THAT(state("Headset/Tx/pcm0p/sub0 state"), Pair("RUNNING", 121'250U));
    EXPECT_THAT(state("Headset/Rx/pcm0c/sub0 format"), Pair("S16_LE/16000/1", 32'751U));
    EXPECT_EQ(channel("Headset/Rx/pcm0c/sub0 hw_ptr").value, 524'000);
}

TEST_F(SoundCardsTest, OfASystemOnAChipMayBeInAnyState)
{
    plug("soc");
    EXPECT_THAT(state("SnapCard/Tx/pcm0p/sub0 state"), Pair("PAUSED", 3000U));
    EXPECT_THAT(state("SnapCard/Tx/pcm0p/sub0 format"), Pair("S16_LE/48000/2", 0U)) << "no sound is running in it";
    EXPECT_THAT(state("SnapCard/Tx/pcm1p/sub0 state"), Pair("DRAINING", 1500U));
    EXPECT_THAT(state("SnapCard/Tx/pcm1p/sub0 format"), Pair("S24_LE/192000/8", 1500U));
    EXPECT_THAT(state("SnapCard/Tx/pcm2p/sub0 state"), Pair("OPEN", 0U));
    EXPECT_THAT(state("SnapCard/Rx/pcm3c/sub0 state"), Pair("RUNNING", 0U)) << "the program asked for no time stamps";
    EXPECT_THAT(state("SnapCard/Tx/pcm10p/sub0 state"), Pair("XRUN", 21'000U));
    const auto names = namesOf(read());
    EXPECT_THAT(names, testing::Not(testing::Contains("SnapCard/Tx/pcm2p/sub0 format"))) << "no format is set";
    EXPECT_EQ(names.back(), "SnapCard/Tx/pcm10p/sub0 format") << "after the streams with one digit";
}

TEST_F(SoundCardsTest, ThatAreNotInUseHaveTheirPointersAtRest)
{
    plug("none-running");
    const auto channels = read();
    EXPECT_THAT(channels, SizeIs(2 * 8 * 2));
    for (const ReportingChannel& channel : channels) {
        EXPECT_EQ(channel.format, static_cast<std::uint8_t>(ChannelFormat::Simple));
        EXPECT_EQ(channel.value, 0);
    }
}

TEST_F(SoundCardsTest, AreReadByGroupAndSubgroup)
{
    plug("usb-headset");
    EXPECT_THAT(read({"Tx", {}}), SizeIs(4));
    EXPECT_THAT(read({"Rx", {}}), SizeIs(4));
    EXPECT_THAT(read({{}, "pcm0c"}), SizeIs(4));
    EXPECT_THAT(read({"Tx", "pcm0c"}), IsEmpty());
    EXPECT_THAT(read({"Speaker", {}}), IsEmpty());
    EXPECT_THAT(read({{}, "MCA"}), IsEmpty());
}

TEST_F(SoundCardsTest, ComeAndGo)
{
    plug("usb-headset");
    EXPECT_THAT(read(), SizeIs(8));
    fs::remove_all(root / "card1");
    EXPECT_THAT(read(), IsEmpty());
}

TEST_F(SoundCardsTest, AreNamedByTheirFolderWhenTheyHaveNoName)
{
    plug("usb-headset");
    fs::remove(root / "card1/id");
    EXPECT_EQ(read().front().driver, "card1");
    support::writeFile(root / "card1/id", "\xFF\n");
    EXPECT_EQ(read().front().driver, "card1");
}

TEST_F(SoundCardsTest, HaveNoMoreStreamsThanAreRead)
{
    const fs::path device = root / "card0/pcm0p";
    for (int number = 0; number < 1025; ++number) {
        fs::create_directories(device / ("sub" + std::to_string(number)));
        support::writeFile(device / ("sub" + std::to_string(number)) / "status", "closed\n");
    }
    const auto names = namesOf(read());
    EXPECT_THAT(names, SizeIs(2 * 1024));
    EXPECT_EQ(names.back(), "card0/Tx/pcm0p/sub1023 appl_ptr");
}

TEST_F(SoundCardsTest, TellNoLongerTimeThanANumberHolds)
{
    plug("usb-headset");
    support::writeFile(root / "card1/pcm0p/sub0/status",
                       "state: RUNNING\ntrigger_time: 1.000\ntstamp: 9223372036854775807.999\n");
    EXPECT_THAT(state("Headset/Tx/pcm0p/sub0 state"), Pair("RUNNING", 9'223'372'036'854'773'999U));
}

TEST_F(SoundCardsTest, LoseNothingButAStreamThatCannotBeUnderstood)
{
    plug("usb-headset");
    const fs::path stream = root / "card1/pcm0p/sub0";
    support::writeFile(stream / "status", "");
    EXPECT_THAT(read({"Tx", {}}), IsEmpty());
    support::writeFile(stream / "status", std::string(SoundCards::largestFile + 1, 'x'));
    EXPECT_THAT(read({"Tx", {}}), IsEmpty());
    support::writeFile(stream / "status", "state: RUNNING\xFF\n");
    EXPECT_THAT(read({"Tx", {}}), IsEmpty());
    support::writeFile(stream / "status", "state: RUNNING\nhw_ptr      : many\ntrigger_time: -1.x\ntstamp:\n");
    EXPECT_THAT(read({"Tx", {}}), SizeIs(4));
    EXPECT_EQ(channel("Headset/Tx/pcm0p/sub0 hw_ptr").value, 0);
    EXPECT_THAT(state("Headset/Tx/pcm0p/sub0 state"), Pair("RUNNING", 0U));
    support::writeFile(stream / "status",
                       "state: RUNNING\nhw_ptr: -5\ntrigger_time: 1.0\ntstamp: 99999999999999999999.5\n");
    EXPECT_EQ(channel("Headset/Tx/pcm0p/sub0 hw_ptr").value, 0);
    fs::remove(stream / "hw_params");
    EXPECT_THAT(read({"Tx", {}}), SizeIs(3)) << "no format";
    fs::remove(stream / "status");
    EXPECT_THAT(read({"Tx", {}}), IsEmpty());
    EXPECT_THAT(read({"Rx", {}}), SizeIs(4));
}

} // namespace
} // namespace platform
