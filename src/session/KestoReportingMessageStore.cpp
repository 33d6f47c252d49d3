// A record is the kind's number (4 bytes), the length of the payload (4 bytes), and the payload as CBOR.
#include "session/KestoReportingMessageStore.h"

#include "utility/KestoReportingUtility.h"

#include <algorithm>
#include <array>
#include <cstring>

namespace {

struct RecordHead {
    std::uint32_t kind;
    std::uint32_t length;
};

// Small sessions stay small, large ones get by with few allocations.
constexpr std::size_t firstChunk = 512;
constexpr std::size_t largestChunk = std::size_t{256} << 10;

// A larger payload accepted last is decoded again when it is compared: it would take many times its bytes.
constexpr std::size_t largestKeptDecoded = 1024;

// Stamps that a client may add to any message; they say when, not what.
constexpr std::array<std::string_view, 3> timeStampKeys{"processuptime_ms", "systemuptime_sec",
                                                        KestoReportingTimestampKey};

// A payload that was encoded here; it may nest as deep as preferences do.
foundation::Dictionary decoded(std::string_view encoded)
{
    constexpr unsigned anyDepth = 1000;
    foundation::CborDecoder decoder;
    const auto value = decoder.decode(encoded, anyDepth);
    return value ? value->dictionary().value_or(foundation::Dictionary()) : foundation::Dictionary();
}

} // namespace

KestoReportingMessageStore::KestoReportingMessageStore(std::shared_ptr<KestoReportingStorageBudget> budget)
    : budget_(std::move(budget))
{
}

KestoReportingMessageStore::~KestoReportingMessageStore()
{
    budget_->giveBack(bytesTaken_);
}

KestoReportingMessageStore::Outcome KestoReportingMessageStore::record(AudioEventCategory category, AudioEventType type,
                                                                       const foundation::Dictionary& payload)
{
    const std::uint32_t number = kindOf(category, type);
    Kind& kind = kinds_[number];
    const bool isError = category == AudioEventCategoryError || type == AudioEventTypeError;
    if (!isError && repeatsLast(kind, payload))
        return Outcome::Redundant;

    scratch_.clear();
    foundation::appendCbor(payload, scratch_);
    const RecordHead head{number, static_cast<std::uint32_t>(scratch_.size())};
    char* place = allocate(sizeof head + scratch_.size());
    if (place == nullptr)
        return Outcome::Full;
    std::memcpy(place, &head, sizeof head);
    std::memcpy(place + sizeof head, scratch_.data(), scratch_.size());
    ++size_;
    ++kind.count;
    kind.lastEncoded = {place + sizeof head, scratch_.size()};
    kind.hasLastPayload = scratch_.size() <= largestKeptDecoded;
    kind.lastPayload = kind.hasLastPayload ? payload : foundation::Dictionary();
    return Outcome::Recorded;
}

bool KestoReportingMessageStore::repeatsLast(const Kind& kind, const foundation::Dictionary& payload)
{
    if (kind.count == 0)
        return false;
    const foundation::Dictionary last = kind.hasLastPayload ? kind.lastPayload : decoded(kind.lastEncoded);
    return payload.isEqualIgnoring(last, timeStampKeys);
}

std::uint32_t KestoReportingMessageStore::kindOf(AudioEventCategory category, AudioEventType type)
{
    // By name, not by number: numbers that share their names are one kind.
    std::string key = KestoReportingUtilityCategoryString(category);
    key += '_';
    key += KestoReportingUtilityTypeString(type);
    const auto [found, isNew] = kindByKey_.try_emplace(std::move(key), static_cast<std::uint32_t>(kinds_.size()));
    if (isNew)
        kinds_.push_back({.key = found->first, .count = 0, .lastEncoded = {}, .lastPayload = {}});
    return found->second;
}

// Room for so many bytes, or null pointer when the budget has no more.
char* KestoReportingMessageStore::allocate(std::size_t bytes)
{
    if (chunks_.empty() || chunks_.back().capacity - chunks_.back().used < bytes) {
        const std::size_t next = chunks_.empty() ? firstChunk : std::min(chunks_.back().capacity * 2, largestChunk);
        const std::size_t capacity = std::max(next, bytes);
        if (!budget_->take(capacity))
            return nullptr;
        bytesTaken_ += capacity;
        chunks_.push_back({std::make_unique_for_overwrite<char[]>(capacity), 0, capacity});
    }
    Chunk& chunk = chunks_.back();
    char* place = chunk.bytes.get() + chunk.used;
    chunk.used += bytes;
    return place;
}

void KestoReportingMessageStore::forEach(
    const std::function<void(const std::string& identifier, const foundation::Dictionary& payload)>& visit) const
{
    std::vector<std::uint64_t> seen(kinds_.size());
    for (const Chunk& chunk : chunks_) {
        for (std::string_view rest(chunk.bytes.get(), chunk.used); !rest.empty();) {
            RecordHead head;
            std::memcpy(&head, rest.data(), sizeof head);
            const std::string identifier = kinds_[head.kind].key + '_' + std::to_string(++seen[head.kind]);
            visit(identifier, decoded(rest.substr(sizeof head, head.length)));
            rest.remove_prefix(sizeof head + head.length);
        }
    }
}

foundation::Dictionary KestoReportingMessageStore::counts() const
{
    foundation::Dictionary::Entries entries;
    for (const Kind& kind : kinds_)
        if (kind.count != 0)
            entries.push_back({foundation::String(kind.key), kind.count});
    return entries;
}
