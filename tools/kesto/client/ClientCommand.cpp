// SPDX-License-Identifier: Apache-2.0
// The room of the client: the one command that calls the service. It connects to the service's socket.
//
// `kesto client`: every operation of the service from a shell. It reads one JSON array in each line, and prints one
// JSON object for each answer as it comes.
#include "client/ServiceOperations.h"
#include "foundation/values/Json.h"
#include "foundation/values/Value.h"
#include "kesto/Commands.h"
#include "kesto/client/ClientCall.h"

#include <chrono>
#include <condition_variable>
#include <fmt/format.h>
#include <iostream>
#include <mutex>
#include <string>
#include <thread>

namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;

struct ClientOptions {
    std::string socket;
    double wait = 10;
};

const client::ServiceOperation& operationOf(const kesto::Answer& answer)
{
    return *client::serviceOperationNumbered(static_cast<std::int64_t>(answer.operation()));
}

Value valuesOf(const kesto::Answer& answer)
{
    switch (operationOf(answer).result()) {
    case client::OperationResult::None: break;
    case client::OperationResult::Success: return Array{answer.success()};
    case client::OperationResult::ServiceType: return Array{static_cast<int>(answer.serviceType())};
    case client::OperationResult::Validity:
        return Array{Dictionary{{"reporterID", answer.validReporter()},
                                {"serviceType", static_cast<int>(answer.serviceType())}}};
    case client::OperationResult::ReporterIDs: {
        std::vector<Value> reporters;
        for (const kesto::ReporterID reporter : answer.reporters())
            reporters.emplace_back(reporter);
        return Array{Value(Array(std::move(reporters)))}; // a list in a list: without Value some compilers copy it
    }
    }
    return Array();
}

std::string lineOf(const kesto::Answer& answer)
{
    const Value error =
        answer.ok() ? Value() : Value(Dictionary{{"domain", answer.errorDomain()}, {"code", answer.errorCode()}});
    std::string line;
    foundation::appendJsonText(Dictionary{{"call", answer.call()},
                                          {"operation", operationOf(answer).name()},
                                          {"error", error},
                                          {"values", answer.ok() ? valuesOf(answer) : Value(Array())}},
                               line);
    return line;
}

// The library takes calls of up to a quarter of its queue, and the service takes up to 1 MiB.
constexpr std::size_t queueBytes = std::size_t{4} * 1024 * 1024;
// The longest such call, with all its escapes.
constexpr std::size_t longestLine = std::size_t{8} * 1024 * 1024;

// Reads the next line; of a line that is too long, only enough to show this. False at the end of the input.
bool readLine(std::istream& input, std::string& line)
{
    line.clear();
    char character = 0;
    while (input.get(character) && character != '\n')
        if (line.size() <= longestLine)
            line += character;
    return !line.empty() || input;
}

// How many answers to wait for at the end. A start is answered when its session stops, which may never happen; a call
// for the service type of reporter 0 is answered twice.
std::size_t awaitedAnswers(const ClientCall& call)
{
    if (call.operation == kesto::Operation::StartSession)
        return 0;
    return call.operation == kesto::Operation::GetServiceType && call.reporter == 0 ? 2 : 1;
}

// One run: the lines of standard input as calls, and their answers.
class ClientRun {
public:
    explicit ClientRun(const ClientOptions& options) : options_(options) { }

    int run()
    {
        kesto::Options options;
        options.socketPath = options_.socket;
        options.queueBytes = queueBytes;
        options.wakeOnSend = true; // a person may wait for each answer, and system calls do no harm here
        options.stamp = false; // a message is sent as it stands in its line
        options.stateChanged = [this](const kesto::StateChange& change) { stateChanged(change); };
        if (const auto status = client_.open(options); status != kesto::Status::Ok) {
            fmt::print(stderr, "kesto client: {}\n", kesto::errorText(status));
            return exitFailure;
        }
        std::string line;
        for (unsigned number = 1; !isOver() && readLine(std::cin, line); ++number)
            if (line.size() > longestLine || line.find_first_not_of(" \t\r") != std::string::npos)
                carryOut(line, number);
        waitForAnswers();
        client_.close(std::chrono::milliseconds(0));
        return hasFailed_ ? exitFailure : exitOk;
    }

private:
    void carryOut(std::string_view line, unsigned number)
    {
        const auto call = line.size() > longestLine ? std::unexpected(fmt::format("longer than {} bytes", longestLine))
                                                    : parseClientCall(line);
        if (!call) {
            fmt::print(stderr, "kesto client: line {}: {}\n", number, call.error());
            const std::scoped_lock lock(lock_);
            hasFailed_ = true;
            return;
        }
        const std::size_t awaited = awaitedAnswers(*call);
        {
            const std::scoped_lock lock(lock_);
            unanswered_ += awaited;
            isKilling_ |= call->operation == kesto::Operation::KillService;
        }
        const auto answered = [this](const kesto::Answer& answer) { print(answer); };
        kesto::Status status = submit(client_, *call, answered);
        while (status == kesto::Status::QueueFull) {
            client_.flush(std::chrono::milliseconds(100));
            status = submit(client_, *call, answered);
        }
        if (status == kesto::Status::Ok)
            return;
        std::unique_lock lock(lock_);
        unanswered_ -= awaited;
        if (status == kesto::Status::NotConnected) // `stateChanged` is about to give the reason
            changed_.wait_for(lock, std::chrono::duration<double>(options_.wait), [this] { return isOver_; });
        if (!isOver_)
            fmt::print(stderr, "kesto client: line {}: {}\n", number, kesto::errorText(status));
        hasFailed_ = true;
    }

