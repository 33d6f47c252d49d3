// SPDX-License-Identifier: Apache-2.0
// `kesto events`: the stored events, as a table for people or as JSON lines for programs, and on request future events.
#include "foundation/values/Json.h"
#include "kesto/Commands.h"
#include "kesto/ServiceDirectories.h"
#include "kesto/Terminal.h"
#include "kesto/files/JsonReader.h"
#include "kesto/results/EventStore.h"
#include "kesto/results/MomentText.h"

#include <array>
#include <charconv>
#include <chrono>
#include <cmath>
#include <cstdio>
#include <fmt/format.h>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>

namespace {

struct EventsOptions {
    std::filesystem::path database;
    EventFilter filter;
    std::string since;
    std::optional<std::string> after; // a cursor, or empty
    bool isJson = false;
    bool isFollowing = false;
};

class EventTable {
public:
    void printHead() const
    {
        fmt::print("{} {} {} {}\n", padded("TIME", timeColumns), padded("EVENT", nameColumns),
                   padded("APPLICATION", applicationColumns), "PAYLOAD");
    }

    void print(const StoredEvent& event) const
    {
        const std::string_view name = event.name.starts_with(namePrefix)
            ? std::string_view(event.name).substr(namePrefix.size())
            : std::string_view(event.name);
        std::string application;
        const std::string payload = describe(event.payload, application);
        const std::size_t used = timeColumns + nameColumns + applicationColumns + 3;
        fmt::print("{} {} {} {}\n", padded(timeText(event.time), timeColumns),
                   padded(fitted(printable(name), nameColumns), nameColumns),
                   padded(fitted(printable(application), applicationColumns), applicationColumns),
                   fitted(printable(payload), columnsBehind(used, width_)));
    }

private:
    static constexpr std::size_t timeColumns = 23;
    static constexpr std::size_t nameColumns = 34;
    static constexpr std::size_t applicationColumns = 22;

    static std::string timeText(double time)
    {
        if (!std::isfinite(time))
            return "?";
        return momentText(time) + fmt::format(".{:03}", static_cast<int>((time - std::floor(time)) * 1000));
    }

    // "key=value key=value", without the application, which has a column of its own.
    static std::string describe(const std::string& payload, std::string& application)
    {
        const auto value = parseJson(payload);
        const auto entries = value ? value->dictionary() : std::nullopt;
        if (!entries)
            return payload;
        std::string description;
        for (const auto& [key, entry] : *entries) {
            const std::string_view name = key.view();
            if (name == "HostApplicationDisplayID" || name == "processName")
                application = shownText(entry);
            else
                description += fmt::format("{}{}={}", description.empty() ? "" : " ", name, shownText(entry));
        }
        return description;
    }

    const std::size_t width_ = outputWidth();
};

// The place of an event in one database and no other: "EPOCH:ID".
struct Cursor {
    std::string epoch;
    std::int64_t id = 0;

    static std::optional<Cursor> parse(std::string_view text)
    {
        const std::size_t colon = text.find(':');
        if (colon == 0 || colon == std::string_view::npos)
            return std::nullopt;
        Cursor cursor{.epoch = std::string(text.substr(0, colon))};
        const char* const end = text.data() + text.size();
        const auto [parsed, error] = std::from_chars(text.data() + colon + 1, end, cursor.id);
        return error == std::errc() && parsed == end && cursor.id >= 0 ? std::optional(cursor) : std::nullopt;
    }
};

void printJson(const StoredEvent& event, const std::optional<std::string>& epoch)
{
    std::string name;
    foundation::appendJsonText(event.name, name);
    const std::string cursor = epoch ? fmt::format(",\"cursor\":\"{}:{}\"", *epoch, event.id) : std::string();
    fmt::print("{{\"id\":{},\"time\":{},\"name\":{},\"payload\":{}{}}}\n", event.id, event.time, name, event.payload,
               cursor);
}

class EventsRun {
public:
    explicit EventsRun(const EventsOptions& options)
        : options_(options),
          filter_(options.filter),
          store_(options.database)
    {
    }

    void run()
    {
        if (options_.after)
            goTo(*options_.after);
        if (!options_.isJson)
            table_.printHead();
        if (filter_.most == 0)
            passOver();
        else
            print();
        if (!options_.isFollowing)
            return explainNothing();
        filter_.most.reset();
        follow();
    }

private:
    // Behind the event of the cursor, or to the oldest event if the cursor is empty.
    void goTo(const std::string& text)
    {
        filter_.areOldest = true;
        const auto cursor = Cursor::parse(text);
        if (!cursor)
            return;
        epoch_ = store_.epoch();
        if (!epoch_)
            throw EventStoreError(
                fmt::format("the event store {} has no cursors: an earlier version of kestod made it. "
                            "They come as soon as this version of kestod runs",
                            printable(options_.database.native())));
        if (cursor->epoch == *epoch_)
            filter_.afterID = cursor->id;
        else
            fmt::print(stderr, "kesto: the cursor is of another event store: this one begins with its oldest event\n");
    }

