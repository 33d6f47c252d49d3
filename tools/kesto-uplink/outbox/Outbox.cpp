// SPDX-License-Identifier: Apache-2.0
// A batch is collected until it is full. One that is still too large when it is compressed is collected again with half
// of the rows, and half of the sessions that have ended; a row that is too large alone is left out.
#include "kesto-uplink/outbox/Outbox.h"

#include "kesto-uplink/outbox/Compression.h"
#include "platform/linux/store/tables/SkippedIDs.h"

#include <algorithm>
#include <fmt/format.h>
#include <functional>
#include <numeric>
#include <utility>

namespace kesto_uplink {

namespace {

constexpr const char* stretchName = "stretch";

const std::string* applicationOf(const std::optional<std::int64_t>& session, const Slice& slice)
{
    const auto found = session ? slice.applications.find(*session) : slice.applications.end();
    return found == slice.applications.end() ? nullptr : &found->second;
}

} // namespace

std::int64_t LeftOut::rows() const
{
    std::int64_t sum = 0;
    for (const auto* const reason : {&notAllowed, &unreadable, &tooLarge})
        for (const auto& [name, count] : *reason)
            sum += count;
    return sum;
}

Progress Batch::progress() const
{
    return {.last = last,
            .first = first.id,
            .rows = rows,
            .bytes = std::ssize(bytes),
            .notAllowed = leftOut.rows(),
            .lostToAge = leftOut.lostToAge,
            .openSessions = openSessions};
}

// A batch that is being made, of the range from `after` to `last`.
struct Outbox::Draft {
    Cursor after = {};
    std::int64_t last = 0;
    std::int64_t seen = 0; // rows of the store in the range
    std::string lines = {}; // of events and stretches
    std::int64_t rows = 0; // the same
    std::int64_t lastRow = 0; // the ID of the last of them
    std::optional<double> oldest = {};
    std::set<std::int64_t> sessions = {}; // that these name
    std::string sessionLines = {};
    std::int64_t sessionRows = 0;
    std::int64_t endedSessions = 0; // those of which the draft has nothing else
    LeftOut leftOut = {};
    std::set<std::int64_t> openSessions = {};

    [[nodiscard]] bool hasRoom(const std::string& line, std::int64_t mostRows, const OutboxLimits& limits) const
    {
        return rows == 0 || (rows < mostRows && lines.size() + line.size() <= limits.rowBytes);
    }

    void append(const std::string& line, std::int64_t id, double time, const std::optional<std::int64_t>& session)
    {
        lines += line;
        ++rows;
        lastRow = id;
        oldest = oldest.value_or(time);
        if (session)
            sessions.insert(*session);
    }

