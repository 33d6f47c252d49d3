// SPDX-License-Identifier: Apache-2.0
// The package for Python with a real service: what its documents show and what its example reports of a player become
// stored seconds, volumes and devices. Clocks move only when a program sleeps.
#include "sdk/PlayTimes.h"
#include "support/TemporaryDirectory.h"

#include <csignal>
#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace {

using end_to_end::Kestod;
using sdk_test::Finished;
using sdk_test::messagesWith;
using sdk_test::playTimes;
using sdk_test::Process;
using testing::ElementsAre;

const std::string source = KESTO_SOURCE_DIRECTORY "/";

// What aplay prints of a sound of 16 bits on a card that takes 32. Then it waits for a line.
const std::string beginning = "cat >&2 <<END\n"
                              "Playing WAVE '$2' : Signed 16 bit Little Endian, Rate 44100 Hz, Stereo\n"
                              "Plug PCM: Linear conversion PCM (S32_LE)\n"
                              "Its setup is:\n"
                              "  stream       : PLAYBACK\n"
                              "  format       : S16_LE\n"
                              "  subformat    : STD\n"
                              "  channels     : 2\n"
                              "  rate         : 44100\n"
                              "  exact rate   : 44100 (44100/1)\n"
                              "Slave: Hardware PCM card 0 'HDA Intel PCH' device 0 subdevice 0\n"
                              "Its setup is:\n"
                              "  stream       : PLAYBACK\n"
                              "  format       : S32_LE\n"
                              "  subformat    : STD\n"
                              "  channels     : 2\n"
                              "  rate         : 44100\n"
                              "  exact rate   : 44100 (44100/1)\n"
                              "  appl_ptr     : 0\n"
                              "END\n"
                              "read go\n";
const std::string endOfBeginning = "appl_ptr";

class PythonTest : public testing::Test {
protected:
    void SetUp() override { kestod_.startAndAwait(); }

    // The environment of a program in Python that reports to the service.
    [[nodiscard]] Process::Environment surroundings() const
    {
        Process::Environment environment = sdk_test::surroundings(kestod_);
        environment.insert(environment.end(),
                           {"PYTHONPATH=" KESTO_PYTHON_PATH, "PYTHONDONTWRITEBYTECODE=1",
                            "KESTO_LIBRARY=" KESTO_LIBRARY, "KESTO_TEST_SLEPT=" + std::string(directory_ / "slept"),
                            "PATH=" + directory_.path().string() + ":/usr/bin:/bin"});
        return environment;
    }

    // Runs the blocks of Python in a document as one program.
    [[nodiscard]] Finished runDocument(const std::string& document) const
    {
        std::ifstream stream(source + document);
        EXPECT_TRUE(stream) << document;
        std::string program;
        bool isInside = false;
        for (std::string line; std::getline(stream, line);) {
            if (line.starts_with("```"))
                isInside = line == "```python";
            else if (isInside)
                program += line + '\n';
        }
        EXPECT_NE(program, "");
        return sdk_test::run({KESTO_PYTHON, "-X", "dev", "-W", "error", "-"}, program, surroundings());
    }

    // The example, with a program in the place of aplay that does this.
    [[nodiscard]] Process::Arguments examplePlaying(const std::string& script) const
    {
        const std::filesystem::path player = directory_ / "aplay";
        std::ofstream(player) << "#!/bin/sh\n" << script;
        std::filesystem::permissions(player, std::filesystem::perms::owner_all);
        return {KESTO_PYTHON, "-X", "dev", "-W", "error", source + "sdk/examples/aplay.py", "a.wav"};
    }
    // Lets the program in the place of aplay go on as soon as the example has read so much of what it prints.
    static void goOnAfter(Process& player, const std::string& text)
    {
        EXPECT_TRUE(end_to_end::waitUntil([&] { return player.errors().contains(text); })) << player.errors();
        player.write("\n");
    }

    const support::TemporaryDirectory directory_;
    Kestod kestod_{sdk_test::internalBuild()};
};

