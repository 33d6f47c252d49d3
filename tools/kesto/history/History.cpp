// SPDX-License-Identifier: Apache-2.0
// The rows are read in the order of their IDs, and chosen here: all of a small store are read in the time that a person
// does not notice, and of a large one the sessions lie beside each other.
#include "kesto/history/History.h"

#include "foundation/values/Microseconds.h"
#include "foundation/values/String.h"
#include "kesto/history/HistoryQueries.h"
#include "kesto/store/EventDatabase.h"
#include "kesto/store/StoreHolder.h"
#include "platform/PlayingFacts.h"
#include "platform/linux/store/stretches/Stretch.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <fmt/format.h>
#include <iterator>
#include <optional>
#include <string_view>
#include <utility>

namespace {

using platform::SqliteStatement;

constexpr std::string_view serviceEnded = "service-ended";

double present()
{
    return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
}

// To six decimals.
double rounded(double number)
{
    return std::nearbyint(number * foundation::millionthsOfOne) / foundation::millionthsOfOne;
}

std::optional<double> realAt(const SqliteStatement& row, int column)
{
    return row.isNull(column) ? std::nullopt : std::optional(row.real(column));
}

std::optional<std::int64_t> integerAt(const SqliteStatement& row, int column)
{
    return row.isNull(column) ? std::nullopt : std::optional(row.integer(column));
}

class HistoryReader {
public:
    HistoryReader(EventDatabase& database, const HistoryQuestion& question) : database_(database), question_(question)
    {
    }

    // One snapshot: whatever is read belongs together.
    void read()
    {
        const bool isRunning = isHeldByService(database_.path());
        database_.execute("BEGIN");
        requireTables();
        readStretches();
        readOpenStretches(isRunning);
        readFaults();
        readSessions();
        database_.execute("COMMIT");
    }

    // Without the database.
    [[nodiscard]] History choose()
    {
        keepFaultsOfDirection();
        keepMatching();
        keepNamedSessions();
        return std::move(history_);
    }

private:
    void requireTables()
    {
        constexpr std::int64_t tables = 5;
        if (database_.number(history_queries::tableCount) != tables)
            throw EventStoreError(fmt::format("the event store {} has no playing times: an earlier version of kestod "
                                              "made it, or none has finished making it. They come as soon as this "
                                              "version of kestod runs",
                                              database_.path().native()));
    }

    // `row`: session, recording, and so on. A session that did it outside of the span, too, says of a fault what it
    // did.
    [[nodiscard]] bool isAskedFor(const SqliteStatement& row)
    {
        const std::int64_t session = row.integer(0);
        const bool isIt = (row.integer(1) != 0) == question_.isRecording;
        auto& sessions = isIt ? sessions_ : otherSessions_;
        if (sessions.empty() || sessions.back() != session)
            sessions.push_back(session);
        return isIt;
    }

    // `row`: session, recording, began, device, format, volume. The ending is that of the store; of what runs, empty.
    void add(const SqliteStatement& row, double seconds, std::string_view ending)
    {
        history_.stretches.push_back({.session = row.integer(0),
                                      .began = rounded(row.real(2)),
                                      .seconds = rounded(seconds),
                                      .device = std::string(row.text(3)),
                                      .format = std::string(row.text(4)),
                                      .volume = realAt(row, 5),
                                      .isRunning = ending.empty(),
                                      .hasVanished = ending == "vanished",
                                      .hasServiceEnded = ending == serviceEnded});
        if (auto& volume = history_.stretches.back().volume)
            volume = rounded(std::clamp(*volume, 0.0, 1.0));
    }

    void bindQuestion(const SqliteStatement& statement) const
    {
        statement.bind(1, question_.span.until);
        statement.bind(2, question_.span.from);
        if (question_.session)
            statement.bind(3, *question_.session);
    }

    void readStretches()
    {
        const auto statement = database_.prepare(history_queries::stretches);
        bindQuestion(statement);
        database_.forEachRow(statement, [this](const SqliteStatement& row) {
            const bool isInSpan = row.integer(8) != 0;
            if (isAskedFor(row) && isInSpan)
                add(row, row.real(6), row.text(7));
        });
    }

    // As the service ends them at its next start, if it was killed: they ran until its last transaction. Two clocks
    // cannot be compared, so they begin by the service's clock, too.
    void readOpenStretches(bool isRunning)
    {
        const auto lastWord = database_.prepare(history_queries::lastWord);
        history_.now = present();
        if (!isRunning)
            database_.forEachRow(lastWord, [this](const SqliteStatement& row) { history_.now = row.real(0); });
        const auto statement = database_.prepare(history_queries::openStretches);
        database_.forEachRow(statement, [this, isRunning](const SqliteStatement& row) {
            const double began = row.real(2);
            const double seconds = platform::lengthOfTime(began, history_.now);
            if (question_.session && *question_.session != row.integer(0))
                return;
            const bool isInSpan = began < question_.span.until && began + seconds > question_.span.from;
            if (isAskedFor(row) && isInSpan && (isRunning || seconds > 0))
                add(row, seconds, isRunning ? "" : serviceEnded);
        });
    }

