// SPDX-License-Identifier: Apache-2.0
// Files are distinguished by their identity and not by their times, because clocks are too coarse for short traces.
#include "kesto/trace/TraceResultsPlace.h"

#include "kesto/Terminal.h"
#include "kesto/files/InputFile.h"
#include "kesto/trace/TraceView.h"

#include <cerrno>
#include <fcntl.h>
#include <fmt/format.h>
#include <stdexcept>
#include <sys/stat.h>
#include <system_error>

namespace {

bool isSame(const platform::FileDescriptor& left, const platform::FileDescriptor& right)
{
    struct stat one = {};
    struct stat other = {};
    return left && right && ::fstat(left.get(), &one) == 0 && ::fstat(right.get(), &other) == 0
        && one.st_dev == other.st_dev && one.st_ino == other.st_ino;
}

} // namespace

TraceResultsPlace::TraceResultsPlace(std::filesystem::path path) : path_(std::move(path)), last_(look()) { }

std::string TraceResultsPlace::takeNew()
{
    platform::FileDescriptor now = look();
    if (!now || isSame(now, last_))
        throw std::runtime_error(fmt::format("the service has written no results to {}: its log says why, unless its "
                                             "log directory is another; then name it with --results",
                                             printable(path_.native())));
    last_ = std::move(now);
    return readInput(path_, largestTraceResults);
}

platform::FileDescriptor TraceResultsPlace::look() const
{
    platform::FileDescriptor file(::open(path_.c_str(), O_PATH | O_CLOEXEC));
    if (!file && errno != ENOENT)
        throw std::runtime_error(fmt::format("cannot read {}: {}{}", printable(path_.native()),
                                             std::generic_category().message(errno),
                                             errno == EACCES ? "; as packaged, members of the group kesto can" : ""));
    return file;
}
