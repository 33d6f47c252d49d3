// SPDX-License-Identifier: Apache-2.0
// The last words.
#include "utility/EndProcess.h"

#include "foundation/text/Format.h"
#include "platform/Platform.h"
#include "utility/LogCategories.h"

#include <cstdlib>
#include <string>

namespace utility {

void reportLosses()
{
    platform::current().analytics.reportLosses();
    const ledger::Account account = platform::current().ledger.sinceStart();
    std::string losses;
    for (const ledger::CounterRow& row : ledger::counterRows())
        if (row.meaning == ledger::Meaning::Loss && account[row.counter] != 0)
            losses += foundation::format("{}{} {}", losses.empty() ? "" : ", ", row.path, account[row.counter]);
    if (!losses.empty())
        KESTO_LOG(KestoReportingServiceDelegateCategory(), Error, "lost since the start: {}", losses);
    platform::current().log.flush();
}

void endProcess(int status)
{
    reportLosses();
    std::_Exit(status);
}

} // namespace utility
