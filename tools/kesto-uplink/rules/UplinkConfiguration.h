// SPDX-License-Identifier: Apache-2.0
// The room of rules: the maker's settings in uplink.toml, which say whether anything leaves the device, to whom, how
// often, and what exactly.
//
// A mistake in this file could let something leave that should stay. So a file with any mistake switches the uplink off
// until it is corrected.
#pragma once

#include "kesto-uplink/rules/AllowList.h"

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <string>
#include <string_view>
#include <vector>

namespace kesto_uplink {

// What has to happen before the device forgets that rows were to be sent.
enum class ForgetWhen : std::uint8_t {
    Stored, // the fleet's database has them
    Queued // the stream of the servers has them
};

// Of the fleet's protocol.
constexpr std::size_t largestBatch = std::size_t{512} * 1024; // compressed
constexpr std::size_t longestText = 16'384; // in bytes, of texts outside of payloads

struct UplinkConfiguration {
    bool enabled = false;
    std::vector<std::string> servers; // such as "tls://reports.example:4222"
    std::filesystem::path credentials; // empty: none
    std::filesystem::path ca; // of the servers' certificates; empty: the system's
    double pseudonymDays = 90; // after that the pseudonym is due for renewal
    double hashKeyDays = 90;
    ForgetWhen forgetWhen = ForgetWhen::Stored;
    double intervalSeconds = 900; // at most one wake-up in each
    std::uint64_t maximumBytesADay = 20'000'000;
    bool metered = true; // false: nothing is sent on metered networks
    std::string model; // labels of the device; empty: none
    std::string version;
    AllowList allowed;
};

// A configuration, and what is wrong with the file: sentences for a person, with file and line. Nothing may leave as
// long as there is one.
struct CheckedUplinkConfiguration {
    UplinkConfiguration configuration;
    std::vector<std::string> problems;

    [[nodiscard]] bool isOn() const { return configuration.enabled && problems.empty(); }
};

// A missing file switches nothing on. Any thread.
[[nodiscard]] CheckedUplinkConfiguration readUplinkConfiguration(const std::filesystem::path& file);
// The same for the text of a file of that name.
[[nodiscard]] CheckedUplinkConfiguration parseUplinkConfiguration(const std::filesystem::path& file,
                                                                  std::string_view text);

} // namespace kesto_uplink
