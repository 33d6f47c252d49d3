// SPDX-License-Identifier: Apache-2.0
// The frames that a turn sends, held back until the turn is over and what it stored is kept: a client that reads an
// answer may rely on it.
//
// Gathering them also makes sending cheap: all that a turn has for one connection leaves in one system call.
#pragma once

#include <functional>
#include <memory>
#include <string>
#include <vector>

namespace platform {

class Connection;

// One thread at a time.
class Letters {
public:
    // The letter for the connection, to which the connection appends its frames as its wire has them. Valid until the
    // next call.
    template <typename Recipient> [[nodiscard]] std::string& to(Recipient& connection)
    {
        if (letters_.empty() || letters_.back().connection.get() != &connection)
            letters_.push_back({connection.shared_from_this(), {}});
        return letters_.back().frames;
    }

    // Takes all letters. The returned function makes each connection write its letter, on the calling thread; the
    // functions of several turns must be called one after the other, in the order of the turns. It is empty without
    // letters.
    [[nodiscard]] std::move_only_function<void()> take();

private:
    struct Letter {
        std::shared_ptr<Connection> connection;
        std::string frames;
    };

    [[nodiscard]] static std::vector<Letter> merged(std::vector<Letter> letters);

    std::vector<Letter> letters_; // successive answers for one connection already share a letter
};

} // namespace platform
