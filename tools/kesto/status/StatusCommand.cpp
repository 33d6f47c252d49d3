// SPDX-License-Identifier: Apache-2.0
// `kesto status`: what the service counted, once or again and again.
#include "foundation/values/Json.h"
#include "kesto/Commands.h"
#include "kesto/ServiceDirectories.h"
#include "kesto/Terminal.h"
#include "kesto/status/StatusMetrics.h"
#include "kesto/status/StatusSource.h"
#include "kesto/status/StatusText.h"
#include "ledger/Report.h"

#include <chrono>
#include <cstdio>
#include <fmt/format.h>
#include <memory>
#include <optional>
#include <thread>
#include <unistd.h>

namespace {

using foundation::Dictionary;

struct StatusOptions {
    std::filesystem::path socket;
    std::filesystem::path ledgerFile;
    bool isJson = false;
    bool isMetrics = false;
    bool isWatching = false;
    double interval = 2;
    std::optional<std::size_t> count;
};

class StatusRun {
public:
    explicit StatusRun(const StatusOptions& options)
        : options_(options),
          source_(options.socket, options.ledgerFile) { }

    int show()
    {
        return withReport([&](const Dictionary& report) { fmt::print("{}", textOf(report)); });
    }

    // On a terminal each status takes the place of the one before; elsewhere each is one line.
    int watch()
    {
        const bool isScreen = ::isatty(STDOUT_FILENO) != 0 && !options_.isJson;
        int exitStatus = exitOk;
        for (std::size_t look = 0; look < options_.count.value_or(SIZE_MAX); ++look) {
            if (look != 0)
                std::this_thread::sleep_for(std::chrono::duration<double>(options_.interval));
            exitStatus = withReport([&](const Dictionary& report) {
                if (isScreen)
                    fmt::print("\x1B[H\x1B[2J{}", textOf(report));
                else
                    fmt::print("{}\n", lineOf(report));
            });
            std::fflush(stdout);
        }
        return exitStatus;
    }

private:
    template <typename Print> int withReport(Print print)
    {
        try {
            const Dictionary report = source_.read();
            print(report);
            return exitStatusOf(report);
        } catch (const StatusError& error) {
            fmt::print(stderr, "kesto status: {}\n", error.what());
            return exitNotRunning;
        }
    }

    [[nodiscard]] std::string textOf(const Dictionary& report) const
    {
        if (options_.isMetrics)
            return metricsText(report);
        return options_.isJson ? lineOf(report) + '\n' : statusText(report, outputWidth());
    }

    [[nodiscard]] std::string lineOf(const Dictionary& report) const
    {
        if (!options_.isJson && !report.find("running")->asBoolean())
            return "kestod does not run";
        if (!options_.isJson)
            return ledger::statusLine(
                report, std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count());
        std::string line;
        foundation::appendJsonText(report, line);
        return line;
    }

    const StatusOptions& options_;
    StatusSource source_;
};

} // namespace

void addStatusCommand(CLI::App& application, int& exitStatus)
{
    const auto options = std::make_shared<StatusOptions>();
    CLI::App* command =
        application.add_subcommand("status", "Shows what the service counted, and what it lost and why");
    command->add_option("--socket", options->socket, "The service's socket, if it is not at its usual place");
    command->add_option("--ledger", options->ledgerFile,
                        "The file to read if the service does not run, if it is not at its usual place");
    CLI::Option* json = command->add_flag("--json", options->isJson, "One JSON object, for programs");
    CLI::Option* metrics = command->add_flag("--prometheus", options->isMetrics, "The text format of Prometheus");
    CLI::Option* watch =
        command->add_flag("--watch", options->isWatching, "Go on, and show the status again and again");
    json->excludes(metrics);
    metrics->excludes(watch);
    command->add_option("--interval", options->interval, "Seconds between two looks, 0.01 to 86400; 2 by default")
        ->check(secondsToWait())
        ->needs(watch);
    command->add_option("--count", options->count, "End after this many looks")
        ->check(CLI::NonNegativeNumber)
        ->needs(watch);
    command->footer("Exit status: 0 if the service runs and lost nothing since its start, 1 if it lost something,\n"
                    "2 if the command line was wrong, 3 if the service does not run or does not answer.");
    command->callback([options, &exitStatus] {
        if (options->socket.empty())
            options->socket = usualSocket();
        if (options->ledgerFile.empty())
            options->ledgerFile = usualLedger();
        StatusRun run(*options);
        exitStatus = options->isWatching ? run.watch() : run.show();
    });
}
