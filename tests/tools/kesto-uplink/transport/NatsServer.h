// SPDX-License-Identifier: Apache-2.0
// A real nats-server on loopback, with the streams and accounts that a fleet has, in a directory of its own.
//
// It keeps its port as long as the object lives, so that it comes back where its clients look for it.
#pragma once

#include "support/KeptPort.h"
#include "support/TemporaryDirectory.h"

#include <nats/nats.h>

#include <cstdint>
#include <functional>
#include <string>
#include <sys/types.h>
#include <vector>

namespace uplink_test {

struct StoredMessage {
    std::string subject;
    std::string id; // Nats-Msg-Id
    std::string edition; // Kesto-Edition
    std::string bytes;

    bool operator==(const StoredMessage&) const = default;
};

class NatsServer {
public:
    struct Setup {
        std::string tls = {}; // the inner lines of a block `tls`, or nothing
        bool hasStreams = true;
    };

    NatsServer() : NatsServer(Setup{}) { }
    explicit NatsServer(const Setup& setup);
    ~NatsServer();
    NatsServer(const NatsServer&) = delete;
    NatsServer& operator=(const NatsServer&) = delete;

    void start(); // again, after `kill`
    void kill();
    // Answers nothing until it goes on, as behind a network that is gone.
    void freeze();
    void goOn();

    [[nodiscard]] std::uint16_t port() const { return port_.number(); }
    [[nodiscard]] std::string url(const std::string& scheme = "nats", const std::string& host = "127.0.0.1") const;

    // Each of these connects with all rights, without encryption.
    void fill(); // until the stream KESTO takes no more
    void drain();
    void publish(const std::string& subject, const std::string& bytes);
    [[nodiscard]] std::vector<StoredMessage> stored(); // in the stream KESTO, in order

private:
    void asAdministrator(const std::function<void(natsConnection*, jsCtx*)>& work);

    const support::TemporaryDirectory directory_;
    bool hasTLS_ = false;
    const support::KeptPort port_;
    pid_t process_ = 0;
};

} // namespace uplink_test
