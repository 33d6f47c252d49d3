// How channels changed from one sample to a later one.
//
// Values, hits, transitions and residencies are subtracted; minimum and maximum are those of the later sample, and a
// state's duty cycle is its share of the difference's residency. Whoever publishes a channel may begin anew in between,
// and then all its counters begin at 0: a channel in which a counter went down, a bucket has other bounds, or a state
// is gone was reset, and its difference is what it now holds. So is that of a channel that was not there; but where
// the earlier sample is not whole, nobody knows whether it was, and it has none.
#pragma once

#include "platform/ReportingChannels.h"

namespace platform {

// The channels of `to` that have a difference, in its order. Any thread.
[[nodiscard]] ReportingSample channelDifference(const ReportingSample& from, const ReportingSample& to);

} // namespace platform
