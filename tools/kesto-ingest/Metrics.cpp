// SPDX-License-Identifier: Apache-2.0
// One row for each counter; rows with the same name stand together, as the format demands.
#include "kesto-ingest/Metrics.h"

#include <fmt/format.h>

#include <iterator>
#include <string_view>

namespace kesto_ingest {

namespace {

struct MetricRow {
    std::string_view name;
    std::string_view label;
    std::string_view help;
};

constexpr std::array<MetricRow, static_cast<std::size_t>(Counter::Count)> rows = {
    MetricRow{"kesto_ingest_batches_taken_total", "", "Batches that came from the stream."},
    MetricRow{"kesto_ingest_batches_repeated_total", "", "Those of them that came before, to this copy or another."},
    MetricRow{"kesto_ingest_batches_stored_total", "", "Batches whose rows are stored, and whose devices know it."},
    MetricRow{"kesto_ingest_batches_refused_total", "{reason=\"unreadable\"}",
              "Batches that were put aside as a whole."},
    MetricRow{"kesto_ingest_batches_refused_total", "{reason=\"forged\"}", ""},
    MetricRow{"kesto_ingest_rows_stored_total", "{table=\"batches\"}", "Rows that the database has taken."},
    MetricRow{"kesto_ingest_rows_stored_total", "{table=\"events\"}", ""},
    MetricRow{"kesto_ingest_rows_stored_total", "{table=\"stretches\"}", ""},
    MetricRow{"kesto_ingest_rows_stored_total", "{table=\"sessions\"}", ""},
    MetricRow{"kesto_ingest_rows_refused_total", "{reason=\"schema\"}", "Rows that were put aside."},
    MetricRow{"kesto_ingest_rows_refused_total", "{reason=\"database\"}", ""},
    MetricRow{"kesto_ingest_letters_lost_total", "", "Dead letters that the stream refused for their size."},
    MetricRow{"kesto_ingest_taken_bytes_total", "", "Compressed bytes that came from the stream."},
    MetricRow{"kesto_ingest_inserts_total", "", "Blocks that the database has taken."},
    MetricRow{"kesto_ingest_insert_failures_total", "", "Attempts to store that failed; each is repeated."},
    MetricRow{"kesto_ingest_stream_failures_total", "", "Questions to the stream that failed; each is repeated."},
};

void append(std::string_view name, std::string_view label, std::string_view type, std::string_view help,
            std::int64_t value, std::string& text)
{
    if (!help.empty())
        fmt::format_to(std::back_inserter(text), "# HELP {0} {1}\n# TYPE {0} {2}\n", name, help, type);
    fmt::format_to(std::back_inserter(text), "{}{} {}\n", name, label, value);
}

} // namespace

std::string Metrics::text() const
{
    std::string text;
    for (std::size_t place = 0; place < rows.size(); ++place)
        append(rows[place].name, rows[place].label, "counter", rows[place].help,
               static_cast<std::int64_t>(counters_[place].load()), text);
    append("kesto_ingest_waiting_rows", "", "gauge", "Rows that are taken and not stored.",
           static_cast<std::int64_t>(waitingRows.load()), text);
    append("kesto_ingest_database_up", "", "gauge", "Whether the database answered the last time.",
           isDatabaseUp ? 1 : 0, text);
    append("kesto_ingest_stream_up", "", "gauge", "Whether the stream answered the last time.", isStreamUp ? 1 : 0,
           text);
    append("kesto_ingest_last_stored_seconds", "", "gauge", "When rows were stored last, in seconds since 1970.",
           lastStored, text);
    return text;
}

} // namespace kesto_ingest
