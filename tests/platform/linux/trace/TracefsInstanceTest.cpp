// SPDX-License-Identifier: Apache-2.0
// An instance on an imitation of tracefs: how it is found, set up, taken over and read, and the errors of each step.
#include "platform/linux/trace/TracefsInstance.h"
#include "platform/linux/trace/ImitatedTracefs.h"

#include <gmock/gmock.h>
#include <sys/file.h>

namespace platform {
namespace {

namespace fs = std::filesystem;
using support::readFile;
using support::RingBufferPageBuilder;
using support::TracefsTree;
using support::writeFile;
using testing::ElementsAre;
using testing::EndsWith;
using testing::HasSubstr;
using testing::IsEmpty;

class TracefsInstanceTest : public testing::Test {
protected:
    [[nodiscard]] std::expected<TracefsInstance, TracefsFailure> open() const
    {
        return TracefsInstance::open(tree.directory.path() / "tracing", "kesto");
    }
    [[nodiscard]] std::string problem() const
    {
        const auto opened = open();
        return opened ? "" : opened.error().what;
    }
    static std::vector<std::string> pagesOf(TracefsInstance& instance)
    {
        std::vector<std::string> pages;
        instance.readPages([&](std::uint32_t cpu, std::span<const std::byte> page) {
            pages.push_back(std::to_string(cpu) + ":"
                            + std::string(reinterpret_cast<const char*>(page.data()), page.size()));
        });
        return pages;
    }

