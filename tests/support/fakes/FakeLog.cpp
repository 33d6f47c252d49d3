// SPDX-License-Identifier: Apache-2.0
// Keeps lines in their order; a failing test shows them in full.
#include "support/fakes/FakeLog.h"

#include <algorithm>
#include <ostream>
#include <utility>

namespace support {

void PrintTo(const LogLine& line, std::ostream* out)
{
    *out << platform::name(line.level) << ' ' << line.tag << ' ' << line.file << ':' << line.line << " \""
         << line.message << '"';
}

std::vector<LogLine> FakeLog::lines() const
{
    const foundation::Lock lock(lock_);
    return lines_;
}

std::vector<LogLine> FakeLog::lines(std::string_view tag) const
{
    auto found = lines();
    std::erase_if(found, [tag](const LogLine& line) { return line.tag != tag; });
    return found;
}

std::vector<LogLine> FakeLog::take()
{
    const foundation::Lock lock(lock_);
    return std::exchange(lines_, {});
}

void FakeLog::write(const platform::LogRecord& record)
{
    LogLine line{record.level,
                 std::string(record.category.tag()),
                 std::string(record.message),
                 std::string(record.category.subsystem()),
                 std::string(record.location.file),
                 record.location.line,
                 std::string(record.location.name)};
    if (observer_)
        observer_(line);
    const foundation::Lock lock(lock_);
    lines_.push_back(std::move(line));
}

} // namespace support
