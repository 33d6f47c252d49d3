// All errors of writing have one form.
#include "kesto/files/OutputFile.h"

#include "kesto/Terminal.h"
#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/files/WriteAll.h"

#include <cerrno>
#include <fcntl.h>
#include <fmt/format.h>
#include <stdexcept>
#include <sys/stat.h>
#include <system_error>
#include <unistd.h>

namespace {

constexpr mode_t asTheUmaskAllows = 0666;

std::runtime_error failure(const std::filesystem::path& path, int error)
{
    return std::runtime_error(
        fmt::format("cannot write {}: {}", printable(path.native()), std::generic_category().message(error)));
}

} // namespace

void writeOutput(const std::filesystem::path& path, std::string_view text)
{
    const platform::FileDescriptor file(
        ::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_NOCTTY | O_CLOEXEC, asTheUmaskAllows));
    if (const int error = file ? platform::writeAll(file.get(), text) : errno; error != 0)
        throw failure(path, error);
}

void writeWholeOutput(const std::filesystem::path& path, std::string_view text)
{
    struct stat before{};
    const bool isThere = ::stat(path.c_str(), &before) == 0;
    if (isThere && !S_ISREG(before.st_mode))
        return writeOutput(path, text);
    std::error_code unresolved; // a path that cannot be resolved cannot be written either, which the next call says
    const std::filesystem::path place = isThere ? std::filesystem::canonical(path, unresolved) : path;
    const std::string beside = fmt::format("{}.{}.new", place.native(), ::getpid());
    const mode_t permissions = isThere ? before.st_mode & ACCESSPERMS : asTheUmaskAllows;
    platform::FileDescriptor file(
        ::open(beside.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, permissions));
    if (!file)
        throw failure(path, errno);
    int error = isThere && ::fchmod(file.get(), permissions) != 0 ? errno : platform::writeAll(file.get(), text);
    file = {};
    if (error == 0 && ::rename(beside.c_str(), place.c_str()) == 0)
        return;
    error = error == 0 ? errno : error;
    ::unlink(beside.c_str());
    throw failure(path, error);
}
