// SPDX-License-Identifier: Apache-2.0
// Keeps folders that fill up with files of the service's own within limits: beyond them the oldest files go.
//
// The cost of reading a folder grows with its files. So for each new file only a sum is updated, while its writer
// waits, and the folder is read in the background when the sum passes a limit. Then it is cleared down to three
// quarters, so that the next look comes a thousand files later and not with the next file.
//
// Other users may have files there as well, or make files that look like the service's. So it removes only regular
// files of the service's user with the right form of name, and removes them by their name in the open folder.
#pragma once

#include "foundation/Mutex.h"
#include "platform/FileSystem.h"
#include "platform/WorkQueue.h"
#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/log/ProviderLog.h"

#include <atomic>
#include <functional>
#include <map>
#include <span>

namespace platform {

// Any thread. It outlives the background queue's work.
class FolderLimits {
public:
    using Open = std::function<std::expected<FileDescriptor, std::error_code>()>;

    FolderLimits(WorkQueues& workQueues, ProviderLog log) : workQueues_(workQueues), log_(log) { }

    // A file of so many bytes was added to the folder. If a look is due, `open` is called on the background queue to
    // open the folder. A look that removes files logs one line.
    void added(const std::filesystem::path& folder, const KeptFiles& kept, std::uint64_t bytes, Open open);

    // Removes the unfinished files of a killed process from the open folder, and logs this. Only while no file there is
    // being written.
    void removeUnfinished(const std::filesystem::path& folder, int opened);

    // How many of the oldest files were removed since the start.
    [[nodiscard]] std::uint64_t removedFiles() const noexcept { return removedFiles_; }

private:
    struct File;
    struct Contents {
        std::size_t files = 0;
        std::uint64_t bytes = 0;
    };
    struct Account {
        Contents contents = {}; // an upper estimate: files that come during a look may count twice
        bool isKnown = false; // after the first look
        bool isLookedThrough = false; // a look is running
    };

    // The background queue.
    void look(const std::filesystem::path& folder, const KeptFiles& kept, const Open& open);
    struct Removal {
        std::size_t removed = 0;
        std::size_t staying = 0;
        std::error_code reason; // why the last of these files could not be removed
    };
    [[nodiscard]] static std::expected<std::vector<File>, std::error_code>
    filesIn(int folder, bool (*isOne)(std::string_view name));
    [[nodiscard]] static Removal remove(std::span<const File> files, int folder);
    void removeOldest(std::span<const File> files, int folder, const std::filesystem::path& path,
                      const KeptFiles& kept);

    WorkQueues& workQueues_;
    const ProviderLog log_;
    std::atomic<std::uint64_t> removedFiles_ = 0;
    foundation::Mutex lock_;
    std::map<std::filesystem::path, Account> accounts_ KESTO_GUARDED_BY(lock_); // never large: callers have few folders
};

} // namespace platform
