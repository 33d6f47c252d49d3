// SPDX-License-Identifier: Apache-2.0
// journald as a peer: a real, private instance in a mount namespace, in which its sockets and its journal are in
// private directories, with rate limits off. The machine's own journal is not touched.
#pragma once

#include "support/ChildProcess.h"
#include "support/RawClient.h"
#include "support/TemporaryDirectory.h"

#include <cstddef>
#include <expected>
#include <memory>
#include <string>

namespace bench {

class JournalPeer {
public:
    // Starts it; the error gives the reason if it cannot run on this machine.
    [[nodiscard]] static std::expected<std::unique_ptr<JournalPeer>, std::string> start();

    // Sends so many messages with the fields of the sample by sd_journal_sendv. Returns journald's messages a second,
    // up to the moment at which the last can be read; checks that none is missing.
    [[nodiscard]] double rate(std::size_t count);

private:
    JournalPeer() = default;

    support::TemporaryDirectory directory_;
    SocketPair channel_; // to the process in the namespace
    ChildProcess process_;
};

} // namespace bench
