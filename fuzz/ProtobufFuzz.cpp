// SPDX-License-Identifier: Apache-2.0
// Foreign bytes in the wire format of protocol buffers. Reading must end, return nothing from outside the input, and
// accept a group only if its content alone is well-formed; and a record that was read must stay the same when it is
// written and read again.
#include "foundation/protobuf/ProtobufReader.h"
#include "sinks/AudioIssueDetected.h"

#include <cstdint>
#include <cstdlib>
#include <string>
#include <string_view>

namespace {

using foundation::ProtobufReader;

void require(bool holds)
{
    if (!holds)
        std::abort();
}

// Reads all fields, and those inside groups. Returns whether they are well-formed.
bool readFields(std::string_view bytes)
{
    ProtobufReader reader(bytes);
    while (const auto field = reader.next()) {
        require(field->number >= 1 && field->number < 1U << 29);
        require(field->bytes.empty()
                || (field->bytes.data() >= bytes.data()
                    && field->bytes.data() + field->bytes.size() <= bytes.data() + bytes.size()));
        if (field->wireType == foundation::ProtobufWireType::Group)
            require(readFields(field->bytes));
    }
    require(reader.next() == std::nullopt);
    return reader.result().has_value();
}

std::string written(const trelmmetrics::AudioIssueDetected& record)
{
    std::string out;
    foundation::ProtobufWriter writer(out);
    record.writeTo(writer);
    return out;
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    const std::string_view bytes(reinterpret_cast<const char*>(data), size);
    const bool isWellFormed = readFields(bytes);

    trelmmetrics::AudioIssueDetected record;
    ProtobufReader reader(bytes);
    require(record.readFrom(reader).has_value() == isWellFormed);

    const std::string encoded = written(record);
    trelmmetrics::AudioIssueDetected again;
    ProtobufReader encodedReader(encoded);
    require(again.readFrom(encodedReader).has_value());
    require(again == record && hash_value(again) == hash_value(record));
    require(written(again) == encoded);

    std::string text;
    foundation::ProtobufTextFormatter formatter(text);
    record.formatText(formatter, "record");
    return 0;
}
