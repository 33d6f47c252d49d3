// SPDX-License-Identifier: Apache-2.0
// `kesto-uplink status`: whether the uplink is on, what it has sent, what waits, and what the servers said last.
#include "foundation/values/Json.h"
#include "kesto-uplink/Commands.h"
#include "kesto-uplink/Present.h"
#include "kesto-uplink/Suspects.h"
#include "kesto-uplink/outbox/Outbox.h"
#include "kesto/ExitStatus.h"
#include "kesto/JsonValues.h"
#include "kesto/Terminal.h"
#include "kesto/report/ReportWords.h"

#include <cmath>
#include <cstdio>
#include <fmt/format.h>
#include <memory>
#include <optional>
#include <string>

namespace kesto_uplink {

namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;

constexpr double secondsOfDay = 86'400;

struct StatusOptions {
    Places places;
    bool isJson = false;
};

// What would leave next, as far as a few batches go.
struct Waiting {
    std::int64_t rows = 0;
    std::int64_t bytes = 0;
    bool areMore = false;
    std::optional<double> oldest = {};
};

struct Remembered {
    Identity identity = {};
    Cursor queued = {};
    Cursor stored = {};
    Totals totals = {};
    std::int64_t bytesToday = 0;
    std::optional<LastAnswer> lastAnswer = {};
    std::optional<double> onSince = {};
    std::set<std::int64_t> openSessions = {};
};

class Status {
public:
    explicit Status(const StatusOptions& options)
        : options_(options),
          checked_(readUplinkConfiguration(options.places.configuration)),
          problems_(checked_.problems)
    {
    }

    int run()
    {
        readState();
        readStore();
        fmt::print("{}", options_.isJson ? json() : text());
        return problems_.empty() ? exitOk : exitFailure;
    }

private:
    void readState()
    {
        try {
            auto state = State::openPresent(options_.places.state);
            if (!state)
                return;
            remembered_ = {.identity = state->identity(),
                           .queued = state->queued(),
                           .stored = state->stored(),
                           .totals = state->totals(),
                           .bytesToday = state->bytesSentOn(static_cast<std::int64_t>(present() / secondsOfDay)),
                           .lastAnswer = state->lastAnswer(),
                           .onSince = state->onSince(),
                           .openSessions = state->openSessions()};
        } catch (const StateError& error) {
            problems_.emplace_back(error.what());
        }
    }

    void readStore()
    {
        if (!problems_.empty())
            return;
        try {
            const EventDatabase isThere(options_.places.database); // throws if not
            const Remembered known = remembered_.value_or(Remembered{.identity = newIdentity(present())});
            Outbox outbox(options_.places.database, checked_.configuration, known.identity);
            Waiting waiting;
            Cursor after = known.queued;
            std::set<std::int64_t> openSessions = known.openSessions;
            constexpr int mostBatches = 8;
            for (int looks = 0; looks < mostBatches; ++looks) {
                const auto batch = outbox.next(after, openSessions, present());
                waiting.areMore = batch.has_value();
                if (!batch)
                    break;
                waiting.rows += batch->rows;
                waiting.bytes += std::ssize(batch->bytes);
                waiting.oldest = waiting.oldest ? waiting.oldest : batch->oldest;
                after = batch->last;
                openSessions = batch->openSessions;
            }
            waiting_ = waiting;
            suspects_ = suspects(options_.places, checked_.configuration);
        } catch (const EventStoreError& error) {
            problems_.emplace_back(error.what());
        }
    }

    // --- For people

    [[nodiscard]] std::string onText() const
    {
        const std::string& file = options_.places.configuration.native();
        if (!checked_.problems.empty())
            return fmt::format("off: nothing leaves until {} is corrected", file);
        if (!checked_.configuration.enabled)
            return fmt::format("off: {} does not say enabled = true", file);
        if (!remembered_ || !remembered_->onSince)
            return "on, but kesto-uplink run has not run since";
        return "on since " + momentText(*remembered_->onSince);
    }

