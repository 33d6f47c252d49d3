// Pipes and devices are refused rather than waited for.
#include "TraceInput.h"

#include "Terminal.h"
#include "platform/linux/LinuxFileSystem.h"

#include <fmt/format.h>
#include <stdexcept>

std::string readTraceInput(const std::filesystem::path& path, std::size_t largest)
{
    auto text = platform::LinuxFileSystem({}).readFile(path, largest);
    if (text)
        return *std::move(text);
    const bool isNoFile = text.error() == std::errc::invalid_argument;
    throw std::runtime_error(fmt::format("{} cannot be read: {}", printable(path.native()),
                                         isNoFile ? "it is not a regular file" : text.error().message()));
}
