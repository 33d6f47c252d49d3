// SPDX-License-Identifier: Apache-2.0
// `kesto-uplink preview`: exactly the lines that would leave next, on standard output; and on standard error why the
// rest would not. It changes nothing.
#include "foundation/values/Json.h"
#include "kesto-uplink/Commands.h"
#include "kesto-uplink/Present.h"
#include "kesto-uplink/Suspects.h"
#include "kesto-uplink/outbox/Outbox.h"
#include "kesto/ExitStatus.h"
#include "kesto/Terminal.h"
#include "kesto/report/ReportWords.h"
#include "kesto/results/MomentText.h"

#include <CLI/Error.hpp>
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
using Counts = std::map<std::string, std::int64_t>;

struct PreviewOptions {
    Places places;
    std::string since;
    bool isJson = false;
};

// What the batches have in common.
struct Sum {
    std::int64_t batches = 0;
    std::int64_t rows = 0;
    std::int64_t bytes = 0;
    LeftOut leftOut = {};

    void add(const Batch& batch)
    {
        batches += batch.rows > 0 ? 1 : 0;
        rows += batch.rows;
        bytes += std::ssize(batch.bytes);
        leftOut.lostToAge += batch.leftOut.lostToAge;
        addTo(leftOut.notAllowed, batch.leftOut.notAllowed);
        addTo(leftOut.unreadable, batch.leftOut.unreadable);
        addTo(leftOut.tooLarge, batch.leftOut.tooLarge);
    }

private:
    static void addTo(Counts& sum, const Counts& counts)
    {
        for (const auto& [name, count] : counts)
            sum[name] += count;
    }
};

class Preview {
public:
    explicit Preview(const PreviewOptions& options)
        : options_(options),
          checked_(readUplinkConfiguration(options.places.configuration))
    {
    }

    int run()
    {
        if (!checked_.problems.empty()) {
            for (const std::string& problem : checked_.problems)
                fmt::print(stderr, "{}\n", problem);
            fmt::print(stderr, "kesto-uplink: nothing leaves until this is corrected\n");
            return exitFailure;
        }
        readState();
        printLines();
        if (options_.isJson)
            explainAsJson();
        else
            explain();
        return exitOk;
    }

private:
    // Without a state, or the right to read it, the preview begins where a device without a state would.
    void readState()
    {
        try {
            if (auto state = State::openPresent(options_.places.state)) {
                identity_ = state->identity();
                const UplinkConfiguration& configuration = checked_.configuration;
                isRenewalDue_ = isOlder(identity_.pseudonymBorn, configuration.pseudonymDays, present())
                    || isOlder(identity_.hashKeyBorn, configuration.hashKeyDays, present());
                after_ = state->queued();
                openSessions_ = state->openSessions();
                return;
            }
            hint_ = fmt::format("{} has no state yet", options_.places.state.native());
        } catch (const StateError& error) {
            hint_ = error.what();
        }
        hint_ += ": the pseudonym here is made up, and no other preview has it";
    }

    void printLines()
    {
        const EventDatabase isThere(options_.places.database); // throws if not
        Outbox outbox(options_.places.database, checked_.configuration, identity_);
        if (!options_.since.empty()) {
            after_ = outbox.before(*parseMoment(options_.since));
            openSessions_.clear();
        }
        const double now = present();
        while (const auto batch = outbox.next(after_, openSessions_, now)) {
            std::fwrite(batch->lines.data(), 1, batch->lines.size(), stdout);
            sum_.add(*batch);
            after_ = batch->last;
            openSessions_ = batch->openSessions;
        }
        suspects_ = suspects(options_.places, checked_.configuration);
    }

    // --- For people

