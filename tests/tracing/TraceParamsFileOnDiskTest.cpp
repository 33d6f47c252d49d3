// SPDX-License-Identifier: Apache-2.0
// A client may name anything as its file: reading ends without waiting, with an empty record and a log line.
#include "tracing/TraceParamsParser.h"

#include "foundation/plist/PropertyListWriter.h"
#include "platform/linux/diagnostics/LinuxFileSystem.h"
#include "support/TemporaryDirectory.h"
#include "support/TestPlatform.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

namespace {

namespace fs = std::filesystem;
using testing::Contains;
using testing::HasSubstr;
using testing::IsEmpty;

// A new directory that is the process's current directory as long as this object lives.
class CurrentDirectory {
public:
    explicit CurrentDirectory(const fs::path& path)
    {
        fs::create_directory(path);
        fs::current_path(path);
    }
    ~CurrentDirectory() { fs::current_path(before_); }
    CurrentDirectory(const CurrentDirectory&) = delete;
    CurrentDirectory& operator=(const CurrentDirectory&) = delete;

private:
    const fs::path before_ = fs::current_path();
};

class TraceParamsFileOnDisk : public testing::Test {
protected:
    TraceParamsFileOnDisk() { platform.fileSystem.disk = &disk; }

    std::unique_ptr<TraceParams> load(const fs::path& path)
    {
        platform.log.clear();
        return TraceParamsParser(path.native()).loadTraceParams();
    }
    void expectRefused(const fs::path& path, std::errc why)
    {
        const auto params = load(path);
        EXPECT_EQ(params->name, "");
        EXPECT_THAT(params->traceDataParams, IsEmpty());
        EXPECT_THAT(platform.log.lines(),
                    Contains(support::IsLine(platform::LogLevel::Error, "kert",
                                             "Reading from plist file failed with error: "
                                                 + std::make_error_code(why).message())))
            << path;
    }

    const support::TemporaryDirectory directory;
    const fs::path root = directory.path();
    platform::LinuxFileSystem disk{root / "logs"};
    support::TestPlatform platform;
    const std::string list = support::xmlPropertyList(foundation::Dictionary{
        {"Children", foundation::Array{foundation::Dictionary{{"Name", "Audio"}, {"Children", foundation::Array()}}}}});
};

TEST_F(TraceParamsFileOnDisk, IsReadAlsoThroughALink)
{
    support::writeFile(root / "traces.plist", list);
    EXPECT_EQ(load(root / "traces.plist")->name, "Audio");
    fs::create_symlink("traces.plist", root / "link");
    EXPECT_EQ(load(root / "link")->name, "Audio");
}

TEST_F(TraceParamsFileOnDisk, ThatIsAPipeIsNotWaitedFor)
{
    ASSERT_EQ(::mkfifo((root / "pipe").c_str(), 0600), 0);
    expectRefused(root / "pipe", std::errc::invalid_argument);
    const int writer = ::open((root / "pipe").c_str(), O_RDWR | O_CLOEXEC);
    ASSERT_EQ(::write(writer, list.data(), list.size()), static_cast<ssize_t>(list.size()));
    expectRefused(root / "pipe", std::errc::invalid_argument);
    ::close(writer);
}

TEST_F(TraceParamsFileOnDisk, ThatIsADeviceOrADirectoryOrASocketIsNotRead)
{
    expectRefused("/dev/zero", std::errc::invalid_argument);
    expectRefused("/dev/null", std::errc::invalid_argument);
    expectRefused("/dev/tty", std::errc::invalid_argument);
    expectRefused(root, std::errc::invalid_argument);
    expectRefused("", std::errc::invalid_argument); // the current directory

    const int socket = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_un address{.sun_family = AF_UNIX, .sun_path = {}};
    (root / "socket").native().copy(address.sun_path, sizeof address.sun_path - 1);
    ASSERT_EQ(::bind(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    expectRefused(root / "socket", std::errc::invalid_argument);
    ::close(socket);
}

TEST_F(TraceParamsFileOnDisk, ThatIsAGigabyteIsNotRead)
{
    support::writeFile(root / "huge", list);
    fs::resize_file(root / "huge", std::uintmax_t{1} << 30);
    expectRefused(root / "huge", std::errc::file_too_large);
}

TEST_F(TraceParamsFileOnDisk, ThatIsMissingOrLeadsNowhereIsNotRead)
{
    expectRefused(root / "missing", std::errc::no_such_file_or_directory);
    fs::create_symlink("circle", root / "circle");
    expectRefused(root / "circle", std::errc::too_many_symbolic_link_levels);
    expectRefused(root / std::string(300, 'x'), std::errc::filename_too_long);
    expectRefused("/" + std::string(100'000, 'x'), std::errc::filename_too_long);
}

TEST_F(TraceParamsFileOnDisk, WithARelativePathIsNotReadWhenTheCurrentDirectoryIsGone)
{
    const CurrentDirectory gone(root / "gone");
    fs::remove(root / "gone");
    expectRefused("traces.plist", std::errc::no_such_file_or_directory);
}

TEST_F(TraceParamsFileOnDisk, WhosePathHasANulIsNotTheFileBeforeIt)
{
    support::writeFile(root / "traces.plist", list);
    expectRefused((root / "traces.plist").native() + '\0' + "x", std::errc::invalid_argument);
}

} // namespace
