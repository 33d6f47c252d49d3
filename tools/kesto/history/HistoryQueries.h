// SPDX-License-Identifier: Apache-2.0
// What a history asks the database. ?1 is the end of the span and ?2 its beginning, or the first and the last session;
// ?3 is the only session that is asked for, or null.
#pragma once

#include <string_view>

namespace history_queries {

constexpr std::string_view tableCount = "SELECT count(*) FROM sqlite_schema WHERE type = 'table' AND name IN"
                                        " ('stretches', 'open_stretches', 'sessions', 'sources', 'store')";
constexpr std::string_view stretches = "SELECT session, recording, began, device, format, volume, seconds, ending,"
                                       " began < ?1 AND began + seconds > ?2 FROM stretches"
                                       " WHERE ?3 IS NULL OR session = ?3";
constexpr std::string_view lastWord = "SELECT wall_time FROM store WHERE wall_time IS NOT NULL";
constexpr std::string_view openStretches =
    "SELECT session, recording, arrived, device, format, volume FROM open_stretches ORDER BY id";
// An event of the category Error stands in the store under two names: by this one each counts once. SQLite finds it by
// the index of names, because the pattern is a literal.
constexpr std::string_view faultPrefix = "com.quarn.kesto.Error.";
constexpr std::string_view faults = "SELECT session, coalesce(happened, time) AS moment, name,"
                                    " iif(json_valid(payload), payload, '{}') ->> 'active_devices',"
                                    " iif(json_valid(payload), payload, '{}') ->> 'late_cycles' FROM events"
                                    " WHERE name GLOB 'com.quarn.kesto.Error.*' AND moment < ?1 AND moment >= ?2"
                                    " AND (?3 IS NULL OR session = ?3)";
constexpr std::string_view sessions =
    "SELECT s.id, s.application, s.service, c.name, c.user, c.process, s.began, s.ended FROM sessions s"
    " LEFT JOIN sources c ON c.id = s.source WHERE s.id BETWEEN ?1 AND ?2 ORDER BY s.id";

} // namespace history_queries
