// SPDX-License-Identifier: Apache-2.0
// How the providers themselves write to the log.
//
// Providers, and some of their threads, exist before the platform is installed and after it is removed, so they hold a
// log of their own and never use the current platform's.
#pragma once

#include "platform/Log.h"

#include <concepts>
#include <fmt/format.h>
#include <source_location>
#include <string_view>
#include <type_traits>

namespace platform {

// The category of the providers' lines.
inline constinit LogCategory providerCategory{"com.quarn.kesto", "kerl"};

// Copies share the log. Any thread.
class ProviderLog {
public:
    // A format that the compiler checks, and its place in the source.
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

    // Logs a failure; the line says what its owner can do.
    template <typename... Arguments>
    void error(Format<std::type_identity_t<Arguments>...> format, const Arguments&... arguments) const
    {
        write(LogLevel::Error, format.location, format.text, fmt::make_format_args(arguments...));
    }

    // Logs an event that an engineer should see.
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
