// SPDX-License-Identifier: Apache-2.0
// Each client keeps a window of unanswered messages; of each kind that the ledger tells apart, some are among them.
#include "soak/Load.h"

#include "end_to_end/WireClient.h"
#include "support/MessageKinds.h"

#include <array>
#include <cmath>
#include <set>
#include <string>

namespace soak {
namespace {

using support::playback;
using support::typeStart;

using namespace end_to_end;
using foundation::Array;
using foundation::Dictionary;

constexpr std::size_t window = 16;

// New ones, repetitions, large ones, and some that JSON cannot express.
Dictionary message(std::int64_t number)
{
    switch (number % 10) {
    case 3:
    case 4: return {{"same", true}};
    case 7: return {{"n", number}, {"text", std::string(20'000, 'x')}};
    case 8: return {{"n", number}, {"level", number % 20 == 8 ? std::nan("") : -INFINITY}};
    default: return {{"n", number}, {"text", std::string(60, 'y')}};
    }
}

class Session {
public:
    Session(const std::filesystem::path& socket, Known& known) : client_(socket), known_(known)
    {
        client_.ask(Create, 1);
        client_.call(Start, 1);
        client_.ask(Validate, 1);
    }

    // Until the service goes or `stop` is asked for.
    void run(const std::stop_token& stop)
    {
        while (unanswered_.size() < window)
            send();
        while (!stop.stop_requested()) {
            const auto reply = client_.nextReply();
            if (!reply)
                return;
            if (unanswered_.erase((*reply)[0].exactly<std::uint64_t>().value_or(0)) == 0)
                continue;
            ++known_.answered;
            send();
        }
    }

private:
    void send()
    {
        ++known_.sent;
        unanswered_.insert(client_.call(SendMessage, message(++number_), playback, typeStart, Array{1}));
    }

    WireClient client_;
    Known& known_;
    std::set<std::uint64_t> unanswered_;
    std::int64_t number_ = 0;
};

void runClient(const std::stop_token& stop, const std::filesystem::path& socket, Known& known)
{
    while (!stop.stop_requested()) {
        try {
            Session(socket, known).run(stop);
        } catch (const std::exception&) { // the service went, or is not there yet
            std::this_thread::sleep_for(std::chrono::milliseconds(1));
        }
    }
}

} // namespace

Load::Load(std::filesystem::path socket, Known& known, int clients)
{
    for (int client = 0; client < clients; ++client)
        threads_.emplace_back([socket, &known](const std::stop_token& stop) { runClient(stop, socket, known); });
}

} // namespace soak
