// SPDX-License-Identifier: Apache-2.0
// The compact form, in one piece.
#include "foundation/values/Json.h"

#include "foundation/values/JsonValueWriter.h"

namespace foundation {
namespace {
using JsonWriter =
    JsonValueWriter<rapidjson::Writer<JsonStringStream, rapidjson::UTF8<>, rapidjson::UTF8<>, rapidjson::CrtAllocator>>;
} // namespace

bool appendJson(const Value& value, std::string& out)
{
    const std::size_t before = out.size();
    if (JsonWriter(out, true).write(value))
        return true;
    out.resize(before);
    return false;
}

void appendJsonText(const Value& value, std::string& out)
{
    JsonWriter(out, false).write(value);
}

} // namespace foundation
