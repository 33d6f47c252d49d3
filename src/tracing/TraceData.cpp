// SPDX-License-Identifier: Apache-2.0
// The average, in single precision, as its callers expect.
#include "tracing/TraceData.h"

float TraceData::getAverageResult() const
{
    float sum = 0;
    for (const std::uint64_t result : results_)
        sum += static_cast<float>(result);
    return sum / static_cast<float>(numTimesTraced_);
}
