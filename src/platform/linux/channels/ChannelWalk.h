// SPDX-License-Identifier: Apache-2.0
// One walk through the channel tree, in short steps: the user who has taken the least of the limits makes the next one
// (ChannelAmounts.h). A step opens one folder, or reads some files of one.
#pragma once

#include "platform/linux/channels/ChannelAmounts.h"
#include "platform/linux/channels/ChannelFile.h"
#include "platform/linux/channels/ChannelTree.h"
#include "platform/linux/channels/OpenFolders.h"

#include <array>
#include <chrono>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace platform {

// One thread. It uses what it is given until it has run.
class ChannelWalk {
public:
    ChannelWalk(DIR* root, const std::vector<ChannelSelection>& selections, const ChannelTreeLimits& limits,
                const ChannelTree::Now& now);

    // Call it once. The drivers are ascending.
    [[nodiscard]] ChannelReading run(const std::vector<std::string>& knownDrivers);

private:
    struct Entry {
        std::string name;
        unsigned char type; // as of readdir
    };
    // A folder that is still to be opened, or one whose files are still to be read.
    struct Folder {
        SharedPlace place;
        std::optional<std::vector<Entry>> files = {};
        std::size_t filesRead = 0;
    };
    // The owner that was looked up last. Usually all channels of a driver have one owner.
    struct KnownOwner {
        SharedPlace driver = {};
        std::string owner = {};
        bool isGone = false;
    };
    struct User {
        std::uint32_t number = 0;
        std::vector<Folder> folders = {}; // the next one is the last
        ChannelAmounts taken = {};
        KnownOwner owner = {};
        bool isCut = false;
    };
    using LeftOut = std::size_t LeftOutChannels::*;

    void findDrivers(const std::vector<std::string>& known);
    void addDriver(const char* name);
    void forgetLastDrivers(User& user);
    void letUsersTakeTurns();
    void step(User& user);
    void open(User& user);
    std::vector<Entry> entriesOf(DIR* folder, User& user);
    void addFolders(const SharedPlace& parent, std::vector<Entry> entries, User& user);
    void readFiles(User& user);
    void readChannel(DIR* folder, const SharedPlace& place, const Entry& entry, User& user);
    std::optional<std::string_view> readFile(DIR* folder, const SharedPlace& place, const Entry& entry, User& user);
    bool isGone(const SharedPlace& driver, std::string_view owner, User& user);
    [[nodiscard]] bool isSelected(const SharedPlace& parent, const std::string& name) const;
    [[nodiscard]] std::chrono::steady_clock::duration timeTaken() const { return now_() - start_; }
    void take(User& user, ChannelResource resource, std::size_t amount);
    void leaveOut(User& user, LeftOut bound, std::size_t count);
    void leaveOutTheRest(User& user);
    void fail(std::string path, std::string_view reason) { reading_.problems.push_back({std::move(path), reason}); }

    DIR* const root_;
    const std::vector<ChannelSelection>& selections_;
    const ChannelTreeLimits& limits_;
    const ChannelTree::Now& now_;
    const std::chrono::steady_clock::time_point start_;
    const ChannelAmounts allowed_;
    ChannelAmounts left_;
    OpenFolders folders_;
    std::map<std::uint32_t, User> users_;
    ChannelReading reading_;
    std::array<char, largestChannelFile + 1> buffer_; // NOLINT: read fills it
};

} // namespace platform
