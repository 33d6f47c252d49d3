// SPDX-License-Identifier: Apache-2.0
// The message holds each kind of value that players send.
#include "support/SampleMessage.h"

namespace bench {

foundation::Dictionary sampleMessage(std::uint32_t number)
{
    static const foundation::Dictionary message{
        {"session_output_running", true},
        {"session_selected_format", "S24LE/48000/2"},
        {"mChannelsPerFrame", 2},
        {"active_devices", "Built-in Speakers"},
        {"PomoSessionVolume", 0.8125},
        {"kestoreporting_timestamp", 1'767'225'600.25},
        {"systemuptime_sec", 86'523},
        {"spatializationEnabled", false},
        {"ringerstate", true},
        {"frames_rendered", numberMark},
    };
    return number == numberMark ? message : message.with("frames_rendered", number);
}

} // namespace bench
