// SPDX-License-Identifier: Apache-2.0
// The content of the connection: calls become frames, and frames become answers. It uses no sockets.
#pragma once

#include "Callback.h"
#include "foundation/cbor/Cbor.h"
#include "kesto/kesto.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace libkesto {

// Records of the queue that are not calls of the wire: those of playbacks and recordings. One of the two begins a
// session, as a start does.
constexpr kesto_operation streamOperation{-1};
constexpr kesto_operation streamStart{-2};
[[nodiscard]] constexpr bool isOfStream(kesto_operation operation) noexcept
{
    return operation == streamOperation || operation == streamStart;
}

// A call as it stands in the queue, before its reporters and entries. Plain data.
struct CallHead {
    kesto_operation operation;
    std::uint16_t type = 0; // of the event, or of the service
    bool hasReporters = false; // false: a null list
    kesto_category category = 0;
    std::uint32_t entryCount = 0;
    std::uint32_t reporterCount = 0;
    kesto_reporter reporter = 0;
    RawCallback callback = {};
    std::string* entries = nullptr; // those of a configuration, which may be too large for the queue; owned
};

// A call with all its parts, valid as long as the bytes from which it was read.
struct Call {
    CallHead head;
    std::vector<kesto_reporter> reporters;
    std::string_view entries;
};

// The head as bytes of a record of the queue, and back.
[[nodiscard]] inline std::string_view bytesOf(const CallHead& head) noexcept
{
    return {reinterpret_cast<const char*>(&head), sizeof head};
}
[[nodiscard]] CallHead readHead(std::string_view record) noexcept;
void readCall(std::string_view record, Call& call);

// The most bytes that a frame takes besides its entries.
[[nodiscard]] constexpr std::size_t frameOverhead(std::size_t reporterCount) noexcept
{
    constexpr std::size_t longestHead = 9;
    constexpr std::size_t otherItems = 6; // the array, the number, the method, the map, category, type
    return longestHead * (otherItems + 1 + reporterCount);
}

// Appends the call as a frame.
void appendCall(std::uint64_t number, const Call& call, std::string& out);

// Appends a request for the descriptors for trace events, as a frame.
void appendTraceRequest(std::uint64_t number, std::string& out);

// An answer as it came. The meaning of its values depends on the call.
struct AnswerFrame {
    std::uint64_t call = 0;
    std::optional<foundation::String> errorDomain;
    std::int64_t errorCode = 0;
    foundation::Array frame; // the values are its elements from the third on
};

// Nothing if the frame is not an answer.
[[nodiscard]] std::optional<AnswerFrame> readAnswer(std::string_view frame, foundation::CborDecoder& decoder);

// Fills in the operation's result. False if the values are not such a result. `reporters` holds the answer's list of
// reporters.
[[nodiscard]] bool readResult(const AnswerFrame& frame, kesto_answer& answer, std::vector<kesto_reporter>& reporters);

} // namespace libkesto
