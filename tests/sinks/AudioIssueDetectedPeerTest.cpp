// SPDX-License-Identifier: Apache-2.0
// libprotobuf's generated class as the other side: each reads the other's bytes, with records and foreign fields from
// RapidCheck; and the record refuses all broken bytes that libprotobuf refuses.
#include "sinks/AudioIssueDetected.h"

#include "AudioIssueDetected.pb.h"
#include "foundation/GuardedBytes.h"
#include "foundation/values/GeneratedValues.h"

#include <google/protobuf/stubs/logging.h>
#include <google/protobuf/text_format.h>
#include <google/protobuf/unknown_field_set.h>
#include <gtest/gtest.h>
#include <rapidcheck/gtest.h>

namespace {

using foundation::ProtobufReader;
using google::protobuf::UnknownFieldSet;
using trelmmetrics::AudioIssueDetected;

// Numbers of all lengths.
rc::Gen<std::uint64_t> number()
{
    return rc::gen::apply([](std::uint64_t value, int shift) { return value >> shift; },
                          rc::gen::arbitrary<std::uint64_t>(), rc::gen::inRange(0, 64));
}

AudioIssueDetected generatedRecord()
{
    AudioIssueDetected record;
    if (*rc::gen::arbitrary<bool>())
        record.setTimestamp(*number());
    record.setDuration(static_cast<std::uint32_t>(*number()));
    record.setIssuetype(*generated::text());
    record.setNode(*generated::text());
    record.setRtaidclient(*generated::text());
    return record;
}

peer::AudioIssueDetected peerOf(const AudioIssueDetected& record)
{
    peer::AudioIssueDetected other;
    if (record.hasTimestamp())
        other.set_timestamp(record.timestamp());
    other.set_duration(record.duration());
    other.set_issuetype(record.issuetype());
    other.set_node(record.node());
    other.set_rtaidclient(record.rtaidclient());
    return other;
}

// Compares only the fields: the peer also distinguishes an empty text from a missing one.
bool haveSameFields(const AudioIssueDetected& record, const peer::AudioIssueDetected& other)
{
    return record.hasTimestamp() == other.has_timestamp() && record.timestamp() == other.timestamp()
        && record.duration() == other.duration() && record.issuetype() == other.issuetype()
        && record.node() == other.node() && record.rtaidclient() == other.rtaidclient();
}

std::string written(const AudioIssueDetected& record)
{
    std::string bytes;
    foundation::ProtobufWriter writer(bytes);
    record.writeTo(writer);
    return bytes;
}

bool isReadInto(AudioIssueDetected& record, const std::string& bytes)
{
    const GuardedBytes guarded(bytes);
    ProtobufReader reader(guarded.view());
    return record.readFrom(reader).has_value();
}

// Fields of all kinds and numbers, the record's own among them, in groups within groups.
void addFields(UnknownFieldSet& fields, int depth)
{
    const int count = *rc::gen::inRange(0, 6);
    for (int each = 0; each < count; ++each) {
        const int field =
            *rc::gen::weightedOneOf<int>({{8, rc::gen::inRange(1, 9)}, {1, rc::gen::inRange(1, 1 << 29)}});
        switch (*rc::gen::inRange(0, depth > 0 ? 5 : 4)) {
        case 0: fields.AddVarint(field, *number()); break;
        case 1: fields.AddFixed32(field, static_cast<std::uint32_t>(*number())); break;
        case 2: fields.AddFixed64(field, *number()); break;
        case 3: fields.AddLengthDelimited(field, *generated::text()); break;
        default: addFields(*fields.AddGroup(field), depth - 1); break;
        }
    }
}

std::string generatedFields()
{
    UnknownFieldSet fields;
    addFields(fields, 3);
    std::string bytes;
    fields.SerializeToString(&bytes);
    return bytes;
}

RC_GTEST_PROP(AudioIssueDetectedPeer, WritesTheSameBytes, ())
{
    const AudioIssueDetected record = generatedRecord();
    RC_ASSERT(written(record) == peerOf(record).SerializeAsString());
}

RC_GTEST_PROP(AudioIssueDetectedPeer, ReadsWhatWeWrite, ())
{
    const AudioIssueDetected record = generatedRecord();
    peer::AudioIssueDetected other;
    RC_ASSERT(other.ParseFromString(written(record)));
    RC_ASSERT(haveSameFields(record, other));
}

RC_GTEST_PROP(AudioIssueDetectedPeer, WritesWhatWeRead, ())
{
    const AudioIssueDetected record = generatedRecord();
    AudioIssueDetected again;
    RC_ASSERT(isReadInto(again, peerOf(record).SerializeAsString()));
    RC_ASSERT(again == record);
}

RC_GTEST_PROP(AudioIssueDetectedPeer, FindsTheSameFieldsAmongForeignOnes, ())
{
    const std::string bytes = generatedFields() + written(generatedRecord()) + generatedFields();
    AudioIssueDetected record;
    peer::AudioIssueDetected other;
    RC_ASSERT(isReadInto(record, bytes));
    RC_ASSERT(other.ParseFromString(bytes));
    RC_ASSERT(haveSameFields(record, other));
}

// For refused bytes the fields before the error may differ, so they are not compared.
RC_GTEST_PROP(AudioIssueDetectedPeer, AcceptsWhatWeAcceptOfBrokenBytes, ())
{
    const google::protobuf::LogSilencer silent; // about text that is not UTF-8
    std::string bytes = generatedFields() + written(generatedRecord());
    const int changes = *rc::gen::inRange(1, 4);
    for (int change = 0; change < changes; ++change)
        bytes[*rc::gen::inRange<std::size_t>(0, bytes.size())] = static_cast<char>(*rc::gen::inRange(0, 256));
    bytes.resize(*rc::gen::weightedOneOf<std::size_t>(
        {{1, rc::gen::inRange<std::size_t>(0, bytes.size())}, {2, rc::gen::just(bytes.size())}}));
    AudioIssueDetected record;
    peer::AudioIssueDetected other;
    const bool isRead = isReadInto(record, bytes);
    RC_CLASSIFY(isRead, "read");
    if (!isRead)
        return;
    RC_ASSERT(other.ParseFromString(bytes));
    RC_ASSERT(haveSameFields(record, other));
}

RC_GTEST_PROP(AudioIssueDetectedPeer, ReadsOurText, ())
{
    const AudioIssueDetected record = generatedRecord();
    std::string text;
    foundation::ProtobufTextFormatter formatter(text);
    record.formatText(formatter, "record");
    peer::Named named;
    RC_ASSERT(google::protobuf::TextFormat::ParseFromString(text, &named));
    RC_ASSERT(haveSameFields(record, named.record()));
}

TEST(AudioIssueDetectedPeer, NestsGroupsAsDeepAsWeDo)
{
    const auto nested = [](unsigned depth) { return std::string(depth, '\x4B') + std::string(depth, '\x4C'); };
    for (const unsigned depth : {ProtobufReader::deepestGroup, ProtobufReader::deepestGroup + 1}) {
        AudioIssueDetected record;
        EXPECT_EQ(isReadInto(record, nested(depth)), peer::AudioIssueDetected().ParseFromString(nested(depth)))
            << depth;
    }
}

} // namespace
