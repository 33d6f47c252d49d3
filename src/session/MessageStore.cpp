// SPDX-License-Identifier: Apache-2.0
// How payloads are laid out in memory, how they are paid for, and when a message is a repetition.
#include "session/MessageStore.h"

#include "foundation/cbor/Cbor.h"
#include "utility/KestoReportingUtility.h"

#include <algorithm>
#include <array>
#include <cstring>

namespace session {

namespace {

// Small sessions stay small, and large ones need few allocations.
constexpr std::size_t firstChunk = 512;
constexpr std::size_t largestChunk = std::size_t{256} << 10;

// A larger last payload is decoded again for each comparison: decoded, it would take many times its bytes.
constexpr std::size_t largestKeptDecoded = 1024;

// Of the payloads that may be kept as they come, only larger ones are.
constexpr std::size_t largestEncoded = std::size_t{1} << 20;

// Stamps that a client may add to any message. They give its time, and nothing about its content.
constexpr std::array<std::string_view, 3> timeStampKeys{"processuptime_ms", "systemuptime_sec", utility::timestampKey};

// The characters of the payload's keys and strings, which is what makes a payload large.
std::size_t textSize(const foundation::Dictionary& payload)
{
    std::size_t size = 0;
    for (const auto& [key, value] : payload)
        size += key.view().size() + value.stringView().size();
    return size;
}

} // namespace

foundation::Dictionary MessageStore::Payload::dictionary() const
{
    if (kept_ != nullptr)
        return *kept_;
    return foundation::CborItem(encoded_).value().dictionary().value_or(foundation::Dictionary());
}

MessageStore::MessageStore(std::shared_ptr<StorageBudget> budget) : share_(std::move(budget)) { }

MessageStore::Outcome MessageStore::record(AudioEventCategory category, AudioEventType type,
                                           const foundation::Dictionary& payload)
{
    const auto number = kindOf(category, type);
    if (!number)
        return Outcome::Full;
    Kind& kind = kinds_[*number];
    const bool isError = category == AudioEventCategoryError || type == AudioEventTypeError;
    if (!isError && repeatsLast(kind, payload))
        return Outcome::Redundant;
    const std::size_t bytes = payload.roughBytes();
    if (!append(*number, payload, bytes, kind.last))
        return Outcome::Full;
    ++size_;
    ++kind.count;
    kind.isLastDecoded = payForDecoded(kind, bytes);
    kind.lastDecoded = kind.isLastDecoded ? payload : foundation::Dictionary();
    return Outcome::Recorded;
}

// A kind keeps what it has paid for, because its next payloads usually take as much.
bool MessageStore::payForDecoded(Kind& kind, std::size_t bytes)
{
    if (kind.last.kept_ != nullptr || kind.last.encoded_.size() > largestKeptDecoded)
        return false;
    if (bytes <= kind.bytesForDecoded)
        return true;
    if (!share_.grow(bytes - kind.bytesForDecoded))
        return false;
    kind.bytesForDecoded = bytes;
    return true;
}

bool MessageStore::repeatsLast(const Kind& kind, const foundation::Dictionary& payload)
{
    if (kind.count == 0)
        return false;
    return payload.isEqualIgnoring(kind.isLastDecoded ? kind.lastDecoded : kind.last.dictionary(), timeStampKeys);
}

// Messages come in runs of one kind. The numbers of category and type are the fast way to recognise it.
std::optional<std::uint32_t> MessageStore::kindOf(AudioEventCategory category, AudioEventType type)
{
    if (recent_ && recent_->category == category && recent_->type == type)
        return recent_->kind;
    const auto kind = kindNamedLike(category, type);
    if (kind)
        recent_ = {category, type, *kind};
    return kind;
}

// Numbers with the same names are one kind. Nothing if the budget has no memory for a new kind.
std::optional<std::uint32_t> MessageStore::kindNamedLike(AudioEventCategory category, AudioEventType type)
{
    std::string key = KestoReportingUtilityCategoryString(category);
    key += '_';
    key += KestoReportingUtilityTypeString(type);
    if (const auto found = kindByKey_.find(key); found != kindByKey_.end())
        return found->second;
    if (!share_.grow(bytesOfAKind + key.size()))
        return std::nullopt;
    const auto number = static_cast<std::uint32_t>(kinds_.size());
    kinds_.emplace_back().key = kindByKey_.emplace(std::move(key), number).first->first;
    return number;
}

bool MessageStore::append(std::uint32_t kind, const foundation::Dictionary& payload, std::size_t bytes,
                          Payload& appended)
{
    const bool isLarge = keepsLargeAside_ && bytes > largestEncoded && textSize(payload) > largestEncoded;
    if (isLarge && !share_.grow(bytes))
        return false;
    const std::size_t size = isLarge ? 0 : foundation::cborSize(payload);
    const Head head{kind, isLarge, static_cast<std::uint32_t>(size)};
    char* place = allocate(sizeof head + size);
    if (place == nullptr) {
        if (isLarge)
            share_.shrink(bytes);
        return false;
    }
    std::memcpy(place, &head, sizeof head);
    appended.encoded_ = {place + sizeof head, size};
    if (!isLarge)
        foundation::putCbor(payload, place + sizeof head);
    appended.kept_ = isLarge ? &keptAside_.emplace_back(payload) : nullptr;
    return true;
}

// Room for so many bytes, or null if the budget has no more.
char* MessageStore::allocate(std::size_t bytes)
{
    if (chunks_.empty() || chunks_.back().capacity - chunks_.back().used < bytes) {
        const std::size_t next = chunks_.empty() ? firstChunk : std::min(chunks_.back().capacity * 2, largestChunk);
        const std::size_t capacity = std::max(next, bytes);
        if (!share_.grow(capacity))
            return nullptr;
        chunks_.push_back({std::make_unique_for_overwrite<char[]>(capacity), 0, capacity});
    }
    Chunk& chunk = chunks_.back();
    char* place = chunk.bytes.get() + chunk.used;
    chunk.used += bytes;
    return place;
}

std::string MessageStore::identifier(const Message& message) const
{
    return std::string(kinds_[message.kind].key) + '_' + std::to_string(message.index);
}

foundation::Dictionary MessageStore::counts() const
{
    foundation::Dictionary::Entries entries;
    for (const Kind& kind : kinds_)
        if (kind.count != 0)
            entries.push_back({foundation::String(kind.key), kind.count});
    return entries;
}

} // namespace session
