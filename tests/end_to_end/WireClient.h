// SPDX-License-Identifier: Apache-2.0
// A client that sends frames and, for some tests, other bytes.
#pragma once

#include "foundation/cbor/Cbor.h"
#include "foundation/values/Value.h"
#include "platform/linux/files/FileDescriptor.h"

#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>
#include <string_view>

namespace end_to_end {

// The operations by their numbers on the wire.
enum WireMethod : std::uint8_t {
    Create = 1,
    SetServiceType,
    GetServiceName,
    SetConfiguration,
    Start,
    SendMessage,
    Stop,
    Destroy,
    Validate,
    GetAllReporters,
    KillService
};

inline const foundation::Value null{};

// One thread.
class WireClient {
public:
    // Connects, and waits for the service to listen if need be.
    explicit WireClient(const std::filesystem::path& socketPath);

    // Sends a call and returns its number.
    template <typename... Arguments> std::uint64_t call(WireMethod method, Arguments... arguments)
    {
        const std::uint64_t number = nextCall_++;
        sendFrame(foundation::Array{number, static_cast<int>(method), foundation::Value(arguments)...});
        return number;
    }
    // Sends a call and returns the reply that must come next, which must be the call's.
    template <typename... Arguments> foundation::Array ask(WireMethod method, Arguments... arguments)
    {
        return replyTo(call(method, arguments...));
    }
    // The next reply, which must be that of the call.
    foundation::Array replyTo(std::uint64_t call);
    // The next reply, or nothing at the end of the stream.
    std::optional<foundation::Array> nextReply();
    // Whether the service closes the connection without another reply.
    [[nodiscard]] bool isClosed() { return !nextReply(); }

    // Sends the frame, so many times in one piece.
    void sendFrame(const foundation::Value& item, int times = 1);
    void sendFrameBytes(std::string_view item);
    void sendBytes(std::string_view bytes);
    // Sends nothing more, but goes on reading.
    void closeSendingSide();
    // Ends the connection between frames.
    void close() { socket_ = platform::FileDescriptor(); }
    // Ends the connection with a reset.
    void reset();

private:
    [[nodiscard]] bool receive(char* bytes, std::size_t count);

    platform::FileDescriptor socket_;
    foundation::CborDecoder decoder_;
    std::uint64_t nextCall_ = 1;
};

} // namespace end_to_end
