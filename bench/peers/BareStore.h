// SPDX-License-Identifier: Apache-2.0
// A loop that writes the rows of the store with SQLite and does nothing else: what the disk and SQLite allow.
#pragma once

#include "support/TemporaryDirectory.h"

#include <cstddef>
#include <cstdint>
#include <memory>

namespace platform {
class SqliteConnection;
}

namespace bench {

class BareStore {
public:
    enum class Edition : std::uint8_t { First, Second }; // of the tables: a row for each event, or for each message

    explicit BareStore(Edition edition);
    ~BareStore();
    BareStore(const BareStore&) = delete;
    BareStore& operator=(const BareStore&) = delete;

    // Writes so many sample messages, each as two events, in transactions as large as the service's. Returns messages a
    // second.
    [[nodiscard]] double rate(std::size_t count);
    // The bytes of the file for each message so far.
    [[nodiscard]] double bytesOfAMessage();

private:
    void execute(const char* sql);

    const support::TemporaryDirectory directory_;
    const Edition edition_;
    std::unique_ptr<platform::SqliteConnection> connection_;
    std::size_t written_ = 0;
};

} // namespace bench
