// SPDX-License-Identifier: Apache-2.0
// The process gets an environment of its own, with only the sanitizers' variables from the test, and ends with SIGKILL,
// because its guarantees must hold even then. The tests read its store by SQL, as any user may.
#include "end_to_end/Kestod.h"

#include "end_to_end/WireClient.h"

#include <charconv>
#include <csignal>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sched.h>
#include <sqlite3.h>
#include <stdexcept>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

namespace end_to_end {
namespace {

namespace fs = std::filesystem;

constexpr int firstPassedDescriptor = 3; // by the protocol of socket activation
constexpr std::string_view passedTo = "LISTEN_PID=";
constexpr std::size_t longestPID = 10; // in digits

} // namespace

Kestod::Kestod(const Files& configuration, Environment further)
{
    for (const char* name : {"run", "state", "logs", "configuration"})
        fs::create_directory(directory() / name);
    for (const auto& [name, text] : configuration) {
        const fs::path path = directory() / "configuration" / name;
        fs::create_directories(path.parent_path());
        support::writeFile(path, text);
    }
    environment_ = {
        {"RUNTIME_DIRECTORY", directory() / "run"}, {"STATE_DIRECTORY", directory() / "state"},
        {"LOGS_DIRECTORY", directory() / "logs"},   {"CONFIGURATION_DIRECTORY", directory() / "configuration"},
        {"KESTO_SERVICE_NAME", "kesto.socket"},     {"KESTO_LOG", "debug"}};
    for (auto& [name, value] : further)
        environment_[name] = std::move(value);
}

Kestod::~Kestod()
{
    kill();
    if (testing::Test::HasFailure())
        std::fprintf(stderr, "--- log of the service:\n%s", log().c_str());
}

void Kestod::shiftClock(std::chrono::seconds shift)
{
    const fs::path path = directory() / "clock-shift";
    environment_["KESTO_TEST_CLOCK_SHIFT"] = path;
    environment_["LD_PRELOAD"] = SHIFTED_CLOCK_PATH;
    const std::int64_t seconds = shift.count();
    const int file = ::open(path.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600);
    const bool isWritten = ::pwrite(file, &seconds, sizeof seconds, 0) == sizeof seconds; // the process has it mapped
    ::close(file);
    if (!isWritten)
        throw std::runtime_error("the clock cannot be shifted");
}

void Kestod::startAndAwait()
{
    start();
    static_cast<void>(WireClient(socketPath()));
}

void Kestod::start(const InheritedDescriptors& inherited)
{
    std::vector<std::string> variables;
    for (const auto& [name, value] : environment_)
        if (!value.empty())
            variables.push_back(std::string(name).append("=").append(value));
    for (const char* name : {"ASAN_OPTIONS", "TSAN_OPTIONS", "UBSAN_OPTIONS", "LSAN_OPTIONS", "LD_LIBRARY_PATH"})
        if (const char* value = std::getenv(name))
            variables.push_back(std::string(name) + "=" + value);
    if (inherited.listeningSocket >= 0) {
        variables.emplace_back("LISTEN_FDS=1");
        variables.push_back(std::string(passedTo).append(longestPID, '\0')); // only the process knows its own
    }
    std::vector<char*> pointers;
    pointers.reserve(variables.size() + 1);
    for (std::string& variable : variables)
        pointers.push_back(variable.data());
    pointers.push_back(nullptr);

    const fs::path logPath = directory() / "log";
    process_ = ::fork();
    if (process_ == 0) {
        ::prctl(PR_SET_PDEATHSIG, SIGKILL); // a test that is killed leaves nothing behind
        if (!hidden_.empty()
            && (::unshare(CLONE_NEWNS) != 0 || ::mount("none", hidden_.c_str(), "tmpfs", 0, nullptr) != 0))
            ::_exit(127);
        const int standardError = inherited.standardError >= 0
            ? inherited.standardError
            : ::open(logPath.c_str(), O_WRONLY | O_CREAT | O_APPEND, 0600);
        if (standardError < 0 || ::dup2(standardError, STDERR_FILENO) < 0)
            ::_exit(127);
        if (inherited.listeningSocket >= 0) {
            if (::dup2(inherited.listeningSocket, firstPassedDescriptor) == inherited.listeningSocket)
                ::fcntl(firstPassedDescriptor, F_SETFD, 0);
            char* digits = variables.back().data() + passedTo.size();
            std::to_chars(digits, digits + longestPID, ::getpid());
        }
        const rlimit descriptors{mostDescriptors_.value_or(0), mostDescriptors_.value_or(0)};
        if (mostDescriptors_ && ::setrlimit(RLIMIT_NOFILE, &descriptors) != 0)
            ::_exit(127);
        ::signal(SIGPIPE, SIG_DFL); // as in a shell; the test may have inherited another setting
        char name[] = "kestod";
        char* arguments[] = {name, nullptr};
        ::execve(program(), arguments, pointers.data());
        ::_exit(127);
    }
}

const char* Kestod::program() noexcept
{
    return KESTOD_PATH;
}

void Kestod::kill()
{
    if (process_ == 0)
        return;
    ::kill(process_, SIGKILL);
    ::waitpid(process_, nullptr, 0);
    process_ = 0;
}

int Kestod::exitStatus()
{
    int status = 0;
    if (!waitUntil([&] { return ::waitpid(process_, &status, WNOHANG) == process_; }))
        throw std::runtime_error("the service does not end");
    process_ = 0;
    return WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
}

std::string Kestod::log() const
{
    return support::readFile(directory() / "log");
}

bool Kestod::waitForLog(std::string_view text) const
{
    return waitUntil([&] { return log().contains(text); });
}

std::size_t Kestod::countInLog(std::string_view text) const
{
    const std::string all = log();
    std::size_t count = 0;
    for (std::size_t at = all.find(text); at != std::string::npos; at = all.find(text, at + 1))
        ++count;
    return count;
}

// Lines keep their order.
void Kestod::awaitLog() const
{
    constexpr std::string_view arrival = "new client with pid";
    const std::size_t before = countInLog(arrival);
    WireClient(socketPath()).ask(GetAllReporters);
    if (!waitUntil([&] { return countInLog(arrival) > before; }))
        throw std::runtime_error("the service logs no new client");
}

std::expected<std::vector<StoreRow>, std::string> Kestod::readEvents(std::string_view pattern) const
{
    const fs::path path = directory() / "state" / "analytics.sqlite3";
    std::vector<StoreRow> events;
    sqlite3* database = nullptr;
    sqlite3_stmt* query = nullptr;
    int status = sqlite3_open_v2(path.c_str(), &database, SQLITE_OPEN_READONLY, nullptr);
    sqlite3_busy_timeout(database, 10'000); // the service locks it while it opens or closes it
    if (status == SQLITE_OK)
        status = sqlite3_prepare_v2(database, "SELECT name, payload FROM events WHERE name GLOB ?1 ORDER BY id", -1,
                                    &query, nullptr);
    if (status == SQLITE_OK)
        status = sqlite3_bind_text(query, 1, pattern.data(), static_cast<int>(pattern.size()), SQLITE_TRANSIENT);
    if (status == SQLITE_OK) {
        const auto text = [&](int column) {
            return std::string(reinterpret_cast<const char*>(sqlite3_column_text(query, column)));
        };
        while ((status = sqlite3_step(query)) == SQLITE_ROW)
            events.push_back({text(0), text(1)});
    }
    const std::string problem = sqlite3_errmsg(database);
    sqlite3_finalize(query);
    sqlite3_close(database);
    if (status != SQLITE_DONE)
        return std::unexpected(problem);
    return events;
}

std::vector<StoreRow> Kestod::events(std::string_view pattern) const
{
    auto events = readEvents(pattern);
    if (!events)
        throw std::runtime_error("the store cannot be read: " + events.error());
    return *std::move(events);
}

std::vector<std::string> Kestod::query(const std::string& sql) const
{
    std::vector<std::string> rows;
    const auto note = [](void* texts, int, char** columns, char**) {
        static_cast<std::vector<std::string>*>(texts)->emplace_back(columns[0] == nullptr ? "NULL" : columns[0]);
        return SQLITE_OK;
    };
    sqlite3* database = nullptr;
    sqlite3_open_v2((directory() / "state" / "analytics.sqlite3").c_str(), &database, SQLITE_OPEN_READONLY, nullptr);
    sqlite3_busy_timeout(database, 10'000);
    const int status = sqlite3_exec(database, sql.c_str(), note, &rows, nullptr);
    const std::string problem = sqlite3_errmsg(database);
    sqlite3_close(database);
    if (status != SQLITE_OK)
        throw std::runtime_error("the store cannot be read: " + problem);
    return rows;
}

std::uint64_t Kestod::eventCount() const
{
    const fs::path path = directory() / "state" / "analytics.sqlite3";
    sqlite3* database = nullptr;
    sqlite3_stmt* query = nullptr;
    std::optional<std::uint64_t> count;
    if (sqlite3_open_v2(path.c_str(), &database, SQLITE_OPEN_READONLY, nullptr) == SQLITE_OK) {
        sqlite3_busy_timeout(database, 10'000);
        if (sqlite3_prepare_v2(database, "SELECT count(*) FROM events", -1, &query, nullptr) == SQLITE_OK
            && sqlite3_step(query) == SQLITE_ROW)
            count = static_cast<std::uint64_t>(sqlite3_column_int64(query, 0));
    }
    const std::string problem = sqlite3_errmsg(database);
    sqlite3_finalize(query);
    sqlite3_close(database);
    if (!count)
        throw std::runtime_error("the store cannot be read: " + problem);
    return *count;
}

std::vector<StoreRow> Kestod::waitForEvents(std::string_view pattern, std::size_t count) const
{
    constexpr std::vector<StoreRow> noStoreYet;
    waitUntil([&] { return readEvents(pattern).value_or(noStoreYet).size() >= count; });
    return events(pattern);
}

} // namespace end_to_end
