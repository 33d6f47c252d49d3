// SPDX-License-Identifier: Apache-2.0
// Further keys are allowed, so that later editions may say more.
#include "kesto-uplink/transport/ConfirmationText.h"

#include <rapidjson/document.h>

namespace kesto_uplink {

std::optional<Confirmation> confirmationIn(std::string_view text)
{
    rapidjson::Document document;
    document.Parse<rapidjson::kParseIterativeFlag>(text.data(), text.size());
    if (document.HasParseError() || !document.IsObject())
        return std::nullopt;
    const auto epoch = document.FindMember("epoch");
    const auto id = document.FindMember("id");
    if (epoch == document.MemberEnd() || !epoch->value.IsString() || id == document.MemberEnd() || !id->value.IsInt64()
        || id->value.GetInt64() < 0)
        return std::nullopt;
    return Confirmation{{epoch->value.GetString(), epoch->value.GetStringLength()}, id->value.GetInt64()};
}

} // namespace kesto_uplink
