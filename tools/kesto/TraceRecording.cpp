// That the service traces shows three times: a start is answered at once, a client that asked for it may emit events,
// and a new results file takes the place of the old one. Whoever is refused on the way is told where to look.
#include "TraceRecording.h"

#include "Commands.h"
#include "InputFile.h"
#include "Places.h"
#include "Terminal.h"
#include "TraceView.h"
#include "foundation/PropertyList.h"
#include "platform/linux/FileDescriptor.h"

#include <cerrno>
#include <chrono>
#include <condition_variable>
#include <csignal>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <fcntl.h>
#include <fmt/format.h>
#include <functional>
#include <kesto/trace.hpp>
#include <mutex>
#include <optional>
#include <random>
#include <spawn.h>
#include <stdexcept>
#include <sys/stat.h>
#include <sys/wait.h>
#include <system_error>
#include <unistd.h>

namespace {

namespace fs = std::filesystem;

template <typename... Arguments> [[noreturn]] void fail(fmt::format_string<Arguments...> text, Arguments&&... arguments)
{
    throw std::runtime_error(fmt::format(text, std::forward<Arguments>(arguments)...));
}

std::string errorText(int error)
{
    return std::generic_category().message(error);
}

// The service goes on with whatever it finds; an engineer wants to know before.
void checkParameters(const fs::path& path)
{
    const std::string text = readInput(path, foundation::PropertyListLimits().bytes);
    if (const auto list = foundation::readPropertyList(text); !list)
        fail("{} is no parameters file: {}", printable(path.native()), printable(list.error().text));
}

// The results file that is there now. It is kept open: so no file that comes later can be taken for it.
class LastResults {
public:
    explicit LastResults(fs::path path) : path_(std::move(path)), file_(::open(path_.c_str(), O_PATH | O_CLOEXEC)) { }

    [[nodiscard]] const fs::path& path() const { return path_; }
    [[nodiscard]] bool areReplaced() const
    {
        struct stat before = {};
        struct stat now = {};
        if (::stat(path_.c_str(), &now) != 0)
            return false;
        return !file_ || ::fstat(file_.get(), &before) != 0 || before.st_dev != now.st_dev
            || before.st_ino != now.st_ino;
    }

private:
    const fs::path path_;
    const platform::FileDescriptor file_;
};

// A session of the service that traces from `start` to `stop`; it ends with its connection at the latest.
class TracedSession {
public:
    explicit TracedSession(const std::string& socket)
    {
        kesto::Options options;
        options.socketPath = socket;
        options.wakeOnSend = true;
        options.trace = true;
        options.stateChanged = [this](const kesto::StateChange& change) { stateChanged(change); };
        if (const auto status = client_.open(options); status != kesto::Status::Ok)
            fail("the service cannot be reached: {}", kesto::errorText(status));
    }

    void start(const fs::path& parameters)
    {
        // The kind of trace is left out: the service knows one, and takes no client's word for it.
        kesto::Message configuration;
        configuration.add("KestoReportingPellorinPlistFilePath", parameters.native());
        ask([&](const auto& answered) { return client_.createSession(reporter_, answered); });
        ask([&](const auto& answered) {
            return client_.setServiceType(kesto::ServiceType::Test, reporter_, answered);
        });
        ask([&](const auto& answered) { return client_.setConfiguration(configuration, reporter_, answered); });
        // Where the service may trace, a start is answered before the next call; else it is answered when it ends.
        if (const auto status = client_.startSession(reporter_, [this](const auto& answer) { takeStart(answer); });
            status != kesto::Status::Ok)
            fail("the session cannot be started: {}", kesto::errorText(status));
        ask([&](const auto& answered) { return client_.validate(reporter_, answered); });
        {
            const std::scoped_lock lock(lock_);
            if (!mayBeTraced_)
                fail("the service does not trace. Either the feature is off (feature-flags.toml: [Sonalis] Tracing = "
                     "true), or there is no tracefs that it may use: its log says so");
        }
        waitForTrace();
    }

    // When it returns, the service has written the results, if it could.
    void stop()
    {
        ask([&](const auto& answered) { return client_.stopSession(reporter_, answered); });
    }

private:
    using Call = std::function<kesto::Status(const kesto::AnswerCallback& answered)>;

    static constexpr std::chrono::seconds patience{30}; // until an answer
    static constexpr std::chrono::seconds tracePatience{2}; // until a trace that was started is seen here

    static kesto::ReporterID randomReporter()
    {
        std::random_device random;
        return std::uniform_int_distribution<kesto::ReporterID>(1)(random);
    }

