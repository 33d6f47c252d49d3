// SPDX-License-Identifier: Apache-2.0
// What to do when the database fails: try again later, set it aside, or count the loss. The keeper never gives up for
// good.
#include "platform/linux/store/SqliteKeeper.h"

#include "platform/linux/files/SmallFile.h"

#include <algorithm>
#include <system_error>
#include <tuple>
#include <utility>

namespace platform {
namespace {

namespace fs = std::filesystem;

constexpr std::uint64_t bytesOfARow = 64; // besides its payload, roughly
constexpr std::uint64_t bytesTidiedAtOnce = 1024 * 1024;
constexpr double secondsADay = 86400;

bool hasContent(const fs::path& file)
{
    std::error_code error;
    return fs::file_size(file, error) > 0 && !error;
}

std::uint64_t countOf(std::span<const EventRow> rows)
{
    std::uint64_t events = 0;
    for (const EventRow& row : rows)
        events += row.events();
    return events;
}

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
      removals_(clock, log),
      repair_(path_, clock, log),
      check_(path_, clock, [this] {
          if (wake_)
              wake_();
      })
{
    origins_.bootIdentifier = bootIdentifier();
}

void SqliteKeeper::setConfiguration(const AnalyticsConfiguration& configuration)
{
    configuration_ = configuration;
    hasMoreToTidy_ = true; // the new limits may be lower
    if (!configuration_.stretches)
        stretches_.endAll(clock_.secondsSince1970());
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
    if (database_)
        return {};
    if (clock_.systemUptime() < openAgainAt_)
        return std::unexpected(openError_);
    const auto done = openAnew();
    if (!done) {
        close();
        openError_ = done.error();
        openAgainAt_ = clock_.systemUptime() + secondsBetweenOpenings;
    }
    return done;
}

SqliteKeeper::Expected<> SqliteKeeper::openAnew()
{
    repair_.finishRenaming();
    if (hasContent(withSuffix(path_, "-wal")))
        check_.ask(); // a service that ends in order leaves an empty log
    auto done = connectAndRepair();
    if (!done && files_->change() == FilesInPlace::Change::Database)
        done = connectAndRepair(); // it was removed or replaced while it was opened
    if (done || (done.error() != StoreError::Corrupt && done.error() != StoreError::Newer))
        return done;
    close();
    return repair_.setAside(done.error()) ? connectAndRepair() : done;
}

// When this returns, the database has what must be saved before it takes events.
SqliteKeeper::Expected<> SqliteKeeper::connectAndRepair()
{
    auto done = connect();
    if (!done)
        return done;
    const auto isDamaged = repair_.begin(*database_);
    if (!isDamaged)
        return std::unexpected(isDamaged.error());
    if (*isDamaged) {
        origins_.epoch.clear(); // so that the sources and sessions that were saved end
        done = connect();
    }
    return done;
}

SqliteKeeper::Expected<> SqliteKeeper::connect()
{
    close();
    files_.emplace(path_);
    auto opened = SqliteEventFile::open(path_, clock_, origins_, stretches_);
    if (!opened)
        return std::unexpected(opened.error());
    database_ = *std::move(opened);
    bytes_ = 0;
    oldest_ = 0;
    hasMoreToTidy_ = true; // which also completes the state
    logBytesAtCheckpoint_ = 0;
    return database_->setSynchronization(configuration_.synchronization);
}

// As long as a connection of the process is open, SQLite gives its index of the log to the next one too, also if that
// has another log.
void SqliteKeeper::close()
{
    check_.breakOff();
    database_.reset();
}

void SqliteKeeper::prepareForEnd()
{
    check_.breakOff();
    if (database_)
        database_->endRun();
}

// --- Keeping

void SqliteKeeper::keep(EventBatch& events, ledger::Tally& tally)
{
    if (events.empty())
        return;
    origins_.begin(events.announcements());
    const auto rows = events.rows();
    lose(StoreError::NotJson, events.rowsWithoutJson(), tally);
    const OriginAnnouncements& announced = events.announcements();
    followStretches(rows, announced);
    if (rows.empty() && !endsRows(announced) && !stretches_.hasChanges()) {
        countStretches(tally);
        return losses_.report();
    }
    auto done = write(rows, announced);
    if (done ? !areFilesInPlace() : done.error() == StoreError::Corrupt)
        done = write(rows, announced); // now into another database
    origins_.end(announced); // also where nothing could be written
    if (done) {
        tally.add(ledger::Counter::Kept, countOf(rows));
        if (!stretches_.ended().empty())
            tally.add(ledger::Counter::StretchesKept, stretches_.ended().size());
        stretches_.written();
    } else {
        lose(done.error(), rows, tally);
        stretches_.notWritten();
    }
    countStretches(tally);
    losses_.report();
}

void SqliteKeeper::followStretches(std::span<const EventRow> rows, const OriginAnnouncements& announced)
{
    if (!configuration_.stretches)
        return;
    const auto ownerOf = [this](std::uint64_t session) { return origins_.ownerOf(session); };
    stretches_.take(rows, announced, ownerOf, isServiceEnding_ ? StretchEnding::ServiceEnded : StretchEnding::Vanished);
}

void SqliteKeeper::countStretches(ledger::Tally& tally)
{
    const auto add = [&tally](ledger::Counter counter, std::uint64_t count) {
        if (count != 0)
            tally.add(counter, count);
    };
    const auto [closed, removed, leftOut] =
        database_ ? database_->takeStretchCounts() : SqliteEventFile::StretchCounts();
    add(ledger::Counter::StretchesKept, closed);
    add(ledger::Counter::StretchesRemoved, removed);
    add(ledger::Counter::StretchesLeftOut, leftOut + stretches_.takeLeftOut());
}

void SqliteKeeper::lose(StoreError reason, std::span<const EventRow> rows, ledger::Tally& tally)
{
    if (rows.empty())
        return;
    losses_.add(reason, countOf(rows));
    origins_.countLoss(counterOf(reason), eventsByOrigin(rows), tally);
}

std::optional<ledger::StoreState> SqliteKeeper::state() const
{
    if (!database_ || !repair_.isDone())
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
        if (isLogFull())
            return std::unexpected(StoreError::LogHeld);
        if (const auto done = database_->begin(); !done)
            return done;
        if (const auto done = database_->insert(rows); !done)
            return done;
        if (const auto done = database_->insertStretches(); !done)
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
    close();
    if (error == StoreError::InputOutput)
        check_.ask();
    if (error == StoreError::Corrupt && wasOpen && repair_.setAside(error)) {
        std::ignore = ensureOpen(); // if that fails, the next event tries again
        hasBegunAnew_ = true;
    }
}

// Whether readers find what was just committed. The question comes after each commit, so no event is acknowledged that
// went into a file that is gone. Closes a database that is.
bool SqliteKeeper::areFilesInPlace()
{
    switch (files_->change()) {
    case FilesInPlace::Change::None: return true;
    case FilesInPlace::Change::Database:
        log_.error("{} was removed or replaced; events are now kept in the file that is there, or in a new one",
                   path_.native());
        close();
        files_->removeNotedCompanions();
        return false;
    case FilesInPlace::Change::Companions: replaceLog(); return true;
    }
    return true;
}

// The connection still has the log open, so that everything can be moved to the database.
void SqliteKeeper::replaceLog()
{
    check_.breakOff();
    if (!emptyLog())
        return; // a reader needs the log; tried again after the next commit
    log_.error("the write-ahead log of {} or its index was removed or replaced; the events are moved from it to the "
               "database, and a new log is begun",
               path_.native());
    close();
    files_->removeCompanions();
    check_.ask();
    std::ignore = ensureOpen(); // the next commit tries again
}

// --- Housekeeping

bool SqliteKeeper::awaitsQuiet() const
{
    return database_ && isLogLongerBy(logBytesBetweenCheckpoints);
}

bool SqliteKeeper::tidy(bool isQuiet, ledger::Tally& tally)
{
    const bool hasMore = tidySome(isQuiet, tally);
    countStretches(tally);
    return std::exchange(hasBegunAnew_, false) || hasMore;
}

bool SqliteKeeper::tidySome(bool isQuiet, ledger::Tally& tally)
{
    losses_.report();
    removals_.report();
    heedCheck();
    if (const std::uint64_t saved = repair_.takeSavedMessages(); saved != 0)
        tally.add(ledger::Counter::Salvaged, saved);
    if (!database_)
        return false;
    if (database_->logBytes() < logBytesAtCheckpoint_)
        logBytesAtCheckpoint_ = 0; // the log started again
    if (isLogLongerBy(isQuiet ? logBytesBetweenCheckpoints : mostLogBytesBetweenCheckpoints))
        emptyLog();
    if (!repair_.isDone())
        return salvageSome();
    if (database_->hasFirstEdition() && !isLogFull())
        return moveFirstEdition(tally);
    const bool isDue = hasMoreToTidy_ || bytesSinceCheck_ >= bytesBetweenChecks
        || clock_.systemUptime() - checkedAt_ >= secondsBetweenChecks;
    hasMoreToTidy_ = isDue && !isLogFull() && makeRoom(tally); // deleting makes the log longer
    return hasMoreToTidy_;
}

// Sets a database aside in which the check found damage. A check that keeps the log from starting again for too long
// gives way; one that looks at a database without its log would find it damaged.
void SqliteKeeper::heedCheck()
{
    if (!database_)
        return;
    const auto areInPlace = [this] { return files_->change() == FilesInPlace::Change::None; };
    if (database_->logBytes() > maximumBytes() / 2 || !areInPlace())
        check_.breakOff();
    else if (repair_.isDone())
        check_.beginIfDue(areInPlace);
    if (check_.takeFinding() == DamageCheck::Finding::Damaged)
        handleFailure(StoreError::Corrupt);
}

// True if more is left to do. Nothing is removed meanwhile: what is too old or too much shows when all events are
// there.
bool SqliteKeeper::salvageSome()
{
    if (isLogFull())
        return false;
    auto done = repair_.goOn(*database_);
    if (done && repair_.isDone())
        done = connect();
    if (!done)
        handleFailure(done.error());
    return done.has_value();
}

// Longer than at the last checkpoint.
bool SqliteKeeper::isLogLongerBy(std::uint64_t bytes) const
{
    return database_->logBytes() >= logBytesAtCheckpoint_ + std::min(bytes, maximumBytes() / 4);
}

// Whether a reader has kept the log until it gets nothing more. The check, which is a reader too, gives way.
bool SqliteKeeper::isLogFull()
{
    if (database_->logBytes() <= maximumBytes())
        return false;
    check_.breakOff();
    return !emptyLog();
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

void SqliteKeeper::count(ledger::Counter reason, const EventHolder& holder, std::uint64_t events, ledger::Tally& tally)
{
    const auto& [user, process, application] = holder;
    if (user)
        tally.add(reason, ledger::Culprit{*user, process, application}, events);
    else
        tally.add(reason, events);
}

// False if nothing is left to do.
SqliteKeeper::Expected<bool> SqliteKeeper::makeSomeRoom(const SqliteEventFile::Size& size, ledger::Tally& tally)
{
    using enum ledger::Counter;
    const auto aged = database_->deleteOlderThan(configuration_.maximumAgeDays * secondsADay, eventsDeletedAtOnce);
    if (!aged)
        return std::unexpected(aged.error());
    for (const auto& [holder, events] : *aged) {
        removals_.removed().forAge += events;
        count(RemovedForAge, holder, events, tally);
    }
    bool hasRemoved = !aged->empty();
    if (!hasRemoved && size.usedBytes > maximumBytes()) {
        const auto removal = database_->deleteOfLargestHolder(size.usedBytes - maximumBytes(), eventsDeletedAtOnce);
        if (!removal)
            return std::unexpected(removal.error());
        (removal->isOnlyHolder ? removals_.removed().forSize : removals_.removed().forShare) += removal->events;
        count(removal->isOnlyHolder ? RemovedForSize : RemovedForShare, removal->holder, removal->events, tally);
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
