// SPDX-License-Identifier: Apache-2.0
// A fault that changes files does so behind the service's back, as another program or a bad disk would.
#include "soak/Faults.h"

#include "end_to_end/WireClient.h"
#include "platform/linux/damage/DatabaseDamage.h"
#include "support/MessageKinds.h"

#include <csignal>
#include <sqlite3.h>
#include <stdexcept>
#include <thread>

namespace soak {
namespace {

using support::playback;
using support::typeStart;

namespace fs = std::filesystem;
using namespace end_to_end;
using namespace std::chrono_literals;
using foundation::Array;
using foundation::Dictionary;
using foundation::Value;

fs::path store(const Scene& scene, const char* suffix = "")
{
    return scene.kestod.directory() / "state" / (std::string("analytics.sqlite3") + suffix);
}

unsigned upTo(Scene& scene, unsigned most)
{
    return static_cast<unsigned>(scene.random()) % (most + 1);
}

void rest(Scene& scene, unsigned mostMilliseconds = 30)
{
    std::this_thread::sleep_for(std::chrono::milliseconds(upTo(scene, mostMilliseconds)));
}

void kill(Scene& scene)
{
    scene.kestod.kill();
    ++scene.kills;
}

void restart(Scene& scene)
{
    kill(scene);
    scene.kestod.startAndAwait();
}

// --- Ends of the service

void killAtItsStart(Scene& scene)
{
    kill(scene);
    scene.kestod.start();
    rest(scene);
    restart(scene);
}

void killOften(Scene& scene)
{
    for (unsigned count = 1 + upTo(scene, 9); count > 0; --count) {
        restart(scene);
        rest(scene);
    }
}

void expectStatus(Scene& scene, int expected)
{
    if (const int status = scene.kestod.exitStatus(); status != expected)
        throw std::runtime_error("the service ended with status " + std::to_string(status) + ", not "
                                 + std::to_string(expected));
    scene.kestod.startAndAwait();
}

void terminate(Scene& scene)
{
    scene.kestod.signal(SIGTERM);
    expectStatus(scene, 0);
}

void callKillService(Scene& scene)
{
    WireClient(scene.kestod.socketPath()).call(KillService);
    expectStatus(scene, 2);
}

// --- Clients

void comeAndGo(Scene& scene)
{
    for (unsigned count = upTo(scene, 300); count > 0; --count)
        WireClient(scene.kestod.socketPath()).call(Create, 1);
}

void sendBrokenFrames(Scene& scene)
{
    for (unsigned count = upTo(scene, 50); count > 0; --count)
        WireClient(scene.kestod.socketPath()).sendBytes(std::string("\x05\0\0\0\xFFgarbage", 12));
}

// More than a client may have, and one message to more than it may go to.
void exceedSessionsAndReceivers(Scene& scene)
{
    constexpr int tooMany = 10'010;
    WireClient client(scene.kestod.socketPath());
    std::vector<Value> receivers;
    for (int session = 1; session <= tooMany; ++session) {
        client.call(Create, session);
        if (receivers.size() < 200)
            receivers.emplace_back(session);
    }
    client.call(SendMessage, Dictionary{{"text", std::string(1'000'000, 'x')}}, playback, typeStart, Array(receivers));
    for (int answer = 0; answer <= tooMany; ++answer)
        if (!client.nextReply())
            throw std::runtime_error("the service ended a connection with too many sessions");
}

// --- The disk and other programs

void fillDisk(Scene& scene)
{
    scene.disk.fill();
    rest(scene, 200);
    if (scene.random() % 2 == 0)
        restart(scene);
    rest(scene, 200);
    scene.disk.free();
}

// For more than the second after which the service tries again. Only a service that starts meets it.
void makeReadOnly(Scene& scene)
{
    kill(scene);
    {
        const ReadOnlyView view(store(scene));
        scene.kestod.startAndAwait();
        rest(scene, 1500);
    }
    rest(scene);
}

void lock(Scene& scene)
{
    const std::chrono::milliseconds time(scene.random() % 4 == 0 ? 2500 : upTo(scene, 300));
    sqlite3* other = nullptr;
    if (sqlite3_open_v2(store(scene).c_str(), &other, SQLITE_OPEN_READWRITE, nullptr) == SQLITE_OK) {
        sqlite3_busy_timeout(other, 2000);
        if (sqlite3_exec(other, "BEGIN IMMEDIATE", nullptr, nullptr, nullptr) == SQLITE_OK) {
            std::this_thread::sleep_for(time);
            sqlite3_exec(other, "ROLLBACK", nullptr, nullptr, nullptr);
        }
    }
    sqlite3_close(other);
}

void readForLong(Scene& scene)
{
    sqlite3* reader = nullptr;
    if (sqlite3_open_v2(store(scene).c_str(), &reader, SQLITE_OPEN_READONLY, nullptr) == SQLITE_OK) {
        sqlite3_exec(reader, "BEGIN; SELECT count(*) FROM events", nullptr, nullptr, nullptr);
        rest(scene, 500);
    }
    sqlite3_close(reader);
}

// --- Files

void remove(Scene& scene, const char* suffix)
{
    std::error_code error;
    fs::remove(store(scene, suffix), error);
}

void removeWhileStopped(Scene& scene)
{
    kill(scene);
    for (const char* suffix : {"", "-wal", "-shm"})
        remove(scene, suffix);
    scene.kestod.startAndAwait();
}

// By a backup, from some time ago.
void replace(Scene& scene)
{
    const fs::path copy = store(scene, ".copy");
    std::error_code error;
    fs::remove(copy, error);
    sqlite3* from = nullptr;
    sqlite3* to = nullptr;
    bool isCopied = sqlite3_open_v2(store(scene).c_str(), &from, SQLITE_OPEN_READONLY, nullptr) == SQLITE_OK
        && sqlite3_open(copy.c_str(), &to) == SQLITE_OK;
    if (sqlite3_backup* backup = isCopied ? sqlite3_backup_init(to, "main", from, "main") : nullptr) {
        isCopied = sqlite3_backup_step(backup, -1) == SQLITE_DONE;
        sqlite3_backup_finish(backup);
    }
    sqlite3_close(from);
    sqlite3_close(to);
    rest(scene, 100);
    if (isCopied)
        fs::rename(copy, store(scene), error);
}

// The service has noticed when the message is answered. If it were killed before, SQLite would apply the log to a
// database that it does not belong to, which can leave one that looks sound.
void replaceWhileRunning(Scene& scene)
{
    replace(scene);
    WireClient client(scene.kestod.socketPath());
    client.ask(Create, 1);
    client.ask(SendMessage, Dictionary{{"replaced", true}}, playback, typeStart, Array{1});
}

void replaceWhileStopped(Scene& scene)
{
    kill(scene);
    replace(scene);
    for (const char* suffix : {"-wal", "-shm"})
        remove(scene, suffix);
    scene.kestod.startAndAwait();
}

void truncate(Scene& scene)
{
    std::error_code error;
    const auto size = fs::file_size(store(scene), error);
    if (!error)
        fs::resize_file(store(scene), upTo(scene, static_cast<unsigned>(size)), error);
    scene.isDamaged = true;
}

void overwritePages(Scene& scene)
{
    constexpr std::uint64_t pageSize = 8192;
    constexpr unsigned most = 8;
    std::error_code error;
    const std::uint64_t size = fs::file_size(store(scene), error);
    if (error || size < most * pageSize)
        return;
    support::overwriteRandomPages(store(scene), 1 + upTo(scene, most - 1), scene.random, pageSize);
    scene.isDamaged = true;
}

// Until the service has made it anew, a kill would lose what was counted.
void removeLedger(Scene& scene)
{
    const fs::path ledger = scene.kestod.directory() / "state" / "analytics.ledger";
    fs::remove(ledger);
    WireClient client(scene.kestod.socketPath());
    client.ask(Create, 1);
    const bool isBack = waitUntil([&] {
        client.ask(Validate, 1);
        return fs::exists(ledger);
    });
    if (!isBack)
        throw std::runtime_error("the service does not make its ledger anew");
}

template <typename Change> std::function<void(Scene&)> whileStopped(Change change)
{
    return [change](Scene& scene) {
        kill(scene);
        change(scene);
        scene.kestod.startAndAwait();
    };
}

// --- Settings and clock

void changeConfiguration(Scene& scene)
{
    const char* used = scene.random() % 2 == 0 ? "com.quarn.*" : "com.quarn.kesto.*";
    const unsigned megabytes = 1 + upTo(scene, mostMegabytes - 1);
    support::replaceFile(scene.kestod.directory() / "configuration" / "analytics.toml",
                         "used = [\"" + std::string(used) + "\"]\nmaximum_size_mb = " + std::to_string(megabytes)
                             + "\n");
}

void setClock(Scene& scene)
{
    constexpr auto day = std::chrono::days(1);
    const std::chrono::seconds shifts[] = {0s, 91 * day, -3653 * day};
    scene.kestod.shiftClock(shifts[scene.random() % std::size(shifts)]);
    rest(scene);
}

} // namespace

Faults allFaults(const Scene& scene)
{
    Faults faults;
    faults.possible = {
        {"quiet", 1, [](Scene& at) { rest(at); }},
        {"SIGKILL", 4, restart},
        {"SIGKILL several times", 3, killOften},
        {"SIGKILL at the start", 2, killAtItsStart},
        {"SIGTERM", 2, terminate},
        {"killService", 2, callKillService},
        {"connections that come and go", 2, comeAndGo},
        {"broken frames", 1, sendBrokenFrames},
        {"sessions and receivers beyond the limits", 1, exceedSessionsAndReceivers},
        {"store locked by another program", 1, lock},
        {"store read for long", 1, readForLong},
        {"store removed", 1, [](Scene& at) { remove(at, ""); }},
        {"store removed while stopped", 1, removeWhileStopped},
        {"store replaced", 1, replaceWhileRunning},
        {"store replaced while stopped", 1, replaceWhileStopped},
        {"log removed", 1, [](Scene& at) { remove(at, "-wal"); }},
        {"index of the log removed", 1, [](Scene& at) { remove(at, "-shm"); }},
        {"ledger removed", 1, removeLedger},
        {"store truncated", 1, truncate},
        {"store truncated while stopped", 1, whileStopped(truncate)},
        {"pages overwritten", 1, overwritePages},
        {"pages overwritten while stopped", 1, whileStopped(overwritePages)},
        {"configuration changed", 1, changeConfiguration},
        {"clock set", 1, setClock},
        {"clock set while stopped", 1, whileStopped(setClock)},
    };
    if (scene.disk) {
        faults.possible.push_back({"disk full", 1, fillDisk});
        faults.possible.push_back({"store read-only", 1, makeReadOnly});
    } else {
        faults.impossible = {"disk full", "store read-only"};
    }
    return faults;
}

} // namespace soak
