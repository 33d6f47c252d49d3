// The messages of one run of a session, in the order of acceptance, each under an identifier made of its kind
// and a running number ("Volume_Summary_3").
//
// A session may record millions of messages, so they are kept encoded, one behind the other in large
// chunks, and identifiers are not kept at all: the kind's number is, and the index follows from the
// order. What decides on the next message is kept ready: per kind, the count and the payload accepted last.
#pragma once

#include "foundation/Cbor.h"
#include "foundation/Value.h"
#include "session/KestoReportingStorageBudget.h"
#include "utility/KestoReportingVocabulary.h"

#include <cstdint>
#include <functional>
#include <memory>
#include <span>
#include <string>
#include <unordered_map>
#include <vector>

// The owner keeps calls apart: one thread at a time.
class KestoReportingMessageStore {
public:
    enum class Outcome : std::uint8_t {
        Recorded,
        Redundant, // says the same as the message of its kind before it
        Full // the budget is used up; the message is lost
    };

    explicit KestoReportingMessageStore(std::shared_ptr<KestoReportingStorageBudget> budget);
    ~KestoReportingMessageStore();
    KestoReportingMessageStore(const KestoReportingMessageStore&) = delete;
    KestoReportingMessageStore& operator=(const KestoReportingMessageStore&) = delete;

    // Records the payload unless it repeats the one accepted last of its kind, time stamps aside. Errors
    // (by category or type) are recorded even then.
    Outcome record(AudioEventCategory category, AudioEventType type, const foundation::Dictionary& payload);

    [[nodiscard]] std::size_t size() const noexcept { return size_; }
    [[nodiscard]] bool empty() const noexcept { return size_ == 0; }
    // The bytes that the recorded messages take.
    [[nodiscard]] std::size_t bytes() const noexcept { return bytesTaken_; }

    // Calls `visit` for each message in the order of acceptance.
    void forEach(
        const std::function<void(const std::string& identifier, const foundation::Dictionary& payload)>& visit) const;

    // By kind ("Volume_Summary"), the number of the message accepted last.
    [[nodiscard]] foundation::Dictionary counts() const;

private:
    struct Kind {
        std::string key;
        std::uint64_t count = 0;
        std::string_view lastEncoded; // in a chunk
        foundation::Dictionary lastPayload; // where it is small: decoded
        bool hasLastPayload = false;
    };
    struct Chunk {
        std::unique_ptr<char[]> bytes;
        std::size_t used = 0;
        std::size_t capacity = 0;
    };

    std::uint32_t kindOf(AudioEventCategory category, AudioEventType type);
    [[nodiscard]] static bool repeatsLast(const Kind& kind, const foundation::Dictionary& payload);
    [[nodiscard]] char* allocate(std::size_t bytes);

    std::shared_ptr<KestoReportingStorageBudget> budget_;
    std::vector<Chunk> chunks_;
    std::vector<Kind> kinds_;
    std::unordered_map<std::string, std::uint32_t> kindByKey_;
    std::size_t size_ = 0;
    std::size_t bytesTaken_ = 0;
    std::string scratch_;
};
