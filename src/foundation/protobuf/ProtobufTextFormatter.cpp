// SPDX-License-Identifier: Apache-2.0
// Text is escaped so that the protocol's own parser reads back the same bytes.
#include "foundation/protobuf/ProtobufTextFormatter.h"

#include "foundation/text/Format.h"

#include <cassert>
#include <iterator>

namespace foundation {
namespace {

void appendEscaped(std::string_view text, std::string& out)
{
    for (const char character : text) {
        const auto byte = static_cast<unsigned char>(character);
        if (character == '"' || character == '\\')
            out.append({'\\', character});
        else if (character == '\n')
            out.append("\\n");
        else if (byte >= 0x20 && byte < 0x7F)
            out.push_back(character);
        else
            format_to(std::back_inserter(out), "\\{:03o}", byte); // always three digits: a digit may follow
    }
}

} // namespace

void ProtobufTextFormatter::beginObject(std::string_view name)
{
    indent();
    out_.append(name).append(" {\n");
    ++depth_;
}

void ProtobufTextFormatter::endObject()
{
    assert(depth_ > 0);
    --depth_;
    indent();
    out_.append("}\n");
}

void ProtobufTextFormatter::format(std::string_view name, std::uint64_t value)
{
    indent();
    format_to(std::back_inserter(out_), "{}: {}\n", name, value);
}

void ProtobufTextFormatter::format(std::string_view name, std::string_view text)
{
    indent();
    out_.append(name).append(": \"");
    appendEscaped(text, out_);
    out_.append("\"\n");
}

} // namespace foundation
