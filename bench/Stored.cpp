// How many messages a second become stored events: the service answers when both events of a message are committed; for
// journald the time ends when its last message can be read back. Measured in a burst, and so long that both move their
// written data to its final place; each may keep 4 GB.
#include "Groups.h"
#include "peers/JournalPeer.h"
#include "support/ServiceProcess.h"

#include <fmt/format.h>

namespace bench {

void measureStored(const BenchOptions& options, Report& report)
{
    const std::string what = "sendMessage pipelined, two events stored";
    const ServiceProcess service(options, "used = [\"com.quarn.*\"]\nmaximum_size_mb = 4096");
    showProgress("starting a private journald");
    const auto journal = JournalPeer::start();
    for (const std::size_t count : {20'000, 200'000}) {
        const std::string name = fmt::format("{}, {} of them", what, count);
        const Contestant measureService = [&] {
            RawClient client = service.makeClient();
            const auto start = Clock::now();
            client.pipeline(count);
            return static_cast<double>(count) / nanosecondsSince(start) * 1e9;
        };
        if (!journal) {
            report.skip(name + ", over journald", journal.error());
            report.add({name, "/s", compete(options, name, measureService).front()});
            continue;
        }
        const auto rates = compete(options, name, measureService, [&] { return (*journal)->rate(count); });
        report.add({name, "/s", rates[0], PeerFigure{"journald, one entry stored", rates[1]}, Target::ratioAtLeast(3)});
    }
}

} // namespace bench
