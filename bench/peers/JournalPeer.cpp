// SPDX-License-Identifier: Apache-2.0
// A process cannot leave a namespace, so journald and the measuring code run in a child, and a socket carries requests
// and figures.
#include "peers/JournalPeer.h"

#include "support/Harness.h"
#include "support/SampleMessage.h"

#include <array>
#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <fmt/format.h>
#include <fstream>
#include <sched.h>
#include <stdexcept>
#include <sys/mount.h>
#include <systemd/sd-journal.h>
#include <thread>
#include <unistd.h>

namespace bench {
namespace {

namespace fs = std::filesystem;

constexpr const char* program = "/lib/systemd/systemd-journald";
constexpr std::string_view configuration = "[Journal]\nStorage=persistent\nRateLimitIntervalSec=0\nRateLimitBurst=0\n"
                                           "ReadKMsg=no\nAudit=no\nForwardToSyslog=no\nForwardToWall=no\n"
                                           "SystemMaxUse=4G\nSystemKeepFree=1M\n";

// --- In the namespace

void check(bool succeeded, std::string_view doing)
{
    if (!succeeded)
        throw std::runtime_error(fmt::format("{}: {}", doing, std::strerror(errno)));
}

void writeFile(const fs::path& path, std::string_view text)
{
    std::ofstream file(path);
    file << text;
    check(static_cast<bool>(file.flush()), path.native());
}

// A process without root privileges gets them in a user namespace.
void enterNamespace()
{
    const auto user = ::getuid();
    const auto group = ::getgid();
    if (user == 0)
        return check(::unshare(CLONE_NEWNS) == 0, "a mount namespace");
    check(::unshare(CLONE_NEWNS | CLONE_NEWUSER) == 0, "a mount namespace in a user namespace");
    writeFile("/proc/self/setgroups", "deny");
    writeFile("/proc/self/uid_map", fmt::format("0 {} 1", user));
    writeFile("/proc/self/gid_map", fmt::format("0 {} 1", group));
}

void bringJournaldHome(const fs::path& directory)
{
    check(::mount("", "/", nullptr, MS_REC | MS_PRIVATE, nullptr) == 0, "a private view of the file systems");
    check(::mount("tmpfs", "/run", "tmpfs", 0, "mode=755") == 0, "mounting /run");
    check(::mount(directory.c_str(), "/var/log", nullptr, MS_BIND, nullptr) == 0, "mounting /var/log");
    fs::create_directories("/var/log/journal");
    fs::create_directories("/run/systemd/journal");
    fs::create_directories("/run/systemd/journald.conf.d");
    writeFile("/run/systemd/journald.conf.d/bench.conf", configuration);
    writeFile("/run/systemd/journal/flushed", ""); // writes to the disk immediately, as after the system's start
}

template <typename Condition> void waitUntil(Condition condition, std::string_view what)
{
    constexpr std::chrono::seconds patience(20);
    for (const auto start = Clock::now(); !condition(); std::this_thread::sleep_for(std::chrono::microseconds(200)))
        if (Clock::now() - start > patience)
            throw std::runtime_error(fmt::format("journald: no {} in {} seconds", what, patience.count()));
}

struct CloseJournal {
    void operator()(sd_journal* journal) const { ::sd_journal_close(journal); }
};

// Messages are numbered; the journal is read from its end.
class Journal {
public:
    void open()
    {
        sd_journal* journal = nullptr;
        check(::sd_journal_open(&journal, SD_JOURNAL_LOCAL_ONLY) >= 0, "opening the journal");
        journal_.reset(journal);
        (void)::sd_journal_get_fd(journal); // from now on it notices new files
    }

    void send(std::uint32_t number)
    {
        const std::string numbered = fmt::format("FRAMES_RENDERED={}", number);
        std::array fields{
            field("MESSAGE=Playback Start"),
            field("CATEGORY=4"),
            field("TYPE=1"),
            field("REPORTER=42"),
            field("SESSION_OUTPUT_RUNNING=1"),
            field("SESSION_SELECTED_FORMAT=lpcm, 48 kHz, 24 bit"),
            field("MCHANNELSPERFRAME=2"),
            field("ACTIVE_DEVICES=Built-in Speakers"),
            field("POMOSESSIONVOLUME=0.8125"),
            field("KESTOREPORTING_TIMESTAMP=1767225600.25"),
            field("SYSTEMUPTIME_SEC=86523"),
            field("SPATIALIZATIONENABLED=0"),
            field("RINGERSTATE=1"),
            field(numbered),
        };
        check(::sd_journal_sendv(fields.data(), static_cast<int>(fields.size())) >= 0, "sending to journald");
    }

