// The average, in the precision that its readers know.
#include "tracing/TraceData.h"

float TraceData::getAverageResult() const
{
    float sum = 0;
    for (const std::uint64_t result : results_)
        sum += static_cast<float>(result);
    return sum / static_cast<float>(numTimesTraced_);
}
