// SPDX-License-Identifier: Apache-2.0
// How channels changed from one sample to a later one.
//
// Values, hits, transitions and residencies are subtracted; minimum and maximum are those of the later sample, and a
// state's duty cycle is its share of the difference's residency.
//
// A publisher may start again in between, and then all its counters start at 0. A channel was reset if a counter went
// down, a bucket has other bounds, or a state is missing; its difference is then its whole later content. The same
// holds for a channel that is missing in the earlier sample; but if that sample is incomplete, for all users or for the
// channel's, the channel may have existed, and it has no difference.
#pragma once

#include "platform/ReportingChannels.h"

namespace platform {

// The channels of `to` that have a difference, in its order. Any thread.
[[nodiscard]] ReportingSample channelDifference(const ReportingSample& from, const ReportingSample& to);

} // namespace platform
