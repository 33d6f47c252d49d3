// SPDX-License-Identifier: Apache-2.0
// The file of the ledger is read like any other: only its format is used, so that no code of the service checks itself.
#include "end_to_end/Sums.h"

#include <cstring>
#include <fmt/format.h>
#include <memory>
#include <stdexcept>

namespace end_to_end {

using ledger::Counter;

ledger::Account readLedger(const Kestod& kestod)
{
    const auto image = std::make_unique<ledger::LedgerImage>();
    // Twice in a row at most, a reader meets the slot that is being filled.
    for (int attempt = 0; attempt < 100; ++attempt) {
        const std::string bytes = support::readFile(kestod.directory() / "state" / "analytics.ledger");
        if (bytes.size() != sizeof *image)
            break;
        std::memcpy(image.get(), bytes.data(), sizeof *image);
        if (const auto account = accountIn(*image))
            return *account;
    }
    throw std::runtime_error("there is no ledger");
}

namespace {

std::uint64_t charged(const ledger::Account& account, ledger::Charge charge)
{
    std::uint64_t sum = 0;
    for (const ledger::CulpritCount& culprit : account.culprits[static_cast<std::size_t>(charge)])
        sum += culprit.count;
    return sum;
}

} // namespace

std::vector<std::string> brokenSums(const ledger::Account& account, std::uint64_t stored)
{
    std::vector<std::string> broken;
    const auto check = [&](std::string_view name, std::uint64_t whole, std::uint64_t parts) {
        if (whole != parts)
            broken.push_back(fmt::format("{}: {} are {}", name, whole, parts));
    };
    const std::uint64_t refused = account[Counter::RefusedForMemory] + account[Counter::RefusedForSize];
    check("deliveries = recorded + repeated + inert + refused", account[Counter::Deliveries],
          account[Counter::Recorded] + account[Counter::Repeated] + account[Counter::Inert] + refused);
    check("events = kept + unwanted + lost", account[Counter::Events],
          account[Counter::Kept] + account[Counter::Unwanted] + account.sum(ledger::Charge::Lost));
    check("kept = stored + removed", account[Counter::Kept], stored + account.sum(ledger::Charge::Removed));
    check("lost = charged to culprits", account.sum(ledger::Charge::Lost), charged(account, ledger::Charge::Lost));
    return broken;
}

std::vector<std::string> brokenSums(const Kestod& kestod)
{
    return brokenSums(readLedger(kestod), kestod.eventCount());
}

} // namespace end_to_end
