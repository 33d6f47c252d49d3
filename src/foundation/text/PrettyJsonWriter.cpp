// SPDX-License-Identifier: Apache-2.0
// RapidJSON indents; this file collects the text and passes it on in large pieces.
#include "foundation/text/PrettyJsonWriter.h"

#include "foundation/values/JsonValueWriter.h"

namespace foundation {
namespace {
using RapidWriter =
    rapidjson::PrettyWriter<JsonStringStream, rapidjson::UTF8<>, rapidjson::UTF8<>, rapidjson::CrtAllocator>;

// Writes encoded values too, without making values of them first.
class EncodedValueWriter : public JsonValueWriter<RapidWriter> {
public:
    using JsonValueWriter::JsonValueWriter;
    using JsonValueWriter::write;

    bool write(CborItem item)
    {
        switch (item.kind()) {
        case Value::Kind::Number: return writeNumber(*item.number());
        case Value::Kind::String: return writeText(item.stringView());
        case Value::Kind::Array: return writeArray(CborItems(item));
        default: return write(item.value());
        }
    }

private:
    bool writeArray(CborItems elements)
    {
        StartArray();
        for (const CborItem element : elements)
            if (!write(element))
                return false;
        return EndArray();
    }
};
} // namespace

class PrettyJsonWriter::Implementation {
public:
    explicit Implementation(Sink sink) : sink_(std::move(sink)) { }
    ~Implementation() { passOn(); }
    Implementation(const Implementation&) = delete;
    Implementation& operator=(const Implementation&) = delete;

    [[nodiscard]] bool isWhole() const { return isWhole_; }

    // Calls `write` with the writer, unless an earlier value has failed.
    template <typename Write> void write(Write write)
    {
        isWhole_ = isWhole_ && write(writer_);
        constexpr std::size_t large = std::size_t{64} << 10;
        if (text_.size() >= large)
            passOn();
    }

    void writeMember(std::string_view key, CborItem value, std::string& text)
    {
        write([&](auto& writer) {
            const std::size_t before = text_.size();
            const bool isWritten = writer.writeText(key) && writer.write(value);
            text.assign(text_, text_.find('"', before)); // behind the indent
            return isWritten;
        });
    }

private:
    void passOn()
    {
        sink_(text_);
        text_.clear();
    }

    Sink sink_;
    std::string text_;
    EncodedValueWriter writer_{text_, true};
    bool isWhole_ = true;
};

PrettyJsonWriter::PrettyJsonWriter(Sink sink) : implementation_(std::make_unique<Implementation>(std::move(sink))) { }
PrettyJsonWriter::~PrettyJsonWriter() = default;

void PrettyJsonWriter::beginArray()
{
    implementation_->write([](auto& writer) { return writer.StartArray(); });
}

void PrettyJsonWriter::endArray()
{
    implementation_->write([](auto& writer) { return writer.EndArray(); });
}

void PrettyJsonWriter::beginObject()
{
    implementation_->write([](auto& writer) { return writer.StartObject(); });
}

void PrettyJsonWriter::endObject()
{
    implementation_->write([](auto& writer) { return writer.EndObject(); });
}

void PrettyJsonWriter::key(std::string_view key)
{
    implementation_->write([key](auto& writer) { return writer.writeText(key); });
}

void PrettyJsonWriter::write(const Value& value)
{
    implementation_->write([&value](auto& writer) { return writer.write(value); });
}

void PrettyJsonWriter::write(CborItem item)
{
    implementation_->write([item](auto& writer) { return writer.write(item); });
}

void PrettyJsonWriter::writeMember(std::string_view key, CborItem value, std::string& text)
{
    implementation_->writeMember(key, value, text);
}

void PrettyJsonWriter::writeMember(std::string_view text)
{
    implementation_->write([text](auto& writer) { return writer.writeMember(text); });
}

bool PrettyJsonWriter::isWhole() const
{
    return implementation_->isWhole();
}

} // namespace foundation
