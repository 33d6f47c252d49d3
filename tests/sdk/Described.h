// SPDX-License-Identifier: Apache-2.0
// Calls as a test reads them: "create", "type 7", "Volume State {...}", with the message as JSON.
#pragma once

#include "foundation/values/Json.h"
#include "sdk/FakeService.h"
#include "utility/MessageKinds.h"

#include <algorithm>
#include <cstdint>
#include <iterator>
#include <string>
#include <vector>

namespace sdk_test {

[[nodiscard]] inline std::string jsonAt(const foundation::Array& call, std::size_t index)
{
    std::string json;
    foundation::appendJsonText(call[index], json);
    return json;
}

// Without the reporter.
[[nodiscard]] inline std::string described(const foundation::Array& call)
{
    switch (method(call)) {
    case 1: return "create";
    case 2: return "type " + std::to_string(integerAt(call, 2));
    case 4: return "configure " + jsonAt(call, 2);
    case 5: return "start";
    case 6:
        return KestoReportingUtilityCategoryString(static_cast<AudioEventCategory>(integerAt(call, 3))) + " "
            + std::string(KestoReportingUtilityTypeString(static_cast<AudioEventType>(integerAt(call, 4)))) + " "
            + jsonAt(call, 2);
    case 7: return "stop";
    case 8: return "destroy";
    default: return "method " + std::to_string(method(call));
    }
}

[[nodiscard]] inline std::vector<std::string> described(const std::vector<foundation::Array>& calls)
{
    std::vector<std::string> texts;
    std::ranges::transform(calls, std::back_inserter(texts), [](const auto& call) { return described(call); });
    return texts;
}

// The reporter of one of these calls.
[[nodiscard]] inline std::int64_t reporterOf(const foundation::Array& call)
{
    switch (method(call)) {
    case 2:
    case 4: return integerAt(call, 3);
    case 6: return integerAt(*call[5].array(), 0);
    default: return integerAt(call, 2);
    }
}

} // namespace sdk_test
