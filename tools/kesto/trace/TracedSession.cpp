// SPDX-License-Identifier: Apache-2.0
// The library calls back on its own thread; each step waits for this callback.
#include "kesto/trace/TracedSession.h"

#include "kesto/Terminal.h"

#include <chrono>
#include <fmt/format.h>
#include <kesto/trace.hpp>
#include <random>
#include <stdexcept>
#include <system_error>

namespace {

constexpr std::chrono::seconds patience{30}; // how long to wait for an answer
constexpr std::chrono::seconds tracePatience{2}; // how long to wait until a started trace becomes visible

template <typename... Arguments> [[noreturn]] void fail(fmt::format_string<Arguments...> text, Arguments&&... arguments)
{
    throw std::runtime_error(fmt::format(text, std::forward<Arguments>(arguments)...));
}

kesto::ReporterID randomReporter()
{
    std::random_device random;
    return std::uniform_int_distribution<kesto::ReporterID>(1)(random);
}

} // namespace

TracedSession::TracedSession(const std::string& socket) : reporter_(randomReporter())
{
    kesto::Options options;
    options.socketPath = socket;
    options.wakeOnSend = true;
    options.trace = true;
    options.stateChanged = [this](const kesto::StateChange& change) { stateChanged(change); };
    if (const auto status = client_.open(options); status != kesto::Status::Ok)
        fail("the service cannot be reached: {}", kesto::errorText(status));
    ask([&](const auto& answered) { return client_.createSession(reporter_, answered); });
    ask([&](const auto& answered) { return client_.setServiceType(kesto::ServiceType::Test, reporter_, answered); });
}

void TracedSession::start(const std::filesystem::path& parameters)
{
    // The configuration leaves out the kind of trace: the service has one kind, and refuses a kind from a client.
    kesto::Message configuration;
    configuration.add("KestoReportingPellorinPlistFilePath", parameters.native());
    ask([&](const auto& answered) { return client_.setConfiguration(configuration, reporter_, answered); });
    {
        const std::scoped_lock lock(lock_);
        mayBeTraced_ = false; // the last start got its second answer when it was stopped
    }
    // If the service may trace, a start is answered before the next call; else when the session stops.
    if (const auto status = client_.startSession(reporter_, [this](const auto& answer) { takeStart(answer); });
        status != kesto::Status::Ok)
        fail("the session cannot be started: {}", kesto::errorText(status));
    ask([&](const auto& answered) { return client_.validate(reporter_, answered); });
    {
        const std::scoped_lock lock(lock_);
        if (!mayBeTraced_)
            fail("the service does not trace. Either the feature is off (feature-flags.toml: [Sonalis] Tracing = "
                 "true), or it may not use tracefs: its log gives the reason");
    }
    waitForTrace();
}

void TracedSession::stop()
{
    ask([&](const auto& answered) { return client_.stopSession(reporter_, answered); });
}

void TracedSession::ask(const Call& call)
{
    {
        const std::scoped_lock lock(lock_);
        isAnswered_ = false;
    }
    if (const auto status = call([this](const kesto::Answer& answer) { take(answer); });
        status != kesto::Status::Ok && status != kesto::Status::NotConnected) // a lost connection is reported below
        fail("the service cannot be asked: {}", kesto::errorText(status));
    std::unique_lock lock(lock_);
    if (!changed_.wait_for(lock, patience, [this] { return isAnswered_ || !problem_.empty(); }))
        fail("the service does not answer within {} s", patience.count());
    if (!problem_.empty())
        throw std::runtime_error(problem_);
}

void TracedSession::waitForTrace()
{
    const kesto::Tracer tracer(client_);
    const auto end = std::chrono::steady_clock::now() + tracePatience;
    std::unique_lock lock(lock_);
    while (!tracer.isActive()) {
        if (!problem_.empty())
            throw std::runtime_error(problem_);
        if (std::chrono::steady_clock::now() > end)
            fail("the service has begun no trace: its log says why");
        changed_.wait_for(lock, std::chrono::milliseconds(1)); // the library does not report its beginning
    }
}

void TracedSession::take(const kesto::Answer& answer)
{
    const std::scoped_lock lock(lock_);
    if (answer.status() != kesto::Status::Ok)
        return; // the library's error for a lost connection, which is reported separately
    isAnswered_ = true;
    if (!answer.ok())
        problem_ = fmt::format("the service refuses: {} {}; is reporting disabled?", printable(answer.errorDomain()),
                               answer.errorCode());
    changed_.notify_all();
}

void TracedSession::takeStart(const kesto::Answer& answer)
{
    const std::scoped_lock lock(lock_);
    mayBeTraced_ |= answer.ok();
}

void TracedSession::stateChanged(const kesto::StateChange& change)
{
    if (change.state != kesto::State::Disconnected)
        return;
    const std::scoped_lock lock(lock_);
    problem_ =
        fmt::format("{}: {}{}; {}", change.socketPath, kesto::errorText(change.reason),
                    change.systemError == 0 ? "" : " (" + std::generic_category().message(change.systemError) + ")",
                    change.reason == kesto::Status::ConnectionLost ? "its log says why" : "is kestod running?");
    changed_.notify_all();
}
