// SPDX-License-Identifier: Apache-2.0
// The order of one turn: sleep, look for news, send. Looking comes before sending, so nothing that is stored meanwhile
// is overlooked.
#include "kesto-uplink/rounds/Rounds.h"

#include <sstream>

namespace kesto_uplink {

void runRounds(const std::function<RoundResult()>& round, Schedule& schedule, Sleep& sleep,
               const std::function<void(const RoundResult&)>& report)
{
    if (!sleep.sleep(schedule.untilFirstRound()))
        return;
    while (true) {
        const RoundResult result = round();
        if (result.outcome == Outcome::Interrupted)
            return;
        report(result);
        if (!sleep.sleep(schedule.untilNextRound(result.outcome)))
            return;
        if (Schedule::needsNews(result.outcome) && !sleep.untilNews())
            return;
    }
}

namespace {

// Servers of a list are asked in random order: which one says something is no news.
std::string withoutServers(const std::string& sentence)
{
    std::istringstream words(sentence);
    std::string rest;
    for (std::string word; words >> word;) {
        if (!word.contains("://"))
            rest += word + ' ';
    }
    return rest;
}

} // namespace

// The servers of a list are away in turn, and the bytes of a day are others each day: there only the kind matters.
std::optional<std::string> Diary::line(const RoundResult& result)
{
    const bool isLasting =
        result.outcome == Outcome::Away || result.outcome == Outcome::Full || result.outcome == Outcome::DayUsedUp;
    const bool isNew = result.outcome != lastOutcome_ || (!isLasting && withoutServers(result.sentence) != last_);
    if (result.outcome == Outcome::Nothing || !isNew)
        return std::nullopt;
    lastOutcome_ = result.outcome;
    last_ = withoutServers(result.sentence);
    return result.sentence;
}

} // namespace kesto_uplink
