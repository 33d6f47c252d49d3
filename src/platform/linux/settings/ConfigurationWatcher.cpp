// SPDX-License-Identifier: Apache-2.0
// inotify watches only existing directories. So the watcher awaits a missing directory by its name in the nearest
// directory above it, and checks all directories again each time that such a name comes or goes.
#include "platform/linux/settings/ConfigurationWatcher.h"

#include "platform/linux/process/Thread.h"

#include <array>
#include <cerrno>
#include <memory>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/inotify.h>
#include <system_error>
#include <utility>

namespace platform {
namespace {

namespace fs = std::filesystem;

// A file counts as changed when its writer closes it, not at every write.
constexpr std::uint32_t changesOfFiles =
    IN_CLOSE_WRITE | IN_CREATE | IN_MOVED_TO | IN_MOVED_FROM | IN_DELETE | IN_ATTRIB;
// A touch changes a file's times and may not even open it.
constexpr std::uint32_t writesOfFiles = IN_CLOSE_WRITE | IN_MOVED_TO | IN_ATTRIB;
constexpr std::uint32_t endsOfDirectories = IN_DELETE_SELF | IN_MOVE_SELF;
// Without IN_MASK_ADD the kernel clears the events of a directory that is watched already, and sets them again: a
// change between the two is not reported.
constexpr std::uint32_t ofEachDirectory = changesOfFiles | endsOfDirectories | IN_ONLYDIR | IN_MASK_ADD;

bool isThere(const fs::path& directory)
{
    std::error_code ignored;
    return fs::is_directory(directory, ignored);
}

} // namespace

ConfigurationWatcher::Watch::~Watch()
{
    const foundation::Lock lock(watcher_.lock_);
    watcher_.watches_.remove(this);
}

ConfigurationWatcher::ConfigurationWatcher(fs::path root, ProviderLog log) : root_(std::move(root)), log_(log) { }

ConfigurationWatcher::~ConfigurationWatcher()
{
    if (!thread_.joinable())
        return;
    ::eventfd_write(stop_.get(), 1);
    thread_.join();
}

std::unique_ptr<ConfigurationWatcher::Watch> ConfigurationWatcher::watch(const fs::path& subdirectory, Handler handler,
                                                                         Changes changes)
{
    const fs::path directory = subdirectory.empty() ? root_ : root_ / subdirectory;
    std::unique_ptr<Watch> watch(new Watch(*this, directory, changes, std::move(handler)));
    const foundation::Lock lock(lock_);
    watches_.push_back(watch.get());
    if (start())
        armFor(directory);
    return watch;
}

// Called with the first watch. False if the kernel refuses.
bool ConfigurationWatcher::start()
{
    if (!std::exchange(isStarted_, true)) {
        inotify_ = FileDescriptor(::inotify_init1(IN_CLOEXEC | IN_NONBLOCK));
        stop_ = FileDescriptor(inotify_ ? ::eventfd(0, EFD_CLOEXEC) : -1);
        if (stop_)
            thread_ = startThread("configuration", QualityOfService::Default, [this] { run(); });
        else
            complain("inotify", errno);
    }
    return thread_.joinable();
}

// Sets up all watches again: there are few directories, so single changes need no treatment of their own. An unchanged
// directory is watched without a gap, because the kernel recognises it and returns the same descriptor. Returns the
// directories with files that were not watched before.
std::set<fs::path> ConfigurationWatcher::arm()
{
    const auto before = std::exchange(places_, {});
    for (const Watch* watch : watches_)
        armFor(watch->directory_);
    for (const auto& [descriptor, place] : before)
        if (!places_.contains(descriptor))
            ::inotify_rm_watch(inotify_.get(), descriptor);

    std::set<fs::path> added;
    for (const auto& [descriptor, place] : places_) {
        const auto known = before.find(descriptor);
        const bool wasWatched =
            known != before.end() && known->second.isWanted && known->second.directory == place.directory;
        if (place.isWanted && !wasWatched)
            added.insert(place.directory);
    }
    return added;
}

// Watches the directory or, while it is missing, the nearest directory above it for the missing name.
void ConfigurationWatcher::armFor(const fs::path& wanted)
{
    fs::path directory = wanted;
    std::string missing;
    while (Place* place = add(directory, missing)) {
        if (directory == wanted) {
            place->isWanted = true;
            return;
        }
        place->awaited.insert(missing);
        if (!isThere(directory / missing))
            return;
        directory = wanted; // it was made just before its name was awaited
    }
}

// Watches the directory or the nearest existing one above it; null if the kernel refuses.
ConfigurationWatcher::Place* ConfigurationWatcher::add(fs::path& directory, std::string& missing)
{
    for (;;) {
        const int descriptor = ::inotify_add_watch(inotify_.get(), directory.c_str(), ofEachDirectory);
        if (descriptor >= 0) {
            Place& place = places_[descriptor];
            place.directory = directory;
            return &place;
        }
        const bool isMissing = (errno == ENOENT || errno == ENOTDIR) && directory.has_relative_path();
        if (!isMissing) {
            complain(directory.native(), errno);
            return nullptr;
        }
        missing = directory.filename();
        directory = directory.parent_path();
    }
}

void ConfigurationWatcher::run()
{
    std::array<pollfd, 2> awaited = {{{inotify_.get(), POLLIN, 0}, {stop_.get(), POLLIN, 0}}};
    for (;;) {
        ::poll(awaited.data(), awaited.size(), -1);
        if (awaited[1].revents != 0)
            return;
        handleEvents();
    }
}

void ConfigurationWatcher::handleEvents()
{
    alignas(inotify_event) std::array<char, 4096> buffer;
    const ssize_t length = ::read(inotify_.get(), buffer.data(), buffer.size());
    const foundation::Lock lock(lock_);
    bool structureChanged = false;
    bool eventsWereLost = false;
    for (ssize_t at = 0; at < length;) {
        const auto& event = *reinterpret_cast<const inotify_event*>(buffer.data() + at);
        at += static_cast<ssize_t>(sizeof event + event.len);
        const std::string_view fileName = event.len > 0 ? event.name : "";
        const auto place = places_.find(event.wd);
        if ((event.mask & IN_Q_OVERFLOW) != 0)
            eventsWereLost = true;
        else if (place == places_.end())
            continue; // of a watch that was removed meanwhile
        else if ((event.mask & (endsOfDirectories | IN_IGNORED | IN_UNMOUNT)) != 0
                 || place->second.awaited.contains(fileName))
            structureChanged = true;
        else if (!fileName.empty())
            callHandlers(place->second.directory, fileName, (event.mask & writesOfFiles) != 0);
    }
    if (!structureChanged && !eventsWereLost)
        return;
    const auto added = arm();
    for (const Watch* watch : watches_)
        if (watch->changes_ == Changes::All || eventsWereLost || added.contains(watch->directory_))
            watch->handler_({});
}

void ConfigurationWatcher::callHandlers(const fs::path& directory, std::string_view fileName, bool isWrite)
{
    for (const Watch* watch : watches_)
        if (watch->directory_ == directory && (isWrite || watch->changes_ == Changes::All))
            watch->handler_(fileName);
}

void ConfigurationWatcher::complain(std::string_view what, int systemError)
{
    log_.error("changes of the configuration in {} will take effect at the next start only: {}: {}; raising "
               "fs.inotify.max_user_instances or fs.inotify.max_user_watches may help",
               root_.native(), what, std::generic_category().message(systemError));
}

} // namespace platform
