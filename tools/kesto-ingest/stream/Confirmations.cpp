// SPDX-License-Identifier: Apache-2.0
// A message replaces only the one that it was compared with. If another copy was faster, it is compared anew.
#include "kesto-ingest/stream/Confirmations.h"

#include "kesto-ingest/stream/Subjects.h"

#include <fmt/format.h>
#include <rapidjson/document.h>

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

std::expected<void, std::string> Confirmations::tell(const Confirmation& confirmation)
{
    const std::string subject = fmt::format("{}{}.{}", storedPrefix, confirmation.credential, confirmation.device);
    const std::string text = fmt::format(R"({{"epoch":"{}","id":{}}})", confirmation.epoch, confirmation.id);
    if (told_.size() >= mostTold)
        told_.clear();
    for (int attempt = 0; attempt < mostAttempts; ++attempt) {
        if (!told_.contains(subject)) {
            auto told = look(subject);
            if (!told)
                return std::unexpected(told.error());
            told_[subject] = *std::move(told);
        }
        Told& told = told_[subject];
        if (told.epoch == confirmation.epoch && told.id >= confirmation.id)
            return {};
        const auto sequence = stream_.put(subject, text, told.sequence);
        if (!sequence) {
            told_.erase(subject); // it may be there
            return std::unexpected(sequence.error());
        }
        if (*sequence) {
            told = {.epoch = confirmation.epoch, .id = confirmation.id, .sequence = **sequence};
            return {};
        }
        told_.erase(subject);
    }
    return std::unexpected("others change what is told to " + subject + " without end");
}

} // namespace kesto_ingest
