// SPDX-License-Identifier: Apache-2.0
// A message replaces only the one that it was compared with. If another copy was faster, it is compared anew.
#include "kesto-ingest/stream/Confirmations.h"

#include "kesto-ingest/stream/Subjects.h"

#include <fmt/format.h>
#include <rapidjson/document.h>

#include <iterator>
#include <vector>

namespace kesto_ingest {

namespace {

constexpr std::size_t mostTold = 200'000; // some 40 MB
constexpr int mostAttempts = 10;

} // namespace

std::expected<Confirmations::Told, std::string> Confirmations::look(const std::string& subject)
{
    const auto entry = stream_.last(subject);
    if (!entry)
        return std::unexpected(entry.error());
    if (!*entry)
        return Told();
    Told told{.epoch = {}, .id = 0, .sequence = (*entry)->sequence};
    rapidjson::Document document;
    document.Parse((*entry)->payload.data(), (*entry)->payload.size());
    if (document.IsObject() && document.HasMember("epoch") && document["epoch"].IsString() && document.HasMember("id")
        && document["id"].IsUint64()) {
        told.epoch = document["epoch"].GetString();
        told.id = document["id"].GetUint64();
    }
    return told;
}

std::expected<void, std::string> Confirmations::leaveOutWhatIsTold(Waiting& waiting)
{
    for (auto next = waiting.begin(); next != waiting.end();) {
        const auto& [subject, confirmation] = *next;
        if (!told_.contains(subject)) {
            auto told = look(subject);
            if (!told)
                return std::unexpected(told.error());
            told_[subject] = *std::move(told);
            holdOn_();
        }
        const Told& told = told_[subject];
        const bool isTold = told.epoch == confirmation->epoch ? told.id >= confirmation->id
                                                              : confirmation->isRepeated && !told.epoch.empty();
        next = isTold ? waiting.erase(next) : std::next(next);
    }
    return {};
}

// What stays waiting was overtaken by another copy.
std::expected<void, std::string> Confirmations::put(Waiting& waiting)
{
    std::vector<Put> puts;
    puts.reserve(waiting.size());
    for (const auto& [subject, confirmation] : waiting)
        puts.push_back({.subject = subject,
                        .payload = fmt::format(R"({{"epoch":"{}","id":{}}})", confirmation->epoch, confirmation->id),
                        .after = told_[subject].sequence});
    const auto answers = stream_.put(puts);
    for (std::size_t place = 0; place < puts.size(); ++place) {
        const std::string& subject = puts[place].subject;
        if (answers && (*answers)[place]) {
            const Confirmation& confirmation = *waiting[subject];
            told_[subject] = {.epoch = confirmation.epoch, .id = confirmation.id, .sequence = *(*answers)[place]};
            waiting.erase(subject);
        } else
            told_.erase(subject);
    }
    return answers ? std::expected<void, std::string>() : std::unexpected(answers.error());
}

std::expected<void, std::string> Confirmations::tell(std::span<const Confirmation> confirmations)
{
    if (told_.size() >= mostTold)
        told_.clear();
    Waiting waiting;
    for (const Confirmation& each : confirmations) {
        const Confirmation*& kept = waiting[fmt::format("{}{}.{}", storedPrefix, each.credential, each.device)];
        const bool isNewer = kept == nullptr || (kept->epoch == each.epoch ? kept->id < each.id : !each.isRepeated);
        if (isNewer)
            kept = &each;
    }
    for (int attempt = 0; attempt < mostAttempts; ++attempt) {
        if (auto left = leaveOutWhatIsTold(waiting); !left || waiting.empty())
            return left;
        if (auto done = put(waiting); !done)
            return done;
        holdOn_();
    }
    if (waiting.empty())
        return {};
    return std::unexpected("others change what is told to " + waiting.begin()->first + " without end");
}

} // namespace kesto_ingest
