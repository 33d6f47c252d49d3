// SPDX-License-Identifier: Apache-2.0
// The store's failures as the ledger knows them.
#include "platform/linux/store/StoreError.h"

namespace platform {

ledger::Counter counterOf(StoreError error) noexcept
{
    using enum ledger::Counter;
    switch (error) {
    case StoreError::DiskFull: return LostToDiskFull;
    case StoreError::ReadOnly: return LostToReadOnly;
    case StoreError::Locked: return LostToLock;
    case StoreError::InUse: return LostToOtherService;
    case StoreError::CannotOpen: return LostToOpening;
    case StoreError::InputOutput: return LostToInputOutput;
    case StoreError::Corrupt: return LostToDamage;
    case StoreError::Newer: return LostToNewerStore;
    case StoreError::LogHeld: return LostToReader;
    case StoreError::NotJson: return LostNotJson;
    case StoreError::Other: break;
    }
    return LostToOther;
}

} // namespace platform
