// SPDX-License-Identifier: Apache-2.0
// The log is moved to the database when it has 32 MiB, as in the service.
#include "peers/BareStore.h"

#include "foundation/values/Json.h"
#include "platform/linux/store/SqliteConnection.h"
#include "platform/linux/store/tables/StoreSchema.h"
#include "support/Harness.h"
#include "support/SampleMessage.h"

#include <filesystem>
#include <stdexcept>
#include <string>

namespace bench {
namespace {

constexpr std::size_t messagesATransaction = 2048;
constexpr std::uint64_t longestLog = 32 * 1024 * 1024;
constexpr double firstTime = 1'800'000'000;

constexpr const char* firstEdition =
    "PRAGMA page_size = 4096; PRAGMA auto_vacuum = INCREMENTAL; CREATE TABLE events(id INTEGER PRIMARY KEY "
    "AUTOINCREMENT, time REAL NOT NULL, name TEXT NOT NULL, payload TEXT NOT NULL) STRICT";

constexpr std::string_view insertEvents = "INSERT INTO events(time, name, payload) VALUES"
                                          " (?1, 'com.quarn.kesto.Playback.Start', ?2),"
                                          " (?1, 'com.quarn.unknown.Playback.Start', ?2)";
constexpr std::string_view insertMessage =
    "INSERT INTO messages(id, time, kind, session, source, happened, holder, payload)"
    " VALUES (?3, ?1, 1, 1, 1, 1767225600.25, 1, ?2)";

template <typename Result> Result checked(platform::StoreExpected<Result> result)
{
    if (!result)
        throw std::runtime_error("SQLite failed");
    if constexpr (!std::is_void_v<Result>)
        return std::move(*result);
}

std::string samplePayload()
{
    std::string payload;
    use(foundation::appendJson(sampleMessage().with("HostApplicationDisplayID", "Unknown"), payload));
    return payload;
}

} // namespace

BareStore::BareStore(Edition edition)
    : edition_(edition),
      connection_(checked(platform::SqliteConnection::open(directory_ / "bare.sqlite3")))
{
    if (edition == Edition::First)
        execute(firstEdition);
    else
        checked(platform::StoreSchema::make(*connection_));
    checked(connection_->beginLog());
    execute("PRAGMA synchronous = NORMAL");
    if (edition == Edition::Second)
        execute("INSERT INTO kinds VALUES (1, 'com.quarn.kesto.Playback.Start', 'com.quarn.unknown.Playback.Start')");
}

BareStore::~BareStore() = default;

void BareStore::execute(const char* sql)
{
    checked(connection_->execute(sql));
}

double BareStore::rate(std::size_t count)
{
    const std::string payload = samplePayload();
    const auto insert = checked(connection_->prepare(edition_ == Edition::First ? insertEvents : insertMessage));
    const auto start = Clock::now();
    const std::size_t end = written_ + count;
    const std::uint64_t pageBytes = static_cast<std::uint64_t>(checked(connection_->number("PRAGMA page_size")));
    while (written_ < end) {
        execute("BEGIN IMMEDIATE");
        for (std::size_t each = 0; each < messagesATransaction && written_ < end; ++each, ++written_) {
            insert.bind(1, firstTime + static_cast<double>(written_) * 1e-5);
            insert.bind(2, std::string_view(payload));
            if (edition_ == Edition::Second)
                insert.bind(3, static_cast<std::uint64_t>(2 * written_ + 1));
            checked(insert.run());
        }
        execute("COMMIT");
        if (connection_->logPages() * pageBytes >= longestLog)
            use(connection_->emptyLog({}));
    }
    return static_cast<double>(count) / nanosecondsSince(start) * 1e9;
}

double BareStore::bytesOfAMessage()
{
    use(connection_->emptyLog({}));
    return static_cast<double>(std::filesystem::file_size(directory_ / "bare.sqlite3")) / static_cast<double>(written_);
}

} // namespace bench
