// Bursts of messages a fraction of a second apart, as switches cause them.
#pragma once

#include <cstddef>
#include <optional>

// Sorts the payloads that belong together into bursts. A pause is measured from the payload before, not from
// the first of the burst; one without a time counts as 0, and leaves the next without anything to be measured from.
class KestoReportingBurstFinder {
public:
    explicit KestoReportingBurstFinder(double maximumPauseTime) : maximumPauseTime_(maximumPauseTime) { }

    // The number of the burst, from 0, that the next payload belongs to; its time in seconds.
    std::size_t burstOf(std::optional<double> time)
    {
        const bool isPaused = hasLastTime_ && time.value_or(0) - lastTime_ > maximumPauseTime_;
        if (burstCount_ == 0 || isPaused)
            ++burstCount_;
        hasLastTime_ = time.has_value();
        lastTime_ = time.value_or(0);
        return burstCount_ - 1;
    }

private:
    const double maximumPauseTime_;
    std::size_t burstCount_ = 0;
    bool hasLastTime_ = false;
    double lastTime_ = 0;
};
