// The room of settings: preferences, features, device properties and notifications. It reads the configuration
// directory, watches it with inotify, and never writes there.
//
// Notices when files of the configuration directory change, whichever way that happens: written in place,
// replaced, removed, or come to be with a directory that was not there before.
//
// One thread for all of the configuration. It sleeps in the kernel until something changes, and is not even
// started before somebody wants to know.
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

// Any thread, but its own.
class ConfigurationWatcher {
public:
    // Told on the watcher's thread which file of the watched directory may have changed; without a name, that any of
    // them may have: the directory came to be with whatever is in it, or changes were more than the kernel remembers.
    using Handler = std::function<void(std::string_view fileName)>;

    // Which changes of files somebody wants to know.
    enum class Changes : std::uint8_t {
        All, // without a name also when it is merely not known that nothing changed
        Writes // that a file was written to its end, put in place or touched; also when it holds what it held before
    };

    // What somebody watches; it ends with this object, which waits for a handler that is running.
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

    // The configuration directory, which need not be there yet.
    ConfigurationWatcher(std::filesystem::path root, ProviderLog log);
    // All watches have ended before.
    ~ConfigurationWatcher();
    ConfigurationWatcher(const ConfigurationWatcher&) = delete;
    ConfigurationWatcher& operator=(const ConfigurationWatcher&) = delete;

    [[nodiscard]] const std::filesystem::path& root() const noexcept { return root_; }

    // Watches the files of the root, of a directory in it, or of any other given by its absolute path. From the moment
    // this returns, no change is missed: watch first, then read. Where the kernel refuses to watch, one line of the log
    // says so and changes take effect at the next start.
    [[nodiscard]] std::unique_ptr<Watch> watch(const std::filesystem::path& subdirectory, Handler handler,
                                               Changes changes = Changes::All);

private:
    // What an inotify watch is there for.
    struct Place {
        std::filesystem::path directory;
        bool isWanted = false; // somebody watches its files
        // The names in it that decide whether a wanted directory further down is there.
        std::set<std::string, std::less<>> awaited;
    };

    [[nodiscard]] bool start() KESTO_REQUIRES(lock_);
    std::set<std::filesystem::path> arm() KESTO_REQUIRES(lock_);
    void armFor(const std::filesystem::path& directory) KESTO_REQUIRES(lock_);
    Place* add(std::filesystem::path& directory, std::string& missing) KESTO_REQUIRES(lock_);
    void run();
    void handleEvents();
    void tell(const std::filesystem::path& directory, std::string_view fileName, bool isWrite) KESTO_REQUIRES(lock_);
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
