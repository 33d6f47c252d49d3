// SPDX-License-Identifier: Apache-2.0
// SQLite looks at all pages in one step, which only an interruption ends. One that comes before the step is forgotten,
// so the progress handler asks once more.
#include "platform/linux/damage/DamageCheck.h"

#include "platform/linux/damage/FilesInPlace.h"
#include "platform/linux/process/Thread.h"

#include <cmath>
#include <fmt/format.h>
#include <fstream>
#include <memory>
#include <sqlite3.h>
#include <string>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <system_error>
#include <unistd.h>
#include <utility>

namespace platform {
namespace {

// The kernel's numbers, for which the C library has no names.
constexpr int ofThread = 1; // IOPRIO_WHO_PROCESS
constexpr int idle = 3 << 13; // IOPRIO_CLASS_IDLE

constexpr int lowestPriority = 19;

// If the kernel refuses, the check disturbs others more, but is as good.
void giveWayToAllOthers()
{
    ::syscall(SYS_ioprio_set, ofThread, 0, idle);
    ::setpriority(PRIO_PROCESS, static_cast<id_t>(::gettid()), lowestPriority);
}

double readStamp(const std::filesystem::path& path)
{
    double seconds = 0;
    std::ifstream(path) >> seconds;
    return seconds;
}

// An error of the disk is damage too, if it is a page that cannot be read.
bool isDamage(int extendedError)
{
    switch (extendedError & 0xFF) {
    case SQLITE_CORRUPT:
    case SQLITE_NOTADB: return true;
    case SQLITE_IOERR:
        return extendedError == SQLITE_IOERR_READ || extendedError == SQLITE_IOERR_SHORT_READ
            || extendedError == SQLITE_IOERR_CORRUPTFS;
    default: return false;
    }
}

} // namespace

DamageCheck::DamageCheck(std::filesystem::path path, const Clock& clock, std::function<void()> whenFinished)
    : path_(std::move(path)),
      stampPath_(withSuffix(path_, stampSuffix)),
      clock_(clock),
      whenFinished_(std::move(whenFinished)),
      checkedAt_(readStamp(stampPath_))
{
}

DamageCheck::~DamageCheck()
{
    breakOff();
}

void DamageCheck::ask()
{
    isAsked_ = true;
    notBefore_ = 0;
    std::error_code error;
    std::filesystem::remove(stampPath_, error);
}

// A stamp from the future was made by a clock that was wrong, and counts for nothing.
void DamageCheck::beginIfDue(const std::function<bool()>& isInPlace)
{
    const bool isDue = isAsked_ || std::abs(clock_.secondsSince1970() - checkedAt_) >= secondsBetweenChecks;
    if (!isDue || clock_.systemUptime() < notBefore_ || thread_.joinable())
        return;
    Connection connection = connect();
    if (!isInPlace())
        return;
    isAsked_ = false;
    hasEnded_ = false;
    mustEnd_ = false;
    thread_ = startThread("damage-check", QualityOfService::Background,
                          [this, opened = std::move(connection)]() mutable { run(std::move(opened)); });
}

void DamageCheck::Close::operator()(sqlite3* connection) const noexcept
{
    ::sqlite3_close(connection);
}

// Null if the file cannot be opened. Nothing is read yet.
DamageCheck::Connection DamageCheck::connect() const
{
    sqlite3* opened = nullptr;
    const int isOpen = ::sqlite3_open_v2(path_.c_str(), &opened, SQLITE_OPEN_READONLY, nullptr);
    Connection connection(opened);
    return isOpen == SQLITE_OK ? std::move(connection) : Connection();
}

void DamageCheck::breakOff()
{
    mustEnd_ = true;
    {
        const foundation::Lock lock(lock_);
        if (connection_ != nullptr)
            ::sqlite3_interrupt(connection_);
    }
    if (!thread_.joinable())
        return;
    thread_.join();
    hasEnded_ = false;
    repeatLater();
}

std::optional<DamageCheck::Finding> DamageCheck::takeFinding()
{
    if (!hasEnded_.exchange(false))
        return std::nullopt;
    thread_.join();
    if (finding_ == Finding::Unknown) {
        repeatLater();
    } else {
        checkedAt_ = clock_.secondsSince1970();
        writeStamp();
    }
    return finding_;
}

void DamageCheck::repeatLater()
{
    isAsked_ = true;
    notBefore_ = clock_.systemUptime() + secondsBeforeRepetition;
}

// Without a stamp the next start checks once more.
void DamageCheck::writeStamp() const
{
    std::ofstream(stampPath_, std::ios::trunc) << fmt::format("{:.0f}\n", checkedAt_);
}

// --- The check's thread

void DamageCheck::run(Connection connection)
{
    giveWayToAllOthers();
    setConnection(connection.get());
    finding_ = examine(connection.get());
    setConnection(nullptr);
    connection.reset();
    hasEnded_ = true;
    if (!mustEnd_ && whenFinished_)
        whenFinished_();
}

DamageCheck::Finding DamageCheck::examine(sqlite3* connection)
{
    if (connection == nullptr)
        return Finding::Unknown;
    const auto mustEnd = [](void* check) { return static_cast<DamageCheck*>(check)->mustEnd_ ? 1 : 0; };
    ::sqlite3_progress_handler(connection, 1, mustEnd, this);

    std::string answer;
    const auto note = [](void* text, int, char** values, char**) {
        *static_cast<std::string*>(text) = values[0];
        return 0;
    };
    const int done = ::sqlite3_exec(connection, "PRAGMA quick_check(1)", note, &answer, nullptr);
    if (mustEnd_)
        return Finding::Unknown; // what was not looked at counts as missing in SQLite's answer
    if (done != SQLITE_OK)
        return isDamage(::sqlite3_extended_errcode(connection)) ? Finding::Damaged : Finding::Unknown;
    return answer == "ok" ? Finding::Sound : Finding::Damaged;
}

void DamageCheck::setConnection(sqlite3* connection)
{
    const foundation::Lock lock(lock_);
    connection_ = connection;
}

} // namespace platform
