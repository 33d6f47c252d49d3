// SPDX-License-Identifier: Apache-2.0
// Batches as the other side sees them: unpacked with the library, read with another reader of JSON.
#pragma once

#include "kesto-uplink/outbox/Outbox.h"
#include "support/ParseJson.h"

#include <gtest/gtest.h>
#include <sstream>
#include <string>
#include <vector>
#include <zstd.h>

namespace kesto_uplink_test {

using foundation::Dictionary;

// The frame must name its size.
inline std::string unpacked(const std::string& bytes)
{
    const auto size = ZSTD_getFrameContentSize(bytes.data(), bytes.size());
    EXPECT_EQ(ZSTD_findFrameCompressedSize(bytes.data(), bytes.size()), bytes.size());
    if (size > 100'000'000) {
        ADD_FAILURE() << "the frame does not name its size";
        return {};
    }
    std::string text(size, '\0');
    EXPECT_EQ(ZSTD_decompress(text.data(), text.size(), bytes.data(), bytes.size()), text.size());
    return text;
}

inline std::vector<Dictionary> rowsIn(const std::string& lines)
{
    std::vector<Dictionary> rows;
    std::istringstream stream(lines);
    for (std::string line; std::getline(stream, line);) {
        const auto value = support::parseJson(line);
        EXPECT_TRUE(value && value->dictionary()) << line;
        rows.push_back(value && value->dictionary() ? *value->dictionary() : Dictionary());
    }
    EXPECT_TRUE(lines.empty() || lines.ends_with('\n'));
    return rows;
}

inline std::string textIn(const Dictionary& row, std::string_view key)
{
    const auto* const value = row.find(key);
    return value == nullptr ? "" : value->text();
}

// All batches behind the cursor, as a device sends them one after the other.
inline std::vector<kesto_uplink::Batch> allBatches(kesto_uplink::Outbox& outbox, kesto_uplink::Cursor after = {},
                                                   std::set<std::int64_t> openSessions = {})
{
    std::vector<kesto_uplink::Batch> batches;
    while (auto batch = outbox.next(after, openSessions, 5000)) {
        EXPECT_EQ(batch->first.id, batches.empty() ? batch->first.id : batches.back().last.id + 1);
        EXPECT_GE(batch->last.id, batch->first.id);
        EXPECT_EQ(batch->bytes.empty() ? "" : unpacked(batch->bytes), batch->lines);
        after = batch->last;
        openSessions = batch->openSessions;
        batches.push_back(*std::move(batch));
    }
    return batches;
}

// "kind id" of each row, without those of devices.
inline std::vector<std::string> keysIn(const std::vector<kesto_uplink::Batch>& batches)
{
    std::vector<std::string> keys;
    for (const auto& batch : batches)
        for (const Dictionary& row : rowsIn(batch.lines))
            if (textIn(row, "kind") != "device")
                keys.push_back(textIn(row, "kind") + " " + textIn(row, "id"));
    return keys;
}

} // namespace kesto_uplink_test
