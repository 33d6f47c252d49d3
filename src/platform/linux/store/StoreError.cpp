// All messages about the store's troubles for its owner, each with what to do.
#include "platform/linux/store/StoreError.h"

namespace platform {

StoreErrorWords words(StoreError error) noexcept
{
    switch (error) {
    case StoreError::DiskFull: return {"the disk is full", "make room, or lower maximum_size_mb in analytics.toml"};
    case StoreError::ReadOnly: return {"the database is read-only", "let the user of the service write to it"};
    case StoreError::Locked:
        return {"another program writes to the database", "end it; programs should open the database read-only"};
    case StoreError::InUse:
        return {"another process keeps its events in the same directory", "give each service its own state directory"};
    case StoreError::CannotOpen:
        return {"the database cannot be opened or made", "let the user of the service write to its directory"};
    case StoreError::InputOutput: return {"the disk failed", "look for its errors in the kernel's log"};
    case StoreError::Corrupt:
        return {"the database is damaged and cannot be set aside", "move it to another place by hand"};
    case StoreError::Newer:
        return {"the database is of a later version and cannot be set aside", "move it to another place by hand"};
    case StoreError::LogHeld:
        return {"a program has been reading the database for too long", "end it, or let it read in short transactions"};
    case StoreError::NotJson:
        return {"their payloads hold NaN or infinity, which JSON cannot express",
                "correct the programs that send them"};
    case StoreError::Other: return {"SQLite refused", "restart the service and report this"};
    }
    return {"unknown", "report this"};
}

} // namespace platform
