// SPDX-License-Identifier: Apache-2.0
// `kesto-uplink run` as a process, on the store of a kestod or a made-up one.
#pragma once

#include "fleet/Truth.h"
#include "sdk/Process.h"

#include <filesystem>
#include <memory>
#include <string>

namespace fleet {

// One thread. The process ends with this object.
class RealUplink {
public:
    // Servers are a list of TOML.
    RealUplink(std::filesystem::path directory, std::filesystem::path store, const std::string& credential,
               const std::string& servers);

    void start();
    void kill(); // at once
    [[nodiscard]] pid_t process() const { return process_->identifier(); }
    [[nodiscard]] std::string log() const;

    // Of the uplink's state; "nothing" is sent before the process has made it.
    [[nodiscard]] bool isAllSent() const;
    void awaitAllSent() const;
    [[nodiscard]] std::int64_t sentUpTo() const; // ID
    [[nodiscard]] std::int64_t batches() const; // that the stream has answered, as the next
    [[nodiscard]] std::uint64_t rows() const;

    // What must be in the database.
    [[nodiscard]] Chapter chapter() const;

private:
    [[nodiscard]] std::filesystem::path state() const { return directory_ / "state"; }

    const std::filesystem::path directory_;
    const std::filesystem::path store_;
    std::unique_ptr<sdk_test::Process> process_;
};

} // namespace fleet
