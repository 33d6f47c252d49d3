// SPDX-License-Identifier: Apache-2.0
// A session of the service that traces from `start` to `stop`, any number of times; it ends with its connection at the
// latest.
//
// Two signs show that the service traces: it answers a start before the session stops, and a client that asked may emit
// events. If the service refuses, the error says where to look.
#pragma once

#include <condition_variable>
#include <filesystem>
#include <functional>
#include <kesto/kesto.hpp>
#include <mutex>
#include <string>

// One thread. Every function throws std::runtime_error, with a line for a person, on failure.
class TracedSession {
public:
    // An empty socket stands for the service's usual place.
    explicit TracedSession(const std::string& socket);

    // When it returns, the service has read the parameters and, as far as a client can see, traces.
    void start(const std::filesystem::path& parameters);
    // When it returns, the service has written the results, if it could.
    void stop();

private:
    using Call = std::function<kesto::Status(const kesto::AnswerCallback& answered)>;

    void ask(const Call& call);
    void waitForTrace();
    // On the library's thread.
    void take(const kesto::Answer& answer);
    void takeStart(const kesto::Answer& answer);
    void stateChanged(const kesto::StateChange& change);

    const kesto::ReporterID reporter_;
    std::mutex lock_;
    std::condition_variable changed_;
    bool isAnswered_ = false; // the last call
    bool mayBeTraced_ = false; // the start was answered before a stop
    std::string problem_;
    kesto::Client client_; // destroyed first: its thread uses the members above
};
