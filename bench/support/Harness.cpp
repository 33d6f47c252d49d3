// SPDX-License-Identifier: Apache-2.0
// The contestants take turns by rounds, so that disturbances by the machine affect all of them.
#include "support/Harness.h"

#include <algorithm>
#include <cstdio>
#include <ctime>
#include <fmt/format.h>
#include <unistd.h>

namespace bench {

double median(std::vector<double> values)
{
    return quantile(std::move(values), 0.5);
}

double quantile(std::vector<double> values, double share)
{
    const auto place =
        std::min(static_cast<std::size_t>(share * static_cast<double>(values.size())), values.size() - 1);
    const auto found = values.begin() + static_cast<std::ptrdiff_t>(place);
    std::ranges::nth_element(values, found);
    return *found;
}

double Series::median() const
{
    return bench::median(figures_);
}

std::vector<Series> compete(const BenchOptions& options, std::string_view what, std::span<const Contestant> contestants)
{
    std::vector<std::vector<double>> figures(contestants.size());
    for (int round = 0; round <= options.rounds; ++round) {
        showProgress(fmt::format("{}: {}", what,
                                 round == 0 ? "warming up" : fmt::format("round {} of {}", round, options.rounds)));
        for (std::size_t contestant = 0; contestant < contestants.size(); ++contestant) {
            const double figure = contestants[contestant]();
            if (round != 0)
                figures[contestant].push_back(figure);
        }
    }
    clearProgress();
    return {std::make_move_iterator(figures.begin()), std::make_move_iterator(figures.end())};
}

double processorTime()
{
    timespec time{};
    ::clock_gettime(CLOCK_THREAD_CPUTIME_ID, &time);
    return std::chrono::duration<double, std::nano>(std::chrono::seconds(time.tv_sec)).count()
        + static_cast<double>(time.tv_nsec);
}

void showProgress(std::string_view text)
{
    if (::isatty(STDERR_FILENO) == 1)
        fmt::print(stderr, "\r\x1B[K{}", text);
    else
        fmt::print(stderr, "{}\n", text);
}

void clearProgress()
{
    if (::isatty(STDERR_FILENO) == 1)
        fmt::print(stderr, "\r\x1B[K");
}

} // namespace bench
