// SPDX-License-Identifier: Apache-2.0
// Batches come from devices that others hold in their hands. For all bytes, as a compressed batch and as its lines,
// reading must end with a reason or with rows; and what becomes a row of the database must be one line of JSON of its
// own, with a payload that is JSON, too.
#include "kesto-ingest/batch/Batch.h"

#include <rapidjson/document.h>

#include <cstdint>
#include <cstdlib>
#include <string_view>

namespace {

void require(bool holds)
{
    if (!holds)
        std::abort();
}

void check(const std::expected<kesto_ingest::Batch, std::string>& batch)
{
    if (!batch) {
        require(!batch.error().empty());
        return;
    }
    require(batch->device.size() == 32 && batch->epoch.size() == 32 && !batch->rows.empty());
    for (const kesto_ingest::Row& row : batch->rows) {
        const std::string_view json = batch->jsonOf(row);
        require(json.find('\n') == json.size() - 1);
        rapidjson::Document document;
        document.Parse<rapidjson::kParseValidateEncodingFlag>(json.data(), json.size());
        require(document.IsObject() && document.HasMember("device") && document["device"].GetString() == batch->device);
        require(document.HasMember("payload") == (row.table == kesto_ingest::Table::Events));
        if (row.table == kesto_ingest::Table::Events) {
            rapidjson::Document payload;
            const auto& text = document["payload"];
            payload.Parse<rapidjson::kParseNumbersAsStringsFlag>(text.GetString(), text.GetStringLength());
            require(payload.IsObject());
        }
    }
    require(batch->badRows.size() <= kesto_ingest::mostBadRows);
    for (const kesto_ingest::BadRow& row : batch->badRows)
        require(!row.reason.empty());
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    const std::string_view bytes(reinterpret_cast<const char*>(data), size);
    check(kesto_ingest::readBatch(bytes));
    check(kesto_ingest::readLines(bytes));
    return 0;
}
