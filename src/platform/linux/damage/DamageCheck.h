// SPDX-License-Identifier: Apache-2.0
// The room of damage to the store's database: how it is noticed, how the database is set aside, and how its rows are
// read in spite of it.
//
// The check looks for damage in the database, without delaying events: on a thread of its own, which the scheduler and
// the disk serve last, through a read-only connection.
//
// SQLite notices damage only on pages that it reads, and the service seldom reads what it has written. So every page is
// also looked at when there is a reason: after an end that was not clean, at a sign of damage, and once a day of use.
#pragma once

#include "foundation/Mutex.h"
#include "platform/Clock.h"

#include <atomic>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <string_view>
#include <thread>

struct sqlite3;

namespace platform {

// One thread at a time, except where noted.
class DamageCheck {
public:
    enum class Finding : std::uint8_t {
        Sound,
        Damaged,
        Unknown // for example, because the database could not be opened
    };
    static constexpr double secondsBetweenChecks = 86400;
    static constexpr double secondsBeforeRepetition = 3600; // of a check that found nothing out
    // The file with the time of the last finding: seconds since 1970, as text. It lies beside the database.
    static constexpr std::string_view stampSuffix = "-checked";

    // The path is that of the database. `whenFinished` is called on the check's thread at the end of a check that is
    // not broken off; `takeFinding` has its finding then.
    DamageCheck(std::filesystem::path path, const Clock& clock, std::function<void()> whenFinished);
    // Breaks the check off.
    ~DamageCheck();
    DamageCheck(const DamageCheck&) = delete;
    DamageCheck& operator=(const DamageCheck&) = delete;

    // Makes a check due now, before a day has passed. If it is not made in this run, the next one makes it.
    void ask();
    // Begins a check if one is due and none runs. It opens the file that is there, and looks at it only if then
    // `isInPlace` says that it still is the file that the service has open: SQLite lets the connections of a process
    // change the index of the log under each other if these have different files of the same name.
    void beginIfDue(const std::function<bool()>& isInPlace);
    // Ends the check that runs and its use of the database, and forgets a finding that was not taken. It is repeated
    // later. Returns as soon as the check has ended.
    void breakOff();
    // What the check found that ended since the last call.
    [[nodiscard]] std::optional<Finding> takeFinding();

private:
    struct Close {
        void operator()(sqlite3* connection) const noexcept;
    };
    using Connection = std::unique_ptr<sqlite3, Close>;

    [[nodiscard]] Connection connect() const;
    void run(Connection connection);
    [[nodiscard]] Finding examine(sqlite3* connection);
    void setConnection(sqlite3* connection);
    void repeatLater();
    void writeStamp() const;

    const std::filesystem::path path_;
    const std::filesystem::path stampPath_;
    const Clock& clock_;
    const std::function<void()> whenFinished_;
    double checkedAt_ = 0; // seconds since 1970: the last finding
    double notBefore_ = 0; // uptime, in seconds
    bool isAsked_ = false;

    std::thread thread_; // of the check that runs or whose finding was not taken
    Finding finding_ = Finding::Unknown; // of that check; its thread's until it has ended
    std::atomic<bool> hasEnded_ = false;
    std::atomic<bool> mustEnd_ = false;
    foundation::Mutex lock_;
    sqlite3* connection_ KESTO_GUARDED_BY(lock_) = nullptr; // of the check that runs
};

} // namespace platform
