#include "foundation/PrettyJsonWriter.h"

#include "foundation/JsonValueWriter.h"

namespace foundation {
namespace {
using RapidWriter =
    rapidjson::PrettyWriter<JsonStringStream, rapidjson::UTF8<>, rapidjson::UTF8<>, rapidjson::CrtAllocator>;
} // namespace

class PrettyJsonWriter::Implementation {
public:
    explicit Implementation(Sink sink) : sink_(std::move(sink)) { }
    ~Implementation() { passOn(); }
    Implementation(const Implementation&) = delete;
    Implementation& operator=(const Implementation&) = delete;

    void passOnIfLarge()
    {
        constexpr std::size_t large = std::size_t{64} << 10;
        if (text_.size() >= large)
            passOn();
    }

    JsonValueWriter<RapidWriter>& writer() { return writer_; }

private:
    void passOn()
    {
        sink_(text_);
        text_.clear();
    }

    Sink sink_;
    std::string text_;
    JsonValueWriter<RapidWriter> writer_{text_, true};
};

PrettyJsonWriter::PrettyJsonWriter(Sink sink) : implementation_(std::make_unique<Implementation>(std::move(sink))) { }
PrettyJsonWriter::~PrettyJsonWriter() = default;

void PrettyJsonWriter::beginArray()
{
    implementation_->writer().StartArray();
}

void PrettyJsonWriter::endArray()
{
    implementation_->writer().EndArray();
}

void PrettyJsonWriter::beginObject()
{
    implementation_->writer().StartObject();
}

void PrettyJsonWriter::endObject()
{
    implementation_->writer().EndObject();
    implementation_->passOnIfLarge();
}

void PrettyJsonWriter::key(std::string_view key)
{
    implementation_->writer().writeText(key);
}

bool PrettyJsonWriter::write(const Value& value)
{
    return implementation_->writer().write(value);
}

bool PrettyJsonWriter::write(CborItem item)
{
    return implementation_->writer().write(item);
}

} // namespace foundation
