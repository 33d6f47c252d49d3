// SPDX-License-Identifier: Apache-2.0
// Messages and the stretches that they end share one sequence of IDs, as the service gives them out.
#include "support/weeks/WeeksFile.h"

#include "platform/linux/store/SqliteConnection.h"
#include "platform/linux/store/tables/StoreSchema.h"
#include "platform/linux/store/tables/StretchRows.h"

#include <algorithm>
#include <fmt/format.h>
#include <map>
#include <stdexcept>
#include <string>
#include <string_view>
#include <tuple>
#include <type_traits>
#include <utility>

namespace weeks {
namespace {

constexpr std::int64_t theHolder = 1;
constexpr double delivery = 0.02; // from what happens to its message's arrival, in seconds

template <typename Result> Result must(platform::StoreExpected<Result>&& done)
{
    if (!done)
        throw std::runtime_error("the store of made-up weeks cannot be written");
    if constexpr (!std::is_void_v<Result>)
        return std::move(*done);
}

std::string nameOf(const Message& message)
{
    const std::string direction = message.isRecording ? "Record." : "Playback.";
    switch (message.kind) {
    case MessageKind::Start: return direction + "Start";
    case MessageKind::Stop: return direction + "Stop";
    case MessageKind::Deactivate: return direction + "Deactivate";
    case MessageKind::Volume: return "Volume.State";
    case MessageKind::Route: return "RouteChange.State";
    case MessageKind::Fault: return "Error.IssueDetector";
    case MessageKind::Idle: return "Setup.State";
    }
    return {};
}

class Writer {
public:
    Writer(const Weeks& weeks, platform::SqliteConnection& connection)
        : weeks_(weeks),
          connection_(connection),
          counts_(must(platform::StoreCountsRow::open(connection, weeks.now))),
          stretchRows_(must(platform::StretchRows::open(connection))),
          insertMessage_(
              must(connection.prepare("INSERT INTO messages(id, time, kind, session, source, happened, holder, payload)"
                                      " VALUES (?, ?, ?, ?, ?, ?, ?, ?)"))),
          insertKind_(must(connection.prepare("INSERT INTO kinds(id, name, second_name) VALUES (?, ?, ?)")))
    {
    }

    void write()
    {
        must(connection_.execute("BEGIN"));
        writeOrigins();
        writeRows();
        platform::StoreCounts& counts = counts_.counts();
        counts.nextSource = counts.nextSession = static_cast<std::int64_t>(weeks_.sessions.size()) + 1;
        counts.kept = 2 * static_cast<std::int64_t>(weeks_.messages.size());
        counts.clock.wall = weeks_.now;
        must(counts_.write());
        must(connection_.execute("COMMIT"));
    }

private:
    // Each session has a connection of its own.
    void writeOrigins()
    {
        must(connection_.execute("INSERT INTO holders VALUES (1, 1000, 'everybody', '', 0, 1)"));
        const auto source = must(connection_.prepare(
            "INSERT INTO sources(id, boot, user, process, name, began, ended) VALUES (?, 'boot', ?, ?, ?, ?, ?)"));
        const auto session =
            must(connection_.prepare("INSERT INTO sessions(id, source, reporter, service, application, began, ended)"
                                     " VALUES (?, ?, ?, ?, ?, ?, ?)"));
        for (const Session& made : weeks_.sessions) {
            bind(source, made.id, made.user, made.processID, std::string_view(made.process), made.began, made.ended);
            bind(session, made.id, made.id, made.id, std::string_view(made.service), std::string_view(made.application),
                 made.began, made.ended);
        }
    }

    template <typename... Values> static void bind(const platform::SqliteStatement& statement, const Values&... values)
    {
        int parameter = 0;
        (statement.bind(++parameter, values), ...);
        must(statement.run());
    }

    // A stretch comes behind the message that ends it.
    void writeRows()
    {
        std::vector<const Stretch*> ended;
        for (const Stretch& stretch : weeks_.stretches)
            ended.push_back(&stretch);
        const auto end = [](const Stretch* stretch) { return stretch->began + stretch->seconds; };
        std::ranges::stable_sort(ended, {}, end);
        auto next = ended.begin();
        for (const Message& message : weeks_.messages) {
            for (; next != ended.end() && end(*next) < message.happened; ++next)
                write(**next);
            write(message);
        }
        for (; next != ended.end(); ++next)
            write(**next);
    }

    void write(const Message& message)
    {
        const std::string payload = payloadOf(message);
        auto& id = counts_.counts().nextEvent;
        bind(insertMessage_, id, std::min(message.happened + delivery, weeks_.now), kindOf(message), message.session,
             message.session, message.happened, theHolder, std::string_view(payload));
        id += 2;
    }