    void explain() const
    {
        if (!checked_.configuration.enabled)
            fmt::print(stderr, "The uplink is off: {} does not say enabled = true. This would leave if it was on.\n",
                       options_.places.configuration.native());
        if (!hint_.empty())
            fmt::print(stderr, "{}.\n", hint_);
        if (isRenewalDue_)
            fmt::print(stderr,
                       "The pseudonym or the key of hashes is older than the configuration allows: the next round "
                       "renews it, and these lines leave with the new one.\n");
        fmt::print(stderr, "{} would leave (batches: {}; compressed: {}).\n", rowsText(sum_.rows), sum_.batches,
                   sizeText(static_cast<std::uint64_t>(sum_.bytes)));
        explain(sum_.leftOut.notAllowed, "stay, because no rule allows them");
        explain(
            sum_.leftOut.unreadable,
            "cannot leave, because their payload is no JSON object or has a number that JSON has not, or their name "
            "is longer than 16384 bytes");
        explain(sum_.leftOut.tooLarge, "cannot leave, because each alone is larger than a batch may be");
        if (sum_.leftOut.lostToAge > 0)
            fmt::print(stderr,
                       "Lost to age: {}. The event store removed what was too old or too much before it could "
                       "leave.\n",
                       rowsText(sum_.leftOut.lostToAge));
        for (const std::string& sentence : suspects_)
            fmt::print(stderr, "{}\n", sentence);
    }

    static std::string rowsText(std::int64_t count) { return countText(static_cast<std::size_t>(count), "row"); }

    static void explain(const Counts& counts, std::string_view why)
    {
        if (counts.empty())
            return;
        fmt::print(stderr, "These {}:\n", why);
        for (const auto& [name, count] : counts)
            fmt::print(stderr, "{:>9}  {}\n", count, printable(name));
    }

    // --- For programs

    void explainAsJson() const
    {
        std::vector<Value> sentences(suspects_.begin(), suspects_.end());
        std::string line;
        foundation::appendJsonText(Dictionary{{"enabled", checked_.configuration.enabled},
                                              {"rows", sum_.rows},
                                              {"batches", sum_.batches},
                                              {"bytes", sum_.bytes},
                                              {"not_allowed", valueOf(sum_.leftOut.notAllowed)},
                                              {"unreadable", valueOf(sum_.leftOut.unreadable)},
                                              {"too_large", valueOf(sum_.leftOut.tooLarge)},
                                              {"lost_to_age", sum_.leftOut.lostToAge},
                                              {"pseudonym_is_made_up", !hint_.empty()},
                                              {"renewal_is_due", isRenewalDue_},
                                              {"suspects", Array(std::move(sentences))}},
                                   line);
        fmt::print(stderr, "{}\n", line);
    }

    static Value valueOf(const Counts& counts)
    {
        Dictionary::Entries entries;
        for (const auto& [name, count] : counts)
            entries.push_back({foundation::String(name), count});
        return Dictionary(std::move(entries));
    }

    const PreviewOptions& options_;
    const CheckedUplinkConfiguration checked_;
    Identity identity_ = newIdentity(present());
    Cursor after_ = {};
    std::set<std::int64_t> openSessions_ = {};
    std::string hint_ = {};
    bool isRenewalDue_ = false;
    Sum sum_ = {};
    std::vector<std::string> suspects_ = {};
};

} // namespace

void addPreviewCommand(CLI::App& application, int& exitStatus)
{
    const auto options = std::make_shared<PreviewOptions>();
    CLI::App* const command = application.add_subcommand(
        "preview", "Prints exactly the lines that would leave next, and on standard error why the rest would not");
    addPlaceOptions(*command, options->places);
    command->add_option("--since", options->since,
                        "What was stored since then, sent or not: 90s, 10m, 2h, 7d ago, or a time such as "
                        "2026-01-31T18:00:00");
    command->add_flag("--json", options->isJson, "On standard error one JSON object, for programs");
    command->callback([options, &exitStatus] {
        if (!options->since.empty() && !parseMoment(options->since))
            throw CLI::ValidationError("--since",
                                       "\"" + options->since
                                           + "\" is neither so long ago, such as 10m, "
                                             "nor a time such as 2026-01-31T18:00:00");
        exitStatus = Preview(*options).run();
    });
}

} // namespace kesto_uplink
