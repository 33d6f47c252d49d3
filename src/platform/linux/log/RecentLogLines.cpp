// SPDX-License-Identifier: Apache-2.0
// Times become text only when a bug is captured: lines are frequent, bugs are rare.
#include "platform/linux/log/RecentLogLines.h"

#include "foundation/text/LocalTime.h"
#include "foundation/values/String.h"

#include <cmath>
#include <fmt/format.h>
#include <iterator>

namespace platform {

void RecentLogLines::add(double time, LogLevel level, std::string_view tag, std::string_view line)
{
    std::string text(foundation::cutBetweenCharacters(line, longestLine));
    const foundation::Lock lock(lock_);
    bytes_ += text.size();
    lines_.push_back({time, level, tag, std::move(text)});
    while (lines_.size() > mostLines || bytes_ > mostBytes) {
        bytes_ -= lines_.front().text.size();
        lines_.pop_front();
    }
}

std::string RecentLogLines::text() const
{
    const foundation::Lock lock(lock_);
    std::string text;
    for (const Line& line : lines_)
        fmt::format_to(std::back_inserter(text), "{}.{:03} {:<7} {} {}\n",
                       foundation::localTimeText(line.time, "{:%Y-%m-%d %H:%M:%S}"),
                       static_cast<int>((line.time - std::floor(line.time)) * 1000), name(line.level), line.tag,
                       line.text);
    return text;
}

} // namespace platform
