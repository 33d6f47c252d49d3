// How the providers themselves write to the log.
//
// They are made, and some of their threads run, before the platform is installed and after it is taken away,
// so they hold the log that they were given and never ask for the current one.
#pragma once

#include "platform/Log.h"

#include <concepts>
#include <fmt/format.h>
#include <source_location>
#include <string_view>
#include <type_traits>

namespace platform {

// The category of what the providers have to say.
inline constinit LogCategory providerCategory{"com.quarn.kesto", "kerl"};

// A copy is as good as the original. Any thread.
class ProviderLog {
public:
    // A format that is checked when it is compiled, and the line that it stands in.
    template <typename... Arguments> struct Format {
        template <std::convertible_to<std::string_view> Text>
        consteval Format(const Text& given, std::source_location where = std::source_location::current())
            : text(given),
              location(where.file_name(), static_cast<int>(where.line()))
        {
        }
        fmt::format_string<Arguments...> text;
        LogLocation location;
    };

    // The log outlives every provider.
    explicit ProviderLog(Log& log) noexcept : log_(&log) { }

    // Something does not work, and its owner can do something about it: the line says what.
    template <typename... Arguments>
    void error(Format<std::type_identity_t<Arguments>...> format, const Arguments&... arguments) const
    {
        write(LogLevel::Error, format.location, format.text, fmt::make_format_args(arguments...));
    }

    // Something worth knowing happened.
    template <typename... Arguments>
    void note(Format<std::type_identity_t<Arguments>...> format, const Arguments&... arguments) const
    {
        write(LogLevel::Default, format.location, format.text, fmt::make_format_args(arguments...));
    }

private:
    void write(LogLevel level, LogLocation location, fmt::string_view format, fmt::format_args arguments) const
    {
        if (level <= log_->threshold(providerCategory))
            log_->write({providerCategory, level, location, fmt::vformat(format, arguments)});
    }

    Log* log_;
};

} // namespace platform
