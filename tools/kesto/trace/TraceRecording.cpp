// SPDX-License-Identifier: Apache-2.0
// The program runs only after a check that it can be measured: the service first traces for a moment, and its results
// show whether it can read the parameters, where its results are, and whether the tool can read them.
#include "kesto/trace/TraceRecording.h"

#include "kesto/ExitStatus.h"
#include "kesto/ServiceDirectories.h"
#include "kesto/Terminal.h"
#include "kesto/files/OutputFile.h"
#include "kesto/trace/TraceParametersFile.h"
#include "kesto/trace/TraceResultsPlace.h"
#include "kesto/trace/TraceView.h"
#include "kesto/trace/TracedSession.h"

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <fmt/format.h>
#include <optional>
#include <spawn.h>
#include <stdexcept>
#include <sys/wait.h>
#include <system_error>
#include <unistd.h>

namespace {

namespace fs = std::filesystem;

// The folder of the results, and the root below which other users may write, too.
struct ResultsFolder {
    fs::path root;
    fs::path path;
};

ResultsFolder folderOf(const TraceRecordingOptions& options)
{
    if (!options.results.empty())
        return {.root = fs::absolute(options.results).parent_path(),
                .path = fs::absolute(options.results).parent_path()};
    return {.root = usualLogsDirectory(), .path = usualLogsDirectory() / "Audio/Traces"};
}

// The problem that the service reports when it traces for a moment with the parameters at that path.
std::string problemWith(const fs::path& parameters, TracedSession& session, TraceResultsPlace& results)
{
    session.start(parameters);
    session.stop();
    return traceResultsOf(results.takeNew(), results.path()).problem;
}

// Starts the trace. Errors in the file itself were reported before; any other problem of the service ends the
// recording.
void start(TracedSession& session, const TraceParametersFile& file, TraceResultsPlace& results,
           const ResultsFolder& folder)
{
    const std::string problem = problemWith(file.path, session, results);
    if (problem == file.params.problem)
        return session.start(file.path);
    std::optional<TraceParametersCopy> copy;
    try {
        copy.emplace(folder.root, folder.path, file.text);
    } catch (const std::runtime_error& error) {
        throw std::runtime_error(
            fmt::format("the service does not measure by {}: {}; and it cannot be given a copy: {}",
                        printable(file.path.native()), printable(problem), error.what()));
    }
    if (const std::string other = problemWith(copy->path(), session, results); other != file.params.problem)
        throw std::runtime_error(
            fmt::format("the service does not measure by {}: {}", printable(file.path.native()), printable(other)));
    session.start(copy->path()); // the service has read the copy when this returns
}

// While a program runs in the foreground, keyboard signals are for the program: the tool ignores them, as a shell does.
class KeyboardSignals {
public:
    KeyboardSignals()
    {
        struct sigaction ignore = {};
        ignore.sa_handler = SIG_IGN;
        ::sigaction(SIGINT, &ignore, &interrupt_);
        ::sigaction(SIGQUIT, &ignore, &quit_);
    }
    ~KeyboardSignals()
    {
        ::sigaction(SIGINT, &interrupt_, nullptr);
        ::sigaction(SIGQUIT, &quit_, nullptr);
    }
    KeyboardSignals(const KeyboardSignals&) = delete;
    KeyboardSignals& operator=(const KeyboardSignals&) = delete;

    // The signals that the program must handle as before.
    [[nodiscard]] sigset_t handledBefore() const
    {
        sigset_t signals;
        ::sigemptyset(&signals);
        if (interrupt_.sa_handler != SIG_IGN)
            ::sigaddset(&signals, SIGINT);
        if (quit_.sa_handler != SIG_IGN)
            ::sigaddset(&signals, SIGQUIT);
        return signals;
    }

private:
    struct sigaction interrupt_ = {};
    struct sigaction quit_ = {};
};

// 0 or an error number.
int spawn(std::vector<std::string> command, const KeyboardSignals& signals, pid_t& process)
{
    std::vector<char*> words;
    words.reserve(command.size() + 1);
    for (std::string& word : command)
        words.push_back(word.data());
    words.push_back(nullptr);
    const sigset_t handled = signals.handledBefore();
    posix_spawnattr_t attributes;
    ::posix_spawnattr_init(&attributes);
    ::posix_spawnattr_setsigdefault(&attributes, &handled);
    ::posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGDEF);
    const int error = ::posix_spawnp(&process, words.front(), nullptr, &attributes, words.data(), environ);
    ::posix_spawnattr_destroy(&attributes);
    return error;
}

// Runs the program to its end and returns its exit status; if it cannot run, prints the reason and returns nothing.
std::optional<int> run(const std::vector<std::string>& command)
{
    constexpr int signalled = 128;
    const KeyboardSignals signals;
    pid_t process = 0;
    if (const int error = spawn(command, signals, process); error != 0) {
        fmt::print(stderr, "kesto: {} cannot be run: {}\n", printable(command.front()),
                   std::generic_category().message(error));
        return std::nullopt;
    }
    int status = 0;
    while (::waitpid(process, &status, 0) < 0 && errno == EINTR) { }
    return WIFEXITED(status) ? WEXITSTATUS(status) : signalled + WTERMSIG(status);
}

void report(const std::exception& exception)
{
    fmt::print(stderr, "kesto: {}\n", exception.what());
}

// Returns the exit status for a program that succeeded.
int show(TraceResultsPlace& results, const fs::path& output)
{
    const std::string text = results.takeNew();
    int status = exitOk;
    try {
        if (!output.empty())
            writeOutput(output, text);
    } catch (const std::exception& exception) { // the results are shown all the same
        report(exception);
        status = exitFailure;
    }
    const int shown = showTraceResults(traceResultsOf(text, results.path()), false);
    return status == exitOk ? shown : status;
}

} // namespace

int recordTrace(const TraceRecordingOptions& options)
{
    constexpr int exitCannotRun = 127; // as in shells
    const TraceParametersFile parameters = readTraceParameters(options.parameters);
    for (const std::string& warning : warningsOf(parameters.params))
        fmt::print(stderr, "kesto: warning: {}: {}\n", printable(parameters.path.native()), printable(warning));
    const ResultsFolder folder = folderOf(options);
    removeLeftTraceParametersCopies(folder.root, folder.path);
    TraceResultsPlace results(options.results.empty() ? folder.path / "tracing_results.qdj" : options.results);
    if (!options.socket.empty())
        ::setenv("KESTO_SOCKET", options.socket.c_str(), 1); // before threads start
    TracedSession session(options.socket);
    start(session, parameters, results, folder);
    const auto ended = run(options.command);
    if (!ended)
        return exitCannotRun;
    int status = exitFailure;
    try {
        session.stop();
        status = show(results, options.output);
    } catch (const std::exception& exception) {
        report(exception);
    }
    return *ended == exitOk ? status : *ended;
}
