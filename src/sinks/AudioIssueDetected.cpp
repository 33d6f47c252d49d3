// SPDX-License-Identifier: Apache-2.0
// The record's fields on the wire, in its text, and in comparisons.
#include "sinks/AudioIssueDetected.h"

#include <functional>
#include <utility>

namespace trelmmetrics {
namespace {

// The fields by their numbers on the wire.
enum Field : std::uint32_t { Timestamp = 1, Duration, Issuetype, Node, Rtaidclient };

} // namespace

std::expected<void, foundation::ProtobufError> AudioIssueDetected::readFrom(foundation::ProtobufReader& reader)
{
    using enum foundation::ProtobufWireType;
    while (const auto field = reader.next()) {
        if (field->wireType == Varint) {
            switch (field->number) {
            case Timestamp: setTimestamp(field->integer); break;
            case Duration: duration_ = static_cast<std::uint32_t>(field->integer); break; // its low 32 bits
            default: break;
            }
        } else if (field->wireType == LengthDelimited) {
            switch (field->number) {
            case Issuetype: issuetype_ = field->bytes; break;
            case Node: node_ = field->bytes; break;
            case Rtaidclient: rtaidclient_ = field->bytes; break;
            default: break;
            }
        }
    }
    return reader.result();
}

void AudioIssueDetected::writeTo(foundation::ProtobufWriter& writer) const
{
    writer.reserve(5 * foundation::ProtobufWriter::longestHead + issuetype_.size() + node_.size()
                   + rtaidclient_.size());
    if (hasTimestamp())
        writer.writeVarint(Timestamp, timestamp_);
    writer.writeVarint(Duration, duration_);
    writer.writeString(Issuetype, issuetype_);
    writer.writeString(Node, node_);
    writer.writeString(Rtaidclient, rtaidclient_);
}

void AudioIssueDetected::formatText(foundation::ProtobufTextFormatter& formatter, std::string_view name) const
{
    formatter.beginObject(name);
    formatter.format("duration", duration_);
    formatter.format("issuetype", issuetype_);
    formatter.format("node", node_);
    formatter.format("rtaidclient", rtaidclient_);
    if (hasTimestamp())
        formatter.format("timestamp", timestamp_);
    formatter.endObject();
}

void swap(AudioIssueDetected& left, AudioIssueDetected& right) noexcept
{
    using std::swap;
    swap(left.timestamp_, right.timestamp_);
    swap(left.duration_, right.duration_);
    swap(left.issuetype_, right.issuetype_);
    swap(left.node_, right.node_);
    swap(left.rtaidclient_, right.rtaidclient_);
    swap(left.hasBits_, right.hasBits_);
}

bool operator==(const AudioIssueDetected& left, const AudioIssueDetected& right) noexcept
{
    return left.hasBits_ == right.hasBits_ && left.timestamp_ == right.timestamp_ && left.duration_ == right.duration_
        && left.issuetype_ == right.issuetype_ && left.node_ == right.node_ && left.rtaidclient_ == right.rtaidclient_;
}

std::size_t hash_value(const AudioIssueDetected& record) noexcept
{
    const std::hash<std::string> hash;
    return record.timestamp_ ^ record.duration_ ^ hash(record.issuetype_) ^ hash(record.node_)
        ^ hash(record.rtaidclient_);
}

} // namespace trelmmetrics
