// One request and its answer need no more than a socket: libkesto would start a thread.
#include "kesto/status/StatusSource.h"

#include "foundation/cbor/Cbor.h"
#include "kesto/ExitStatus.h"
#include "kesto/Terminal.h"
#include "kesto/files/InputFile.h"
#include "ledger/Report.h"
#include "platform/linux/connection/FrameReader.h"
#include "platform/linux/files/FileDescriptor.h"

#include <array>
#include <cerrno>
#include <cstring>
#include <fmt/format.h>
#include <iterator>
#include <sys/socket.h>
#include <sys/un.h>
#include <system_error>

using foundation::Dictionary;

int exitStatusOf(const Dictionary& report)
{
    if (!report.find("running")->asBoolean())
        return exitNotRunning;
    return ledger::lossesIn(*report.find("sinceStart")->dictionary()) == 0 ? exitOk : exitFailure;
}

StatusError StatusSource::noAnswer(std::string_view why) const
{
    return StatusError(fmt::format("the service at {} does not answer: {}", printable(socket_.native()), why));
}

StatusError StatusSource::systemFailure() const
{
    return noAnswer(errno == EAGAIN ? "it takes more than ten seconds" : std::generic_category().message(errno));
}

// False if no service listens there.
bool StatusSource::isConnected()
{
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (socket_.native().size() >= sizeof address.sun_path)
        throw noAnswer("the path is too long for a socket");
    socket_.native().copy(address.sun_path, sizeof address.sun_path - 1);
    connection_ = platform::FileDescriptor(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    if (!connection_)
        throw systemFailure();
    constexpr timeval longestWait{.tv_sec = 10, .tv_usec = 0};
    ::setsockopt(connection_.get(), SOL_SOCKET, SO_RCVTIMEO, &longestWait, sizeof longestWait);
    ::setsockopt(connection_.get(), SOL_SOCKET, SO_SNDTIMEO, &longestWait, sizeof longestWait);
    if (::connect(connection_.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0)
        return true;
    const auto failure = systemFailure();
    const bool isNobodyThere = errno == ENOENT || errno == ECONNREFUSED || errno == ENOTDIR;
    connection_ = platform::FileDescriptor();
    if (!isNobodyThere)
        throw failure;
    return false;
}

std::string StatusSource::receiveFrame()
{
    platform::FrameReader reader;
    std::array<char, 16384> buffer;
    while (true) {
        const ssize_t count = ::recv(connection_.get(), buffer.data(), buffer.size(), 0);
        if (count < 0)
            throw systemFailure();
        if (count == 0)
            throw noAnswer("it closed the connection; is it older than this program?");
        reader.feed({buffer.data(), static_cast<std::size_t>(count)});
        const auto frame = reader.next();
        if (frame && *frame)
            return std::string(**frame);
        if (!frame)
            throw noAnswer("its answer is too long");
    }
}

void StatusSource::ask()
{
    std::string item;
    foundation::appendCbor(foundation::Array{1, "status"}, item);
    std::string request;
    platform::appendFrame(item, request);
    if (::send(connection_.get(), request.data(), request.size(), MSG_NOSIGNAL) != std::ssize(request))
        throw systemFailure();
    isAsked_ = true;
}

Dictionary StatusSource::answer()
{
    isAsked_ = false;
    foundation::CborDecoder decoder;
    const auto answer = decoder.decode(receiveFrame());
    const auto values = answer ? answer->array() : std::nullopt;
    if (!values || values->size() != 3 || !(*values)[2].dictionary())
        throw noAnswer("it sent something else than a status");
    return *(*values)[2].dictionary();
}

Dictionary StatusSource::readLedger() const
{
    std::string bytes;
    try {
        bytes = readInput(ledgerFile_, sizeof(ledger::LedgerImage));
    } catch (const std::runtime_error& error) {
        throw StatusError(fmt::format("the service does not run, and left no status: {}", error.what()));
    }
    ledger::LedgerImage image = {};
    std::memcpy(&image, bytes.data(), bytes.size());
    const auto account = bytes.size() == sizeof image ? ledger::accountIn(image) : std::nullopt;
    if (!account)
        throw StatusError(fmt::format("the service does not run, and {} is damaged or of another version",
                                      printable(ledgerFile_.native())));
    return ledger::report(*account, true);
}

int StatusSource::request()
{
    if (!isAsked_ && connection_) {
        try {
            ask();
        } catch (const StatusError&) {
            connection_ = platform::FileDescriptor(); // the service has ended meanwhile; another may run
        }
    }
    if (!isAsked_ && isConnected())
        ask();
    return isAsked_ ? connection_.get() : -1;
}

Dictionary StatusSource::read()
{
    const bool isKept = static_cast<bool>(connection_);
    if (request() < 0)
        return readLedger();
    try {
        return answer();
    } catch (const StatusError&) {
        connection_ = platform::FileDescriptor();
        if (!isKept)
            throw;
    }
    return read();
}
