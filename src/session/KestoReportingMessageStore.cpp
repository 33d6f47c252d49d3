#include "session/KestoReportingMessageStore.h"

#include "foundation/Cbor.h"
#include "utility/KestoReportingUtility.h"

#include <algorithm>
#include <array>
#include <cstring>

namespace {

// Small sessions stay small, large ones get by with few allocations.
constexpr std::size_t firstChunk = 512;
constexpr std::size_t largestChunk = std::size_t{256} << 10;

// A larger payload accepted last is decoded again when it is compared: it would take many times its bytes.
constexpr std::size_t largestKeptDecoded = 1024;

// Larger payloads are kept as they are: none comes from a client in one frame, only the summary of a session
// grows like that, and it need not be in memory twice.
constexpr std::size_t largestEncoded = std::size_t{1} << 20;

// Stamps that a client may add to any message; they say when, not what.
constexpr std::array<std::string_view, 3> timeStampKeys{"processuptime_ms", "systemuptime_sec",
                                                        KestoReportingTimestampKey};

// The characters of the payload's keys and strings, which is what makes a payload large.
std::size_t textSize(const foundation::Dictionary& payload)
{
    std::size_t size = 0;
    for (const auto& [key, value] : payload)
        size += key.view().size() + value.stringView().size();
    return size;
}

} // namespace

foundation::Dictionary KestoReportingMessageStore::Payload::dictionary() const
{
    if (kept_ != nullptr)
        return *kept_;
    return foundation::CborItem(encoded_).value().dictionary().value_or(foundation::Dictionary());
}

KestoReportingMessageStore::KestoReportingMessageStore(std::shared_ptr<KestoReportingStorageBudget> budget)
    : budget_(std::move(budget))
{
}

KestoReportingMessageStore::~KestoReportingMessageStore()
{
    budget_->giveBack(paid_);
}

KestoReportingMessageStore::Outcome KestoReportingMessageStore::record(AudioEventCategory category, AudioEventType type,
                                                                       const foundation::Dictionary& payload)
{
    const std::uint32_t number = kindOf(category, type);
    Kind& kind = kinds_[number];
    const bool isError = category == AudioEventCategoryError || type == AudioEventTypeError;
    if (!isError && repeatsLast(kind, payload))
        return Outcome::Redundant;
    if (!append(number, payload, kind.last))
        return Outcome::Full;
    ++size_;
    ++kind.count;
    kind.isLastDecoded = kind.last.encoded_.size() <= largestKeptDecoded;
    kind.lastDecoded = kind.isLastDecoded ? payload : foundation::Dictionary();
    return Outcome::Recorded;
}

bool KestoReportingMessageStore::repeatsLast(const Kind& kind, const foundation::Dictionary& payload)
{
    if (kind.count == 0)
        return false;
    return payload.isEqualIgnoring(kind.isLastDecoded ? kind.lastDecoded : kind.last.dictionary(), timeStampKeys);
}

// Messages come in runs of one kind, which is told by its numbers.
std::uint32_t KestoReportingMessageStore::kindOf(AudioEventCategory category, AudioEventType type)
{
    if (!recent_ || recent_->category != category || recent_->type != type)
        recent_ = {category, type, kindNamedLike(category, type)};
    return recent_->kind;
}

// Numbers that share their names are one kind.
std::uint32_t KestoReportingMessageStore::kindNamedLike(AudioEventCategory category, AudioEventType type)
{
    std::string key = KestoReportingUtilityCategoryString(category);
    key += '_';
    key += KestoReportingUtilityTypeString(type);
    const auto [found, isNew] = kindByKey_.try_emplace(std::move(key), static_cast<std::uint32_t>(kinds_.size()));
    if (isNew)
        kinds_.emplace_back().key = found->first;
    return found->second;
}

bool KestoReportingMessageStore::append(std::uint32_t kind, const foundation::Dictionary& payload, Payload& appended)
{
    const std::size_t size = textSize(payload);
    const bool isLarge = size > largestEncoded;
    if (isLarge && !pay(size))
        return false;
    scratch_.clear();
    if (!isLarge)
        foundation::appendCbor(payload, scratch_);
    const Head head{kind, isLarge, static_cast<std::uint32_t>(scratch_.size())};
    char* place = allocate(sizeof head + scratch_.size());
    if (place == nullptr) {
        if (isLarge)
            refund(size);
        return false;
    }
    std::memcpy(place, &head, sizeof head);
    std::memcpy(place + sizeof head, scratch_.data(), scratch_.size());
    appended.encoded_ = {place + sizeof head, scratch_.size()};
    appended.kept_ = isLarge ? &keptAside_.emplace_back(payload) : nullptr;
    return true;
}

// Takes so many bytes from the budget.
bool KestoReportingMessageStore::pay(std::size_t bytes)
{
    if (!budget_->take(bytes))
        return false;
    paid_ += bytes;
    return true;
}

void KestoReportingMessageStore::refund(std::size_t bytes)
{
    budget_->giveBack(bytes);
    paid_ -= bytes;
}

// Room for so many bytes, or null pointer when the budget has no more.
char* KestoReportingMessageStore::allocate(std::size_t bytes)
{
    if (chunks_.empty() || chunks_.back().capacity - chunks_.back().used < bytes) {
        const std::size_t next = chunks_.empty() ? firstChunk : std::min(chunks_.back().capacity * 2, largestChunk);
        const std::size_t capacity = std::max(next, bytes);
        if (!pay(capacity))
            return nullptr;
        chunks_.push_back({std::make_unique_for_overwrite<char[]>(capacity), 0, capacity});
    }
    Chunk& chunk = chunks_.back();
    char* place = chunk.bytes.get() + chunk.used;
    chunk.used += bytes;
    return place;
}

std::string KestoReportingMessageStore::identifier(const Message& message) const
{
    return kinds_[message.kind].key + '_' + std::to_string(message.index);
}

foundation::Dictionary KestoReportingMessageStore::counts() const
{
    foundation::Dictionary::Entries entries;
    for (const Kind& kind : kinds_)
        if (kind.count != 0)
            entries.push_back({foundation::String(kind.key), kind.count});
    return entries;
}
