// SPDX-License-Identifier: Apache-2.0
// tracefs describes its formats as text, which differs between kernels: the service compares the parts that it relies
// on before the first event, so that it does not read events in a wrong format.
#include "platform/linux/trace/TracefsInstance.h"

#include "platform/linux/files/FilesAt.h"
#include "platform/linux/files/SmallFile.h"
#include "platform/linux/files/SystemError.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <fcntl.h>
#include <fmt/format.h>
#include <fstream>
#include <sstream>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

namespace platform {
namespace {

namespace fs = std::filesystem;

constexpr std::size_t bytesOfKilobyte = 1024;

TracefsFailure failure(const fs::path& path, std::string_view problem, int error)
{
    return {.what = fmt::format("{} {}: {}", path.native(), problem, systemErrorText(error))};
}

std::unexpected<TracefsFailure> unexpectedFormat(const fs::path& path)
{
    return std::unexpected(TracefsFailure{.what = path.native() + " has another form than this service expects"});
}

// In the table of mounts, blanks and the like stand as three octal digits.
std::string unescaped(std::string_view text)
{
    constexpr std::size_t digits = 3;
    std::string result;
    for (std::size_t place = 0; place < text.size(); ++place) {
        unsigned code = 0;
        const char* const begin = text.data() + place + 1;
        if (text[place] == '\\' && text.size() - place > digits
            && std::from_chars(begin, begin + digits, code, 8).ptr == begin + digits) {
            result += static_cast<char>(code);
            place += digits;
        } else {
            result += text[place];
        }
    }
    return result;
}

FileDescriptor openAt(const FileDescriptor& directory, const char* name, int flags)
{
    return FileDescriptor(::openat(directory.get(), name, flags | O_CLOEXEC | O_NONBLOCK));
}

// 0 or an error number.
int writeAt(const FileDescriptor& directory, const char* name, std::string_view text)
{
    const FileDescriptor file = openAt(directory, name, O_WRONLY | O_TRUNC);
    if (!file)
        return errno;
    return ::write(file.get(), text.data(), text.size()) < 0 ? errno : 0;
}

int writeAt(const FileDescriptor& directory, const char* name, std::size_t number)
{
    return writeAt(directory, name, std::to_string(number));
}

// The number behind the first of these words; nothing if it is missing.
std::optional<std::size_t> numberBehind(std::string_view text, std::string_view word)
{
    const std::size_t place = text.find(word);
    if (place == std::string_view::npos)
        return std::nullopt;
    const std::string_view rest = text.substr(place + word.size());
    std::size_t number = 0;
    if (std::from_chars(rest.data(), rest.data() + rest.size(), number).ec != std::errc())
        return std::nullopt;
    return number;
}

// How many bytes one read returns.
std::size_t pageSize(const fs::path& instance)
{
    constexpr std::size_t most = 1024; // kilobytes
    std::size_t kilobytes = 0;
    std::ifstream(instance / "buffer_subbuf_size_kb") >> kilobytes; // there since Linux 6.8
    if (kilobytes == 0)
        return static_cast<std::size_t>(::sysconf(_SC_PAGESIZE));
    return std::min(kilobytes, most) * bytesOfKilobyte;
}

} // namespace

std::optional<fs::path> findTracefs(const fs::path& mounts)
{
    constexpr std::string_view usualPlace = "/sys/kernel/tracing";
    std::optional<fs::path> found;
    std::ifstream table(mounts);
    for (std::string line; std::getline(table, line);) {
        std::string device;
        std::string place;
        std::string type;
        std::istringstream(line) >> device >> place >> type;
        if (type == "tracefs" && (!found || place == usualPlace))
            found = unescaped(place);
    }
    return found;
}

std::expected<TracefsInstance, TracefsFailure> TracefsInstance::open(const fs::path& tracefs, const std::string& name)
{
    const fs::path path = tracefs / "instances" / name;
    if (::mkdir(path.c_str(), S_IRWXU) != 0 && errno != EEXIST)
        return std::unexpected(failure(path, "cannot be made", errno));
    TracefsInstance instance;
    instance.directory_ = FileDescriptor(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC | O_NOFOLLOW));
    if (!instance.directory_)
        return std::unexpected(failure(path, "cannot be opened", errno));
    if (::flock(instance.directory_.get(), LOCK_EX | LOCK_NB) != 0)
        return std::unexpected(TracefsFailure{.what = path.native() + " is in use by another running service",
                                              .isInUse = errno == EWOULDBLOCK});
    if (const auto done = instance.setUp(path); !done)
        return std::unexpected(done.error());
    return instance;
}

