// SPDX-License-Identifier: Apache-2.0
// The room of the status: what the service counted, for people and for programs that watch it. It asks the service, or
// reads the file of its ledger while it does not run.
#pragma once

#include "foundation/values/Value.h"
#include "platform/linux/connection/FrameReader.h"
#include "platform/linux/files/FileDescriptor.h"

#include <filesystem>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>
#include <utility>

// A line for a person: there is no status to show.
class StatusError : public std::runtime_error {
public:
    using std::runtime_error::runtime_error;
};

// How a command ends that asked for the status: 0 if the service lost nothing since its start, 1 if it did, 3 if it
// does not run or does not answer.
constexpr int exitNotRunning = 3;
[[nodiscard]] int exitStatusOf(const foundation::Dictionary& report);

// One thread.
class StatusSource {
public:
    StatusSource(std::filesystem::path socket, std::filesystem::path ledgerFile)
        : socket_(std::move(socket)),
          ledgerFile_(std::move(ledgerFile))
    {
    }

    // Asks the service without waiting for it. The answer is there when this descriptor can be read; -1: there is
    // nothing to wait for. Throws StatusError.
    [[nodiscard]] int request();
    // What was asked for, as far as it is there: the report (`ledger::report`) of the service that listens at the
    // socket; if none does, that of the ledger's file. Nothing: a part is still missing, or the service that was asked
    // has ended; call `request` again. Does not wait. Throws StatusError.
    [[nodiscard]] std::optional<foundation::Dictionary> take();
    // Both, with a wait of at most ten seconds in between. Throws StatusError.
    [[nodiscard]] foundation::Dictionary read();

private:
    [[nodiscard]] bool isConnected();
    [[nodiscard]] bool isAsked();
    void disconnect();
    [[nodiscard]] std::optional<std::string> receiveFrame();
    [[nodiscard]] foundation::Dictionary readLedger() const;
    [[nodiscard]] StatusError noAnswer(std::string_view why) const;
    [[nodiscard]] StatusError systemFailure() const;

    const std::filesystem::path socket_;
    const std::filesystem::path ledgerFile_;
    platform::FileDescriptor connection_; // kept, because the service stores an event for each that ends
    platform::FrameReader reader_; // of the answer
    bool isAsked_ = false; // over the connection, and not answered yet
    bool hasAnswered_ = false; // over this connection, before
};
