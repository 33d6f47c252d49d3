// journald as a peer: a real one of its own, in a mount namespace where it finds its sockets and its journal in
// private directories, with rate limits off. The machine's own journal is left alone.
#pragma once

#include "support/ChildProcess.h"
#include "support/RawClient.h"

#include <cstddef>
#include <expected>
#include <memory>
#include <string>

namespace bench {

class JournalPeer {
public:
    // Or why it cannot be run on this machine.
    [[nodiscard]] static std::expected<std::unique_ptr<JournalPeer>, std::string> start();

    // Sends so many messages with the fields of the sample by sd_journal_sendv. How many journald took a second, until
    // the last of them could be read from the journal, and all were there.
    [[nodiscard]] double rate(std::size_t count);

private:
    JournalPeer() = default;

    TemporaryDirectory directory_;
    SocketPair channel_; // to the process in the namespace
    ChildProcess process_;
};

} // namespace bench
