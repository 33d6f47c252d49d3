// SPDX-License-Identifier: Apache-2.0
// Encoding and decoding the diagnostics record, compared with the class that protoc generates for the same record. Each
// side reuses its record and its bytes, as a program with many records does.
#include "AudioIssueDetected.pb.h"
#include "Groups.h"
#include "sinks/AudioIssueDetected.h"

#include <fmt/format.h>
#include <stdexcept>

namespace bench {
namespace {

constexpr std::size_t count = 500'000;

template <typename Record> Record sampleRecord()
{
    Record record;
    if constexpr (std::is_base_of_v<foundation::ProtobufMessage, Record>) {
        record.setTimestamp(1'800'000'000'000);
        record.setDuration(1500);
        record.setIssuetype("output_underrun");
        record.setNode("alsa_output.pci-0000_00_1f.3.analog-stereo");
        record.setRtaidclient("org.example.player");
    } else {
        record.set_timestamp(1'800'000'000'000);
        record.set_duration(1500);
        record.set_issuetype("output_underrun");
        record.set_node("alsa_output.pci-0000_00_1f.3.analog-stereo");
        record.set_rtaidclient("org.example.player");
    }
    return record;
}

std::string encoded(const trelmmetrics::AudioIssueDetected& record)
{
    std::string bytes;
    foundation::ProtobufWriter writer(bytes);
    record.writeTo(writer);
    return bytes;
}

double costOfEncoding()
{
    const auto record = sampleRecord<trelmmetrics::AudioIssueDetected>();
    std::string bytes;
    return nanosecondsEach(count, [&](std::size_t) {
        bytes.clear();
        foundation::ProtobufWriter writer(bytes);
        record.writeTo(writer);
        use(bytes);
    });
}

double costOfPeersEncoding()
{
    const auto record = sampleRecord<peer::AudioIssueDetected>();
    std::string bytes;
    return nanosecondsEach(count, [&](std::size_t) {
        if (!record.SerializeToString(&bytes))
            throw std::runtime_error("libprotobuf cannot encode the record");
        use(bytes);
    });
}

double costOfEncodingToNewBytes()
{
    const auto record = sampleRecord<trelmmetrics::AudioIssueDetected>();
    return nanosecondsEach(count, [&](std::size_t) { use(encoded(record)); });
}

double costOfPeersEncodingToNewBytes()
{
    const auto record = sampleRecord<peer::AudioIssueDetected>();
    return nanosecondsEach(count, [&](std::size_t) { use(record.SerializeAsString()); });
}

double costOfDecoding(const std::string& bytes)
{
    trelmmetrics::AudioIssueDetected record;
    return nanosecondsEach(count, [&](std::size_t) {
        foundation::ProtobufReader reader(bytes);
        if (!record.readFrom(reader))
            throw std::runtime_error("the record cannot be decoded");
        use(record);
    });
}

double costOfPeersDecoding(const std::string& bytes)
{
    peer::AudioIssueDetected record;
    return nanosecondsEach(count, [&](std::size_t) {
        if (!record.ParseFromString(bytes))
            throw std::runtime_error("libprotobuf cannot decode the record");
        use(record);
    });
}

} // namespace

void measureDiagnosticsRecord(const BenchOptions& options, Report& report)
{
    const std::string bytes = encoded(sampleRecord<trelmmetrics::AudioIssueDetected>());
    if (bytes != sampleRecord<peer::AudioIssueDetected>().SerializeAsString())
        throw std::runtime_error("the two records are not the same");
    const auto costs = compete(
        options, "record", costOfEncoding, costOfPeersEncoding, costOfEncodingToNewBytes, costOfPeersEncodingToNewBytes,
        [&] { return costOfDecoding(bytes); }, [&] { return costOfPeersDecoding(bytes); });
    const auto add = [&](std::string_view what, std::size_t place) {
        report.add({fmt::format("{} a diagnostics record, {} B", what, bytes.size()), "ns", costs[place],
                    PeerFigure{"libprotobuf, generated class", costs[place + 1]}, Target::ratioAtMost(1)});
    };
    add("encoding", 0);
    add("encoding, to new bytes,", 2);
    add("decoding", 4);
}

} // namespace bench
