// SPDX-License-Identifier: Apache-2.0
// The evidence of processes and of the sound system, from trees like the kernel's and from malformed ones.
#include "platform/linux/bugs/BugEvidence.h"

#include "platform/linux/process/LinuxProcessTable.h"
#include "support/TemporaryDirectory.h"

#include <gmock/gmock.h>
#include <sys/stat.h>
#include <unistd.h>

namespace platform {
namespace {

namespace fs = std::filesystem;
using namespace std::string_literals;
using foundation::Array;
using foundation::Dictionary;
using foundation::Value;

class BugEvidenceTest : public testing::Test {
protected:
    void addProcess(int number, const std::string& name)
    {
        const fs::path folder = proc / std::to_string(number);
        fs::create_directory(folder);
        support::writeFile(folder / "comm", name + "\n");
        support::writeFile(folder / "status", "Name:\t" + name + "\nState:\tR (running)\n");
        support::writeFile(folder / "stat", std::to_string(number) + " (" + name + ") R 1\n");
        support::writeFile(folder / "cmdline", "/usr/bin/" + name + "\0--loud\0"s);
        support::writeFile(folder / "wchan", "do_poll"); // without an end of line
        support::writeFile(folder / "limits", "Limit  Soft\nMax open files  1024\n");
    }
    void addSound(const std::string& path, std::string_view text)
    {
        fs::create_directories((proc / "asound" / path).parent_path());
        support::writeFile(proc / "asound" / path, text);
    }
    static std::vector<std::int64_t> pids(const Dictionary& evidence)
    {
        std::vector<std::int64_t> numbers;
        const Array processes = *evidence.find("processes")->array();
        for (const Value& process : processes)
            numbers.push_back(process.dictionary()->find("pid")->number()->int64Value());
        return numbers;
    }

