// SPDX-License-Identifier: Apache-2.0
// The real service, in directories of its own, and its clients' messages.
#pragma once

#include "foundation/values/Value.h"
#include "support/ChildProcess.h"
#include "support/Harness.h"
#include "support/RawClient.h"
#include "support/TemporaryDirectory.h"

#include <cstdint>
#include <string>
#include <string_view>

namespace bench {

class ServiceProcess {
public:
    enum class Build : std::uint8_t { Customer, Internal };

    // What only some measurements need.
    struct Extras {
        std::string_view featureFlags; // the content of feature-flags.toml
        std::filesystem::path channelRoot; // where the channels are, unless it is empty
    };

    // `analytics` is the content of analytics.toml. Returns before the service listens.
    explicit ServiceProcess(const BenchOptions& options, std::string_view analytics = "used = []",
                            Build build = Build::Customer, const Extras& extras = {});

    [[nodiscard]] pid_t identifier() const { return process_.identifier(); }
    [[nodiscard]] std::filesystem::path socketPath() const;
    // Kills the service with SIGKILL.
    void kill() { process_.kill(); }
    // Lets programs of other users reach the socket.
    void admitOtherUsers() const;
    // Waits until the service listens.
    [[nodiscard]] platform::FileDescriptor connect() const;
    // A connection with the sample session on it, started.
    [[nodiscard]] platform::FileDescriptor connectWithSession() const;
    // A client that sends the sample message to it.
    [[nodiscard]] RawClient makeClient() const;

private:
    support::TemporaryDirectory directory_;
    ChildProcess process_;
};

// A frame with its head.
[[nodiscard]] std::string frame(const foundation::Array& call);
// The frame of the sample message, for pre-encoded use. The call's number is the running number, too.
[[nodiscard]] std::string sampleFrame();
// The size of its answer's frame.
constexpr std::size_t sampleAnswerSize = 11;

} // namespace bench
