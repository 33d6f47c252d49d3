// SPDX-License-Identifier: Apache-2.0
// `kesto-uplink run` as a process, with its files in a directory of its own.
#pragma once

#include "support/TemporaryDirectory.h"

#include <filesystem>
#include <string>
#include <sys/types.h>

namespace uplink_test {

// One thread. The process ends with this object, if it has not ended before.
class UplinkProcess {
public:
    // All events may leave, and of their payloads "number"; a round comes each fifth of a second, and waits for no
    // confirmation.
    UplinkProcess(std::filesystem::path database, const std::string& server);
    ~UplinkProcess();
    UplinkProcess(const UplinkProcess&) = delete;
    UplinkProcess& operator=(const UplinkProcess&) = delete;

    void writeConfiguration(const std::string& text) const;
    void writeCredentials(const std::string& text) const;

    void start();
    void signal(int number) const;
    // Waits for the process to end. The status, or the negative number of the signal that killed it.
    [[nodiscard]] int exitStatus();
    [[nodiscard]] std::string log() const;
    [[nodiscard]] std::filesystem::path state() const { return directory_.path(); }

private:
    const support::TemporaryDirectory directory_;
    std::filesystem::path database_;
    pid_t process_ = 0;
};

} // namespace uplink_test
