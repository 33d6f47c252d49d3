// Waiting for a file to appear without asking for it again and again: whoever lost a server learns at once
// that its socket is back.
#pragma once

#include "kesto-pipewire/Loop.h"

#include <filesystem>
#include <functional>

namespace kesto_pipewire {

// Calls each time that the file is made or moved to its place. Does nothing where its folder cannot be watched,
// as when it does not exist: who needs certainty has a timer too. On the loop's thread.
class FileWatch {
public:
    FileWatch(Loop& loop, const std::filesystem::path& file, std::function<void()> appeared);
    ~FileWatch();
    FileWatch(const FileWatch&) = delete;
    FileWatch& operator=(const FileWatch&) = delete;

private:
    [[nodiscard]] bool readsOwnName() const;

    std::string name_;
    int inotify_ = -1;
    Source readable_;
};

} // namespace kesto_pipewire