    void readFaults()
    {
        const auto statement = database_.prepare(history_queries::faults);
        bindQuestion(statement);
        database_.forEachRow(statement, [this](const SqliteStatement& row) {
            constexpr std::int64_t most = 1'000'000'000; // what a client says can still be added up
            history_.faults.push_back({.session = row.integer(0),
                                       .happened = rounded(row.real(1)),
                                       .kind = std::string(row.text(2).substr(history_queries::faultPrefix.size())),
                                       .device = std::string(foundation::cutBetweenCharacters(
                                           row.text(3), platform::PlayingFacts::longestDevices)), // as of a stretch
                                       .lateCycles = std::clamp<std::int64_t>(row.integer(4), 0, most)});
        });
        std::ranges::stable_sort(history_.faults, {}, &Fault::happened);
    }

    void readSessions()
    {
        const auto [first, last] = sessionsNamed();
        const auto statement = database_.prepare(history_queries::sessions);
        statement.bind(1, first);
        statement.bind(2, last);
        database_.forEachRow(statement, [this](const SqliteStatement& row) {
            history_.sessions.push_back({.id = row.integer(0),
                                         .application = std::string(row.text(1)),
                                         .service = std::string(row.text(2)),
                                         .process = std::string(row.text(3)),
                                         .user = integerAt(row, 4),
                                         .processID = integerAt(row, 5),
                                         .began = row.real(6),
                                         .ended = realAt(row, 7)});
        });
    }

    // The lowest and the highest.
    [[nodiscard]] std::pair<std::int64_t, std::int64_t> sessionsNamed() const
    {
        std::pair<std::int64_t, std::int64_t> range{std::numeric_limits<std::int64_t>::max(), 0};
        const auto note = [&range](std::int64_t session) {
            range = {std::min(range.first, session), std::max(range.second, session)};
        };
        std::ranges::for_each(history_.stretches, note, &PlayedStretch::session);
        std::ranges::for_each(history_.faults, note, &Fault::session);
        return range;
    }

    // A fault does not say whether something was played or recorded: its session tells it.
    void keepFaultsOfDirection()
    {
        std::ranges::sort(sessions_);
        std::ranges::sort(otherSessions_);
        std::erase_if(history_.faults, [this](const Fault& fault) {
            return !std::ranges::binary_search(sessions_, fault.session)
                && (question_.isRecording || std::ranges::binary_search(otherSessions_, fault.session));
        });
    }

    void keepMatching()
    {
        std::ranges::sort(history_.stretches, {},
                          [](const PlayedStretch& stretch) { return std::pair(stretch.session, stretch.began); });
        for (Fault& fault : history_.faults) {
            const auto* const stretch = fault.device.empty() ? stretchOf(history_, fault) : nullptr;
            if (stretch != nullptr)
                fault.device = stretch->device;
        }
        const auto isLeftOut = [this](const auto& each) {
            const HistorySession* const session = sessionOf(history_, each.session);
            return !matches(each.device, question_.devices)
                || !matches(session == nullptr ? std::string() : session->application, question_.applications);
        };
        if (question_.devices == "*" && question_.applications == "*")
            return;
        std::erase_if(history_.stretches, isLeftOut);
        std::erase_if(history_.faults, isLeftOut);
    }

    void keepNamedSessions()
    {
        std::vector<std::int64_t> named;
        std::ranges::transform(history_.stretches, std::back_inserter(named), &PlayedStretch::session);
        std::ranges::transform(history_.faults, std::back_inserter(named), &Fault::session);
        std::ranges::sort(named);
        std::erase_if(history_.sessions,
                      [&named](const HistorySession& each) { return !std::ranges::binary_search(named, each.id); });
    }

    EventDatabase& database_;
    const HistoryQuestion& question_;
    History history_;
    std::vector<std::int64_t> sessions_; // those that did what the question asks for; may repeat
    std::vector<std::int64_t> otherSessions_; // those that did the other
};

} // namespace

const HistorySession* sessionOf(const History& history, std::int64_t id)
{
    const auto found = std::ranges::lower_bound(history.sessions, id, {}, &HistorySession::id);
    return found != history.sessions.end() && found->id == id ? &*found : nullptr;
}

const PlayedStretch* stretchOf(const History& history, const Fault& fault)
{
    const auto ofSession = std::ranges::equal_range(history.stretches, fault.session, {}, &PlayedStretch::session);
    if (fault.session == 0 || ofSession.empty())
        return nullptr;
    const auto next = std::ranges::upper_bound(ofSession, fault.happened, {}, &PlayedStretch::began);
    return next == ofSession.begin() ? &*next : &*std::prev(next);
}

History readHistory(const std::filesystem::path& database, const HistoryQuestion& question)
{
    std::optional<EventDatabase> open(database);
    HistoryReader reader(*open, question);
    reader.read();
    open.reset();
    return reader.choose();
}
