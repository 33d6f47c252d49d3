// SPDX-License-Identifier: Apache-2.0
// Tables with two columns of numbers: since the service started, and since the counting began. Losses and limits are
// listed only if there are some, each with its remedy from the table of counters.
#include "kesto/status/StatusText.h"

#include "foundation/text/LocalTime.h"
#include "kesto/Terminal.h"
#include "ledger/Report.h"

#include <array>
#include <fmt/format.h>
#include <string_view>

using foundation::Dictionary;
using foundation::Value;
using ledger::groupedText;
using ledger::numberIn;

namespace {

constexpr std::size_t nameColumns = 34;
constexpr std::size_t numberColumns = 18;

std::string moment(std::uint64_t seconds)
{
    return momentText(static_cast<double>(seconds));
}

// Empty if the entry is missing.
std::string textIn(const Dictionary& entries, std::string_view key)
{
    const Value* const value = entries.find(key);
    return value == nullptr ? std::string() : printable(value->text());
}

class StatusTables {
public:
    StatusTables(const Dictionary& report, std::size_t width)
        : report_(report),
          width_(width),
          isRunning_(report.find("running")->asBoolean()),
          sinceStart_(isRunning_ ? *report.find("sinceStart")->dictionary() : Dictionary())
    {
    }

    std::string text()
    {
        addHead();
        addCounts();
        addProblems();
        addCulprits();
        addWork();
        return std::move(text_);
    }

private:
    void addLine(std::string_view line) { (text_ += fitted(line, width_)) += '\n'; }

    [[nodiscard]] std::string counted(std::string_view path, std::string_view one) const
    {
        return ledger::countedText(numberIn(report_, path), one);
    }

    // Not of an earlier version, which does not tell it.
    [[nodiscard]] bool isOff(std::string_view key) const
    {
        const auto* const value = report_.find(key);
        return value != nullptr && !value->asBoolean();
    }

    [[nodiscard]] std::string size(std::string_view path) const { return sizeText(numberIn(report_, path)); }

    void addHead()
    {
        if (isRunning_) {
            addLine(fmt::format("kestod {}{}, running since {}", textIn(report_, "version"),
                                report_.find("internalBuild")->asBoolean() ? " (internal build)" : "",
                                moment(numberIn(report_, "started"))));
            addLine(fmt::format("{} and {} now; {} and {} in the last minute", counted("now.connections", "connection"),
                                counted("now.sessions", "session"), counted("rates.deliveries", "message"),
                                counted("rates.events", "event")));
            if (report_.contains("memory")) // an earlier version does not tell it
                addLine(
                    fmt::format("what clients sent takes {} of at most {} of memory; a user may have {}, a client {}",
                                size("memory.used"), size("memory.limit"), size("memory.limitOfAUser"),
                                size("memory.limitOfAClient")));
        } else {
            addLine("kestod does not run; this is what it counted before");
        }
        const std::uint64_t oldest = numberIn(report_, "store.oldest");
        addLine(fmt::format("the store has {} in {}{}", counted("store.events", "event"), size("store.bytes"),
                            oldest == 0 ? "" : ", the oldest of " + moment(oldest)));
        if (isRunning_ && isOff("storing"))
            addLine(nothingIsStored);
        else if (isRunning_ && isOff("storingStretches"))
            addLine(noStretchesAreStored);
    }

    void addRow(std::string_view name, std::string_view ofRun, std::string_view ofAll, std::string_view rest = {})
    {
        addLine(fmt::format("{}{:>{}}{:>{}}{}{}", padded(std::string(name), nameColumns), ofRun, numberColumns, ofAll,
                            numberColumns, rest.empty() ? "" : "  ", rest));
    }

    void addHeadings(std::string_view title, std::string_view rest = {})
    {
        text_ += '\n';
        const std::string began =
            foundation::localTimeText(static_cast<double>(numberIn(report_, "began")), "{:%Y-%m-%d}");
        addRow(title, isRunning_ ? "SINCE START" : "", "SINCE " + began, rest);
    }

    void addCount(std::string_view name, std::string_view path, std::string_view rest = {})
    {
        addRow(name, isRunning_ ? groupedText(numberIn(sinceStart_, path)) : "", groupedText(numberIn(report_, path)),
               rest);
    }