    [[nodiscard]] std::string text() const
    {
        std::string text = fmt::format("uplink       {}\n", onText());
        if (remembered_) {
            const Totals& totals = remembered_->totals;
            const bool isAllStored = remembered_->queued == remembered_->stored;
            text += fmt::format("pseudonym    {} since {}\n", remembered_->identity.pseudonym,
                                momentText(remembered_->identity.pseudonymBorn));
            text += fmt::format("sent         {}, {} ({} today); batches: {}, retries: {}\n", rowsText(totals.rows),
                                size(totals.bytes), size(remembered_->bytesToday), totals.batches, totals.retries);
            text += fmt::format("stored       {}\n",
                                isAllStored ? "all that was sent"
                                            : fmt::format("up to ID {}; sent up to ID {}", remembered_->stored.id,
                                                          remembered_->queued.id));
            text += fmt::format("left out     {} may not leave; lost to age: {}\n", rowsText(totals.notAllowed),
                                totals.lostToAge);
        }
        if (waiting_)
            text += fmt::format("waiting      {}{}, {}{}\n", waiting_->areMore ? "at least " : "",
                                rowsText(waiting_->rows), size(waiting_->bytes),
                                waiting_->oldest ? "; the oldest since " + momentText(*waiting_->oldest) : "");
        if (remembered_)
            text +=
                fmt::format("last answer  {}\n",
                            remembered_->lastAnswer ? fmt::format("{}: {}", momentText(remembered_->lastAnswer->time),
                                                                  printable(remembered_->lastAnswer->text))
                                                    : "none");
        for (const auto* const sentences : {&problems_, &suspects_})
            for (const std::string& sentence : *sentences)
                text += sentence + '\n';
        return text;
    }

    static std::string rowsText(std::int64_t count) { return countText(static_cast<std::size_t>(count), "row"); }
    static std::string size(std::int64_t bytes) { return sizeText(static_cast<std::uint64_t>(bytes)); }

    // --- For programs

    [[nodiscard]] std::string json() const
    {
        Dictionary::Entries entries = {
            {"on", checked_.isOn()},
            {"configuration", options_.places.configuration.native()},
            {"problems", listOf(problems_)},
            {"suspects", listOf(suspects_)},
        };
        if (remembered_) {
            const Remembered& known = *remembered_;
            entries.push_back({"on_since", valueOf(known.onSince)});
            entries.push_back({"pseudonym", known.identity.pseudonym});
            entries.push_back({"pseudonym_since", known.identity.pseudonymBorn});
            entries.push_back({"sent",
                               Dictionary{{"rows", known.totals.rows},
                                          {"batches", known.totals.batches},
                                          {"bytes", known.totals.bytes},
                                          {"bytes_today", known.bytesToday},
                                          {"retries", known.totals.retries}}});
            entries.push_back(
                {"left_out",
                 Dictionary{{"not_allowed", known.totals.notAllowed}, {"lost_to_age", known.totals.lostToAge}}});
            entries.push_back({"queued", placeOf(known.queued)});
            entries.push_back({"stored", placeOf(known.stored)});
            entries.push_back({"last_answer",
                               known.lastAnswer ? Value(Dictionary{{"text", known.lastAnswer->text},
                                                                   {"time", known.lastAnswer->time}})
                                                : Value()});
        }
        if (waiting_)
            entries.push_back({"waiting",
                               Dictionary{{"rows", waiting_->rows},
                                          {"bytes", waiting_->bytes},
                                          {"more", waiting_->areMore},
                                          {"oldest", valueOf(waiting_->oldest)}}});
        std::string line;
        foundation::appendJsonText(Dictionary(std::move(entries)), line);
        return line + '\n';
    }

    static Value placeOf(const Cursor& cursor) { return Dictionary{{"epoch", cursor.epoch}, {"id", cursor.id}}; }

    static Value listOf(const std::vector<std::string>& sentences)
    {
        return Array(std::vector<Value>(sentences.begin(), sentences.end()));
    }

    const StatusOptions& options_;
    const CheckedUplinkConfiguration checked_;
    std::vector<std::string> problems_;
    std::optional<Remembered> remembered_ = {};
    std::optional<Waiting> waiting_ = {};
    std::vector<std::string> suspects_ = {};
};

} // namespace

void addStatusCommand(CLI::App& application, int& exitStatus)
{
    const auto options = std::make_shared<StatusOptions>();
    CLI::App* const command = application.add_subcommand(
        "status", "Shows whether the uplink is on, what it has sent, what waits, and the last answer");
    addPlaceOptions(*command, options->places);
    command->add_flag("--json", options->isJson, "One JSON object, for programs");
    command->callback([options, &exitStatus] { exitStatus = Status(*options).run(); });
}

} // namespace kesto_uplink