    // Whether the journal ends with that message.
    bool endsWith(std::uint32_t number)
    {
        ::sd_journal_process(journal_.get());
        ::sd_journal_seek_tail(journal_.get());
        return ::sd_journal_previous(journal_.get()) > 0 && numberHere() == number;
    }

    // Whether the messages before the last one are all there, down to `number`.
    bool reachesBackTo(std::uint32_t number)
    {
        for (auto next = numberHere(); next != number;) {
            if (::sd_journal_previous(journal_.get()) <= 0)
                return false;
            if (const auto here = numberHere(); here != 0 && here != --next)
                return false;
        }
        return true;
    }

private:
    static iovec field(std::string_view text) { return {const_cast<char*>(text.data()), text.size()}; }

    // The number of the message at the reading position; 0 for a foreign message.
    std::uint32_t numberHere()
    {
        constexpr std::string_view name = "FRAMES_RENDERED";
        const void* data = nullptr;
        std::size_t size = 0;
        if (::sd_journal_get_data(journal_.get(), name.data(), &data, &size) < 0)
            return 0;
        const std::string text(static_cast<const char*>(data), size);
        return static_cast<std::uint32_t>(std::stoul(text.substr(name.size() + 1)));
    }

    std::unique_ptr<sd_journal, CloseJournal> journal_;
};

struct JournalAnswer {
    double rate = 0;
    std::array<char, 256> problem{}; // empty on success

    static JournalAnswer about(std::string_view problem)
    {
        JournalAnswer answer;
        problem.copy(answer.problem.data(), answer.problem.size() - 1);
        return answer;
    }
};

double measureRate(Journal& journal, std::uint32_t& number, std::size_t count)
{
    const std::uint32_t first = number;
    const auto start = Clock::now();
    for (std::size_t each = 0; each < count; ++each)
        journal.send(number++);
    waitUntil([&] { return journal.endsWith(number - 1); }, "end of the messages");
    const double elapsed = nanosecondsSince(start);
    if (!journal.reachesBackTo(first))
        throw std::runtime_error("journald lost messages");
    return static_cast<double>(count) / elapsed * 1e9;
}

void answer(int channel, const JournalAnswer& answer)
{
    writeAll(channel, {reinterpret_cast<const char*>(&answer), sizeof answer});
}

// Reports when it is ready, then measures on each request.
void serve(int channel, const fs::path& directory)
{
    enterNamespace();
    bringJournaldHome(directory);
    const auto journald = ChildProcess::execute({program}, {}, "/var/log/output");
    waitUntil([&] { return fs::exists("/run/systemd/journal/socket") || journald.hasEnded(); }, "socket");
    if (journald.hasEnded())
        throw std::runtime_error("journald ended immediately");
    Journal journal;
    journal.open();
    std::uint32_t number = numberMark;
    (void)measureRate(journal, number, 1);
    answer(channel, {});
    for (std::size_t count = 0; readAll(channel, reinterpret_cast<char*>(&count), sizeof count);)
        answer(channel, {measureRate(journal, number, count), {}});
}

// --- Here

// Throws the error that happened in the namespace.
double readAnswer(int channel)
{
    JournalAnswer answer;
    if (!readAll(channel, reinterpret_cast<char*>(&answer), sizeof answer))
        throw std::runtime_error("the process of journald ended");
    if (answer.problem.front() != '\0')
        throw std::runtime_error(answer.problem.data());
    return answer.rate;
}

} // namespace

std::expected<std::unique_ptr<JournalPeer>, std::string> JournalPeer::start()
{
    if (!fs::exists(program))
        return std::unexpected(fmt::format("{} is not installed", program));
    std::unique_ptr<JournalPeer> peer(new JournalPeer);
    peer->process_ = ChildProcess::run([&] {
        peer->channel_.client = {};
        const int channel = peer->channel_.server.get();
        try {
            serve(channel, peer->directory_.path());
        } catch (const std::exception& problem) {
            answer(channel, JournalAnswer::about(problem.what()));
        }
    });
    peer->channel_.server = {};
    try {
        readAnswer(peer->channel_.client.get());
    } catch (const std::exception& problem) {
        return std::unexpected(problem.what());
    }
    return peer;
}

double JournalPeer::rate(std::size_t count)
{
    const int channel = channel_.client.get();
    writeAll(channel, {reinterpret_cast<const char*>(&count), sizeof count});
    return readAnswer(channel);
}

} // namespace bench
