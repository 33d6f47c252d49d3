// `kesto events`: the stored events, as a table for people or as JSON lines for programs, and on request those that
// are still to come.
#include "Commands.h"
#include "EventStore.h"
#include "Moment.h"
#include "foundation/Json.h"
#include "foundation/LocalTime.h"

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <fmt/format.h>
#include <rapidjson/document.h>
#include <rapidjson/stringbuffer.h>
#include <rapidjson/writer.h>
#include <string>
#include <sys/ioctl.h>
#include <unistd.h>

namespace {

struct EventsOptions {
    std::filesystem::path database;
    EventFilter filter;
    std::string since;
    bool isJson = false;
    bool isFollowing = false;
};

using Json = rapidjson::Value;

// A string as it is, anything else as JSON.
std::string textOf(const Json& json)
{
    if (json.IsString())
        return {json.GetString(), json.GetStringLength()};
    rapidjson::StringBuffer buffer;
    rapidjson::Writer<rapidjson::StringBuffer> writer(buffer);
    json.Accept(writer);
    return {buffer.GetString(), buffer.GetSize()};
}

// Characters that would move the cursor or change colours are not for a terminal.
std::string printable(std::string text)
{
    std::ranges::replace_if(text, [](unsigned char character) { return character < 0x20 || character == 0x7F; }, '?');
    return text;
}

// So many columns of text at most; what is cut ends in "…". Every character counts as one column.
std::string fitted(std::string_view text, std::size_t columns)
{
    const auto isStart = [](char byte) { return (static_cast<unsigned char>(byte) & 0xC0U) != 0x80U; };
    if (static_cast<std::size_t>(std::ranges::count_if(text, isStart)) <= columns)
        return std::string(text);
    std::size_t seen = 0;
    const auto cut = std::ranges::find_if(text, [&](char byte) { return isStart(byte) && ++seen == columns; });
    return std::string(text.begin(), cut) + "…";
}

// Pads to the width, in characters.
std::string padded(std::string text, std::size_t columns)
{
    const auto width = static_cast<std::size_t>(
        std::ranges::count_if(text, [](char byte) { return (static_cast<unsigned char>(byte) & 0xC0U) != 0x80U; }));
    return text + std::string(columns > width ? columns - width : 0, ' ');
}

std::size_t terminalWidth()
{
    winsize size{};
    if (::isatty(STDOUT_FILENO) != 0 && ::ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_col > 0)
        return size.ws_col;
    if (const char* columns = std::getenv("COLUMNS"))
        return std::max(40UL, std::strtoul(columns, nullptr, 10));
    return std::string::npos; // not a terminal: nothing is cut
}

class Table {
public:
    void printHead() const
    {
        fmt::print("{} {} {} {}\n", padded("TIME", timeColumns), padded("EVENT", nameColumns),
                   padded("APPLICATION", applicationColumns), "PAYLOAD");
    }

    void print(const StoredEvent& event) const
    {
        constexpr std::string_view prefix = "com.quarn.";
        const std::string_view name = event.name.starts_with(prefix)
            ? std::string_view(event.name).substr(prefix.size())
            : std::string_view(event.name);
        std::string application;
        const std::string payload = describe(event.payload, application);
        const std::size_t used = timeColumns + nameColumns + applicationColumns + 3;
        const std::size_t rest = width_ == std::string::npos ? width_ : width_ > used + 8 ? width_ - used : 8;
        fmt::print("{} {} {} {}\n", padded(timeText(event.time), timeColumns),
                   padded(fitted(printable(std::string(name)), nameColumns), nameColumns),
                   padded(fitted(printable(application), applicationColumns), applicationColumns),
                   fitted(printable(payload), rest));
    }

private:
    static constexpr std::size_t timeColumns = 23;
    static constexpr std::size_t nameColumns = 34;
    static constexpr std::size_t applicationColumns = 22;

    static std::string timeText(double time)
    {
        return foundation::localTimeText(time, "{:%Y-%m-%d %H:%M:%S}")
            + fmt::format(".{:03}", static_cast<int>((time - std::floor(time)) * 1000));
    }

    // "key=value key=value", but for the application, which has a column of its own.
    static std::string describe(const std::string& payload, std::string& application)
    {
        rapidjson::Document document;
        document.Parse<rapidjson::kParseIterativeFlag>(payload.data(), payload.size());
        if (document.HasParseError() || !document.IsObject())
            return payload;
        std::string description;
        for (const auto& [key, value] : document.GetObject()) {
            const std::string name = textOf(key);
            if (name == "HostApplicationDisplayID" || name == "processName")
                application = textOf(value);
            else
                description += fmt::format("{}{}={}", description.empty() ? "" : " ", name, textOf(value));
        }
        return description;
    }

    const std::size_t width_ = terminalWidth();
};

void printJson(const StoredEvent& event)
{
    std::string name;
    foundation::appendJsonText(event.name, name);
    fmt::print("{{\"id\":{},\"time\":{},\"name\":{},\"payload\":{}}}\n", event.id, event.time, name, event.payload);
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
        if (!options_.isJson)
            table_.printHead();
        print();
        if (!options_.isFollowing)
            return;
        filter_.mostRecent.reset();
        for (const DatabaseWatch watch(options_.database);; watch.wait())
            print();
    }

private:
    void print()
    {
        store_.forEach(filter_, [this](const StoredEvent& event) {
            filter_.afterID = event.id;
            if (options_.isJson)
                printJson(event);
            else
                table_.print(event);
        });
        std::fflush(stdout);
    }

    const EventsOptions& options_;
    EventFilter filter_;
    EventStore store_;
    Table table_;
};

} // namespace

void addEventsCommand(CLI::App& application, int& exitStatus)
{
    const auto options = std::make_shared<EventsOptions>();
    CLI::App* command = application.add_subcommand("events", "Lists the stored events, the most recent last");
    command->add_option("--database", options->database, "The event store, if it is not at its usual place");
    command->add_option("--name", options->filter.namePattern,
                        "Only events of names that match, such as 'com.quarn.*.Volume.*'");
    command->add_option("--since", options->since,
                        "Only events since then: 90s, 10m, 2h, 7d ago, or a time such as 2026-01-31T18:00:00");
    command->add_option("--count", options->filter.mostRecent, "At most so many, the most recent ones")
        ->check(CLI::NonNegativeNumber);
    command->add_flag("--follow", options->isFollowing, "Go on with events as they come");
    command->add_flag("--json", options->isJson, "One JSON object a line, for programs");
    command->callback([options, &exitStatus] {
        if (options->database.empty())
            options->database = EventStore::usualPath();
        if (!options->since.empty()) {
            const auto since = parseMoment(options->since);
            if (!since)
                throw CLI::ValidationError(
                    "--since", "\"" + options->since + "\" is no time: write 90s, 10m, 2h, 7d or 2026-01-31T18:00:00");
            options->filter.since = *since;
        }
        EventsRun(*options).run();
        exitStatus = exitOk;
    });
}
