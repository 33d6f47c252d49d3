// What one connection still has to write: bytes in order, and descriptors that go with one of their frames.
//
// The connection keeps threads apart, and says when the socket may take more.
#pragma once

#include "platform/linux/trace/EmitterAccess.h"

#include <cstddef>
#include <optional>
#include <string>
#include <sys/types.h>

namespace platform {

// One thread at a time.
class ConnectionOutput {
public:
    [[nodiscard]] bool empty() const noexcept { return bytes_.empty(); }

    // Adds frames, with their heads, behind what waits already.
    void append(std::string frames);
    // The same of one frame that the descriptors go with. Once; they are valid until they were written or dropped.
    void append(std::string frame, const EmitterDescriptors& descriptors);

    // Gives the socket what it takes without waiting: how many bytes that were. Nothing, with `errno`, when the peer
    // takes nothing any more.
    [[nodiscard]] std::optional<std::size_t> writeTo(int socket);
    // Drops what was not written: how many bytes that were.
    std::size_t drop() noexcept;

private:
    struct HandOver {
        std::size_t place; // in the bytes, where the frame begins that they go with
        EmitterDescriptors descriptors;
    };

    [[nodiscard]] ssize_t sendTo(int socket);
    void forget(std::size_t count);

    std::string bytes_; // from `start_` on they are still to be written
    std::size_t start_ = 0;
    std::optional<HandOver> handOver_;
};

} // namespace platform
