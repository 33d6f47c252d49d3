// SPDX-License-Identifier: Apache-2.0
// Replies of the service name their calls; the daemon answers the calls of a client in their order.
#include "neighbours/FairClientOf.h"

#include "support/SampleMessage.h"

#include <cstring>

namespace bench {
namespace {

std::optional<FairClient::Message> readReply(std::string_view bytes)
{
    using enum FairClient::Message::Answers;
    constexpr std::size_t sizeOfHead = sizeof(std::uint32_t);
    constexpr std::size_t placeOfMark = 5; // behind the head and that of the array
    constexpr char markOfFourBytes = 0x1A;
    std::uint32_t number = 0;
    std::uint32_t size = 0;
    if (bytes.size() < sizeOfHead)
        return std::nullopt;
    std::memcpy(&size, bytes.data(), sizeof size);
    if (bytes.size() < sizeOfHead + size)
        return std::nullopt;
    if (bytes[placeOfMark] != markOfFourBytes)
        return FairClient::Message{sizeOfHead + size, Nothing}; // that to the start of the session
    std::memcpy(&number, bytes.data() + placeOfMark + 1, sizeof number);
    return FairClient::Message{sizeOfHead + size, Numbered, std::byteswap(number)};
}

std::optional<FairClient::Message> readBusMessage(std::string_view bytes)
{
    using enum FairClient::Message::Answers;
    constexpr std::size_t placeOfType = 1;
    constexpr char methodReturn = 2;
    const auto size = sizeOfBusMessage(bytes);
    if (!size)
        return std::nullopt;
    return FairClient::Message{*size, bytes[placeOfType] == methodReturn ? Oldest : Nothing};
}

} // namespace

FairClient fairClientOf(const ServiceProcess& service)
{
    constexpr int validate = 9;
    return {service.connectWithSession(),
            {Request::marked(frame({numberMark, validate, sampleReporterID}), std::endian::big),
             Request::marked(sampleFrame(), std::endian::big)},
            readReply};
}

FairClient fairClientOf(const DaemonPeer& daemon)
{
    return {daemon.connectSocket(), {busIdentityRequest(), busIdentityRequest()}, readBusMessage};
}

} // namespace bench
