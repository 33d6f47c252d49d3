// SPDX-License-Identifier: Apache-2.0
// How many messages a second become stored events: the service answers when both events of a message are committed; for
// journald the time ends when its last message can be read back. Measured in a burst, and so long that both move their
// written data to its final place; each may keep 4 GB. A bare SQLite loop, which writes the same rows and does nothing
// else, shows the limit of the disk and of SQLite.
#include "Groups.h"
#include "peers/BareStore.h"
#include "peers/JournalPeer.h"
#include "support/ServiceProcess.h"

#include <fmt/format.h>

namespace bench {
namespace {

struct Run {
    std::size_t messages;
    double timesJournald; // the target
};

void measureBytes(Report& report)
{
    constexpr std::size_t count = 20'000;
    BareStore first(BareStore::Edition::First);
    BareStore second(BareStore::Edition::Second);
    use(first.rate(count));
    use(second.rate(count));
    report.add({"bytes of a message with two events", "B", Series({second.bytesOfAMessage()}),
                PeerFigure{"rows of the first edition", Series({first.bytesOfAMessage()})}, Target::ratioAtMost(0.6)});
}

} // namespace

void measureStored(const BenchOptions& options, Report& report)
{
    const std::string what = "sendMessage pipelined, two events stored";
    const ServiceProcess service(options, "used = [\"com.quarn.*\"]\nmaximum_size_mb = 4096");
    showProgress("starting a private journald");
    const auto journal = JournalPeer::start();
    for (const auto& [count, timesJournald] : {Run{20'000, 8}, Run{200'000, 5}, Run{1'000'000, 5}}) {
        const std::string name = fmt::format("{}, {} of them", what, count);
        const Contestant measureService = [&] {
            RawClient client = service.makeClient();
            const auto start = Clock::now();
            client.pipeline(count);
            return static_cast<double>(count) / nanosecondsSince(start) * 1e9;
        };
        const Contestant measureBare = [&] { return BareStore(BareStore::Edition::Second).rate(count); };
        if (!journal) {
            report.skip(name + ", over journald", journal.error());
            const auto rates = compete(options, name, measureService, measureBare);
            report.add({name, "/s", rates[0], PeerFigure{"bare SQLite, the same rows", rates[1]}});
            continue;
        }
        const auto rates = compete(options, name, measureService, [&] { return (*journal)->rate(count); }, measureBare);
        report.add({name, "/s", rates[0], PeerFigure{"journald, one entry stored", rates[1]},
                    Target::ratioAtLeast(timesJournald)});
        report.add({name, "/s", rates[0], PeerFigure{"bare SQLite, the same rows", rates[2]}});
    }
    measureBytes(report);
}

} // namespace bench