    void pass(std::int64_t id)
    {
        last = id;
        ++seen;
    }
};

Outbox::Outbox(std::filesystem::path database, const UplinkConfiguration& configuration, const Identity& identity,
               const OutboxLimits& limits)
    : store_(std::move(database)),
      rows_(configuration, identity),
      pseudonym_(identity.pseudonym),
      limits_(limits)
{
}

std::optional<Batch> Outbox::next(const Cursor& after, const std::set<std::int64_t>& openSessions, double sent)
{
    tooLarge_.clear();
    std::int64_t mostRows = limits_.rows;
    std::int64_t mostEnded = limits_.endedSessions;
    while (true) {
        auto draft = collect(after, mostRows);
        if (!draft)
            return std::nullopt;
        addSessions(*draft, draft->after.epoch == after.epoch ? openSessions : std::set<std::int64_t>(), mostEnded);
        Batch batch = finished(*draft, sent);
        if (batch.bytes.size() <= limits_.compressedBytes && batch.lines.size() <= limits_.wholeBytes)
            return batch;
        if (draft->rows == 1 && draft->endedSessions == 0)
            tooLarge_.insert(draft->lastRow);
        mostRows = std::max<std::int64_t>(1, draft->rows / 2);
        mostEnded = draft->endedSessions / 2;
    }
}

// --- Events and stretches

std::optional<Outbox::Draft> Outbox::collect(const Cursor& after, std::int64_t mostRows)
{
    std::optional<Draft> draft;
    Cursor place = after;
    bool isFull = false;
    while (!isFull && (!draft || draft->seen < limits_.rowsLookedAt)) {
        const auto slice = store_.read(place, limits_.slice);
        if (!slice || (draft && slice->after != place))
            break;
        if (!draft)
            draft = Draft{.after = slice->after, .last = slice->after.id};
        isFull = !add(*draft, *slice, mostRows);
        place = {draft->after.epoch, draft->last};
    }
    if (draft)
        draft->leftOut.lostToAge = platform::removedOf(draft->last - draft->after.id - draft->seen);
    return draft;
}

bool Outbox::add(Draft& draft, const Slice& slice, std::int64_t mostRows)
{
    auto event = slice.events.begin();
    auto stretch = slice.stretches.begin();
    while (event != slice.events.end() || stretch != slice.stretches.end()) {
        const bool isEvent =
            stretch == slice.stretches.end() || (event != slice.events.end() && event->id < stretch->id);
        if (isEvent ? !add(draft, *event++, slice, mostRows) : !add(draft, *stretch++, slice, mostRows))
            return false;
    }
    draft.last = slice.last;
    return true;
}

bool Outbox::add(Draft& draft, const StoredEvent& event, const Slice& slice, std::int64_t mostRows)
{
    const auto line = rows_.event(event, slice.after.epoch, applicationOf(event.session, slice));
    if (!line)
        ++(line.error() == WhyNot::NotAllowed ? draft.leftOut.notAllowed : draft.leftOut.unreadable)[event.name];
    else if (tooLarge_.contains(event.id))
        ++draft.leftOut.tooLarge[event.name];
    else if (draft.hasRoom(*line, mostRows, limits_))
        draft.append(*line, event.id, event.time, event.session);
    else
        return false;
    draft.pass(event.id);
    return true;
}

bool Outbox::add(Draft& draft, const StoredStretch& stretch, const Slice& slice, std::int64_t mostRows)
{
    const auto line = rows_.stretch(stretch, slice.after.epoch, applicationOf(stretch.session, slice));
    if (!line)
        ++(line.error() == WhyNot::NotAllowed ? draft.leftOut.notAllowed : draft.leftOut.unreadable)[stretchName];
    else if (tooLarge_.contains(stretch.id))
        ++draft.leftOut.tooLarge[stretchName];
    else if (draft.hasRoom(*line, mostRows, limits_))
        draft.append(*line, stretch.id, stretch.began + stretch.seconds, stretch.session);
    else
        return false;
    draft.pass(stretch.id);
    return true;
}

// --- Sessions

// With the rows of a session comes the session, and once more when it has ended.
void Outbox::addSessions(Draft& draft, const std::set<std::int64_t>& openSessions, std::int64_t mostEnded)
{
    if (!rows_.filter().allowsSessions())
        return;
    std::set<std::int64_t> wanted = draft.sessions;
    wanted.insert(openSessions.begin(), openSessions.end());
    for (const StoredSession& session : store_.sessions(wanted, draft.after.epoch)) {
        const bool isNamed = draft.sessions.contains(session.id);
        const bool hasEnded = session.past && *session.past <= draft.last + 1;
        if (isNamed || (hasEnded && draft.endedSessions < mostEnded)) {
            draft.endedSessions += isNamed ? 0 : 1;
            const auto line = rows_.session(session, draft.after.epoch);
            draft.sessionLines += line.value_or(std::string());
            draft.sessionRows += line ? 1 : 0;
            if (hasEnded)
                continue;
        }
        draft.openSessions.insert(session.id);
    }
}

// --- The batch

Batch Outbox::finished(const Draft& draft, double sent) const
{
    Batch batch{.first = {draft.after.epoch, draft.after.id + 1},
                .last = {draft.after.epoch, draft.last},
                .rows = draft.rows + draft.sessionRows,
                .oldest = draft.oldest,
                .leftOut = draft.leftOut,
                .openSessions = draft.openSessions};
    batch.messageID = fmt::format("{}:{}:{}:{}", pseudonym_, batch.first.epoch, batch.first.id, batch.last.id);
    if (batch.rows > 0) {
        batch.lines = rows_.device(batch.first, batch.last, sent) + draft.sessionLines + draft.lines;
        batch.bytes = compressed(batch.lines);
    }
    return batch;
}

} // namespace kesto_uplink
