// SPDX-License-Identifier: Apache-2.0
// The whole trial: servers, copies of the ingest, and devices. The scenarios share it.
#pragma once

#include "fleet/Broker.h"
#include "fleet/DatabaseCluster.h"
#include "fleet/Device.h"
#include "fleet/Edition.h"
#include "fleet/Equation.h"
#include "fleet/IngestCopy.h"
#include "fleet/RealDevice.h"
#include "fleet/Truth.h"

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <string>
#include <vector>

namespace fleet {

// Names of credentials.
inline const std::string shared = "fleet"; // of most devices
inline const std::string victim = "victim"; // of the first device
inline const std::string forger = "forger"; // of no device

// What the trial measures on its way.
struct Figures {
    double secondsOfSending = 0; // until the stream had the batches of all devices
    std::uint64_t batches = 0; // that it had then
    std::uint64_t rowsOfWeeks = 0; // in these
    double secondsOfIngest = 0;
    std::uint64_t bytesOfBatches = 0; // as they left the devices
    std::uint64_t bytesInStream = 0; // as one server of the broker keeps them
    std::int64_t peakOfIngest = 0; // in kB, as the next two
    std::int64_t peakOfUplink = 0;
    std::int64_t ownOfUplink = 0;
    std::uint64_t rowsOfUplink = 0;
    double secondsOfUplink = 0; // of a processor, for these rows
    double secondsOfRound = 0; // of a processor, for a round with some rows
    double bytesOfRow = 0; // on the disk of one replica of the database
};

// The thread that made it, which lives as long: servers end with it.
class Fleet {
public:
    // Starts the servers, and makes the devices with their weeks. No ingest runs yet.
    Fleet(const Edition& edition, const std::filesystem::path& directory);

    void startIngests();
    void endIngests(); // each in good order
    [[nodiscard]] std::int64_t metric(const std::string& beginning) const; // of all copies that run

    // Does the work with the first devices, several at a time. Throws the first exception.
    void withDevices(std::size_t count, const std::function<void(Device&)>& work);
    [[nodiscard]] std::size_t done() const { return done_; } // devices of this work so far
    // The same while something else happens, as soon as a quarter is done.
    void withDevicesWhile(std::size_t count, const std::function<void(Device&)>& work,
                          const std::function<void()>& happen);

    // Waits until all that left the devices is stored, and compares.
    [[nodiscard]] Equality settle();

    const Edition edition;
    const std::filesystem::path directory;
    Broker broker;
    DatabaseCluster database;
    std::vector<std::unique_ptr<Device>> devices;
    std::vector<std::unique_ptr<RealDevice>> realDevices;
    std::vector<std::unique_ptr<RealUplink>> furtherUplinks;
    std::vector<std::unique_ptr<IngestCopy>> ingests;
    Figures figures;

private:
    std::atomic<std::size_t> done_ = 0;
    std::atomic<bool> isGivenUp_ = false;
    Truth truth_;
};

} // namespace fleet
