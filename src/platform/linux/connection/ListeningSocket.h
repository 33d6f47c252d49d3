// SPDX-License-Identifier: Apache-2.0
// The socket of the service: either one that the service manager opened and passed, or one bound at a path.
#pragma once

#include "platform/linux/files/FileDescriptor.h"

#include <expected>
#include <filesystem>
#include <optional>
#include <string>

namespace platform {

enum class ListeningSocketError : std::uint8_t {
    NotOneUnixListener, // socket activation passed something other than one listening Unix stream socket
    PathTooLong, // longer than the address of a Unix socket
    NotASocket, // something that is not a socket stands at the path
    AlreadyInUse, // another process listens at the path
    SystemError // the system refused, for the reason given beside
};

// What went wrong, with `errno` if the system gave the reason.
struct ListeningSocketFailure {
    ListeningSocketError error;
    int systemError = 0;
};

// The failure as words for a log line, such as "another process listens there".
[[nodiscard]] std::string description(const ListeningSocketFailure& failure);

// A socket that is ready to accept clients. If it was bound here, its destructor removes its file.
class ListeningSocket {
public:
    using Result = std::expected<ListeningSocket, ListeningSocketFailure>;

    // Who may connect, as permissions of the socket's file. By default every user may: each client is treated as
    // hostile.
    static constexpr unsigned everyone = 0666;

    // The socket that the service manager passed (LISTEN_FDS), or nothing if it passed none. Call it only once: it
    // removes the variables from the environment.
    [[nodiscard]] static std::expected<std::optional<ListeningSocket>, ListeningSocketFailure> passed();

    // Binds at the path. Replaces the socket file of a process that died. Leaves a file alone that is not a socket, or
    // behind which a process listens.
    [[nodiscard]] static Result bind(std::filesystem::path path, unsigned permissions = everyone);

    ListeningSocket(ListeningSocket&&) noexcept = default;
    ListeningSocket& operator=(ListeningSocket&& other) noexcept
    {
        std::swap(descriptor_, other.descriptor_);
        std::swap(boundPath_, other.boundPath_);
        return *this;
    }
    ~ListeningSocket();

    [[nodiscard]] int descriptor() const noexcept { return descriptor_.get(); }

private:
    ListeningSocket(FileDescriptor descriptor, std::filesystem::path boundPath) noexcept
        : descriptor_(std::move(descriptor)),
          boundPath_(std::move(boundPath))
    {
    }

    FileDescriptor descriptor_;
    std::filesystem::path boundPath_; // empty when it was passed
};

} // namespace platform
