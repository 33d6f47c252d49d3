// SPDX-License-Identifier: Apache-2.0
// The messages of one run of a session, in the order of acceptance, each under an identifier made of its kind
// and a running number ("Volume_Summary_3").
//
// A session may record millions of messages. So the store keeps them encoded, one behind the other in large chunks. It
// keeps no identifiers: only the number of the kind, because the index follows from the order. For each kind it also
// keeps the count and the last accepted payload, which decide about the next message.
#pragma once

#include "foundation/cbor/CborView.h"
#include "foundation/values/Value.h"
#include "session/StorageBudget.h"
#include "utility/MessageKinds.h"

#include <cstdint>
#include <cstring>
#include <deque>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

namespace session {

// One thread at a time, which the owner ensures.
class MessageStore {
    // What stands before each payload in a chunk.
    struct Head {
        std::uint32_t kind : 31;
        std::uint32_t isKeptAside : 1; // in `keptAside_`, and not encoded behind the head
        std::uint32_t size; // of the encoding
    };

public:
    enum class Outcome : std::uint8_t {
        Recorded,
        Redundant, // repeats the previous message of its kind
        Full // the budget is used up; the message is lost
    };

    // A payload as it is kept. Valid as long as the store records nothing.
    class Payload {
    public:
        [[nodiscard]] foundation::Dictionary dictionary() const;

        // One of the two is set: the encoding, or a large payload as it came (`keepLargePayloadsAsTheyCome`).
        [[nodiscard]] std::string_view encoded() const noexcept { return encoded_; }
        [[nodiscard]] const foundation::Dictionary* kept() const noexcept { return kept_; }

    private:
        friend class MessageStore;
        std::string_view encoded_;
        const foundation::Dictionary* kept_ = nullptr; // for a large payload, in place of the encoding
    };

    struct Message {
        std::uint32_t kind; // its number in `kindKey`
        std::uint64_t index; // from 1 among the messages of its kind
        Payload payload;
    };

    explicit MessageStore(std::shared_ptr<StorageBudget> budget);
    ~MessageStore() = default;
    MessageStore(const MessageStore&) = delete;
    MessageStore& operator=(const MessageStore&) = delete;

    // Records the payload unless it equals the last accepted one of its kind except for time stamps. Errors (by
    // category or type) are recorded in any case.
    Outcome record(AudioEventCategory category, AudioEventType type, const foundation::Dictionary& payload);

    // From now on large payloads are kept as they come, without an encoding. Call it before a session's summary, the
    // last message of its run: the summary may be so large that its encoding would double the memory of the run.
    // `EntryReader` does not read such payloads.
    void keepLargePayloadsAsTheyCome() noexcept { keepsLargeAside_ = true; }

    [[nodiscard]] std::size_t size() const noexcept { return size_; }
    [[nodiscard]] bool empty() const noexcept { return size_ == 0; }
    // The bytes that it has paid for.
    [[nodiscard]] std::size_t bytes() const noexcept { return share_.bytes(); }

    // Goes over the messages in the order of acceptance. A copy goes on independently from the same place. Valid as
    // long as the store records nothing.
    class Cursor {
    public:
        // Starts before the first message.
        explicit Cursor(const MessageStore& store) : store_(&store) { }
        // Goes to the next message; false when there is none.
        bool next();
        // The kind of the message at which the cursor stands.
        [[nodiscard]] std::uint32_t kind() const { return head_.kind; }
        [[nodiscard]] Payload payload() const;

    private:
        const MessageStore* store_;
        std::size_t chunk_ = 0;
        std::size_t at_ = 0; // in the chunk, behind the message
        std::size_t keptAside_ = 0; // messages kept aside that it passed
        Head head_ = {};
    };

    // Calls `visit` with each `Message`, in the order of acceptance.
    template <typename Visit> void forEach(Visit visit) const;

    // "Volume_Summary"
    [[nodiscard]] std::string_view kindKey(std::uint32_t kind) const { return kinds_[kind].key; }
    // "Volume_Summary_3"
    [[nodiscard]] std::string identifier(const Message& message) const;
    // By kind, the number of the message accepted last.
    [[nodiscard]] foundation::Dictionary counts() const;

private:
    struct Kind {
        std::string_view key; // in `kindByKey_`
        std::uint64_t count = 0;
        Payload last;
        foundation::Dictionary lastDecoded; // while `isLastDecoded`
        bool isLastDecoded = false;
        std::size_t bytesForDecoded = 0; // paid for `lastDecoded`
    };
    // What a kind takes besides its key and payloads: itself, in a vector that doubles, and its place in the index.
    static constexpr std::size_t bytesOfAKind = 2 * sizeof(Kind) + 96;
    struct Recent {
        AudioEventCategory category;
        AudioEventType type;
        std::uint32_t kind;
    };
    struct Chunk {
        std::unique_ptr<char[]> bytes;
        std::size_t used = 0;
        std::size_t capacity = 0;
    };

    std::optional<std::uint32_t> kindOf(AudioEventCategory category, AudioEventType type);
    std::optional<std::uint32_t> kindNamedLike(AudioEventCategory category, AudioEventType type);
    [[nodiscard]] static bool repeatsLast(const Kind& kind, const foundation::Dictionary& payload);
    [[nodiscard]] bool append(std::uint32_t kind, const foundation::Dictionary& payload, std::size_t bytes,
                              Payload& appended);
    [[nodiscard]] bool payForDecoded(Kind& kind, std::size_t bytes);
    [[nodiscard]] char* allocate(std::size_t bytes);

    StorageShare share_;
    std::vector<Chunk> chunks_;
    std::deque<foundation::Dictionary> keptAside_;
    bool keepsLargeAside_ = false;
    std::vector<Kind> kinds_;
    std::unordered_map<std::string, std::uint32_t> kindByKey_;
    std::optional<Recent> recent_; // the kind of the previous message
    std::size_t size_ = 0;
};

inline bool MessageStore::Cursor::next()
{
    for (; chunk_ != store_->chunks_.size(); ++chunk_, at_ = 0) {
        const Chunk& chunk = store_->chunks_[chunk_];
        if (at_ == chunk.used)
            continue;
        std::memcpy(&head_, chunk.bytes.get() + at_, sizeof head_);
        at_ += sizeof head_ + head_.size;
        keptAside_ += head_.isKeptAside;
        return true;
    }
    return false;
}

inline MessageStore::Payload MessageStore::Cursor::payload() const
{
    Payload payload;
    if (head_.isKeptAside)
        payload.kept_ = &store_->keptAside_[keptAside_ - 1];
    else
        payload.encoded_ = {store_->chunks_[chunk_].bytes.get() + at_ - head_.size, head_.size};
    return payload;
}

template <typename Visit> void MessageStore::forEach(Visit visit) const
{
    std::vector<std::uint64_t> counts(kinds_.size());
    for (Cursor cursor(*this); cursor.next();)
        visit(Message{cursor.kind(), ++counts[cursor.kind()], cursor.payload()});
}

} // namespace session