std::expected<void, TracefsFailure> TracefsInstance::setUp(const fs::path& path)
{
    // Times are those of CLOCK_MONOTONIC, in nanoseconds. Setting the clock empties the buffer only if the clock
    // changes; opening `trace` for writing drops the events of an earlier service in any case.
    for (const auto& [name, text] : {std::pair{"tracing_on", "0"}, {"trace_clock", "mono"}, {"trace", ""}})
        if (const int error = writeAt(directory_, name, text); error != 0)
            return std::unexpected(failure(path / name, "cannot be written", error));
    page_.resize(pageSize(path));
    if (const auto read = readFormats(path); !read)
        return read;
    marker_ = openAt(directory_, "trace_marker_raw", O_WRONLY);
    if (!marker_)
        return std::unexpected(failure(path / "trace_marker_raw", "cannot be opened", errno));
    return openPages(path);
}

std::expected<void, TracefsFailure> TracefsInstance::readFormats(const fs::path& path)
{
    // For files of the kernel: their size is known only after reading.
    const auto read = [&](const char* name) {
        std::ostringstream text;
        text << std::ifstream(path / name).rdbuf();
        return text.str();
    };
    const std::string page = read("events/header_page");
    const auto dataOffset = numberBehind(page, "char data;\toffset:");
    const auto commitSize = numberBehind(page, "commit;\toffset:8;\tsize:");
    if (!dataOffset || (commitSize != 4U && commitSize != 8U)
        || *dataOffset < RingBufferPageFormat::commitOffset + *commitSize || *dataOffset >= page_.size())
        return unexpectedFormat(path / "events/header_page");
    pageFormat_ = {.commitSize = *commitSize, .dataOffset = *dataOffset};

    const std::string record = read("events/ftrace/raw_data/format");
    const auto type = numberBehind(record, "ID: ");
    const bool isKnown = record.find("int common_pid;\toffset:4;") != std::string::npos
        && record.find("unsigned int id;\toffset:8;") != std::string::npos
        && record.find("buf[];\toffset:12;") != std::string::npos;
    if (!type || *type > UINT16_MAX || !isKnown)
        return unexpectedFormat(path / "events/ftrace/raw_data/format");
    markerType_ = static_cast<std::uint16_t>(*type);
    return {};
}

std::expected<void, TracefsFailure> TracefsInstance::openPages(const fs::path& path)
{
    constexpr std::size_t mostProcessors = 8192;
    constexpr std::string_view prefix = "cpu";
    const fs::path folder = path / "per_cpu";
    const auto directory = openDirectoryAt(directory_.get(), "per_cpu");
    const auto names = directory ? namesIn(directory->get(), mostProcessors) : std::unexpected(directory.error());
    if (!names)
        return std::unexpected(failure(folder, "cannot be read", names.error().value()));
    for (const std::string& name : *names) {
        std::uint32_t cpu = 0;
        if (!name.starts_with(prefix))
            continue;
        const char* const end = name.data() + name.size();
        const auto read = std::from_chars(name.data() + prefix.size(), end, cpu);
        if (read.ec != std::errc() || read.ptr != end || cpu >= mostProcessors)
            continue;
        FileDescriptor file = openAt(*directory, (name + "/trace_pipe_raw").c_str(), O_RDONLY);
        if (!file)
            return std::unexpected(failure(folder / name / "trace_pipe_raw", "cannot be opened", errno));
        pages_.push_back({cpu, std::move(file)});
    }
    return {};
}

// On a device with little memory a smaller buffer is used.
std::error_code TracefsInstance::switchOn()
{
    int error = writeAt(directory_, "trace", ""); // drops events that came after the last trace
    if (error != 0)
        return {error, std::generic_category()};
    for (std::size_t size = kilobytesWhileOn; size >= fewestKilobytes; size /= 2) {
        error = writeAt(directory_, "buffer_size_kb", size);
        if (error != ENOMEM)
            break;
    }
    if (error == 0)
        error = writeAt(directory_, "tracing_on", "1");
    return {error, std::generic_category()};
}

// Failures are ignored, because they cannot be repaired and have no effect.
void TracefsInstance::switchOff()
{
    static_cast<void>(writeAt(directory_, "tracing_on", "0"));
    static_cast<void>(writeAt(directory_, "buffer_size_kb", kilobytesWhileOff));
}

void TracefsInstance::readPages(const PageHandler& handle)
{
    const std::size_t most = 2 * kilobytesWhileOn * bytesOfKilobyte / page_.size(); // pages hold their heads, too
    for (const Pages& pages : pages_)
        for (std::size_t count = 0; count < most; ++count) {
            const ssize_t size = ::read(pages.file.get(), page_.data(), page_.size());
            if (size <= 0)
                break;
            handle(pages.cpu, std::span(page_).first(static_cast<std::size_t>(size)));
        }
}

} // namespace platform
