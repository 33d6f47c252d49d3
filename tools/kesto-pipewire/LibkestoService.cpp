// SPDX-License-Identifier: Apache-2.0
// libkesto's callbacks come on its own thread: they store the state, and the loop's next turn reads it.
#include "kesto-pipewire/LibkestoService.h"

#include "utility/MessageKinds.h"

#include <cerrno>
#include <chrono>
#include <iterator>
#include <system_error>
#include <utility>

namespace kesto_pipewire {

namespace {

constexpr std::size_t queueBytes = 1024 * 1024; // some thousands of messages, for a slow service
constexpr auto longestFarewell = std::chrono::seconds(3);

// Codes in the kernel's trace, with the session as argument: Start and Stop of a stream.
constexpr std::uint32_t streamStarts = 0x21044080;
constexpr std::uint32_t streamStops = 0x21044084;

std::string textOf(const Payload& payload)
{
    std::string text;
    for (const auto& [key, value] : payload) {
        text.append(text.empty() ? "" : ", ").append(key).append(" ");
        std::visit([&text](const auto& content) { fmt::format_to(std::back_inserter(text), "{}", content); }, value);
    }
    return text;
}

} // namespace

LibkestoService::LibkestoService(Loop& loop, std::string socketPath, const Diagnostics& diagnostics)
    : loop_(loop),
      socketPath_(std::move(socketPath)),
      diagnostics_(diagnostics),
      stateSignal_(loop.addWakeup([this] { handleState(); }))
{
}

LibkestoService::~LibkestoService() = default;

void LibkestoService::open(Handlers handlers)
{
    handlers_ = std::move(handlers);
    kesto::Options options;
    options.socketPath = socketPath_;
    options.queueBytes = queueBytes;
    options.wakeOnSend = true;
    options.reconnect = true;
    options.trace = true;
    options.stateChanged = [this](const kesto::StateChange& change) { stateChanged(change); };
    if (const auto status = client_.open(options); status == kesto::Status::InvalidArgument)
        throw std::system_error(EINVAL, std::generic_category(), "unusable socket path");
    else if (status != kesto::Status::Ok)
        throw std::system_error(errno, std::generic_category(), kesto::errorText(status));
    tracer_ = kesto::Tracer(client_);
}

bool LibkestoService::close()
{
    if (!isConnected_)
        return true; // no started session lacks its end
    const auto status = client_.close(longestFarewell);
    if (status != kesto::Status::Ok)
        diagnostics_.say("the last messages may not have reached the reporting service: {}", kesto::errorText(status));
    if (refusedCalls_ > 0)
        diagnostics_.say("{} calls to the reporting service were left out", refusedCalls_);
    return status == kesto::Status::Ok;
}

void LibkestoService::stateChanged(const kesto::StateChange& change)
{
    if (change.reason != kesto::Status::Ok)
        diagnostics_.detail("{}: {}", change.socketPath, kesto::errorText(change.reason));
    isConnected_ = change.state == kesto::State::Connected;
    connections_ += isConnected_;
    loop_.wake(stateSignal_);
}

void LibkestoService::handleState()
{
    // One signal may stand for a loss and the next connection.
    if (const auto connections = connections_.load(); std::exchange(handledConnections_, connections) != connections) {
        diagnostics_.say("connected to the reporting service");
        hasReportedAbsence_ = false;
        handlers_.lost();
        if (isConnected_)
            handlers_.appeared();
    }
    if (isConnected_)
        return;
    if (!std::exchange(hasReportedAbsence_, true))
        diagnostics_.say("waiting for the reporting service");
    handlers_.lost();
}

// libkesto refuses a call if the service is too slow, or has just gone.
template <typename Describe> void LibkestoService::note(ReporterID session, kesto::Status status, Describe describe)
{
    if (diagnostics_.isVerbose())
        diagnostics_.say("{} {}", session, describe());
    if (status != kesto::Status::Ok && ++refusedCalls_ == 1)
        diagnostics_.say("the reporting service does not take every call: {}", kesto::errorText(status));
}

const kesto::Message& LibkestoService::encode(const Payload& payload)
{
    message_.clear();
    for (const auto& entry : payload)
        std::visit([&](const auto& value) { message_.add(entry.first, value); }, entry.second);
    return message_;
}

void LibkestoService::create(ReporterID session)
{
    note(session, client_.createSession(session), [] { return "create"; });
}

void LibkestoService::setServiceType(ReporterID session, ServiceType type)
{
    note(session, client_.setServiceType(type, session), [type] {
        return KestoReportingUtilityGenerateServiceNameFromServiceType(static_cast<AudioServiceType>(type));
    });
}

void LibkestoService::setConfiguration(ReporterID session, const Payload& configuration)
{
    note(session, client_.setConfiguration(encode(configuration), session), [&] { return textOf(configuration); });
}

void LibkestoService::start(ReporterID session)
{
    note(session, client_.startSession(session), [] { return "start"; });
}

void LibkestoService::send(ReporterID session, Category category, EventType type, const Payload& message)
{
    if (type == EventType::Start)
        tracer_.emit(streamStarts, static_cast<std::uint64_t>(session));
    else if (type == EventType::Stop)
        tracer_.emit(streamStops, static_cast<std::uint64_t>(session));
    note(session, client_.send(encode(message), category, type, session), [&] {
        return fmt::format("{} {}: {}", KestoReportingUtilityCategoryString(static_cast<AudioEventCategory>(category)),
                           KestoReportingUtilityTypeString(static_cast<AudioEventType>(type)), textOf(message));
    });
}

void LibkestoService::stop(ReporterID session)
{
    note(session, client_.stopSession(session), [] { return "stop"; });
}

void LibkestoService::destroy(ReporterID session)
{
    note(session, client_.destroySession(session), [] { return "destroy"; });
}

} // namespace kesto_pipewire
