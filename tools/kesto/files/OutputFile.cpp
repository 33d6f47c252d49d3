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

void writeOutput(const std::filesystem::path& path, std::string_view text)
{
    constexpr mode_t asTheUmaskAllows = 0666;
    const platform::FileDescriptor file(
        ::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_NOCTTY | O_CLOEXEC, asTheUmaskAllows));
    if (const int error = file ? platform::writeAll(file.get(), text) : errno; error != 0)
        throw std::runtime_error(
            fmt::format("cannot write {}: {}", printable(path.native()), std::generic_category().message(error)));
}
