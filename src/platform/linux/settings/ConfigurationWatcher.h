// SPDX-License-Identifier: Apache-2.0
// The room of settings: preferences, features, device properties and notifications. It reads the configuration
// directory, watches it with inotify, and never writes there.
//
// Notices every change of files in the configuration directory: files that are written in place, replaced, removed, or
// made together with their directory.
//
// One thread watches the whole configuration. It sleeps in the kernel until something changes, and starts with the
// first watch.
#pragma once

#include "foundation/Mutex.h"
#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/log/ProviderLog.h"

#include <filesystem>
#include <functional>
#include <list>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <string_view>
#include <thread>

namespace platform {

// Any thread except its own.
class ConfigurationWatcher {
public:
    // Called on the watcher's thread with the name of a file in the watched directory that may have changed. Without a
    // name any of the files may have changed: the directory was made with files in it, or the kernel lost events.
    using Handler = std::function<void(std::string_view fileName)>;

    // Which changes of files a watch reports.
    enum class Changes : std::uint8_t {
        All, // every possible change; a call without a name may be a false alarm
        Writes // a file was written and closed, put in place or touched, even with the same content
    };

    // A watch ends with this object; its destructor waits for a running handler.
    class Watch {
    public:
        ~Watch();
        Watch(const Watch&) = delete;
        Watch& operator=(const Watch&) = delete;

    private:
        friend class ConfigurationWatcher;
        Watch(ConfigurationWatcher& watcher, std::filesystem::path directory, Changes changes, Handler handler)
            : watcher_(watcher),
              directory_(std::move(directory)),
              changes_(changes),
              handler_(std::move(handler))
        {
        }
        ConfigurationWatcher& watcher_;
        const std::filesystem::path directory_;
        const Changes changes_;
        const Handler handler_;
    };

    // The configuration directory may be missing.
    ConfigurationWatcher(std::filesystem::path root, ProviderLog log);
    // All watches must have ended.
    ~ConfigurationWatcher();
    ConfigurationWatcher(const ConfigurationWatcher&) = delete;
    ConfigurationWatcher& operator=(const ConfigurationWatcher&) = delete;

    [[nodiscard]] const std::filesystem::path& root() const noexcept { return root_; }

    // Watches the files of the root, of a directory in it, or of any other given by its absolute path. After it
    // returns, no change is missed: watch first, then read. If the kernel refuses, one line is logged, and changes take
    // effect at the next start.
    [[nodiscard]] std::unique_ptr<Watch> watch(const std::filesystem::path& subdirectory, Handler handler,
                                               Changes changes = Changes::All);

private:
    // The purpose of an inotify watch.
    struct Place {
        std::filesystem::path directory;
        bool isWanted = false; // a watch needs its files
        // The names in it on the way to missing directories that watches need.
        std::set<std::string, std::less<>> awaited;
    };

    [[nodiscard]] bool start() KESTO_REQUIRES(lock_);
    std::set<std::filesystem::path> arm() KESTO_REQUIRES(lock_);
    void armFor(const std::filesystem::path& directory) KESTO_REQUIRES(lock_);
    Place* add(std::filesystem::path& directory, std::string& missing) KESTO_REQUIRES(lock_);
    void run();
    void handleEvents();
    void callHandlers(const std::filesystem::path& directory, std::string_view fileName, bool isWrite)
        KESTO_REQUIRES(lock_);
    void complain(std::string_view what, int systemError);

    const std::filesystem::path root_;
    const ProviderLog log_;

    foundation::Mutex lock_; // held while handlers run
    std::list<Watch*> watches_ KESTO_GUARDED_BY(lock_);
    std::map<int, Place> places_ KESTO_GUARDED_BY(lock_); // by inotify's watch descriptor
    bool isStarted_ KESTO_GUARDED_BY(lock_) = false;
    FileDescriptor inotify_;
    FileDescriptor stop_;
    std::thread thread_;
};

} // namespace platform
