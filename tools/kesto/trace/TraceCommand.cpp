// SPDX-License-Identifier: Apache-2.0
// `kesto trace`: shows the results of a trace, or runs a program while a trace measures it.
#include "kesto/Commands.h"
#include "kesto/files/InputFile.h"
#include "kesto/trace/TraceRecording.h"
#include "kesto/trace/TraceView.h"

#include <CLI/Error.hpp>
#include <memory>

namespace {

struct TraceOptions {
    std::filesystem::path file;
    bool isJson = false;
    TraceRecordingOptions recording;
    std::string program; // to record
};

// The program's name and the words behind it on the command line, without the "--" before them.
std::vector<std::string> commandOf(const CLI::App& command, const std::string& program)
{
    std::vector<std::string> words = command.remaining();
    if (!words.empty() && words.front() == "--")
        words.erase(words.begin());
    words.insert(words.begin(), program);
    return words;
}

CLI::App* addRecordCommand(CLI::App& trace, TraceOptions& options)
{
    CLI::App* command = trace.add_subcommand("record", "Runs a program while a trace measures, and shows the results");
    TraceRecordingOptions& recording = options.recording;
    command
        ->add_option("--params", recording.parameters,
                     "The parameters file: the events that begin and end each measurement")
        ->required();
    command->add_option("--output", recording.output, "Keep a copy of the results file here");
    command->add_option("--socket", recording.socket, "The service's socket, if it is not at its usual place");
    command->add_option("--results", recording.results, "The service's results file, if it is not at its usual place");
    command->add_option("COMMAND", options.program, "The program to run, and its arguments; put -- before")->required();
    command->prefix_command(); // the arguments after it belong to the program
    command->footer(R"(Measures a program in one line:
  kesto trace record --params mixer.plist -- ./mixer -t 10
Exit status: that of the program; instead of 0, 3 if the results are incomplete. 1 if nothing could be
recorded, 127 if the program could not be run.)");
    return command;
}

} // namespace

void addTraceCommand(CLI::App& application, int& exitStatus)
{
    const auto options = std::make_shared<TraceOptions>();
    CLI::App* command = application.add_subcommand("trace", "Shows the results of a trace, or records one");
    CLI::Option* file =
        command->add_option("FILE", options->file,
                            "A results file, such as Audio/Traces/tracing_results.qdj of the service's log directory");
    CLI::Option* json = command->add_flag("--json", options->isJson, "One JSON object for each name, for programs");
    command->require_subcommand(0, 1);
    const CLI::App* record = addRecordCommand(*command, *options);
    command->callback([record, options, file, json, &exitStatus] {
        const bool isRecording = record->parsed();
        if (isRecording && file->count() + json->count() != 0)
            throw CLI::ExcludesError("record", file->count() != 0 ? "FILE" : "--json");
        if (!isRecording && file->count() == 0)
            throw CLI::ValidationError("name a results file, or record a trace: kesto trace record --help");
        if (isRecording) {
            options->recording.command = commandOf(*record, options->program);
            exitStatus = recordTrace(options->recording);
        } else {
            const auto results = traceResultsOf(readInput(options->file, largestTraceResults), options->file);
            exitStatus = showTraceResults(results, options->isJson);
        }
    });
}
