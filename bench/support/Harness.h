// SPDX-License-Identifier: Apache-2.0
// The common part of all measurements: rounds in which the contestants take turns, and medians.
//
// The machine's noise comes in stretches. So a figure and its peer's are measured round by round in turns, and the
// result is the median of the rounds.
#pragma once

#include <array>
#include <chrono>
#include <concepts>
#include <cstddef>
#include <filesystem>
#include <functional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace bench {

struct BenchOptions {
    static constexpr int fewestRounds = 5;
    int rounds = 7;
    std::string filter; // only groups with this text in their names are measured
    std::string part; // of a group that has named parts only those with this text in their names
    std::filesystem::path service; // the program kestod
    std::filesystem::path json; // where the results are written, unless it is empty
};

// The figures of one contestant, one for each round.
class Series {
public:
    Series() = default;
    Series(std::vector<double> figures) : figures_(std::move(figures)) { }
    [[nodiscard]] const std::vector<double>& figures() const { return figures_; }
    [[nodiscard]] double median() const;

private:
    std::vector<double> figures_;
};

// Measures once, and returns the figure.
using Contestant = std::function<double()>;

// Lets the contestants measure in turns, after a round that does not count; the figures in their order.
[[nodiscard]] std::vector<Series> compete(const BenchOptions& options, std::string_view what,
                                          std::span<const Contestant> contestants);
template <std::invocable... Each>
[[nodiscard]] std::vector<Series> compete(const BenchOptions& options, std::string_view what, Each... each)
{
    const std::array all{Contestant(std::move(each))...};
    return compete(options, what, std::span<const Contestant>(all));
}

// The middle one of the sorted values; of an even number the higher of the two.
[[nodiscard]] double median(std::vector<double> values);
// The value that this share (0 to 1) of all values does not exceed.
[[nodiscard]] double quantile(std::vector<double> values, double share);

using Clock = std::chrono::steady_clock;
[[nodiscard]] inline double nanosecondsSince(Clock::time_point start)
{
    return std::chrono::duration<double, std::nano>(Clock::now() - start).count();
}

// The processor time of this thread, in nanoseconds, without that of other threads.
[[nodiscard]] double processorTime();

// The nanoseconds of processor time that one call of `work` takes, on average over `count` calls.
template <typename Work> double nanosecondsEach(std::size_t count, Work work)
{
    const double start = processorTime();
    for (std::size_t index = 0; index < count; ++index)
        work(index);
    return (processorTime() - start) / static_cast<double>(count);
}

// Makes the compiler treat the value as used.
template <typename Value> void use(const Value& value)
{
    asm volatile("" : : "g"(&value) : "memory");
}

// One line on standard error, replaced by the next one.
void showProgress(std::string_view text);
void clearProgress();

} // namespace bench