    // The following functions run on the library's thread.
    void print(const kesto::Answer& answer)
    {
        if (answer.status() == kesto::Status::ConnectionLost)
            return; // the service did not answer; `stateChanged` reports the lost connection
        const std::scoped_lock lock(lock_);
        if (answer.operation() != kesto::Operation::StartSession && unanswered_ > 0)
            --unanswered_;
        changed_.notify_all();
        if (isFinished_)
            return;
        const std::string line = lineOf(answer) + '\n';
        std::fwrite(line.data(), 1, line.size(), stdout); // failures are reported at the end
        std::fflush(stdout);
    }

    void stateChanged(const kesto::StateChange& change)
    {
        if (change.state != kesto::State::Disconnected)
            return;
        const std::scoped_lock lock(lock_);
        isOver_ = true;
        changed_.notify_all();
        if (isFinished_ || (isKilling_ && change.reason == kesto::Status::ConnectionLost))
            return;
        hasFailed_ = true;
        const std::string why = change.systemError == 0
            ? std::string()
            : fmt::format(" ({})", std::generic_category().message(change.systemError));
        fmt::print(stderr, "kesto client: {}: {}{}; is kestod running?\n", change.socketPath,
                   kesto::errorText(change.reason), why);
    }

    [[nodiscard]] bool isOver()
    {
        const std::scoped_lock lock(lock_);
        return isOver_;
    }

    void waitForAnswers()
    {
        std::unique_lock lock(lock_);
        const bool isDone = changed_.wait_for(lock, std::chrono::duration<double>(options_.wait),
                                              [this] { return isOver_ || unanswered_ == 0; });
        isFinished_ = true;
        if (isDone)
            return;
        fmt::print(stderr, "kesto client: {} answers did not come within {} s\n", unanswered_, options_.wait);
        hasFailed_ = true;
    }

    const ClientOptions& options_;
    std::mutex lock_;
    std::condition_variable changed_;
    std::size_t unanswered_ = 0; // the number of answers to wait for
    bool isKilling_ = false;
    bool isOver_ = false; // the connection
    bool isFinished_ = false; // waiting for answers
    bool hasFailed_ = false;
    kesto::Client client_; // ends first: its thread calls what is above
};

} // namespace

void addClientCommand(CLI::App& application, int& exitStatus)
{
    const auto options = std::make_shared<ClientOptions>();
    CLI::App* command = application.add_subcommand("client", "Calls the operations of the service, one in each line");
    command->add_option("--socket", options->socket, "The service's socket, if it is not at its usual place");
    command->add_option("--wait", options->wait, "How many seconds to wait for the last answers")
        ->check(CLI::NonNegativeNumber)
        ->capture_default_str();
    command->footer(R"(Each line of standard input is a JSON array:
  ["create", 42]
  ["setServiceType", "longformaudio", 42]
  ["setConfiguration", {"HostApplicationDisplayID": "org.example.player"}, 42]
  ["start", 42]                    answered when the session is stopped; where kernel traces are on,
                                   that of a "test" session is answered immediately, too
  ["send", {"volume": 0.5}, "Playback", "Start", [42]]     null in place of the list: all started sessions
  ["getServiceName", 42]  ["validate", 42]  ["getAllReporters"]
  ["stop", 42]  ["destroy", 42]  ["kill"]
Each answer is a line of standard output:
  {"call":1,"operation":"createReportingSession","error":null,"values":[true]}
Exit status: 0, or 1 when a line was wrong, the connection was lost or an answer did not come.)");
    command->callback([options, &exitStatus] { exitStatus = ClientRun(*options).run(); });
}
