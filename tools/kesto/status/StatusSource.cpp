// SPDX-License-Identifier: Apache-2.0
// One request and its answer need no more than a socket: libkesto would start a thread. The socket never blocks, so
// that who waits for other things, too, is not held up by a service that hangs.
#include "kesto/status/StatusSource.h"

#include "foundation/cbor/Cbor.h"
#include "kesto/ExitStatus.h"
#include "kesto/Terminal.h"
#include "kesto/files/InputFile.h"
#include "ledger/Report.h"

#include <array>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <fmt/format.h>
#include <iterator>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <system_error>

using foundation::Dictionary;
using foundation::Value;

namespace {

// Whether it has what everybody who shows a status relies on.
bool isStatus(const Dictionary& report)
{
    const auto has = [&report](std::string_view key, Value::Kind kind) {
        const Value* const value = report.find(key);
        return value != nullptr && value->kind() == kind;
    };
    if (!has("running", Value::Kind::Number))
        return false;
    return !report.find("running")->asBoolean()
        || (has("version", Value::Kind::String) && has("internalBuild", Value::Kind::Number)
            && has("now", Value::Kind::Dictionary) && has("sinceStart", Value::Kind::Dictionary));
}

} // namespace

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
    return noAnswer(std::generic_category().message(errno));
}

// False if no service listens there.
bool StatusSource::isConnected()
{
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (socket_.native().size() >= sizeof address.sun_path)
        throw noAnswer("the path is too long for a socket");
    socket_.native().copy(address.sun_path, sizeof address.sun_path - 1);
    platform::FileDescriptor connection(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    if (!connection)
        throw systemFailure();
    if (::connect(connection.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
        if (errno == ENOENT || errno == ECONNREFUSED || errno == ENOTDIR)
            return false;
        throw errno == EAGAIN ? noAnswer("too many others wait for it") : systemFailure();
    }
    connection_ = std::move(connection);
    return true;
}

// False if the connection has ended. A request is so short that a socket takes it whole or not at all.
bool StatusSource::isAsked()
{
    std::string item;
    foundation::appendCbor(foundation::Array{1, "status"}, item);
    std::string request;
    platform::appendFrame(item, request);
    reader_ = {};
    isAsked_ = ::send(connection_.get(), request.data(), request.size(), MSG_NOSIGNAL) == std::ssize(request);
    return isAsked_;
}

void StatusSource::disconnect()
{
    connection_ = {};
    isAsked_ = false;
    hasAnswered_ = false;
}

int StatusSource::request()
{
    if (isAsked_)
        return connection_.get();
    if (connection_ && isAsked())
        return connection_.get();
    disconnect(); // the service has ended meanwhile; another may run
    if (!isConnected())
        return -1;
    if (!isAsked()) {
        const StatusError failure = systemFailure();
        disconnect();
        throw failure;
    }
    return connection_.get();
}

// Nothing: a part of it is missing.
std::optional<std::string> StatusSource::receiveFrame()
{
    std::array<char, 16384> buffer;
    while (true) {
        const ssize_t count = ::recv(connection_.get(), buffer.data(), buffer.size(), 0);
        if (count < 0 && (errno == EAGAIN || errno == EINTR))
            return std::nullopt;
        if (count < 0)
            throw systemFailure();
        if (count == 0)
            throw noAnswer("it closed the connection; is it older than this program?");
        reader_.feed({buffer.data(), static_cast<std::size_t>(count)});
        const auto frame = reader_.next();
        if (!frame)
            throw noAnswer("its answer is too long");
        if (*frame)
            return std::string(**frame);
    }
}

std::optional<Dictionary> StatusSource::take()
{
    if (!isAsked_)
        return readLedger();
    try {
        const auto frame = receiveFrame();
        if (!frame)
            return std::nullopt;
        foundation::CborDecoder decoder;
        const auto answer = decoder.decode(*frame);
        const auto values = answer ? answer->array() : std::nullopt;
        const auto report = values && values->size() == 3 ? (*values)[2].dictionary() : std::nullopt;
        if (!report || !isStatus(*report))
            throw noAnswer("it sent something else than a status");
        isAsked_ = false;
        hasAnswered_ = true;
        return report;
    } catch (const StatusError&) {
        const bool isKept = hasAnswered_;
        disconnect();
        if (!isKept)
            throw;
        return std::nullopt; // the service has ended meanwhile; another may run
    }
}

Dictionary StatusSource::read()
{
    using Clock = std::chrono::steady_clock;
    const auto end = Clock::now() + std::chrono::seconds(10);
    while (true) {
        pollfd answer{.fd = request(), .events = POLLIN, .revents = 0};
        if (answer.fd < 0)
            return readLedger();
        const auto rest = std::chrono::ceil<std::chrono::milliseconds>(end - Clock::now()).count();
        if (rest <= 0) {
            disconnect();
            throw noAnswer("it takes more than ten seconds");
        }
        ::poll(&answer, 1, static_cast<int>(rest));
        if (auto report = take())
            return *report;
    }
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
