// SPDX-License-Identifier: Apache-2.0
// The transport to the streams of NATS (JetStream), by libnats.
//
// Each server of the list is asked in turn, beginning anywhere, so that many devices spread over the servers. The
// library itself never connects again: a round that loses its connection decides itself what to do. Every publish waits
// for its answer, since the library has no time limit for others.
#pragma once

#include "kesto-uplink/transport/Credentials.h"
#include "kesto-uplink/transport/Transport.h"

#include <nats/nats.h>

#include <chrono>
#include <filesystem>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

namespace kesto_uplink {

struct Servers {
    std::vector<std::string> urls = {}; // tls://HOST:PORT, or nats://HOST:PORT without encryption
    std::filesystem::path authorities = {}; // PEM; empty: those that the system trusts
};

struct TimeLimits {
    std::chrono::milliseconds connect = std::chrono::seconds(5); // of each server, and of each step
    std::chrono::milliseconds answer = std::chrono::seconds(10);
    std::int64_t slowestBytesPerSecond = 8192; // a batch has the time of its bytes on such a link besides
};

class JetStream : public Transport {
public:
    JetStream(Servers servers, Credentials credentials, TimeLimits limits = {});
    ~JetStream() override;
    JetStream(const JetStream&) = delete;
    JetStream& operator=(const JetStream&) = delete;

    Answer connect() override;
    void disconnect() override;
    Answer put(const std::string& id, std::string_view batch) override;
    Confirmed lastConfirmation(const std::string& device) override;
    Confirmed awaitConfirmation(std::chrono::milliseconds limit) override;
    void interrupt() override;

private:
    template <auto destroy> struct Destroyer {
        template <typename T> void operator()(T* object) const noexcept { destroy(object); }
    };
    using Options = std::unique_ptr<natsOptions, Destroyer<natsOptions_Destroy>>;
    using Connection = std::unique_ptr<natsConnection, Destroyer<natsConnection_Destroy>>;
    using Context = std::unique_ptr<jsCtx, Destroyer<jsCtx_Destroy>>;
    using Subscription = std::unique_ptr<natsSubscription, Destroyer<natsSubscription_Destroy>>;
    using Message = std::unique_ptr<natsMsg, Destroyer<natsMsg_Destroy>>;

    [[nodiscard]] Options optionsFor(const std::string& url);
    [[nodiscard]] Answer connectTo(const std::string& url);
    [[nodiscard]] Answer withoutConnection();
    // What the end of a call means that did not succeed.
    [[nodiscard]] Answer failure(natsStatus status, jsErrCode code);
    [[nodiscard]] Answer confirmationsFailed(natsStatus status);
    [[nodiscard]] bool isInterrupted();
    [[nodiscard]] std::int64_t timeFor(std::size_t bytes) const;
    static natsStatus sign(char** problem, unsigned char** signature, int* size, const char* nonce, void* transport);

    Servers servers_;
    const Credentials credentials_;
    const TimeLimits limits_;
    const std::string eventSubject_;

    std::mutex mutex_; // of the two below, while connections are exchanged or interrupted
    bool isInterrupted_ = false;
    Connection connection_;
    std::string server_; // of the connection
    Context context_;
    Subscription confirmations_;
};

} // namespace kesto_uplink
