// SPDX-License-Identifier: Apache-2.0
// The closest peer: the same call over sd-bus, peer to peer, the message as a{sv}, then category, type and the array of
// reporters. Its server unpacks the whole call, as a service must, and answers.
#pragma once

#include "support/ChildProcess.h"
#include "support/RawClient.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <string_view>
#include <systemd/sd-bus.h>

namespace bench {

struct CloseBus {
    void operator()(sd_bus* bus) const { ::sd_bus_close_unref(bus); }
};
using Bus = std::unique_ptr<sd_bus, CloseBus>;

// The server's process, for one client at the other end of the socket.
[[nodiscard]] ChildProcess runBusServer(const SocketPair& sockets);

// A client that uses sd-bus, too.
class BusClient {
public:
    explicit BusClient(platform::FileDescriptor socket);
    void roundTrip();
    // Sends so many calls, of which at most as many wait for an answer as `RawClient` allows.
    void pipeline(std::size_t count);

private:
    Bus bus_;
    std::uint32_t number_;
};

// The raw client, with a request that sd-bus encoded.
[[nodiscard]] RawClient makeRawBusClient(platform::FileDescriptor socket);

// A call that a message bus answers itself: for its identity.
[[nodiscard]] Request busIdentityRequest();
// Makes the connected socket one of the bus's clients.
void joinBus(int socket);
// The size of the first whole message in the bytes; nothing if none is whole.
[[nodiscard]] std::optional<std::size_t> sizeOfBusMessage(std::string_view bytes);

// Connects to a message bus that listens at the path, as one of its clients; null if it does not answer.
[[nodiscard]] Bus connectToBus(const std::filesystem::path& path);

} // namespace bench
