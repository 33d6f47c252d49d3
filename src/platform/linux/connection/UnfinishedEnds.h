// SPDX-License-Identifier: Apache-2.0
// The ends of connections that the server queue has yet to carry out: the client's registration if it was brief, the
// stop of its sessions, its removal. A program that opens and closes connections without a pause does so faster than
// they are ended, and each end holds some 2 KiB until then. So there is a bound, beyond which newcomers are refused:
// of a user. A few ends of each process do not count against it, so that one program of a user shuts out no other.
#pragma once

#include "foundation/Mutex.h"
#include "platform/WorkQueue.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <unordered_map>

namespace platform {

// Any thread.
class UnfinishedEnds {
public:
    static constexpr std::size_t mostOfAUser = 16'384;
    // So many of a process may wait however many of its user do.
    static constexpr std::size_t alwaysOfAProcess = 512;

    void add(const Submitter& process);
    // It has been carried out.
    void remove(const Submitter& process);

    struct Refusal {
        std::size_t endsOfUser = 0;
        std::size_t endsOfProcess = 0;
        bool isFirst = false; // since no end of the user waited
    };
    // Why a new connection of the process must be refused, if it must.
    [[nodiscard]] std::optional<Refusal> refusal(const Submitter& process);

private:
    // A user some of whose ends wait.
    struct User {
        std::size_t ends = 0;
        std::unordered_map<std::int32_t, std::size_t> endsOfProcesses; // by number
        bool wasRefused = false;
    };

    foundation::Mutex lock_;
    std::unordered_map<std::uint32_t, User> users_ KESTO_GUARDED_BY(lock_); // by number
};

} // namespace platform
