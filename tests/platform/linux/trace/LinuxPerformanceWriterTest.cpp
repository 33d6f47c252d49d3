// SPDX-License-Identifier: Apache-2.0
// Performance data: the content of a file, the time at which it gets its name, and the log lines of failures.
#include "platform/linux/trace/LinuxPerformanceWriter.h"
#include "platform/linux/diagnostics/LinuxFileSystem.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeFiles.h"
#include "support/fakes/FakeLog.h"

#include <gmock/gmock.h>
#include <limits>
#include <sys/mman.h>

namespace {

namespace fs = std::filesystem;
using enum platform::LogLevel;
using platform::PerformanceUnit;
using support::IsLine;
using support::readFile;
using testing::ElementsAre;
using testing::EndsWith;
using testing::IsEmpty;
using testing::StartsWith;

class LinuxPerformanceWriterTest : public testing::Test {
protected:
    auto open() { return writer.open(path, "KestoReporting", 4); }
    [[nodiscard]] std::size_t namesInDirectory() const
    {
        return static_cast<std::size_t>(
            std::distance(fs::directory_iterator(directory.path()), fs::directory_iterator()));
    }

    support::TemporaryDirectory directory;
    const fs::path path = directory.path() / "results";
    support::FakeLog log;
    platform::LinuxFileSystem files{directory.path()};
    platform::LinuxPerformanceWriter writer{files, platform::ProviderLog(log)};
};

TEST_F(LinuxPerformanceWriterTest, WritesADocumentWithOneRecordALine)
{
    auto file = open();
    file->write("mix", 187'250, PerformanceUnit::Nanoseconds);
    file->write("mix", 0.5, PerformanceUnit::Nanoseconds);
    file->write("render", 18'446'744'073'709'551'615.0, PerformanceUnit::Nanoseconds);
    file.reset();
    EXPECT_EQ(readFile(path), R"({"project":"KestoReporting","version":4,"records":[
{"name":"mix","value":187250,"unit":"ns"},
{"name":"mix","value":0.5,"unit":"ns"},
{"name":"render","value":1.8446744073709552e+19,"unit":"ns"}
],"lostValues":0}
)");
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(LinuxPerformanceWriterTest, WritesADocumentWithoutRecordsToo)
{
    open().reset();
    EXPECT_EQ(readFile(path), "{\"project\":\"KestoReporting\",\"version\":4,\"records\":[\n],\"lostValues\":0}\n");
}

TEST_F(LinuxPerformanceWriterTest, WritesRemarksBehindTheRecords)
{
    auto file = open();
    file->remark("lostEvents", std::uint64_t{1840});
    file->write("mix", 1, PerformanceUnit::Nanoseconds);
    file->remark("problem", "\"a\"");
    file.reset();
    EXPECT_EQ(readFile(path), R"({"project":"KestoReporting","version":4,"records":[
{"name":"mix","value":1,"unit":"ns"}
],"lostEvents":1840,"problem":"\"a\"","lostValues":0}
)");
}

TEST_F(LinuxPerformanceWriterTest, WritesNamesAsJsonText)
{
    auto file = open();
    file->write("", 1, PerformanceUnit::Nanoseconds);
    file->write("a \"b\"\\\n\x01", 2, PerformanceUnit::Nanoseconds);
    file->write("é", 3, PerformanceUnit::Nanoseconds);
    file.reset();
    EXPECT_EQ(readFile(path), R"({"project":"KestoReporting","version":4,"records":[
{"name":"","value":1,"unit":"ns"},
{"name":"a \"b\"\\\n\u0001","value":2,"unit":"ns"},
{"name":"é","value":3,"unit":"ns"}
],"lostValues":0}
)");
}

TEST_F(LinuxPerformanceWriterTest, WritesNullForNumbersThatJsonCannotExpress)
{
    auto file = open();
    file->write("a", std::numeric_limits<double>::quiet_NaN(), PerformanceUnit::Nanoseconds);
    file->write("a", std::numeric_limits<double>::infinity(), PerformanceUnit::Nanoseconds);
    file.reset();
    EXPECT_EQ(readFile(path), R"({"project":"KestoReporting","version":4,"records":[
{"name":"a","value":null,"unit":"ns"},
{"name":"a","value":null,"unit":"ns"}
],"lostValues":0}
)");
}

TEST_F(LinuxPerformanceWriterTest, WritesEveryRecordOfALargeFile)
{
    constexpr int count = 20'000;
    auto file = open();
    std::string expected = "{\"project\":\"KestoReporting\",\"version\":4,\"records\":[";
    for (int value = 0; value < count; ++value) {
        file->write("interval", value, PerformanceUnit::Nanoseconds);
        expected += (value == 0 ? "\n" : ",\n") + std::string(R"({"name":"interval","value":)") + std::to_string(value)
            + R"(,"unit":"ns"})";
    }
    file.reset();
    EXPECT_TRUE(readFile(path) == expected + "\n],\"lostValues\":0}\n");
}

