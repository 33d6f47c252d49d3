// SPDX-License-Identifier: Apache-2.0
// A file that is replaced as a whole is the business of FileReplacement; here is found which file that is.
#include "kesto/files/OutputFile.h"

#include "kesto/Terminal.h"
#include "kesto/files/FileReplacement.h"
#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/files/WriteAll.h"

#include <cerrno>
#include <fcntl.h>
#include <fmt/format.h>
#include <stdexcept>
#include <sys/stat.h>
#include <system_error>
#include <unistd.h>

namespace fs = std::filesystem;

namespace {

constexpr mode_t asTheUmaskAllows = 0666;

std::runtime_error failure(const fs::path& path, int error)
{
    return std::runtime_error(
        fmt::format("cannot write {}: {}", printable(path.native()), std::generic_category().message(error)));
}

// The system tells the mask only in exchange for another.
mode_t fileModeMask()
{
    const mode_t mask = ::umask(0);
    ::umask(mask);
    return mask;
}

// Where links lead to that end at no file.
fs::path behindLinks(fs::path path)
{
    while (fs::is_symlink(path))
        path = path.parent_path() / fs::read_symlink(path);
    return path;
}

} // namespace

void writeOutput(const fs::path& path, std::string_view text)
{
    const platform::FileDescriptor file(
        ::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_NOCTTY | O_CLOEXEC, asTheUmaskAllows));
    if (const int error = file ? platform::writeAll(file.get(), text) : errno; error != 0)
        throw failure(path, error);
}

void writeWholeOutput(const fs::path& path, std::string_view text)
{
    struct stat before{};
    const int error = ::stat(path.c_str(), &before) == 0 ? 0 : errno;
    if (error != 0 && error != ENOENT)
        throw failure(path, error);
    if (error == 0 && !S_ISREG(before.st_mode))
        return writeOutput(path, text);
    replaceFile(error == 0 ? fs::canonical(path) : behindLinks(path), text, asTheUmaskAllows & ~fileModeMask());
}
