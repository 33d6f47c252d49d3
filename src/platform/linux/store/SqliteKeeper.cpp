// What to do when the database fails: try again later, set it aside, or count the loss. The keeper never gives up for
// good.
#include "platform/linux/store/SqliteKeeper.h"

#include "platform/linux/files/SmallFile.h"

#include <algorithm>
#include <array>
#include <fmt/chrono.h>
#include <set>
#include <system_error>
#include <utility>

namespace platform {
namespace {

namespace fs = std::filesystem;

constexpr std::uint64_t bytesOfARow = 64; // besides its payload, roughly
constexpr std::uint64_t bytesTidiedAtOnce = 1024 * 1024;
constexpr double secondsADay = 86400;

fs::path withSuffix(const fs::path& path, std::string_view suffix)
{
    return fs::path(path).concat(suffix);
}

constexpr std::string_view damagedMark = ".corrupt-";
constexpr std::string_view newerMark = ".newer-";

// The files that SQLite keeps beside a database, by the ends of their names.
constexpr std::array<std::string_view, 2> companions = {"-wal", "-shm"};

// Empty where the kernel does not say it.
std::string bootIdentifier()
{
    constexpr std::size_t longest = 64;
    std::string text = readSmallFile("/proc/sys/kernel/random/boot_id", longest).value_or(std::string());
    if (text.ends_with('\n'))
        text.pop_back();
    return text;
}

} // namespace

SqliteKeeper::SqliteKeeper(const fs::path& directory, const Clock& clock, ProviderLog log)
    : path_(directory / fileName),
      clock_(clock),
      log_(log),
      losses_(path_, clock, log),
      removals_(clock, log)
{
    origins_.bootIdentifier = bootIdentifier();
}

void SqliteKeeper::setConfiguration(const AnalyticsConfiguration& configuration)
{
    configuration_ = configuration;
    hasMoreToTidy_ = true; // the new limits may be lower
    if (database_)
        if (const auto done = database_->setSynchronization(configuration_.synchronization); !done)
            handleFailure(done.error());
}

std::uint64_t SqliteKeeper::maximumBytes() const noexcept
{
    return configuration_.maximumSizeMegabytes * 1024 * 1024;
}

// --- Opening

void SqliteKeeper::open()
{
    if (const auto done = ensureOpen(); !done) {
        const auto& [counter, path, meaning, problem, remedy] = row(counterOf(done.error()));
        log_.error("analytics events cannot be kept: {}: {}; {}", path_.native(), problem, remedy);
    }
}

SqliteKeeper::Expected<> SqliteKeeper::ensureOpen()
{
    if (database_ && !database_->wasReplaced())
        return {};
    if (database_) {
        log_.error("{} was removed or replaced; events are now kept in the file that is there, or in a new one",
                   path_.native());
        database_.reset();
    } else if (clock_.systemUptime() < openAgainAt_) {
        return std::unexpected(openError_);
    }
    const auto done = openAnew();
    if (!done) {
        openError_ = done.error();
        openAgainAt_ = clock_.systemUptime() + secondsBetweenOpenings;
    }
    return done;
}

SqliteKeeper::Expected<> SqliteKeeper::openAnew()
{
    auto opened = SqliteEventFile::open(path_, clock_, origins_);
    if (!opened && (opened.error() == StoreError::Corrupt || opened.error() == StoreError::Newer)
        && setAside(opened.error()))
        opened = SqliteEventFile::open(path_, clock_, origins_);
    if (!opened)
        return std::unexpected(opened.error());
    database_ = std::move(*opened);
    bytes_ = 0;
    oldest_ = 0;
    hasMoreToTidy_ = true; // which also completes the state
    logBytesAtCheckpoint_ = 0;
    return database_->setSynchronization(configuration_.synchronization);
}

// Renames the database, which must be closed. One of a later version is good, so it is never removed.
bool SqliteKeeper::setAside(StoreError reason)
{
    const bool isNewer = reason == StoreError::Newer;
    if (!isNewer)
        removeOldestDamaged();
    const auto now = static_cast<std::time_t>(clock_.secondsSince1970());
    const fs::path wanted =
        withSuffix(path_, fmt::format("{}{:%Y%m%dT%H%M%SZ}", isNewer ? newerMark : damagedMark, fmt::gmtime(now)));
    fs::path target = wanted;
    std::error_code error;
    for (int number = 2; fs::exists(target, error); ++number)
        target = withSuffix(wanted, fmt::format(".{}", number));

    fs::rename(path_, target, error);
    if (error)
        return false;
    for (const std::string_view suffix : companions) {
        std::error_code isNotThere;
        fs::rename(withSuffix(path_, suffix), withSuffix(target, suffix), isNotThere);
    }
    log_.error("{} {}; it is now {}, and a new one is begun", path_.native(),
               isNewer ? "was made by a later version of the service" : "is damaged or not a database of events",
               target.native());
    return true;
}

void SqliteKeeper::removeOldestDamaged()
{
    std::set<fs::path> damaged; // oldest first, because the time is in the name
    std::error_code error;
    for (fs::directory_iterator file(path_.parent_path(), error); file != end(file); file.increment(error)) {
        const std::string name = file->path().filename();
        const auto isCompanion = [&name](std::string_view suffix) { return name.ends_with(suffix); };
        if (name.starts_with(fmt::format("{}{}", fileName, damagedMark))
            && std::ranges::none_of(companions, isCompanion))
            damaged.insert(file->path());
    }
    for (; damaged.size() >= mostDamagedKept; damaged.erase(damaged.begin())) {
        fs::remove(*damaged.begin(), error);
        for (const std::string_view suffix : companions)
            fs::remove(withSuffix(*damaged.begin(), suffix), error);
    }
}

// --- Keeping

void SqliteKeeper::keep(EventBatch& events, ledger::Tally& tally)
{
    if (events.empty())
        return;
    origins_.begin(events.announcements());
    const auto rows = events.rows();
    std::uint64_t count = 0;
    for (const EventRow& row : rows)
        count += row.events();
    lose(StoreError::NotJson, events.size() - count, tally);
    const OriginAnnouncements& announced = events.announcements();
    if (rows.empty() && !endsRows(announced))
        return losses_.report();
    auto done = write(rows, announced);
    if (!done && done.error() == StoreError::Corrupt)
        done = write(rows, announced); // now into a new database
    origins_.end(announced); // also where nothing could be written
    if (done)
        tally.add(ledger::Counter::Kept, count);
    else
        lose(done.error(), count, tally);
    losses_.report();
}

void SqliteKeeper::lose(StoreError reason, std::uint64_t events, ledger::Tally& tally)
{
    losses_.add(reason, events);
    tally.add(counterOf(reason), events);
}

std::optional<ledger::StoreState> SqliteKeeper::state() const
{
    if (!database_)
        return std::nullopt;
    return ledger::StoreState{.events = database_->events(), .bytes = bytes_, .oldest = oldest_};
}

// Whether rows are to be written although there is no event. What has no row yet waits for one.
bool SqliteKeeper::endsRows(const OriginAnnouncements& announced)
{
    origins_.end(announced);
    if (database_ && origins_.hasChanged())
        return true;
    origins_.committed();
    return false;
}

SqliteKeeper::Expected<> SqliteKeeper::write(std::span<const EventRow> rows, const OriginAnnouncements& announced)
{
    const auto insertAll = [&]() -> Expected<> {
        if (const auto done = ensureOpen(); !done)
            return done;
        if (database_->logBytes() > maximumBytes() && !emptyLog())
            return std::unexpected(StoreError::LogHeld);
        if (const auto done = database_->begin(); !done)
            return done;
        if (const auto done = database_->insert(rows); !done)
            return done;
        origins_.end(announced); // behind its events
        return database_->commit();
    };
    const auto done = insertAll();
    if (!done) {
        handleFailure(done.error());
        return done;
    }
    for (const EventRow& row : rows)
        bytesSinceCheck_ += bytesOfARow + row.payload.size();
    return done;
}

void SqliteKeeper::handleFailure(StoreError error)
{
    if (database_)
        database_->rollBack();
    origins_.rolledBack();
    if (error == StoreError::DiskFull || error == StoreError::Locked || error == StoreError::LogHeld)
        return; // the connection can still be used
    const bool wasOpen = database_ != nullptr;
    database_.reset();
    if (error == StoreError::Corrupt && wasOpen)
        setAside(error); // if that fails, the next opening finds it damaged again
}

// --- Housekeeping

bool SqliteKeeper::awaitsQuiet() const
{
    return database_ && isLogLongerBy(logBytesBetweenCheckpoints);
}

bool SqliteKeeper::tidy(bool isQuiet, ledger::Tally& tally)
{
    losses_.report();
    removals_.report();
    if (!database_)
        return false;
    if (database_->logBytes() < logBytesAtCheckpoint_)
        logBytesAtCheckpoint_ = 0; // the log started again
    if (isLogLongerBy(isQuiet ? logBytesBetweenCheckpoints : mostLogBytesBetweenCheckpoints))
        emptyLog();
    if (database_->hasFirstEdition() && database_->logBytes() <= maximumBytes())
        return moveFirstEdition(tally);
    const bool isDue = hasMoreToTidy_ || bytesSinceCheck_ >= bytesBetweenChecks
        || clock_.systemUptime() - checkedAt_ >= secondsBetweenChecks;
    hasMoreToTidy_ =
        isDue && database_->logBytes() <= maximumBytes() && makeRoom(tally); // deleting makes the log longer
    return hasMoreToTidy_;
}

// Longer than at the last checkpoint.
bool SqliteKeeper::isLogLongerBy(std::uint64_t bytes) const
{
    return database_->logBytes() >= logBytesAtCheckpoint_ + std::min(bytes, maximumBytes() / 4);
}

bool SqliteKeeper::emptyLog()
{
    const double now = clock_.systemUptime();
    const bool waits = database_->logBytes() > maximumBytes() / 2 && now >= waitForReadersAt_;
    const bool isEmpty = database_->emptyLog(waits ? waitForReaders : std::chrono::milliseconds());
    if (waits && !isEmpty)
        waitForReadersAt_ = now + secondsBetweenWaits;
    logBytesAtCheckpoint_ = database_->logBytes();
    return isEmpty;
}

// The limits wait: what is moved takes half the room. True if more is left to do.
bool SqliteKeeper::moveFirstEdition(ledger::Tally& tally)
{
    const std::uint64_t before = database_->events();
    if (const auto done = database_->moveFirstEdition(); !done) {
        handleFailure(done.error());
        return false;
    }
    tally.add(ledger::Counter::RemovedForAge, before - database_->events()); // those that it found missing
    return true;
}

// Frees more room than events have taken since the last call, so that it keeps up, but only a part of all that is due.
// True if more is left to do.
bool SqliteKeeper::makeRoom(ledger::Tally& tally)
{
    const std::uint64_t mostFreed = 2 * std::exchange(bytesSinceCheck_, 0) + bytesTidiedAtOnce;
    checkedAt_ = clock_.systemUptime();
    // Deleting turns used room into free room, and shrinking turns free room into none.
    const auto room = [](const SqliteEventFile::Size& size) { return 2 * size.usedBytes + size.freeBytes; };
    auto size = database_->size();
    const std::uint64_t roomBefore = size ? room(*size) : 0;
    while (size && room(*size) + mostFreed > roomBefore) {
        bytes_ = size->usedBytes + size->freeBytes + database_->logBytes();
        const auto hasMore = makeSomeRoom(*size, tally);
        if (hasMore && !*hasMore)
            return false;
        size = hasMore ? database_->size() : std::unexpected(hasMore.error());
    }
    if (!size)
        handleFailure(size.error());
    return size.has_value();
}

void SqliteKeeper::count(const SqliteEventFile::Removal& removal, ledger::Tally& tally)
{
    using enum ledger::Counter;
    const auto& [user, process, application] = removal.holder;
    (removal.isOnlyHolder ? removals_.removed().forSize : removals_.removed().forShare) += removal.events;
    const ledger::Counter counter = removal.isOnlyHolder ? RemovedForSize : RemovedForShare;
    if (user)
        tally.add(counter, ledger::Culprit{*user, process, application}, removal.events);
    else
        tally.add(counter, removal.events);
}

// False if nothing is left to do.
SqliteKeeper::Expected<bool> SqliteKeeper::makeSomeRoom(const SqliteEventFile::Size& size, ledger::Tally& tally)
{
    const auto aged = database_->deleteOlderThan(configuration_.maximumAgeDays * secondsADay, eventsDeletedAtOnce);
    if (!aged)
        return std::unexpected(aged.error());
    tally.add(ledger::Counter::RemovedForAge, *aged);
    removals_.removed().forAge += *aged;
    bool hasRemoved = *aged > 0;
    if (!hasRemoved && size.usedBytes > maximumBytes()) {
        const auto removal = database_->deleteOfLargestHolder(size.usedBytes - maximumBytes(), eventsDeletedAtOnce);
        if (!removal)
            return std::unexpected(removal.error());
        count(*removal, tally);
        hasRemoved = !removal->isDone;
    }
    oldest_ = database_->oldest().value_or(0);
    // New events fill the room of deleted ones; the file shrinks only if far too much of it is free.
    const bool isFileTooLarge = size.usedBytes + size.freeBytes > maximumBytes() + maximumBytes() / 8;
    if (hasRemoved || !isFileTooLarge || size.freeBytes == 0)
        return hasRemoved;
    if (const auto done = database_->shrink(bytesTidiedAtOnce); !done)
        return std::unexpected(done.error());
    return true;
}

} // namespace platform
