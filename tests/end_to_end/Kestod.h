// SPDX-License-Identifier: Apache-2.0
// A real service process on a private socket, in directories of its own.
#pragma once

#include "foundation/values/Value.h"
#include "support/TemporaryDirectory.h"

#include <chrono>
#include <csignal>
#include <expected>
#include <filesystem>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <sys/types.h>
#include <thread>
#include <vector>

namespace end_to_end {

// How long a test waits before it fails.
constexpr std::chrono::seconds patience(30);

// Waits until the condition holds; false if the time is over.
template <typename Condition> bool waitUntil(Condition condition)
{
    const auto end = std::chrono::steady_clock::now() + patience;
    while (!condition()) {
        if (std::chrono::steady_clock::now() > end)
            return false;
        std::this_thread::sleep_for(std::chrono::milliseconds(2));
    }
    return true;
}

// One row of the store.
struct StoreRow {
    std::string name;
    std::string payload; // JSON
};

// Descriptors that replace the process's own; -1: none.
struct InheritedDescriptors {
    int standardError = -1; // in place of the log file
    int listeningSocket = -1; // passed as a service manager passes it
};

// One thread. The process ends with this object, if it has not ended before.
class Kestod {
public:
    using Environment = std::map<std::string, std::string>;
    // Files of the configuration directory by name, such as "device.toml".
    using Files = std::map<std::string, std::string>;

    [[nodiscard]] static const char* program() noexcept;

    // Makes the directories and the files, and does not start the process. Adds further variables to the usual ones; an
    // empty one is not set.
    explicit Kestod(const Files& configuration = {}, Environment further = {});
    ~Kestod();
    Kestod(const Kestod&) = delete;
    Kestod& operator=(const Kestod&) = delete;

    // From the next start on the process sees this folder empty, as under a unit with PrivateTmp= or ProtectHome=.
    // Needs the right to mount.
    void hide(const std::filesystem::path& folder) { hidden_ = folder; }

    // From the next start on the process may have so many descriptors.
    void limitDescriptors(unsigned count) { mostDescriptors_ = count; }

    // From the next start on the process sees the time of day shifted by so much; further calls take effect at once.
    void shiftClock(std::chrono::seconds shift);

    // Starts the process; clients that connect immediately must wait until it listens.
    void start(const InheritedDescriptors& inherited = {});
    // The same, for clients that do not wait: returns when the service listens.
    void startAndAwait();
    void kill();
    // Sends the signal, which the process may handle.
    void signal(int number) const { ::kill(process_, number); }
    // Waits for the process to end. The status, or the negative number of the signal that killed it.
    [[nodiscard]] int exitStatus();

    // For a process that was started.
    [[nodiscard]] pid_t process() const { return process_; }
    [[nodiscard]] const std::filesystem::path& directory() const { return directory_.path(); }
    [[nodiscard]] std::filesystem::path socketPath() const { return directory() / "run" / "kesto.socket"; }
    // The process's standard error so far.
    [[nodiscard]] std::string log() const; // a line comes a few milliseconds after what it reports
    // Waits until the log holds the text; false if the time is over.
    [[nodiscard]] bool waitForLog(std::string_view text) const;
    [[nodiscard]] std::size_t countInLog(std::string_view text) const;
    // Returns when the log holds the lines of all that was answered so far. Causes a line of a new client.
    void awaitLog() const;

    // The stored events of names that match the pattern (GLOB), in order. Throws if the store cannot be read.
    [[nodiscard]] std::vector<StoreRow> events(std::string_view pattern = "*") const;
    // The first column of the rows of a query of the store. Throws if it cannot be read.
    [[nodiscard]] std::vector<std::string> query(const std::string& sql) const;
    // How many events the store holds. Throws if it cannot be read.
    [[nodiscard]] std::uint64_t eventCount() const;
    // Waits for at least so many such events.
    [[nodiscard]] std::vector<StoreRow> waitForEvents(std::string_view pattern, std::size_t count = 1) const;

private:
    [[nodiscard]] std::expected<std::vector<StoreRow>, std::string> readEvents(std::string_view pattern) const;

    const support::TemporaryDirectory directory_;
    Environment environment_;
    std::filesystem::path hidden_; // empty: none
    std::optional<unsigned> mostDescriptors_; // nothing: as many as the test
    pid_t process_ = 0;
};

} // namespace end_to_end
