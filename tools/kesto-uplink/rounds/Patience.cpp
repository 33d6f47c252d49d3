// SPDX-License-Identifier: Apache-2.0
// The file has one line: epoch, ID, and when the wait began in seconds since 1970. It is replaced as a whole; half a
// line counts as no wait.
#include "kesto-uplink/rounds/Patience.h"

#include <fmt/format.h>

#include <fstream>
#include <optional>
#include <system_error>

namespace kesto_uplink {

namespace {

struct Wait {
    Cursor stored;
    double since = 0;
};

std::optional<Wait> read(const std::filesystem::path& file)
{
    std::ifstream stream(file);
    Wait wait;
    std::string end;
    if (stream >> wait.stored.epoch >> wait.stored.id >> wait.since >> end && end == "end")
        return wait;
    return std::nullopt;
}

void write(const std::filesystem::path& file, const Wait& wait)
{
    auto temporary = file;
    temporary += ".new";
    std::ofstream stream(temporary);
    stream << fmt::format("{} {} {:.0f} end\n", wait.stored.epoch, wait.stored.id, wait.since);
    stream.close();
    std::error_code ignored;
    if (stream)
        std::filesystem::rename(temporary, file, ignored);
}

} // namespace

void Patience::rest()
{
    std::error_code ignored;
    std::filesystem::remove(file_, ignored);
}

void Patience::wait(const Cursor& stored, double now)
{
    const auto wait = read(file_);
    if (!wait || wait->stored != stored || wait->since > now)
        write(file_, {stored, now});
}

bool Patience::isOver(const Cursor& stored, double now) const
{
    const auto wait = read(file_);
    return wait && wait->stored == stored && now - wait->since > std::chrono::duration<double>(limit).count();
}

} // namespace kesto_uplink