    void addSum(std::string_view name, ledger::Charge charge)
    {
        const auto sum = [&](const Dictionary& counts) {
            std::uint64_t all = 0;
            for (const ledger::CounterRow& row : ledger::counterRows())
                if (ledger::chargeOf(row.counter) == charge)
                    all += numberIn(counts, row.path);
            return groupedText(all);
        };
        addRow(name, isRunning_ ? sum(sinceStart_) : "", sum(report_));
    }

    void addCounts()
    {
        addHeadings("COUNTED");
        addCount("messages, at each session", "deliveries");
        addCount("  recorded", "recorded");
        addCount("  repeated", "repeated");
        addCount("  at no started session", "inert");
        addSum("  refused", ledger::Charge::Refused);
        addCount("events", "events");
        addCount("  kept", "kept");
        addCount("  not wanted", "unwanted");
        addSum("  lost", ledger::Charge::Lost);
        addSum("removed from the store", ledger::Charge::Removed);
        addCount("connections", "connections.accepted");
        addCount("sessions", "sessions.created");
    }

    void addProblems()
    {
        bool isFirst = true;
        for (const ledger::CounterRow& row : ledger::counterRows()) {
            if (row.meaning == ledger::Meaning::Work || numberIn(report_, row.path) == 0)
                continue;
            if (std::exchange(isFirst, false))
                addHeadings("LOST, REFUSED AND LEFT OUT");
            addCount(row.path, row.path);
            addLine(fmt::format("  because: {}", row.reason));
            addLine(fmt::format("  to do:   {}", row.remedy));
        }
        if (isFirst)
            addLine("\nnothing was lost, refused or left out");
    }

    void addCulprits()
    {
        const auto who = report_.find("who") == nullptr ? std::nullopt : report_.find("who")->dictionary();
        if (!who)
            return;
        bool isFirst = true;
        for (const auto& [charge, list] : *who) {
            const foundation::Array culprits = list.array().value_or(foundation::Array());
            for (const Value& each : culprits) {
                if (std::exchange(isFirst, false)) {
                    text_ += '\n';
                    addCulprit("BY WHOM", "USER", "COUNT", "PROCESS", "APPLICATION");
                }
                const Dictionary culprit = each.dictionary().value_or(Dictionary());
                const std::string count = groupedText(numberIn(culprit, "count"));
                if (culprit.contains("user"))
                    addCulprit(charge.view(), textIn(culprit, "user"), count, textIn(culprit, "process"),
                               textIn(culprit, "application"));
                else
                    addCulprit(charge.view(), "-", count, "all others", "");
            }
        }
    }

    void addCulprit(std::string_view charge, std::string_view user, std::string_view count, std::string_view process,
                    std::string_view application)
    {
        constexpr std::size_t chargeColumns = 9;
        constexpr std::size_t userColumns = 11;
        constexpr std::size_t processColumns = 17;
        addLine(fmt::format("{}{:>{}}{:>{}}  {}{}", padded(std::string(charge), chargeColumns), user, userColumns,
                            count, numberColumns, padded(std::string(process), processColumns), application));
    }

    // Only a running service knows it.
    void addWork()
    {
        const Value* const who = sinceStart_.find("who");
        const Value* const time = who == nullptr ? nullptr : who->dictionary().value_or(Dictionary()).find("time");
        const foundation::Array works =
            time == nullptr ? foundation::Array() : time->array().value_or(foundation::Array());
        if (works.empty())
            return;
        text_ += '\n';
        addWork("TIME TAKEN", "USER", "CALLS", "RECEIVED", "PROCESS, SINCE START");
        for (const Value& each : works) {
            const Dictionary work = each.dictionary().value_or(Dictionary());
            const bool hasName = work.contains("user");
            constexpr double second = 1'000'000;
            addWork(fmt::format("{:.3f} s", static_cast<double>(numberIn(work, "microseconds")) / second),
                    hasName ? textIn(work, "user") : "-", groupedText(numberIn(work, "calls")),
                    sizeText(numberIn(work, "bytes")), hasName ? textIn(work, "process") : "all others");
        }
    }

    void addWork(std::string_view time, std::string_view user, std::string_view calls, std::string_view received,
                 std::string_view process)
    {
        addLine(fmt::format("{:>14}{:>12}{:>18}{:>12}  {}", time, user, calls, received, process));
    }

    const Dictionary& report_;
    const std::size_t width_;
    const bool isRunning_;
    const Dictionary sinceStart_;
    std::string text_;
};

} // namespace

std::string statusText(const Dictionary& report, std::size_t width)
{
    return StatusTables(report, width).text();
}
