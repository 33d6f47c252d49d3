// SPDX-License-Identifier: Apache-2.0
// Answers every request on a port of this host with the metrics. It serves a collector, one request at a time, and
// needs no more of HTTP than that.
#pragma once

#include "kesto-ingest/Metrics.h"
#include "platform/linux/files/FileDescriptor.h"

#include <cstdint>
#include <thread>

namespace kesto_ingest {

class MetricsServer {
public:
    // On 127.0.0.1; port 0 is any that is free. Throws std::system_error. The metrics must outlive it.
    MetricsServer(const Metrics& metrics, std::uint16_t port);
    ~MetricsServer();
    MetricsServer(const MetricsServer&) = delete;
    MetricsServer& operator=(const MetricsServer&) = delete;

    [[nodiscard]] std::uint16_t port() const;

private:
    void serve();
    void answer(const platform::FileDescriptor& connection) const;

    const Metrics& metrics_;
    platform::FileDescriptor socket_;
    platform::FileDescriptor end_; // readable when it is time to end
    std::thread thread_;
};

} // namespace kesto_ingest
