// SPDX-License-Identifier: Apache-2.0
// ClickHouse takes rows as JSONEachRow, and says whose fault it is if it does not.
#pragma once

#include "fleet-database/ClickHouseServers.h"
#include "kesto-ingest/database/Database.h"

#include <cstdint>
#include <expected>
#include <string>
#include <string_view>

namespace kesto_ingest {

using fleet_database::ClickHouseConfiguration;

class ClickHouse : public Database {
public:
    explicit ClickHouse(ClickHouseConfiguration configuration);

    // Goes to the next server if one cannot be used, until each was tried.
    [[nodiscard]] InsertAnswer insert(std::string_view table, std::string_view rows) override;
    [[nodiscard]] std::expected<std::uint64_t, std::string> edition() override;

private:
    fleet_database::ClickHouseServers servers_;
};

} // namespace kesto_ingest
