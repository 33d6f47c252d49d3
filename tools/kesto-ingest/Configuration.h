// SPDX-License-Identifier: Apache-2.0
// ingest.toml, and the credentials in a file of their own.
#pragma once

#include "kesto-ingest/database/ClickHouse.h"
#include "kesto-ingest/stream/JetStream.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <expected>
#include <filesystem>
#include <string>

namespace kesto_ingest {

struct Configuration {
    JetStreamConfiguration stream{.servers = {"nats://127.0.0.1:4222"}};
    ClickHouseConfiguration database{.servers = {"http://127.0.0.1:8123"}};
    std::size_t rowsInABlock = 10'000; // as many are joined into one insert
    std::chrono::milliseconds longestJoining{1000}; // or what came in that time
    std::uint16_t metricsPort = 9464;

    friend bool operator==(const Configuration&, const Configuration&) = default;
};

// The error names the file, the place and what to do.
[[nodiscard]] std::expected<Configuration, std::string> readConfiguration(const std::filesystem::path& file);

} // namespace kesto_ingest
