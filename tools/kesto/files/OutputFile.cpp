// What cannot be written is told in one form.
#include "kesto/files/OutputFile.h"

#include "kesto/Terminal.h"
#include "platform/linux/files/FileDescriptor.h"

#include <cerrno>
#include <fcntl.h>
#include <fmt/format.h>
#include <stdexcept>
#include <sys/stat.h>
#include <system_error>
#include <unistd.h>

bool writeAll(int file, std::string_view text)
{
    while (!text.empty()) {
        const ssize_t count = ::write(file, text.data(), text.size());
        if (count >= 0)
            text.remove_prefix(static_cast<std::size_t>(count));
        else if (errno != EINTR)
            return false;
    }
    return true;
}

void writeOutput(const std::filesystem::path& path, std::string_view text)
{
    constexpr mode_t asTheUmaskAllows = 0666;
    const platform::FileDescriptor file(
        ::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_NOCTTY | O_CLOEXEC, asTheUmaskAllows));
    if (!file || !writeAll(file.get(), text))
        throw std::runtime_error(
            fmt::format("cannot write {}: {}", printable(path.native()), std::generic_category().message(errno)));
}