TEST_F(PythonTest, TheBlocksOfItsPageAreAProgramThatReportsWhatItPlays)
{
    const Finished played = runDocument("docs/python.md");
    EXPECT_EQ(played.status, 0);
    EXPECT_EQ(played.errors, "");
    EXPECT_EQ(played.output, "connected\nthe session's run has ended\n6 messages taken, 0 lost\n");
    EXPECT_THAT(playTimes(kestod_, 5),
                ElementsAre("2.0 s at 1 on speaker as S16LE/44100/2, 2 channels, by org.example.player",
                            "4.0 s at 0.5 on speaker as S16LE/44100/2, 2 channels, by org.example.player",
                            "1.0 s at 0.5 on speaker as S16LE/44100/2, 2 channels, by org.example.player",
                            "5.0 s at 0.5 on headset as S16LE/44100/2, 2 channels, by org.example.player",
                            "3.0 s at 0.8 on speaker as S16LE/44100/2, 2 channels, by org.example.session"));
    EXPECT_THAT(messagesWith(kestod_, "session_duration", 2),
                ElementsAre("Playback.Deactivate 13.0", "Record.Deactivate 6.0"));
    EXPECT_THAT(messagesWith(kestod_, "late_cycles", 1), ElementsAre("Error.IssueDetector 3.0"));
}

TEST_F(PythonTest, TheReadmesProgramReportsWhatItPlays)
{
    const Finished played = runDocument("README.md");
    EXPECT_EQ(played.status, 0);
    EXPECT_EQ(played.errors, "");
    EXPECT_THAT(playTimes(kestod_, 1),
                ElementsAre("30.0 s at 0.5 on speaker as S16LE/44100/2, 2 channels, by org.example.player"));
}

TEST_F(PythonTest, AplayIsReportedWithFormatCardGapsAndPlayTime)
{
    Process player(examplePlaying("echo \"$@\"\n" + beginning
                                  + "sleep 3; echo 'underrun!!! (at least 500.000 ms long)' >&2; read go; sleep 2\n"),
                   surroundings());
    goOnAfter(player, endOfBeginning);
    goOnAfter(player, "underrun!!! (at least 500.000 ms long)\n");
    EXPECT_EQ(player.wait(), 0) << player.errors();
    EXPECT_EQ(player.output(), "-v a.wav\n");
    EXPECT_THAT(playTimes(kestod_, 1),
                ElementsAre("5.0 s at 1 on HDA Intel PCH as S16LE/44100/2, 2 channels, by aplay"));
    EXPECT_THAT(messagesWith(kestod_, "late_cycles", 1), ElementsAre("Error.IssueDetector 1.0"));
    EXPECT_THAT(messagesWith(kestod_, "issue_duration", 1), ElementsAre("Error.IssueDetector 0.5"));
    EXPECT_THAT(messagesWith(kestod_, "session_duration", 1), ElementsAre("Playback.Deactivate 5.0"));
}

TEST_F(PythonTest, EachSoundThatAplayPlaysIsASessionOfItsOwn)
{
    Process player(examplePlaying(beginning
                                  + "sleep 2\n"
                                    "cat >&2 <<END\n"
                                    "Playing WAVE 'b.wav' : Unsigned 8 bit, Rate 8000 Hz, Mono\n"
                                    "Hardware PCM card 1 'USB Audio' device 0 subdevice 0\n"
                                    "Its setup is:\n"
                                    "  format       : U8\n"
                                    "  channels     : 1\n"
                                    "  rate         : 8000\n"
                                    "END\n"
                                    "read go; sleep 4\n"),
                   surroundings());
    goOnAfter(player, endOfBeginning);
    goOnAfter(player, "8000\n");
    EXPECT_EQ(player.wait(), 0) << player.errors();
    EXPECT_THAT(playTimes(kestod_, 2),
                ElementsAre("2.0 s at 1 on HDA Intel PCH as S16LE/44100/2, 2 channels, by aplay",
                            "4.0 s at 1 on USB Audio as U8/8000/1, 1 channels, by aplay"));
}

TEST_F(PythonTest, ASignalEndsAplayAndThePlayTime)
{
    Process player(examplePlaying(beginning + "sleep 6; echo playing; exec cat\n"), surroundings());
    goOnAfter(player, endOfBeginning);
    EXPECT_EQ(player.waitForOutput("playing\n"), "playing\n");
    player.signal(SIGTERM);
    EXPECT_EQ(player.wait(), 128 + SIGTERM);
    EXPECT_THAT(playTimes(kestod_, 1),
                ElementsAre("6.0 s at 1 on HDA Intel PCH as S16LE/44100/2, 2 channels, by aplay"));
}

TEST_F(PythonTest, AnAplayThatFailsGivesItsStatus)
{
    const Finished played = sdk_test::run(
        examplePlaying("echo 'aplay: main:831: audio open error: No such file' >&2; exit 1\n"), {}, surroundings());
    EXPECT_EQ(played.status, 1);
    EXPECT_EQ(played.errors, "aplay: main:831: audio open error: No such file\n");
}

} // namespace