    TracefsTree tree;
};

TEST_F(TracefsInstanceTest, IsFoundWhereTracefsIsMounted)
{
    EXPECT_EQ(findTracefs(tree.mounts), tree.directory.path() / "tracing");
    writeFile(tree.mounts, "proc /proc proc rw 0 0\ntracefs /elsewhere ext4 rw 0 0\n");
    EXPECT_EQ(findTracefs(tree.mounts), std::nullopt);
    writeFile(tree.mounts, "t /a\\040b\\134c tracefs rw 0 0\n");
    EXPECT_EQ(findTracefs(tree.mounts), "/a b\\c");
    writeFile(tree.mounts, "t /first tracefs rw 0 0\nt /sys/kernel/tracing tracefs rw 0 0\nt /last tracefs rw 0 0\n");
    EXPECT_EQ(findTracefs(tree.mounts), "/sys/kernel/tracing");
    writeFile(tree.mounts, "t /odd\\04 tracefs rw 0 0\n");
    EXPECT_EQ(findTracefs(tree.mounts), "/odd\\04");
    EXPECT_EQ(findTracefs(tree.mounts / "none"), std::nullopt);
}

TEST_F(TracefsInstanceTest, IsTakenOverSwitchedOffAndEmpty)
{
    const auto instance = open();
    ASSERT_TRUE(instance) << instance.error().what;
    EXPECT_EQ(tree.content("tracing_on"), "0");
    EXPECT_EQ(tree.content("trace_clock"), "mono");
    EXPECT_EQ(tree.content("trace"), "");
    EXPECT_EQ(tree.content("buffer_size_kb"), "before") << "a buffer takes no memory before the first trace";
    EXPECT_EQ(instance->markerType(), 19U);
    EXPECT_EQ(instance->pageFormat().dataOffset, 16U);
    EXPECT_EQ(instance->pageFormat().commitSize, 8U);
}

TEST_F(TracefsInstanceTest, IsSwitchedOnWithRoomAndOffWithout)
{
    auto instance = open();
    ASSERT_TRUE(instance);
    writeFile(tree.instance / "trace", "late");
    EXPECT_FALSE(instance->switchOn());
    EXPECT_EQ(tree.content("trace"), "");
    EXPECT_EQ(tree.content("buffer_size_kb"), "8192");
    EXPECT_EQ(tree.content("tracing_on"), "1");
    instance->switchOff();
    EXPECT_EQ(tree.content("buffer_size_kb"), "4");
    EXPECT_EQ(tree.content("tracing_on"), "0");
    fs::remove(tree.instance / "tracing_on");
    EXPECT_EQ(instance->switchOn(), std::errc::no_such_file_or_directory);
}

TEST_F(TracefsInstanceTest, HandsOutAllPagesOfAllProcessors)
{
    auto instance = open();
    ASSERT_TRUE(instance);
    EXPECT_THAT(pagesOf(*instance), IsEmpty());
    const std::string one = RingBufferPageBuilder(1).page();
    const std::string two = RingBufferPageBuilder(2).page();
    tree.put(1, one);
    tree.put(0, two);
    tree.put(1, two);
    EXPECT_THAT(pagesOf(*instance), ElementsAre("0:" + two, "1:" + one, "1:" + two));
    EXPECT_THAT(pagesOf(*instance), IsEmpty());
}

TEST_F(TracefsInstanceTest, TakesItsMarkersRecords)
{
    const auto instance = open();
    ASSERT_TRUE(instance);
    fs::resize_file(tree.instance / "trace_marker_raw", 0);
    const EmittedEvent record{.code = 7};
    EXPECT_EQ(::write(instance->marker(), &record, sizeof record), 40);
    EXPECT_EQ(tree.content("trace_marker_raw").substr(0, 4), "KSTO");
}

TEST_F(TracefsInstanceTest, BelongsToOneServiceAtATime)
{
    auto instance = open();
    ASSERT_TRUE(instance);
    const auto second = open();
    ASSERT_FALSE(second);
    EXPECT_TRUE(second.error().isInUse);
    EXPECT_THAT(second.error().what, EndsWith("instances/kesto is in use by another running service"));
    {
        const TracefsInstance gone = *std::move(instance);
    }
    EXPECT_TRUE(open()) << "the lock ends with its owner";
}

TEST_F(TracefsInstanceTest, SaysWhatItCannotDo)
{
    const auto folder = tree.instance.parent_path();
    fs::rename(folder, tree.directory.path() / "kept");
    EXPECT_THAT(problem(), EndsWith("instances/kesto cannot be made: No such file or directory"));
    writeFile(folder, "a file in its place");
    EXPECT_THAT(problem(), EndsWith("instances/kesto cannot be made: Not a directory"));
    fs::remove(folder);
    fs::rename(tree.directory.path() / "kept", folder);
    for (const char* file : {"tracing_on", "trace_clock", "trace"}) {
        fs::rename(tree.instance / file, tree.instance / "kept");
        EXPECT_THAT(problem(),
                    EndsWith("instances/kesto/" + std::string(file) + " cannot be written: No such file or directory"));
        fs::rename(tree.instance / "kept", tree.instance / file);
    }
    fs::rename(tree.instance / "trace_marker_raw", tree.instance / "kept");
    EXPECT_THAT(problem(), EndsWith("trace_marker_raw cannot be opened: No such file or directory"));
    fs::rename(tree.instance / "kept", tree.instance / "trace_marker_raw");
    fs::remove(tree.instance / "per_cpu/cpu1/trace_pipe_raw");
    EXPECT_THAT(problem(), EndsWith("per_cpu/cpu1/trace_pipe_raw cannot be opened: No such file or directory"));
    fs::remove_all(tree.instance / "per_cpu");
    EXPECT_THAT(problem(), EndsWith("per_cpu cannot be read: No such file or directory"));
}

TEST_F(TracefsInstanceTest, IsNotUsedWhenTheKernelsFormatsAreOthers)
{
    for (const char* file : {"events/header_page", "events/ftrace/raw_data/format"}) {
        const fs::path path = tree.instance / file;
        const std::string right = readFile(path);
        const std::string expected = std::string(file) + " has another form than this service expects";
        for (const std::string_view number :
             {"offset:8;", "size:8;", "offset:16;", "offset:12;", "offset:4;", "ID: 19"}) {
            const std::size_t place = right.rfind(number);
            if (place == std::string::npos || (std::string_view(file).ends_with("page") && number == "offset:8;"))
                continue;
            std::string wrong = right;
            wrong.replace(place, number.size(),
                          number.starts_with("ID") ? "ID: 65536" : "offset:99999999999999999999;");
            writeFile(path, wrong);
            if (number == "size:8;") // the size of the timestamp is not checked
                continue;
            EXPECT_THAT(problem(), EndsWith(expected)) << number;
        }
        writeFile(path, "");
        EXPECT_THAT(problem(), EndsWith(expected));
        writeFile(path, right);
    }
    EXPECT_EQ(problem(), "");
}

TEST_F(TracefsInstanceTest, IsNotUsedWhenPagesWouldHoldLessThanTheirHeadOrNothingElse)
{
    const fs::path path = tree.instance / "events/header_page";
    const std::string right = readFile(path);
    const auto problemWithOffset = [&](const std::string& offset) {
        std::string changed = right;
        writeFile(path, changed.replace(right.find("offset:16;"), 10, "offset:" + offset + ";"));
        return problem();
    };
    EXPECT_EQ(problemWithOffset("4095"), "");
    EXPECT_EQ(problemWithOffset("16"), "");
    for (const char* offset : {"0", "15", "4096", "5000", "9223372036854775807"})
        EXPECT_THAT(problemWithOffset(offset),
                    EndsWith("events/header_page has another form than this service expects"))
            << offset;
}

TEST_F(TracefsInstanceTest, HasPagesOfKernelsWith32Or64Bits)
{
    const fs::path path = tree.instance / "events/header_page";
    const std::string right = readFile(path);
    const std::string commit = "commit;\toffset:8;\tsize:";
    const auto setCommitSize = [&](const std::string& size) {
        std::string changed = right;
        writeFile(path, changed.replace(right.find(commit), commit.size() + 1, commit + size));
    };
    for (const char* size : {"3", "5", "7", "9"}) {
        setCommitSize(size);
        EXPECT_THAT(problem(), EndsWith("events/header_page has another form than this service expects")) << size;
    }
    setCommitSize("4");
    const auto instance = open();
    ASSERT_TRUE(instance) << instance.error().what;
    EXPECT_EQ(instance->pageFormat().commitSize, 4U);
}

TEST_F(TracefsInstanceTest, MayHaveAnyTypeOfRecordThatARecordCanHold)
{
    const fs::path path = tree.instance / "events/ftrace/raw_data/format";
    std::string changed = readFile(path);
    writeFile(path, changed.replace(changed.find("ID: 19"), 6, "ID: 65535"));
    const auto instance = open();
    ASSERT_TRUE(instance) << instance.error().what;
    EXPECT_EQ(instance->markerType(), 65535U);
}

TEST_F(TracefsInstanceTest, LooksOnlyAtProcessors)
{
    for (const char* name : {"cpu", "cpux", "cpu-1", "cpu99999999999", "other"})
        fs::create_directories(tree.instance / "per_cpu" / name);
    EXPECT_EQ(problem(), "");
}

TEST_F(TracefsInstanceTest, IsNotReachedThroughALink)
{
    fs::rename(tree.instance, tree.directory.path() / "kept");
    fs::create_directory_symlink(tree.directory.path() / "kept", tree.instance);
    EXPECT_THAT(problem(), HasSubstr("cannot be opened"));
}

} // namespace
} // namespace platform
