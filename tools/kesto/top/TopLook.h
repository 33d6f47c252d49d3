// SPDX-License-Identifier: Apache-2.0
// The room of top: what plays now and what the service does, on a screen that renews itself.
//
// A look is all that is known at one moment: the service's status, and what plays by the store. Who draws or prints a
// look asks nobody.
#pragma once

#include "foundation/values/Value.h"
#include "kesto/top/PlayingStreams.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

struct TopRates { // of each second
    double messages = 0;
    double events = 0;
};

struct TopLook {
    double time = 0; // seconds since 1970 UTC
    double steadyTime = 0; // the same moment by a clock that nobody sets
    std::optional<foundation::Dictionary> status = {}; // of `ledger::report`; none: `statusProblem` says why
    std::string statusProblem = {};
    std::optional<TopRates> rates = {}; // none: the service does not run
    std::optional<std::vector<PlayingStream>> streams = {}; // none: nobody knows what plays
    std::string storeProblem = {}; // why, if the store could not be read

    [[nodiscard]] bool isRunning() const;
    // Whether the store is kept up to date: what a killed service left in it plays no more.
    [[nodiscard]] bool isStoring() const;
    [[nodiscard]] bool isStoringStretches() const;
};

// Between two looks at one run of the service, else those of its last minute; none if it does not run.
[[nodiscard]] std::optional<TopRates> ratesOf(const TopLook& look, const TopLook* before);

enum class TopOrder : std::uint8_t { Since, Application, Device, Volume, Faults };

// Those that play the longest, the loudest and those with the most faults first; names by the alphabet. Equal ones by
// application and session.
void sortStreams(std::optional<std::vector<PlayingStream>>& streams, TopOrder order);

// One JSON object without a line end.
[[nodiscard]] std::string topJson(const TopLook& look);
