// SPDX-License-Identifier: Apache-2.0
// The wireless-diagnostics metrics service's record of a detected audio issue. It is part of the message set, so that
// programs can read a received record and make one; no sink of this service sends it.
#pragma once

#include "foundation/protobuf/ProtobufMessage.h"

#include <cstddef>
#include <cstdint>
#include <expected>
#include <string>
#include <string_view>

namespace trelmmetrics {

// Text is the bytes of the wire, which are not checked to be UTF-8.
class AudioIssueDetected final : public foundation::ProtobufMessage {
public:
    AudioIssueDetected() = default;
    AudioIssueDetected(const AudioIssueDetected&) = default;
    AudioIssueDetected(AudioIssueDetected&&) = default;
    AudioIssueDetected& operator=(const AudioIssueDetected&) = default;
    AudioIssueDetected& operator=(AudioIssueDetected&&) = default;
    ~AudioIssueDetected() override = default;

    [[nodiscard]] std::expected<void, foundation::ProtobufError> readFrom(foundation::ProtobufReader& reader) override;
    // Writes the time stamp only if it is set, and every other field even if it is empty.
    void writeTo(foundation::ProtobufWriter& writer) const override;
    void formatText(foundation::ProtobufTextFormatter& formatter, std::string_view name) const override;

    [[nodiscard]] bool hasTimestamp() const noexcept { return (hasBits_ & timestampBit) != 0; }
    [[nodiscard]] std::uint64_t timestamp() const noexcept { return timestamp_; } // 0 while it is not set
    void setTimestamp(std::uint64_t timestamp) noexcept
    {
        timestamp_ = timestamp;
        hasBits_ |= timestampBit;
    }

    [[nodiscard]] std::uint32_t duration() const noexcept { return duration_; }
    void setDuration(std::uint32_t duration) noexcept { duration_ = duration; }
    [[nodiscard]] const std::string& issuetype() const noexcept { return issuetype_; }
    void setIssuetype(std::string_view issuetype) { issuetype_ = issuetype; }
    [[nodiscard]] const std::string& node() const noexcept { return node_; }
    void setNode(std::string_view node) { node_ = node; }
    [[nodiscard]] const std::string& rtaidclient() const noexcept { return rtaidclient_; }
    void setRtaidclient(std::string_view rtaidclient) { rtaidclient_ = rtaidclient; }

    friend void swap(AudioIssueDetected& left, AudioIssueDetected& right) noexcept;
    // A time stamp of 0 differs from a missing one.
    friend bool operator==(const AudioIssueDetected& left, const AudioIssueDetected& right) noexcept;
    friend std::size_t hash_value(const AudioIssueDetected& record) noexcept;

private:
    static constexpr std::uint32_t timestampBit = 1U << 0;

    std::uint64_t timestamp_ = 0;
    std::uint32_t duration_ = 0;
    std::string issuetype_;
    std::string node_;
    std::string rtaidclient_;
    std::uint32_t hasBits_ = 0;
};

} // namespace trelmmetrics
