// SPDX-License-Identifier: Apache-2.0
// Every change that leaves a file in place is a post, as the watcher reports it. The state is read only when a caller
// asks for it.
#include "platform/linux/settings/LinuxNotifications.h"

#include "platform/linux/files/SmallFile.h"

#include <cerrno>
#include <charconv>
#include <optional>
#include <sys/stat.h>
#include <system_error>

namespace platform {
namespace {

constexpr std::size_t longestState = 64; // in bytes, with blanks and line ends around the number

bool isFileName(std::string_view name) noexcept
{
    constexpr std::size_t longestFileName = 255;
    constexpr std::string_view separators("/\0", 2);
    return !name.empty() && name.front() != '.' && name.size() <= longestFileName
        && name.find_first_of(separators) == std::string_view::npos;
}

// 0, or the error number.
int makeDirectory(const std::filesystem::path& path)
{
    // Set despite the umask: a process that may write there decides what sessions get.
    constexpr mode_t nobodyElseWrites = 0755;
    if (::mkdir(path.c_str(), nobodyElseWrites) == 0)
        return 0;
    const int error = errno;
    std::error_code ignored;
    return std::filesystem::is_directory(path, ignored) ? 0 : error;
}

std::optional<std::uint64_t> parseState(std::string_view text) noexcept
{
    constexpr std::string_view blanks = " \t\r\n";
    const std::size_t first = text.find_first_not_of(blanks);
    if (first == std::string_view::npos)
        return std::nullopt;
    text = text.substr(first, text.find_last_not_of(blanks) + 1 - first);
    std::uint64_t state = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), state);
    if (error != std::errc() || end != text.data() + text.size())
        return std::nullopt;
    return state;
}

} // namespace

LinuxNotifications::LinuxNotifications(std::filesystem::path directory, ConfigurationWatcher& watcher, ProviderLog log)
    : directory_(std::move(directory))
{
    if (directory_.empty())
        return;
    if (const int error = makeDirectory(directory_); error != 0)
        log.error("cannot make {}: {}; notifications will come once it is there", directory_.native(),
                  std::generic_category().message(error));
    watch_ = watcher.watch(
        directory_, [this](std::string_view fileName) { handleWrite(fileName); },
        ConfigurationWatcher::Changes::Writes);
}

Notifications::Registration LinuxNotifications::registerNotification(std::string_view name,
                                                                     std::shared_ptr<WorkQueue> queue, Handler handler)
{
    if (!isFileName(name))
        return {.status = invalidName, .token = 0};
    const foundation::Lock lock(lock_);
    registered_.push_back({std::string(name), std::move(queue), std::move(handler)});
    return {.status = 0, .token = static_cast<std::int32_t>(registered_.size())};
}

std::expected<std::uint64_t, NotificationStatus> LinuxNotifications::state(std::int32_t token) const
{
    std::filesystem::path path;
    {
        const foundation::Lock lock(lock_);
        if (token < 1 || static_cast<std::size_t>(token) > registered_.size())
            return std::unexpected(unknownToken);
        if (directory_.empty())
            return std::unexpected(noState);
        path = directory_ / registered_[static_cast<std::size_t>(token) - 1].name;
    }
    const auto text = readSmallFile(path, longestState);
    const auto state = text ? parseState(*text) : std::nullopt;
    if (!state)
        return std::unexpected(noState);
    return *state;
}

void LinuxNotifications::post(std::string_view name)
{
    const foundation::Lock lock(lock_);
    for (std::size_t place = 0; place < registered_.size(); ++place) {
        const auto& [registeredName, queue, handler] = registered_[place];
        if (registeredName == name)
            queue->submit([handler, token = static_cast<std::int32_t>(place + 1)] { handler(token); });
    }
}

// Without a name any of the files may have been written.
void LinuxNotifications::handleWrite(std::string_view fileName)
{
    if (!fileName.empty())
        return post(fileName);
    std::error_code error;
    for (std::filesystem::directory_iterator file(directory_, error); file != end(file); file.increment(error))
        post(file->path().filename().native());
}

} // namespace platform
