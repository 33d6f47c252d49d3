// How many messages a second become stored events: the service answers when both events of a message are committed,
// journald is done when the last of its messages can be read back.
#include "Groups.h"
#include "JournalPeer.h"
#include "ServiceProcess.h"

namespace bench {

void measureStored(const Options& options, Report& report)
{
    constexpr std::size_t count = 20'000;
    const std::string what = "sendMessage pipelined, two events stored";
    const ServiceProcess service(options, R"(["com.quarn.*"])");
    const Contestant measureService = [&] {
        RawClient client = service.makeClient();
        const auto start = Clock::now();
        client.pipeline(count);
        return static_cast<double>(count) / nanosecondsSince(start) * 1e9;
    };

    showProgress("starting a private journald");
    const auto journal = JournalPeer::start();
    if (!journal) {
        report.skip(what + ", over journald", journal.error());
        report.add({what, "/s", compete(options, what, measureService).front()});
        return;
    }
    const auto rates = compete(options, what, measureService, [&] { return (*journal)->rate(count); });
    report.add({what, "/s", rates[0], Peer{"journald, one entry stored", rates[1]}, Target::ratioAtLeast(3)});
}

} // namespace bench
