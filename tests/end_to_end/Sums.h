// SPDX-License-Identifier: Apache-2.0
// What the service counted, against what its store holds: the three sums of the ledger, and that each loss of events is
// charged to a culprit.
#pragma once

#include "end_to_end/Kestod.h"
#include "ledger/LedgerImage.h"

#include <string>
#include <vector>

namespace end_to_end {

// What stands in the service's ledger now, whether it runs or not. Throws if there is no ledger.
[[nodiscard]] ledger::Account readLedger(const Kestod& kestod);

// The sums that do not hold, one line each; `stored` is the number of events that the store holds. All events must come
// from clients, and at most ten of these may have lost any.
[[nodiscard]] std::vector<std::string> brokenSums(const ledger::Account& account, std::uint64_t stored);

// The same for a service whose work is all answered, with the events in its store.
[[nodiscard]] std::vector<std::string> brokenSums(const Kestod& kestod);

} // namespace end_to_end
