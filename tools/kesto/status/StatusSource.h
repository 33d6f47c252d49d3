// The room of the status: what the service counted, for people and for programs that watch it. It asks the service, or
// reads the file of its ledger while it does not run.
#pragma once

#include "foundation/values/Value.h"
#include "platform/linux/files/FileDescriptor.h"

#include <filesystem>
#include <stdexcept>
#include <string>
#include <string_view>
#include <utility>

// A line for a person: there is no status to show.
class StatusError : public std::runtime_error {
public:
    using std::runtime_error::runtime_error;
};

// One thread.
class StatusSource {
public:
    StatusSource(std::filesystem::path socket, std::filesystem::path ledgerFile)
        : socket_(std::move(socket)),
          ledgerFile_(std::move(ledgerFile))
    {
    }

    // The report (`ledger::report`) of the service that listens at the socket; if none does, that of the ledger's file.
    // Waits at most ten seconds for the service. Throws StatusError.
    [[nodiscard]] foundation::Dictionary read();

private:
    [[nodiscard]] bool isConnected();
    [[nodiscard]] foundation::Dictionary ask();
    [[nodiscard]] std::string receiveFrame();
    [[nodiscard]] foundation::Dictionary readLedger() const;
    [[nodiscard]] StatusError noAnswer(std::string_view why) const;
    [[nodiscard]] StatusError systemFailure() const;

    const std::filesystem::path socket_;
    const std::filesystem::path ledgerFile_;
    platform::FileDescriptor connection_; // kept, because the service stores an event for each that ends
};