TEST_F(LinuxPerformanceWriterTest, LosesRecordsThatWouldMakeTheFileTooLargeAndSaysHowMany)
{
    constexpr std::size_t largest = 1000;
    platform::LinuxPerformanceWriter limited(files, platform::ProviderLog(log), largest);
    auto file = limited.open(path, "p", 1);
    file->write(std::string(2 * largest, 'a'), 1, PerformanceUnit::Nanoseconds);
    file->write("b", 2, PerformanceUnit::Nanoseconds);
    file->write(std::string(largest, 'c'), 3, PerformanceUnit::Nanoseconds);
    file.reset();
    EXPECT_EQ(readFile(path), R"({"project":"p","version":1,"records":[
{"name":"b","value":2,"unit":"ns"}
],"lostValues":2}
)");
    EXPECT_THAT(log.lines(),
                ElementsAre(IsLine(Error, "kerl", path.string() + " has become too large; 2 records are lost")));
}

// A very long name; reading it ends the test program.
class UnreadableName {
public:
    explicit UnreadableName(std::size_t size)
        : size_(size),
          place_(::mmap(nullptr, size, PROT_NONE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0))
    {
    }
    ~UnreadableName() { ::munmap(place_, size_); }
    UnreadableName(const UnreadableName&) = delete;
    UnreadableName& operator=(const UnreadableName&) = delete;

    [[nodiscard]] std::string_view text() const { return {static_cast<const char*>(place_), size_}; }

private:
    const std::size_t size_;
    void* const place_;
};

TEST_F(LinuxPerformanceWriterTest, DoesNotReadANameThatIsLongerThanTheRoom)
{
    constexpr std::size_t largest = 1000;
    const UnreadableName name(largest);
    platform::LinuxPerformanceWriter limited(files, platform::ProviderLog(log), largest);
    auto file = limited.open(path, "p", 1);
    file->write(name.text(), 1, PerformanceUnit::Nanoseconds);
    file.reset();
    EXPECT_THAT(readFile(path), EndsWith("\n],\"lostValues\":1}\n"));
}

TEST_F(LinuxPerformanceWriterTest, DoesNotReadANameAsLongAsOneThatDidNotFitAsJsonText)
{
    constexpr std::size_t largest = 1000;
    constexpr std::size_t size = 500;
    const UnreadableName name(size);
    platform::LinuxPerformanceWriter limited(files, platform::ProviderLog(log), largest);
    auto file = limited.open(path, "p", 1);
    file->write(std::string(size, '\x01'), 1, PerformanceUnit::Nanoseconds);
    file->write(name.text(), 2, PerformanceUnit::Nanoseconds);
    file->write("b", 3, PerformanceUnit::Nanoseconds);
    file.reset();
    EXPECT_EQ(readFile(path), R"({"project":"p","version":1,"records":[
{"name":"b","value":3,"unit":"ns"}
],"lostValues":2}
)");
}

TEST_F(LinuxPerformanceWriterTest, PutsTheFileInThePlaceOfALinkAndLeavesAloneWhatItPointedTo)
{
    const fs::path target = directory.path() / "target";
    support::writeFile(target, "precious");
    fs::create_symlink(target, path);
    open().reset();
    EXPECT_FALSE(fs::is_symlink(path));
    EXPECT_EQ(readFile(target), "precious");
}

TEST_F(LinuxPerformanceWriterTest, OpensNoFileWhoseDirectoryIsMissingAndSaysSo)
{
    EXPECT_EQ(writer.open(directory.path() / "missing/results", "p", 1), nullptr);
    EXPECT_THAT(log.lines(),
                ElementsAre(IsLine(Error, "kerl",
                                   (directory.path() / "missing/results").string()
                                       + " cannot be opened (No such file or directory): let the user of the service "
                                         "write there")));
}

TEST_F(LinuxPerformanceWriterTest, OpensNoFileWhereADirectoryStandsAndSaysSo)
{
    fs::create_directory(path);
    EXPECT_EQ(open(), nullptr);
    EXPECT_THAT(log.lines(), ElementsAre(IsLine(Error, "kerl", path.string() + " is a directory: remove it")));
    EXPECT_EQ(namesInDirectory(), 1U);
}

TEST(PerformanceWriterOnAFullDisk, SaysThatTheResultsAreLost)
{
    support::FakeLog log;
    support::FakeFileSystem files;
    files.writeError = std::make_error_code(std::errc::no_space_on_device);
    platform::LinuxPerformanceWriter writer(files, platform::ProviderLog(log));
    writer.open("/diagnostics/results", "p", 1).reset();
    EXPECT_THAT(files.files, IsEmpty());
    EXPECT_THAT(log.lines(),
                ElementsAre(IsLine(Error, "kerl",
                                   "/diagnostics/results cannot be written (No space left on device); its results are "
                                   "lost")));
}

} // namespace
