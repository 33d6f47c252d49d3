// SPDX-License-Identifier: Apache-2.0
// A flush waits until the queue has been read up to its position, and then until all calls up to there are answered.
#include "calls/Flushes.h"

#include "calls/CallTable.h"

namespace libkesto {

void Flushes::serve(std::uint64_t readPosition, std::uint64_t lastCall, const CallTable& calls)
{
    const foundation::Lock lock(mutex_);
    for (Flush* flush : waiting_) {
        if (!flush->lastCall && readPosition >= flush->position)
            flush->lastCall = lastCall;
        if (flush->lastCall && calls.isAnsweredUpTo(*flush->lastCall))
            flush->result = KESTO_OK;
    }
    changed_.notifyAll();
}

void Flushes::endAll(kesto_status status)
{
    const foundation::Lock lock(mutex_);
    endWaiting(status);
}

void Flushes::close()
{
    const foundation::Lock lock(mutex_);
    isClosed_ = true;
    endWaiting(KESTO_CLOSED);
}

void Flushes::endWaiting(kesto_status status)
{
    for (Flush* flush : waiting_)
        if (!flush->result)
            flush->result = status;
    changed_.notifyAll();
}

} // namespace libkesto
