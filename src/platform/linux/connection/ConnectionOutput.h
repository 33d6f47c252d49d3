// SPDX-License-Identifier: Apache-2.0
// The output of one connection: bytes in order, and descriptors that go with one of their frames.
//
// The connection lets one thread at a time use it, and reports when the socket may accept more.
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

    // Adds frames, with their heads, behind those that wait already.
    void append(std::string frames);
    // The same for one frame with descriptors. Only once; the descriptors must stay valid until they were written or
    // dropped.
    void append(std::string frame, const EmitterDescriptors& descriptors);

    // Writes what the socket accepts without waiting, and returns the number of bytes. Nothing, with `errno`, if the
    // peer accepts no more bytes.
    [[nodiscard]] std::optional<std::size_t> writeTo(int socket);
    // Drops what was not written, and returns the number of bytes.
    std::size_t drop() noexcept;

private:
    struct HandOver {
        std::size_t place; // the index of the first byte of their frame
        EmitterDescriptors descriptors;
    };

    [[nodiscard]] ssize_t sendTo(int socket);
    void forget(std::size_t count);

    std::string bytes_; // those from `start_` on are not written yet
    std::size_t start_ = 0;
    std::optional<HandOver> handOver_;
};

} // namespace platform
