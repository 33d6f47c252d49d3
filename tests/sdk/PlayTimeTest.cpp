// SPDX-License-Identifier: Apache-2.0
// The play times that a real service computes and stores, from a player that links the library, also when the service
// goes and comes back. The player's clocks move only by what it plays.
#include "sdk/PlayTimes.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace {

using end_to_end::Kestod;
using sdk_test::messagesWith;
using sdk_test::playTimes;
using sdk_test::Process;
using testing::ElementsAre;

class PlayTimeTest : public testing::Test {
protected:
    void SetUp() override { bringServiceBack(); }

    // Lets the player do this.
    void play(const std::string& script)
    {
        player_.write(script + " say done\n");
        expected_ += "done\n";
        ASSERT_EQ(player_.waitForOutput(expected_), expected_) << player_.errors();
    }
    void loseService()
    {
        kestod_.kill();
        play("await disconnected");
    }
    void bringServiceBack()
    {
        kestod_.startAndAwait();
        play("await connected");
    }
    void finish()
    {
        player_.closeInput();
        EXPECT_EQ(player_.wait(), 0) << player_.errors();
    }

    Kestod kestod_{sdk_test::internalBuild()};

private:
    Process player_{{SCRIPTED_PLAYER}, sdk_test::surroundings(kestod_)};
    std::string expected_;
};

TEST_F(PlayTimeTest, EveryChangeEndsAStretch)
{
    play("start play 2 volume 0.5 play 4 pause play 7 resume play 1 route headset play 5 stop");
    finish();
    EXPECT_THAT(playTimes(kestod_, 4),
                ElementsAre("2.0 s at 1 on speaker as S16LE/44100/2, 2 channels, by player",
                            "4.0 s at 0.5 on speaker as S16LE/44100/2, 2 channels, by player",
                            "1.0 s at 0.5 on speaker as S16LE/44100/2, 2 channels, by player",
                            "5.0 s at 0.5 on headset as S16LE/44100/2, 2 channels, by player"));
    EXPECT_THAT(messagesWith(kestod_, "session_run", 4),
                ElementsAre("Playback.Start 1.0", "Playback.Stop 1.0", "Playback.Start 2.0", "Playback.Stop 2.0"));
    EXPECT_THAT(messagesWith(kestod_, "session_duration", 1), ElementsAre("Playback.Deactivate 19.0"));
}

TEST_F(PlayTimeTest, EqualStartsOfTwoSessionsBothCount)
{
    play("start play 2 stop play 1 start play 3 stop");
    finish();
    EXPECT_THAT(playTimes(kestod_, 2),
                ElementsAre("2.0 s at 1 on speaker as S16LE/44100/2, 2 channels, by player",
                            "3.0 s at 1 on speaker as S16LE/44100/2, 2 channels, by player"));
}

TEST_F(PlayTimeTest, ClosingTheClientEndsTheLastStretch)
{
    play("start play 6");
    finish();
    EXPECT_THAT(playTimes(kestod_, 1), ElementsAre("6.0 s at 1 on speaker as S16LE/44100/2, 2 channels, by player"));
}

TEST_F(PlayTimeTest, AStretchGoesOnOverARestartOfTheService)
{
    play("start play 3 flush");
    loseService();
    play("play 4");
    bringServiceBack();
    play("play 2 stop");
    finish();
    EXPECT_THAT(playTimes(kestod_, 1), ElementsAre("9.0 s at 1 on speaker as S16LE/44100/2, 2 channels, by player"));
    EXPECT_THAT(messagesWith(kestod_, "session_duration", 1), ElementsAre("Playback.Deactivate 9.0"));
}

TEST_F(PlayTimeTest, AChangeWithoutAServiceBeginsTheStretchThatTheNextOneGets)
{
    play("start play 3 flush");
    loseService();
    play("play 2 volume 0.25 route headset play 4");
    bringServiceBack();
    play("play 1 volume 1 play 2 stop");
    finish();
    EXPECT_THAT(playTimes(kestod_, 2),
                ElementsAre("5.0 s at 0.25 on headset as S16LE/44100/2, 2 channels, by player",
                            "2.0 s at 1 on headset as S16LE/44100/2, 2 channels, by player"));
}

TEST_F(PlayTimeTest, APauseOverARestartOfTheServiceIsNotPlayed)
{
    play("start play 3 pause flush");
    loseService();
    play("play 4");
    bringServiceBack();
    play("play 2 resume play 1 stop");
    finish();
    EXPECT_THAT(playTimes(kestod_, 1), ElementsAre("1.0 s at 1 on speaker as S16LE/44100/2, 2 channels, by player"));
}

} // namespace
