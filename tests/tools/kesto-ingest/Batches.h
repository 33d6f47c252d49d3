// SPDX-License-Identifier: Apache-2.0
// Batches as devices send them, made by hand.
#pragma once

#include <fmt/format.h>
#include <zstd.h>

#include <stdexcept>
#include <string>
#include <string_view>

namespace kesto_ingest {

inline constexpr std::string_view deviceA = "0123456789abcdef0123456789abcdef";
inline constexpr std::string_view deviceB = "fedcba9876543210fedcba9876543210";
inline constexpr std::string_view epochA = "00000000000000000000000000000001";

inline std::string compressed(std::string_view content)
{
    std::string bytes(ZSTD_compressBound(content.size()), '\0');
    const std::size_t size = ZSTD_compress(bytes.data(), bytes.size(), content.data(), content.size(), 1);
    if (ZSTD_isError(size) != 0)
        throw std::runtime_error("cannot compress");
    bytes.resize(size);
    return bytes;
}

// Lines with their ends. All times are in the week of Monday, 16 November 2026.
inline std::string deviceLine(int first, int last, std::string_view device = deviceA)
{
    return fmt::format(R"({{"device":"{}","epoch":"{}","kind":"device","model":"lamp","version":"1.2",)"
                       R"("sent":1795264600.5,"first":{},"last":{}}})"
                       "\n",
                       device, epochA, first, last);
}

inline std::string eventLine(int id, std::string_view device = deviceA,
                             std::string_view payload = R"({"late_cycles":3})")
{
    return fmt::format(R"({{"device":"{}","epoch":"{}","kind":"event","id":{},"time":1795264505.66,)"
                       R"("name":"com.quarn.kesto.Error.IssueDetector","session":7,"application":"player",)"
                       R"("payload":{}}})"
                       "\n",
                       device, epochA, id, payload);
}

inline std::string stretchLine(int id, std::string_view device = deviceA)
{
    return fmt::format(R"({{"device":"{}","epoch":"{}","kind":"stretch","id":{},"recording":false,)"
                       R"("began":1795264500.25,"seconds":12.5,"session":7,"device_name":"headset","channels":2,)"
                       R"("volume":0.5,"application":"player","ending":"stopped"}})"
                       "\n",
                       device, epochA, id);
}

// A session with `ended`, if it is not empty.
inline std::string sessionLine(int id, std::string_view ended, std::string_view device = deviceA)
{
    return fmt::format(R"({{"device":"{}","epoch":"{}","kind":"session","id":{},"reporter":-5,"application":"player",)"
                       R"("began":1795264400{}}})"
                       "\n",
                       device, epochA, id, ended.empty() ? "" : fmt::format(",\"ended\":{}", ended));
}

} // namespace kesto_ingest
