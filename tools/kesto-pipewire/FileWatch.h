// SPDX-License-Identifier: Apache-2.0
// Waits without polling for a file to appear: so the program learns immediately that a lost server's socket is back.
#pragma once

#include "kesto-pipewire/Loop.h"

#include <filesystem>
#include <functional>

namespace kesto_pipewire {

// Calls back each time that the file is made or moved to its place. Does nothing if its folder cannot be watched, for
// example because it is missing; so its user needs a timer, too. On the loop's thread.
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
