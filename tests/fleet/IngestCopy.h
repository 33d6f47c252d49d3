// SPDX-License-Identifier: Apache-2.0
// One copy of kesto-ingest as a process, with a configuration of its own.
#pragma once

#include "sdk/Process.h"

#include <cstdint>
#include <filesystem>
#include <memory>
#include <string>

namespace fleet {

// Makes the streams, so that what a copy holds when it is killed comes to another after so many seconds.
void setUpStreams(const std::filesystem::path& directory, const std::string& brokers, int replicas,
                  int redeliverSeconds);

// One thread. The process ends with this object.
class IngestCopy {
public:
    // Brokers and databases are lists of TOML. Returns when the copy is ready.
    IngestCopy(const std::filesystem::path& directory, const std::string& brokers, const std::string& databases);

    void kill(); // at once
    void end(); // as a service manager does. Throws if the exit status is not 0.
    // The sum of the lines of its metrics that begin so.
    [[nodiscard]] std::int64_t metric(const std::string& beginning) const;
    [[nodiscard]] pid_t process() const { return process_->identifier(); }
    [[nodiscard]] std::string log() const { return process_->errors(); }

private:
    std::unique_ptr<sdk_test::Process> process_;
    std::string metricsAddress_;
};

} // namespace fleet
