// Keeps folders that fill up with files of the service's own within limits: beyond them the oldest files go.
//
// To look through a folder costs as much as there is in it. So what comes in is only added up, whoever writes it waits
// for nothing more, and the folder is looked through in the background when the sum passes a limit. It is cleared down
// to three quarters then, so that the next look comes a thousand files later and not with the next one.
//
// Others may have files there as well, or write into the folder what looks like ours: removed is only what has the
// shape of our names, is a regular file and belongs to the service's user, and it is removed by its name in the folder
// that is open.
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
class FolderKeeper {
public:
    using Open = std::function<std::expected<FileDescriptor, std::error_code>()>;

    FolderKeeper(WorkQueues& workQueues, ProviderLog log) : workQueues_(workQueues), log_(log) { }

    // A file of so many bytes has come into the folder, which `open` opens: on the background queue, if at all. A look
    // that removes files says so in the log, in one line.
    void added(const std::filesystem::path& folder, const KeptFiles& kept, std::uint64_t bytes, Open open);

    // Removes what a process that was killed had begun to write in the folder that is open, and says so in the log. Not
    // while anybody writes there.
    void removeUnfinished(const std::filesystem::path& folder, int opened);

    // Since the start, of the oldest.
    [[nodiscard]] std::uint64_t removedFiles() const noexcept { return removedFiles_; }

private:
    struct File;
    struct Contents {
        std::size_t files = 0;
        std::uint64_t bytes = 0;
    };
    struct Account {
        Contents contents = {}; // as far as is known, or more: what comes during a look may be counted twice
        bool isKnown = false; // there was a look
        bool isLookedThrough = false; // right now
    };

    // The background queue.
    void look(const std::filesystem::path& folder, const KeptFiles& kept, const Open& open);
    struct Removal {
        std::size_t removed = 0;
        std::size_t staying = 0;
        std::error_code reason; // of the last one that stays
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
    std::map<std::filesystem::path, Account> accounts_ KESTO_GUARDED_BY(lock_); // callers have few folders
};

} // namespace platform
