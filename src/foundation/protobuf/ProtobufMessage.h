// SPDX-License-Identifier: Apache-2.0
// The room of protocol buffers: reading, writing and showing their records. It reads from memory, and opens no file.
//
// The operations of every protocol-buffers record: reading, writing and formatting.
#pragma once

#include "foundation/protobuf/ProtobufReader.h"
#include "foundation/protobuf/ProtobufTextFormatter.h"
#include "foundation/protobuf/ProtobufWriter.h"

#include <expected>
#include <string_view>

namespace foundation {

// Plain data. Different threads may use distinct messages at the same time.
class ProtobufMessage {
public:
    virtual ~ProtobufMessage() = default;

    // Reads every field that it knows, up to the end of the input. Of a repeated field the last counts; a missing field
    // keeps its value. If the input is broken, the fields before the error have been read.
    [[nodiscard]] virtual std::expected<void, ProtobufError> readFrom(ProtobufReader& reader) = 0;
    virtual void writeTo(ProtobufWriter& writer) const = 0;
    // As an object of that name, its fields in the order of their names.
    virtual void formatText(ProtobufTextFormatter& formatter, std::string_view name) const = 0;

protected:
    ProtobufMessage() = default;
    ProtobufMessage(const ProtobufMessage&) = default;
    ProtobufMessage(ProtobufMessage&&) = default;
    ProtobufMessage& operator=(const ProtobufMessage&) = default;
    ProtobufMessage& operator=(ProtobufMessage&&) = default;
};

} // namespace foundation
