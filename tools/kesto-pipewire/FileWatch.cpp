// SPDX-License-Identifier: Apache-2.0
// Watches the folder, because a missing file cannot be watched.
#include "kesto-pipewire/FileWatch.h"

#include <sys/inotify.h>
#include <unistd.h>

#include <cstddef>

namespace kesto_pipewire {

FileWatch::FileWatch(Loop& loop, const std::filesystem::path& file, std::function<void()> appeared)
    : name_(file.filename()),
      inotify_(inotify_init1(IN_NONBLOCK | IN_CLOEXEC))
{
    if (inotify_ < 0 || inotify_add_watch(inotify_, file.parent_path().c_str(), IN_CREATE | IN_MOVED_TO) < 0)
        return;
    readable_ = loop.addReadable(inotify_, [this, call = std::move(appeared)] {
        if (readsOwnName())
            call(); // which may end this watch
    });
}

FileWatch::~FileWatch()
{
    readable_ = {};
    if (inotify_ >= 0)
        close(inotify_);
}

bool FileWatch::readsOwnName() const
{
    alignas(inotify_event) std::byte buffer[4096];
    bool found = false;
    for (ssize_t size = 0; (size = read(inotify_, buffer, sizeof buffer)) > 0;)
        for (const auto* at = buffer; at < buffer + size;) {
            const auto* event = reinterpret_cast<const inotify_event*>(at);
            found |= event->len > 0 && name_ == event->name;
            at += sizeof *event + event->len;
        }
    return found;
}

} // namespace kesto_pipewire
