// Makes a record of an enabled statement: the message is formatted here for all statements, so that each statement is a
// small call.
#include "platform/Log.h"

#include "platform/Platform.h"

#include <fmt/format.h>

namespace platform {

std::string_view name(LogLevel level) noexcept
{
    switch (level) {
    case LogLevel::Error: return "error";
    case LogLevel::Default: return "default";
    case LogLevel::Info: return "info";
    case LogLevel::Debug: return "debug";
    }
    return "unknown";
}

std::string logPrefix(const LogLocation& location)
{
    return fmt::format("{:>25}:{:<5} ", location.name, location.line);
}

void writeFormattedLog(const LogCategory& category, LogLevel level, LogLocation location, fmt::string_view format,
                       fmt::format_args arguments)
{
    const std::string message = fmt::vformat(format, arguments);
    current().log.write({category, level, location, message});
}

} // namespace platform