    std::int64_t kindOf(const Message& message)
    {
        const std::string_view service = weeks_.sessions[static_cast<std::size_t>(message.session - 1)].service;
        const auto [place, isNew] = kinds_.try_emplace({message.kind, message.isRecording, service}, kinds_.size() + 1);
        if (isNew) {
            const std::string first = "com.quarn.kesto." + nameOf(message);
            const std::string second = fmt::format("com.quarn.{}.{}", service, nameOf(message));
            bind(insertKind_, place->second, std::string_view(first), std::string_view(second));
        }
        return place->second;
    }

    [[nodiscard]] std::string payloadOf(const Message& message) const
    {
        const Session& session = weeks_.sessions[static_cast<std::size_t>(message.session - 1)];
        return fmt::format(R"({{{}"kestoreporting_timestamp":{:.6f},"HostApplicationDisplayID":"{}"}})",
                           contentOf(message), message.happened, session.application);
    }

    [[nodiscard]] std::string contentOf(const Message& message) const
    {
        const char* direction = message.isRecording ? "input" : "output";
        switch (message.kind) {
        case MessageKind::Start: return fmt::format(R"("session_{}_running":true,)", direction);
        case MessageKind::Stop: return fmt::format(R"("session_{}_running":false,)", direction);
        case MessageKind::Deactivate: return fmt::format(R"("session_duration":{:.3f},)", message.number);
        case MessageKind::Volume: return fmt::format(R"("PomoSessionVolume":{},)", message.number);
        case MessageKind::Route: return fmt::format(R"("active_devices":"{}",)", devicesAt(message));
        case MessageKind::Fault:
            return fmt::format(R"("issue":"late_cycles","late_cycles":{},"issue_duration":0.5,{})", message.number,
                               deviceEntry(message));
        case MessageKind::Idle: return R"("session_selected_format":"S16LE/48000/2",)";
        }
        return {};
    }

    [[nodiscard]] std::string deviceEntry(const Message& message) const
    {
        const std::string devices = devicesAt(message);
        return devices.empty() ? std::string() : fmt::format(R"("active_devices":"{}",)", devices);
    }

    // Of the stretch of its session that is not over then.
    [[nodiscard]] std::string devicesAt(const Message& message) const
    {
        const auto [first, last] = std::ranges::equal_range(weeks_.stretches, message.session, {}, &Stretch::session);
        const auto found = std::find_if(
            first, last, [&](const Stretch& stretch) { return stretch.began + stretch.seconds > message.happened; });
        return found == last ? std::string() : found->devices;
    }

    void write(const Stretch& stretch)
    {
        const auto text = [](const std::string& told) { return told.empty() ? std::nullopt : std::optional(told); };
        const platform::PlayingState state{.devices = text(stretch.devices),
                                           .format = text(stretch.format),
                                           .channels = stretch.isRecording ? 1 : 2,
                                           .volume = stretch.volume};
        if (stretch.ending == Ending::None)
            writeOpen(stretch, state);
        else
            must(stretchRows_.insert(counts_.counts().nextEvent++, {.holder = theHolder, .session = stretch.session},
                                     {.origin = {},
                                      .isRecording = stretch.isRecording,
                                      .began = stretch.began,
                                      .seconds = stretch.seconds,
                                      .state = state,
                                      .ending = static_cast<platform::StretchEnding>(stretch.ending)}));
    }

    void writeOpen(const Stretch& stretch, const platform::PlayingState& state)
    {
        const platform::OpenStretch open{.origin = {}, .began = {.arrived = stretch.began, .happened = stretch.began}};
        must(stretchRows_.insertOpen({.holder = theHolder, .session = stretch.session},
                                     {.key = static_cast<platform::Stretches::Key>(stretch.session),
                                      .open = &open,
                                      .isRecording = stretch.isRecording,
                                      .state = &state}));
    }

    const Weeks& weeks_;
    platform::SqliteConnection& connection_;
    platform::StoreCountsRow counts_;
    platform::StretchRows stretchRows_;
    platform::SqliteStatement insertMessage_;
    platform::SqliteStatement insertKind_;
    std::map<std::tuple<MessageKind, bool, std::string_view>, std::int64_t> kinds_; // by service type, too
};

} // namespace

void writeWeeks(const Weeks& weeks, const std::filesystem::path& database)
{
    const auto connection = must(platform::SqliteConnection::open(database));
    must(connection->execute("PRAGMA synchronous = OFF; PRAGMA journal_mode = OFF; PRAGMA cache_size = -65536"));
    must(platform::StoreSchema::make(*connection));
    Writer(weeks, *connection).write();
}

} // namespace weeks
