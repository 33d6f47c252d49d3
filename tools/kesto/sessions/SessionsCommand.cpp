// SPDX-License-Identifier: Apache-2.0
// `kesto sessions`: the sessions of a span of time, a line each, or one of them as a timeline.
#include "kesto/Commands.h"
#include "kesto/ServiceDirectories.h"
#include "kesto/Terminal.h"
#include "kesto/results/MomentText.h"
#include "kesto/sessions/SessionLine.h"
#include "kesto/sessions/SessionText.h"
#include "kesto/sessions/SessionTimeline.h"
#include "kesto/store/EventDatabase.h"

#include <fmt/format.h>
#include <map>
#include <memory>
#include <optional>
#include <string>

namespace {

struct SessionsOptions {
    std::filesystem::path database;
    std::optional<std::int64_t> number;
    std::string since = "7d";
    std::string order = "began";
    SessionChoice choice;
    bool isRecording = false;
    bool isJson = false;
    bool isCsv = false;
};

const std::map<std::string, SessionOrder>& orders()
{
    static const std::map<std::string, SessionOrder> orders{
        {"began", SessionOrder::Began}, {"played", SessionOrder::Played}, {"faults", SessionOrder::Faults}};
    return orders;
}

int showList(const SessionsOptions& options)
{
    const auto since = parseMoment(options.since);
    if (!since)
        throw CLI::ValidationError(
            "--since", "\"" + options.since + "\" is not a time: write 90s, 10m, 2h, 7d or 2026-01-31T18:00:00");
    HistoryQuestion question{.isRecording = options.isRecording};
    question.span.from = *since;
    SessionChoice choice = options.choice;
    choice.order = orders().at(options.order);
    const auto lines = chosen(makeSessionLines(readHistory(options.database, question)), choice);
    if (options.isJson)
        fmt::print("{}", sessionsJson(lines));
    else if (options.isCsv)
        fmt::print("{}", sessionsCsv(lines));
    else if (lines.empty())
        fmt::print("No session that matches {} since {}.\n", options.isRecording ? "recorded" : "played",
                   options.since);
    else
        fmt::print("{}",
                   showsUTF8() ? sessionsText(lines, outputWidth()) : asciiText(sessionsText(lines, outputWidth())));
    return exitOk;
}

// A session that only recorded is shown without a question.
int showOne(std::int64_t session, const SessionsOptions& options)
{
    const auto historyOf = [&](bool isRecording) {
        return readHistory(options.database, {.isRecording = isRecording, .session = session});
    };
    History history = historyOf(options.isRecording);
    if (history.stretches.empty() && !options.isRecording)
        if (History recorded = historyOf(true); !recorded.stretches.empty())
            history = std::move(recorded);
    const auto lines = makeSessionLines(history);
    if (lines.empty())
        throw EventStoreError(fmt::format("session {} {}recorded nothing, or is not in {}: kesto sessions --since 90d"
                                          " lists those that played",
                                          session, options.isRecording ? "" : "played and ",
                                          printable(options.database.native())));
    if (options.isJson)
        fmt::print("{}", sessionJson(lines.front(), history));
    else if (options.isCsv)
        fmt::print("{}", sessionCsv(history));
    else
        fmt::print("{}", sessionTimeline(lines.front(), history, {.width = outputWidth(), .isUTF8 = showsUTF8()}));
    return exitOk;
}

} // namespace

void addSessionsCommand(CLI::App& application, int& exitStatus)
{
    const auto options = std::make_shared<SessionsOptions>();
    CLI::App* command = application.add_subcommand("sessions", "Lists who played when, or shows one session's time");
    CLI::Option* number =
        command->add_option("NUMBER", options->number, "Show this session, with its timeline")->check(atLeastOne());
    command->add_option("--database", options->database, "The event store, if it is not at its usual place");
    command
        ->add_option(
            "--since", options->since,
            "Sessions that played or had faults since then: 90s, 10m, 2h, 30d ago, or a time such as 2026-01-31; 7d by "
            "default")
        ->excludes(number);
    command->add_flag("--faults", options->choice.withFaults, "Only sessions with faults")->excludes(number);
    command->add_flag("--running", options->choice.isRunning, "Only sessions that play now")->excludes(number);
    command->add_flag("--recording", options->isRecording, "Sessions that recorded, in place of those that played");
    command->add_option("--sort", options->order, "What comes first: the latest, the longest, the most faults")
        ->check(CLI::IsMember(orders()))
        ->excludes(number);
    command->add_option("--count", options->choice.most, "At most this many")->check(atLeastOne())->excludes(number);
    CLI::Option* csv = command->add_flag("--csv", options->isCsv, "As CSV");
    command->add_flag("--json", options->isJson, "One JSON object in each line, for programs")->excludes(csv);
    command->callback([options, &exitStatus] {
        if (options->database.empty())
            options->database = usualDatabase();
        exitStatus = options->number ? showOne(*options->number, *options) : showList(*options);
    });
}