    // A pattern that is wrong looks like a store that is empty.
    void explainNothing() const
    {
        if (!options_.after && filter_.afterID == 0 && filter_.namePattern != "*")
            fmt::print(stderr, "kesto: no event{} has a name that matches '{}'\n",
                       options_.since.empty() ? "" : " of that time", printable(filter_.namePattern));
    }

    // Treats all present events as seen.
    void passOver()
    {
        filter_.most = 1;
        filter_.areOldest = false;
        store_.forEach(filter_, [this](const StoredEvent& event) { filter_.afterID = event.id; });
    }

    // A commit becomes visible only after the log is written, on a slow disk much later: so the command checks a few
    // times after each change. A store that is just being made cannot be read yet; this is an error only if it lasts.
    [[noreturn]] void follow()
    {
        using std::chrono::milliseconds;
        constexpr std::array<milliseconds, 5> pauses{milliseconds(10), milliseconds(50), milliseconds(250),
                                                     milliseconds(1000), milliseconds(5000)};
        const DatabaseWatch watch(options_.database);
        for (std::size_t looks = 0;;) {
            try {
                if (store_.refresh())
                    filter_.afterID = 0;
                print();
            } catch (const EventStoreError&) {
                if (looks == pauses.size())
                    throw;
            }
            const bool isChanged =
                watch.wait(looks < pauses.size() ? std::optional(pauses[looks]) : std::optional<milliseconds>());
            looks = isChanged ? 0 : looks + 1;
        }
    }

    void print()
    {
        noteEpoch();
        store_.forEach(filter_, [this](const StoredEvent& event) {
            filter_.afterID = event.id;
            if (options_.isJson)
                printJson(event, epoch_);
            else
                table_.print(event);
        });
        if (std::fflush(stdout) != 0)
            throw std::runtime_error("the output could not be written");
    }

    // A repair ends with a new epoch, and with events behind the cursor of a program that reads on.
    void noteEpoch()
    {
        auto epoch = store_.epoch();
        if (options_.isJson && epoch_ && epoch != epoch_)
            filter_.afterID = 0;
        epoch_ = std::move(epoch);
    }

    const EventsOptions& options_;
    EventFilter filter_;
    EventStore store_;
    std::optional<std::string> epoch_; // none of a store that is just being made
    EventTable table_;
};

} // namespace

void addEventsCommand(CLI::App& application, int& exitStatus)
{
    const auto options = std::make_shared<EventsOptions>();
    CLI::App* command = application.add_subcommand("events", "Lists the stored events, the most recent last");
    command->add_option("--database", options->database, "The event store, if it is not at its usual place");
    command->add_option("--name", options->filter.namePattern,
                        "Only events with matching names, such as '*.Volume.*' or kesto.Playback.Start");
    command->add_option("--since", options->since,
                        "Only events since then: 90s, 10m, 2h, 7d ago, or a time such as 2026-01-31T18:00:00");
    command
        ->add_option("--count", options->filter.most,
                     "At most this many: the most recent ones, or with --after the oldest")
        ->check(CLI::NonNegativeNumber);
    command->add_option(
        "--after", options->after,
        "Only events behind this cursor, which each line of --json has; '' begins with the oldest event");
    command->add_flag("--follow", options->isFollowing, "Print further events as they come");
    command->add_flag("--json", options->isJson, "One JSON object in each line, for programs");
    command->callback([options, &exitStatus] {
        if (options->database.empty())
            options->database = usualDatabase();
        if (!options->since.empty()) {
            const auto since = parseMoment(options->since);
            if (!since)
                throw CLI::ValidationError("--since",
                                           "\"" + options->since
                                               + "\" is not a time: write 90s, 10m, 2h, 7d or 2026-01-31T18:00:00");
            options->filter.since = *since;
        }
        if (options->after && !options->after->empty() && !Cursor::parse(*options->after))
            throw CLI::ValidationError(
                "--after",
                "\"" + *options->after
                    + "\" is not a cursor: give that of a line, such as 0a1b2c:7, or '' to begin "
                      "with the oldest event");
        EventsRun(*options).run();
        exitStatus = exitOk;
    });
}
