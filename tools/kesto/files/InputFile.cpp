// SPDX-License-Identifier: Apache-2.0
// All errors of reading have one form.
#include "kesto/files/InputFile.h"

#include "kesto/Terminal.h"
#include "platform/linux/diagnostics/LinuxFileSystem.h"

#include <cerrno>
#include <fmt/format.h>
#include <stdexcept>
#include <sys/stat.h>
#include <system_error>

namespace {

std::runtime_error cannotRead(const std::filesystem::path& path, const std::string& why)
{
    return std::runtime_error(fmt::format("cannot read {}: {}", printable(path.native()), why));
}

} // namespace

InputFile openInput(const std::filesystem::path& path)
{
    InputFile file(std::fopen(path.c_str(), "re"));
    struct stat status{};
    int error = file && ::fstat(::fileno(file.get()), &status) == 0 ? 0 : errno;
    if (error == 0 && S_ISDIR(status.st_mode))
        error = EISDIR;
    if (error != 0)
        throw cannotRead(path, std::generic_category().message(error));
    return file;
}

std::string readInput(const std::filesystem::path& path, std::size_t largest)
{
    auto text = platform::LinuxFileSystem({}).readFile(path, largest);
    if (text)
        return *std::move(text);
    const bool isNoFile = text.error() == std::errc::invalid_argument;
    throw cannotRead(path, isNoFile ? "it is not a regular file" : text.error().message());
}
