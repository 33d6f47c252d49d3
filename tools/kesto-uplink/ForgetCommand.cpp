// SPDX-License-Identifier: Apache-2.0
// `kesto-uplink forget`: the device gets a new pseudonym, and what waits does not leave.
#include "kesto-uplink/Commands.h"
#include "kesto-uplink/Present.h"
#include "kesto-uplink/outbox/StoreReader.h"
#include "kesto-uplink/state/State.h"

#include <fmt/format.h>
#include <memory>

namespace kesto_uplink {

namespace {

void forget(const Places& places)
{
    // First what can fail: a device that could not forget all has forgotten nothing.
    const EventDatabase isThere(places.database); // throws if not: what comes there later would leave
    const Cursor newest = StoreReader(places.database).newest();
    const double now = present();
    State state = State::open(places.state, now);
    state.forget(newest, now);
    fmt::print("The device has a new pseudonym, {}.\n"
               "Nothing that the event store has kept until now leaves any more.\n"
               "What has left already stays where it is, under the earlier pseudonym.\n",
               state.identity().pseudonym);
}

} // namespace

void addForgetCommand(CLI::App& application, int& exitStatus)
{
    const auto places = std::make_shared<Places>();
    CLI::App* const command = application.add_subcommand(
        "forget", "Gives the device a new pseudonym; what waits to be sent does not leave any more");
    addPlaceOptions(*command, *places);
    command->callback([places, &exitStatus] {
        forget(*places);
        exitStatus = 0;
    });
}

} // namespace kesto_uplink
