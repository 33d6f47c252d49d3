// SPDX-License-Identifier: Apache-2.0
// The cost of a disabled log statement: one of the service's own, with expensive arguments, compared with syslog below
// its mask.
#include "Groups.h"
#include "support/InProcessPlatform.h"
#include "utility/LogCategories.h"

#include <fmt/ranges.h>
#include <syslog.h>

namespace bench {
namespace {

constexpr std::size_t count = 20'000'000;

std::string shownList(const std::vector<std::int64_t>& reporterIDs)
{
    return fmt::format("[{}]", fmt::join(reporterIDs, ","));
}

} // namespace

void measureLogStatement(const BenchOptions& options, Report& report)
{
    const InProcessPlatform platform;
    const std::vector<std::int64_t> reporterIDs{1, 2, 3};
    ::setlogmask(LOG_UPTO(LOG_NOTICE));
    const auto costs = compete(
        options, "log statement",
        [&] {
            return nanosecondsEach(count, [&](std::size_t each) {
                use(each);
                KESTO_LOG(KestoReportingClientCategory(), Debug, "sending message {} for reporter {}", each,
                          shownList(reporterIDs));
            });
        },
        [&] {
            return nanosecondsEach(count, [&](std::size_t each) {
                use(each);
                ::syslog(LOG_DEBUG, "sending message %zu for reporter %lld", each,
                         static_cast<long long>(reporterIDs.front()));
            });
        });
    report.add({"a log statement below the threshold", "ns", costs[0], PeerFigure{"syslog(3) below its mask", costs[1]},
                Target::figureAtMost(2)});
}

} // namespace bench