    const support::TemporaryDirectory directory;
    const fs::path proc = directory.path();
};

// --- processes

TEST_F(BugEvidenceTest, DescribesTheProcessOfThatName)
{
    addProcess(7, "player");
    addProcess(8, "other");
    EXPECT_EQ(processEvidence(proc, "player"),
              (Dictionary{{"name", "player"},
                          {"found", 1},
                          {"processes",
                           Array{Dictionary{{"pid", 7},
                                            {"status", Array{"Name:\tplayer", "State:\tR (running)"}},
                                            {"stat", Array{"7 (player) R 1"}},
                                            {"cmdline", Array{"/usr/bin/player", "--loud"}},
                                            {"wchan", Array{"do_poll"}},
                                            {"limits", Array{"Limit  Soft", "Max open files  1024"}}}}}}));
}

TEST_F(BugEvidenceTest, FindsNothingOfAProcessThatIsGone)
{
    addProcess(7, "player");
    EXPECT_EQ(processEvidence(proc, "gone"), (Dictionary{{"name", "gone"}, {"found", 0}, {"processes", Array()}}));
    EXPECT_EQ(*processEvidence(proc, "").find("found"), Value(0));
    EXPECT_EQ(*processEvidence(proc / "missing", "player").find("found"), Value(0));
}

TEST_F(BugEvidenceTest, DescribesOnlySoManyProcessesOfTheSameNameAndCountsAll)
{
    for (const int number : {30, 4, 200, 5, 11, 6})
        addProcess(number, "player");
    const Dictionary evidence = processEvidence(proc, "player");
    EXPECT_EQ(*evidence.find("found"), Value(6));
    EXPECT_THAT(pids(evidence), testing::ElementsAre(4, 5, 6, 11)) << "by number, not by text";
}

TEST_F(BugEvidenceTest, DescribesTheProcessThatIsAskedForFirstHoweverManyShareItsName)
{
    for (const int number : {30, 4, 200, 5, 11, 6})
        addProcess(number, "player");
    addProcess(201, "other");
    EXPECT_THAT(pids(processEvidence(proc, "player", 200)), testing::ElementsAre(200, 4, 5, 6));
    EXPECT_EQ(*processEvidence(proc, "player", 200).find("found"), Value(6)) << "each is counted once";
    EXPECT_THAT(pids(processEvidence(proc, "player", 5)), testing::ElementsAre(5, 4, 6, 11));
    EXPECT_THAT(pids(processEvidence(proc, "player", 201)), testing::ElementsAre(4, 5, 6, 11))
        << "the ID belongs to another process";
    EXPECT_THAT(pids(processEvidence(proc, "player", 999)), testing::ElementsAre(4, 5, 6, 11))
        << "the process has gone";
}

TEST_F(BugEvidenceTest, KeepsSoMuchOfAFileAtMost)
{
    addProcess(7, "player");
    support::writeFile(proc / "7/cmdline", std::string(1'000'000, 'x'));
    const Dictionary process = *processEvidence(proc, "player").find("processes")->array().value()[0].dictionary();
    EXPECT_EQ(*process.find("cmdline"), Value(Array{std::string(BugEvidenceLimits().longestProcessFile, 'x')}));
}

TEST_F(BugEvidenceTest, AFileThatCannotBeReadIsNull)
{
    addProcess(7, "player");
    support::writeFile(directory.path() / "secret", "secret");
    fs::remove(proc / "7/status");
    fs::create_symlink("../secret", proc / "7/status");
    fs::remove(proc / "7/stat");
    ASSERT_EQ(::mkfifo((proc / "7/stat").c_str(), 0600), 0);
    fs::remove(proc / "7/wchan");
    const Dictionary process = *processEvidence(proc, "player").find("processes")->array().value()[0].dictionary();
    EXPECT_EQ(*process.find("status"), Value()) << "a link is not followed";
    EXPECT_EQ(*process.find("stat"), Value()) << "a pipe is not waited for";
    EXPECT_EQ(*process.find("wchan"), Value());
    EXPECT_EQ(*process.find("limits"), Value(Array{"Limit  Soft", "Max open files  1024"}));
}

TEST_F(BugEvidenceTest, ALinkInThePlaceOfAProcessIsIgnored)
{
    fs::create_directory(proc / "elsewhere");
    support::writeFile(proc / "elsewhere/comm", "player\n");
    fs::create_directory_symlink("elsewhere", proc / "7");
    support::writeFile(proc / "8", "a file");
    EXPECT_EQ(*processEvidence(proc, "player").find("found"), Value(0));
}

TEST_F(BugEvidenceTest, BytesThatAreNotTextAreReplacedInNamesAsInTheProcessTable)
{
    addProcess(7, "pl\xFFyer");
    support::writeFile(proc / "7/cmdline", "\xFF\xFE\0"s);
    const Dictionary evidence = processEvidence(proc, "pl?yer");
    EXPECT_EQ(*evidence.find("found"), Value(1));
    EXPECT_EQ(*evidence.find("processes")->array().value()[0].dictionary()->find("cmdline"), Value(Array{"??"}));
}

TEST_F(BugEvidenceTest, FindsThisProcessInTheRealTable)
{
    const Dictionary evidence = processEvidence("/proc", LinuxProcessTable().ownProcessName(), ::getpid());
    EXPECT_THAT(pids(evidence), testing::Contains(::getpid()));
}

// --- sound

TEST_F(BugEvidenceTest, KeepsEveryFileOfTheSoundSystem)
{
    addSound("version", "Advanced Linux Sound Architecture\n");
    addSound("card0/pcm0p/sub0/status", "state: RUNNING\nhw_ptr : 4800\n");
    addSound("card0/id", "PCH\n");
    EXPECT_EQ(soundEvidence(proc),
              (Dictionary{{"card0/id", Array{"PCH"}},
                          {"card0/pcm0p/sub0/status", Array{"state: RUNNING", "hw_ptr : 4800"}},
                          {"version", Array{"Advanced Linux Sound Architecture"}}}));
}

TEST_F(BugEvidenceTest, ADeviceWithoutSoundHasNone)
{
    EXPECT_EQ(soundEvidence(proc), Dictionary());
    EXPECT_EQ(soundEvidence(proc / "missing"), Dictionary());
}

TEST_F(BugEvidenceTest, FollowsNoLinksAmongTheSoundFiles)
{
    addSound("card0/id", "PCH\n");
    support::writeFile(proc / "secret", "secret");
    fs::create_directory_symlink("card0", proc / "asound/PCH"); // as the kernel has it
    fs::create_symlink("../secret", proc / "asound/cards");
    fs::create_directory_symlink("..", proc / "asound/up");
    EXPECT_EQ(soundEvidence(proc), (Dictionary{{"card0/id", Array{"PCH"}}}));
}

TEST_F(BugEvidenceTest, KeepsNoMoreSoundFilesAndBytesThanAllowed)
{
    BugEvidenceLimits limits;
    limits.mostSoundFiles = 3;
    limits.longestSoundFile = 4;
    limits.mostSoundBytes = 6;
    for (const char* name : {"a", "b", "c", "d"})
        addSound(name, "12345678");
    EXPECT_EQ(soundEvidence(proc, limits), (Dictionary{{"a", Array{"1234"}}, {"b", Array{"12"}}}));
    limits.mostSoundBytes = 1000;
    EXPECT_EQ(soundEvidence(proc, limits).size(), 3U);
}

TEST_F(BugEvidenceTest, GoesOnlySoDeep)
{
    addSound("1/2/3/4/5/6/file", "deep");
    addSound("1/2/3/4/5/6/7/file", "too deep");
    EXPECT_EQ(soundEvidence(proc), (Dictionary{{"1/2/3/4/5/6/file", Array{"deep"}}}));
}

} // namespace
} // namespace platform
