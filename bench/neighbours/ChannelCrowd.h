// SPDX-License-Identifier: Apache-2.0
// A channel tree as a hostile user makes it: 65,000 empty folders beside 4,096 channels of another user. The service
// looks for groups when it starts, and the well-behaved client starts a session, too; both see a small tree, in whose
// place the other one comes when the flood starts.
#pragma once

#include "support/TemporaryDirectory.h"

#include <filesystem>

namespace bench {

class ChannelCrowd {
public:
    ChannelCrowd();
    ~ChannelCrowd();
    ChannelCrowd(const ChannelCrowd&) = delete;
    ChannelCrowd& operator=(const ChannelCrowd&) = delete;

    // Where the service finds the tree.
    [[nodiscard]] std::filesystem::path root() const;
    void showFew() const { show(few_); }
    void showMany() const { show(many_); }

private:
    void show(const std::filesystem::path& tree) const;

    const support::TemporaryDirectory directory_;
    const std::filesystem::path few_;
    const std::filesystem::path many_;
};

} // namespace bench
