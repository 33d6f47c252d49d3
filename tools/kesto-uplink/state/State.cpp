// SPDX-License-Identifier: Apache-2.0
// One row, and the sessions that are open. The file has a rollback journal and no log: SQLite 3.40 can damage a
// database with a log when two connections write, and here a second process may forget. What is overwritten is erased,
// so that no earlier pseudonym is left in the file.
#include "kesto-uplink/state/State.h"

#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/store/applications/KeyedHash.h"

#include <cerrno>
#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <system_error>
#include <type_traits>
#include <unistd.h>
#include <utility>

namespace fs = std::filesystem;

namespace kesto_uplink {

using platform::FileDescriptor;
using platform::SqliteConnection;
using platform::SqliteStatement;
using platform::StoreError;

namespace {

constexpr std::int64_t applicationID = 0x4B55504C; // "KUPL": whose file it is, in SQLite's header
constexpr std::int64_t edition = 1;

constexpr std::string_view tables =
    "CREATE TABLE uplink("
    "row INTEGER PRIMARY KEY CHECK (row = 1),"
    " pseudonym TEXT NOT NULL, pseudonym_born REAL NOT NULL, hash_key TEXT NOT NULL, hash_key_born REAL NOT NULL,"
    " epoch TEXT NOT NULL, queued_id INTEGER NOT NULL, stored_id INTEGER NOT NULL,"
    " sent_id INTEGER NOT NULL," // the last that a batch with rows had
    " day INTEGER NOT NULL, bytes_of_day INTEGER NOT NULL,"
    " rows INTEGER NOT NULL, batches INTEGER NOT NULL, bytes INTEGER NOT NULL, retries INTEGER NOT NULL,"
    " not_allowed INTEGER NOT NULL, lost_to_age INTEGER NOT NULL,"
    " answer TEXT, answered REAL, on_since REAL"
    ") STRICT;"
    "CREATE TABLE open_sessions(id INTEGER PRIMARY KEY) STRICT;"
    "INSERT INTO uplink VALUES (1, '', 0, '', 0, '', 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, NULL, NULL, NULL);";

std::string_view reasonOf(StoreError error)
{
    switch (error) {
    case StoreError::DiskFull: return "there is no room on the disk: make some";
    case StoreError::ReadOnly: return "it is read-only for this user: be root or the user of the uplink";
    case StoreError::Locked: return "another program locks it: end that program";
    case StoreError::CannotOpen: return "it cannot be opened: be root or the user of the uplink";
    case StoreError::InputOutput: return "the disk cannot be read or written: look at the kernel's log";
    case StoreError::Corrupt:
        return "it is damaged: move it away, and the device begins anew, with another pseudonym and with everything "
               "that the event store has";
    default: return "SQLite reports an error that has no other name";
    }
}

void bindAll(const SqliteStatement& /*statement*/, int /*parameter*/) { }

template <typename First, typename... Rest>
void bindAll(const SqliteStatement& statement, int parameter, const First& first, const Rest&... rest)
{
    if constexpr (std::is_convertible_v<First, std::string_view>)
        statement.bind(parameter, std::string_view(first));
    else
        statement.bind(parameter, first);
    bindAll(statement, parameter + 1, rest...);
}

// Makes an empty file that only the directory's owner may read, also if it is root who makes it.
void makeFile(const fs::path& file)
{
    const FileDescriptor made(
        ::open(file.c_str(), O_RDWR | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, S_IRUSR | S_IWUSR));
    struct stat directory{};
    const bool isMade = made && ::stat(file.parent_path().c_str(), &directory) == 0
        && (directory.st_uid == ::geteuid() || ::fchown(made.get(), directory.st_uid, directory.st_gid) == 0);
    if (!isMade && errno != EEXIST)
        throw StateError(
            fmt::format("the state {} cannot be made: {}", file.native(), std::generic_category().message(errno)));
}

} // namespace

Identity newIdentity(double now)
{
    std::string pseudonym;
    std::string hashKey;
    for (const char byte : platform::randomHashKey().substr(0, 16))
        pseudonym += fmt::format("{:02x}", static_cast<unsigned char>(byte));
    for (const char byte : platform::randomHashKey())
        hashKey += fmt::format("{:02x}", static_cast<unsigned char>(byte));
    return {.pseudonym = pseudonym, .pseudonymBorn = now, .hashKey = hashKey, .hashKeyBorn = now};
}

// --- Opening

StateError State::failure(StoreError error) const
{
    return StateError(fmt::format("the state {} cannot be used: {}", file_.native(), reasonOf(error)));
}

State State::open(const fs::path& directory, double now)
{
    const fs::path file = directory / fileName;
    std::error_code error;
    if (!fs::exists(file, error))
        makeFile(file);
    State state(file);
    if (state.isEmpty())
        state.makeTables(now);
    state.check();
    return state;
}

std::optional<State> State::openPresent(const fs::path& directory)
{
    const fs::path file = directory / fileName;
    std::error_code error;
    if (!fs::exists(file, error) && !error)
        return std::nullopt;
    State state(file);
    if (state.isEmpty()) // whoever made it has not come further
        return std::nullopt;
    state.check();
    return state;
}

State::State(fs::path file) : file_(std::move(file))
{
    auto connection = SqliteConnection::open(file_);
    if (!connection)
        throw failure(connection.error());
    connection_ = std::move(*connection);
    run("PRAGMA secure_delete = ON");
    run("PRAGMA cache_size = -256"); // KiB, as in the store: rows are read once
}

bool State::isEmpty()
{
    return number("SELECT count(*) FROM sqlite_schema") == 0;
}

void State::makeTables(double now)
{
    inTransaction([&] {
        if (!isEmpty()) // another process was quicker
            return;
        const auto made = connection_->execute(
            fmt::format("{} PRAGMA application_id = {}; PRAGMA user_version = {}", tables, applicationID, edition)
                .c_str());
        if (!made)
            throw failure(made.error());
        setIdentity(newIdentity(now));
    });
}

void State::check()
{
    if (number("PRAGMA application_id") != applicationID)
        throw StateError(fmt::format("{} is not a state of kesto-uplink: move it away", file_.native()));
    if (number("PRAGMA user_version") != edition)
        throw StateError(fmt::format("a later version of kesto-uplink made the state {}: install that version again, "
                                     "or move the file away, and the device begins anew",
                                     file_.native()));
    bool isSound = false;
    forEachRow("PRAGMA quick_check(1)", [&isSound](const SqliteStatement& row) { isSound = row.text(0) == "ok"; });
    if (!isSound || number("SELECT count(*) FROM uplink") != 1)
        throw failure(StoreError::Corrupt);
}

// --- SQL

template <typename... Values> void State::run(std::string_view sql, const Values&... values)
{
    const auto statement = connection_->prepare(sql);
    if (!statement)
        throw failure(statement.error());
    bindAll(*statement, 1, values...);
    if (const auto done = statement->run(); !done)
        throw failure(done.error());
}

// Reads the rows of a question.
void State::forEachRow(std::string_view sql, const std::function<void(const SqliteStatement&)>& read)
{
    const auto statement = connection_->prepare(sql);
    if (!statement)
        throw failure(statement.error());
    while (true) {
        const auto row = statement->step();
        if (!row)
            throw failure(row.error());
        if (!*row)
            return;
        read(*statement);
    }
}

std::int64_t State::number(std::string_view sql)
{
    std::int64_t result = 0;
    forEachRow(sql, [&result](const SqliteStatement& row) { result = row.integer(0); });
    return result;
}

void State::inTransaction(const std::function<void()>& work)
{
    try {
        run("BEGIN IMMEDIATE");
        work();
        run("COMMIT");
    } catch (...) {
        connection_->rollBack();
        throw;
    }
}

bool State::underPseudonym(const Identity& as, const std::function<void()>& work)
{
    bool isStill = false;
    inTransaction([&] {
        isStill = identity().pseudonym == as.pseudonym;
        if (isStill)
            work();
    });
    return isStill;
}

// --- What is remembered

Identity State::identity()
{
    Identity identity;
    forEachRow("SELECT pseudonym, pseudonym_born, hash_key, hash_key_born FROM uplink",
               [&](const SqliteStatement& row) {
                   identity = {std::string(row.text(0)), row.real(1), std::string(row.text(2)), row.real(3)};
               });
    return identity;
}

Cursor State::queued()
{
    Cursor cursor;
    forEachRow("SELECT epoch, queued_id FROM uplink",
               [&](const SqliteStatement& row) { cursor = {std::string(row.text(0)), row.integer(1)}; });
    return cursor;
}

Cursor State::stored()
{
    Cursor cursor;
    forEachRow("SELECT epoch, stored_id FROM uplink",
               [&](const SqliteStatement& row) { cursor = {std::string(row.text(0)), row.integer(1)}; });
    return cursor;
}

std::set<std::int64_t> State::openSessions()
{
    std::set<std::int64_t> sessions;
    forEachRow("SELECT id FROM open_sessions", [&](const SqliteStatement& row) { sessions.insert(row.integer(0)); });
    return sessions;
}

std::int64_t State::bytesSentOn(std::int64_t day)
{
    return number(fmt::format("SELECT bytes_of_day FROM uplink WHERE day = {}", day));
}

Totals State::totals()
{
    Totals totals;
    forEachRow(
        "SELECT rows, batches, bytes, retries, not_allowed, lost_to_age FROM uplink", [&](const SqliteStatement& row) {
            totals = {row.integer(0), row.integer(1), row.integer(2), row.integer(3), row.integer(4), row.integer(5)};
        });
    return totals;
}

std::optional<LastAnswer> State::lastAnswer()
{
    std::optional<LastAnswer> answer;
    forEachRow("SELECT answer, answered FROM uplink WHERE answer IS NOT NULL",
               [&](const SqliteStatement& row) { answer = {std::string(row.text(0)), row.real(1)}; });
    return answer;
}

std::optional<double> State::onSince()
{
    std::optional<double> since;
    forEachRow("SELECT on_since FROM uplink WHERE on_since IS NOT NULL",
               [&](const SqliteStatement& row) { since = row.real(0); });
    return since;
}

// --- What came of it

// What was under way from another database cannot be sent again, so nothing waits for it.
bool State::noteQueued(const Identity& as, const Progress& progress, std::int64_t day)
{
    return underPseudonym(as, [&] {
        const Cursor& last = progress.last;
        if (queued().epoch != last.epoch)
            run("UPDATE uplink SET epoch = ?1, queued_id = ?2, stored_id = ?2, sent_id = 0", last.epoch,
                progress.first - 1);
        const bool wasAllStored = queued() == stored();
        run("UPDATE uplink SET queued_id = ?, rows = rows + ?, bytes = bytes + ?, not_allowed = not_allowed + ?,"
            " lost_to_age = lost_to_age + ?",
            last.id, progress.rows, progress.bytes, progress.notAllowed, progress.lostToAge);
        setOpenSessions(progress.openSessions);
        if (progress.rows > 0) {
            run("UPDATE uplink SET sent_id = ?, batches = batches + 1", last.id);
            addBytesOfDay(progress.bytes, day);
        } else if (wasAllStored)
            run("UPDATE uplink SET stored_id = ?", last.id);
    });
}

// A range from which nothing was sent counts as stored with what was sent before it.
bool State::noteStored(const Identity& as, const Cursor& upTo)
{
    return underPseudonym(as, [&] {
        run("UPDATE uplink SET stored_id = iif(?1 >= sent_id, queued_id, max(?1, stored_id)) WHERE epoch = ?2", upTo.id,
            upTo.epoch);
    });
}

bool State::noteAllStored(const Identity& as)
{
    return underPseudonym(as, [&] { run("UPDATE uplink SET stored_id = queued_id"); });
}

bool State::sendAgain(const Identity& as)
{
    return underPseudonym(as, [&] { run("UPDATE uplink SET queued_id = stored_id"); });
}

void State::addBytesOfDay(std::int64_t bytes, std::int64_t day)
{
    run("UPDATE uplink SET bytes_of_day = iif(day = ?2, bytes_of_day, 0) + ?1, day = ?2", bytes, day);
}

void State::noteRetry(std::int64_t bytes, std::int64_t day)
{
    inTransaction([&] {
        run("UPDATE uplink SET retries = retries + 1");
        addBytesOfDay(bytes, day);
    });
}

void State::noteAnswer(const LastAnswer& answer)
{
    run("UPDATE uplink SET answer = ?, answered = ?", answer.text, answer.time);
}

void State::noteOn(double now)
{
    run("UPDATE uplink SET on_since = ? WHERE on_since IS NULL", now);
}

void State::noteOff()
{
    run("UPDATE uplink SET on_since = NULL WHERE on_since IS NOT NULL");
}

// --- Who the device is

void State::setIdentity(const Identity& identity)
{
    run("UPDATE uplink SET pseudonym = ?, pseudonym_born = ?, hash_key = ?, hash_key_born = ?", identity.pseudonym,
        identity.pseudonymBorn, identity.hashKey, identity.hashKeyBorn);
}

void State::setOpenSessions(const std::set<std::int64_t>& sessions)
{
    run("DELETE FROM open_sessions");
    for (const std::int64_t session : sessions)
        run("INSERT INTO open_sessions VALUES (?)", session);
}

// A clock that was set back makes nothing older.
bool isOlder(double born, double days, double now)
{
    constexpr double secondsOfDay = 86'400;
    return now - born > days * secondsOfDay;
}

// With the pseudonym goes what would connect it to the next: the key of its hashes, and the sessions that it has begun.
Renewal State::renew(double pseudonymDays, double hashKeyDays, double now)
{
    Renewal result = Renewal::NotDue;
    inTransaction([&] {
        Identity current = identity();
        const Identity fresh = newIdentity(now);
        if (isOlder(current.hashKeyBorn, hashKeyDays, now)) {
            current.hashKey = fresh.hashKey;
            current.hashKeyBorn = now;
            result = Renewal::Renewed;
        }
        const bool isDue = isOlder(current.pseudonymBorn, pseudonymDays, now);
        if (isDue && queued() == stored()) {
            current = fresh;
            setOpenSessions({});
            result = Renewal::Renewed;
        } else if (isDue)
            result = Renewal::Waiting;
        setIdentity(current);
    });
    return result;
}

void State::forget(const Cursor& newest, double now)
{
    inTransaction([&] {
        setIdentity(newIdentity(now));
        setOpenSessions({});
        run("UPDATE uplink SET epoch = ?1, queued_id = ?2, stored_id = ?2, sent_id = 0", newest.epoch, newest.id);
    });
}

} // namespace kesto_uplink