    void ask(const Call& call)
    {
        {
            const std::scoped_lock lock(lock_);
            isAnswered_ = false;
        }
        if (const auto status = call([this](const kesto::Answer& answer) { take(answer); });
            status != kesto::Status::Ok && status != kesto::Status::NotConnected) // what is lost is told below
            fail("the service cannot be asked: {}", kesto::errorText(status));
        std::unique_lock lock(lock_);
        if (!changed_.wait_for(lock, patience, [this] { return isAnswered_ || !problem_.empty(); }))
            fail("the service does not answer within {} s", patience.count());
        if (!problem_.empty())
            throw std::runtime_error(problem_);
    }

    // On the library's thread, as what follows.
    void take(const kesto::Answer& answer)
    {
        const std::scoped_lock lock(lock_);
        if (answer.status() != kesto::Status::Ok)
            return; // the library's, of a connection whose end is told apart
        isAnswered_ = true;
        if (!answer.ok())
            problem_ = fmt::format("the service refuses: {} {}; is reporting disabled?",
                                   printable(answer.errorDomain()), answer.errorCode());
        changed_.notify_all();
    }

    void takeStart(const kesto::Answer& answer)
    {
        const std::scoped_lock lock(lock_);
        mayBeTraced_ |= answer.ok();
    }

    void stateChanged(const kesto::StateChange& change)
    {
        if (change.state != kesto::State::Disconnected)
            return;
        const std::scoped_lock lock(lock_);
        problem_ =
            fmt::format("{}: {}{}; {}", change.socketPath, kesto::errorText(change.reason),
                        change.systemError == 0 ? "" : " (" + errorText(change.systemError) + ")",
                        change.reason == kesto::Status::ConnectionLost ? "its log says why" : "is kestod running?");
        changed_.notify_all();
    }

    void waitForTrace()
    {
        const kesto::Tracer tracer(client_);
        const auto end = std::chrono::steady_clock::now() + tracePatience;
        std::unique_lock lock(lock_);
        while (!tracer.isActive()) {
            if (!problem_.empty())
                throw std::runtime_error(problem_);
            if (std::chrono::steady_clock::now() > end)
                fail("the service has begun no trace: either the parameters file asks for none of the kernel, or too "
                     "many run already; its log says which");
            changed_.wait_for(lock, std::chrono::milliseconds(1)); // nobody tells when it begins
        }
    }

    const kesto::ReporterID reporter_ = randomReporter();
    std::mutex lock_;
    std::condition_variable changed_;
    bool isAnswered_ = false; // the last call
    bool mayBeTraced_ = false;
    std::string problem_;
    kesto::Client client_; // ends first: its thread calls what is above
};

// While a program runs in front, the keys that interrupt are for it: who waits for it goes on, as a shell does.
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

    // Those that the program is to have as they were before.
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

// Runs the program to its end and returns its exit status; nothing when it cannot be run, which is told.
std::optional<int> run(const std::vector<std::string>& command)
{
    constexpr int signalled = 128;
    const KeyboardSignals signals;
    pid_t process = 0;
    if (const int error = spawn(command, signals, process); error != 0) {
        fmt::print(stderr, "kesto: {} cannot be run: {}\n", printable(command.front()), errorText(error));
        return std::nullopt;
    }
    int status = 0;
    while (::waitpid(process, &status, 0) < 0 && errno == EINTR) { }
    return WIFEXITED(status) ? WEXITSTATUS(status) : signalled + WTERMSIG(status);
}

void showResults(const LastResults& results, const fs::path& output)
{
    if (!results.areReplaced())
        fail("the service has written no results to {}; if its log directory is another, name it with --results",
             printable(results.path().native()));
    if (!output.empty())
        fs::copy_file(results.path(), output, fs::copy_options::overwrite_existing);
    showTraceResults(output.empty() ? results.path() : output, false);
}

} // namespace

int recordTrace(const TraceRecordingOptions& options)
{
    constexpr int exitCannotRun = 127; // as shells have it
    const fs::path parameters = fs::absolute(options.parameters); // the service has another directory
    checkParameters(parameters);
    const LastResults results(options.results.empty() ? usualLogsDirectory() / "Audio/Traces/tracing_results.qdj"
                                                      : options.results);
    if (!options.socket.empty())
        ::setenv("KESTO_SOCKET", options.socket.c_str(), 1); // before there are threads
    TracedSession session(options.socket);
    session.start(parameters);
    const auto ended = run(options.command);
    if (!ended)
        return exitCannotRun;
    const int status = *ended;
    try {
        session.stop();
        showResults(results, options.output);
    } catch (const std::exception& exception) {
        fmt::print(stderr, "kesto: {}\n", exception.what());
        return status == exitOk ? exitFailure : status;
    }
    return status;
}
