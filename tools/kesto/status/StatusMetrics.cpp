// SPDX-License-Identifier: Apache-2.0
// The table of counters gives the names: keys become words of the name, and a last key that is a reason or an operation
// becomes a label.
#include "kesto/status/StatusMetrics.h"

#include "ledger/Report.h"

#include <cctype>
#include <fmt/format.h>

using foundation::Dictionary;

namespace {

// "answerBytesDropped" as "answer_bytes_dropped".
std::string snakeCase(std::string_view path)
{
    std::string name;
    for (const char character : path)
        if (character == '.')
            name += '_';
        else if (std::isupper(static_cast<unsigned char>(character)) != 0)
            name += {'_', static_cast<char>(std::tolower(static_cast<unsigned char>(character)))};
        else
            name += character;
    return name;
}

// What a key inside this group is; empty if it is a part of the name.
std::string_view labelInside(std::string_view group)
{
    const std::string_view key = group.substr(group.rfind('.') + 1);
    if (key == "refused" || key == "lost" || key == "removed")
        return "reason";
    return key == "calls" ? "operation" : "";
}

void appendHead(std::string_view name, std::string_view help, std::string_view type, std::string& text)
{
    text += fmt::format("# HELP {} {}\n# TYPE {} {}\n", name, help, name, type);
}

void appendGauge(std::string_view name, std::string_view help, std::uint64_t value, std::string& text)
{
    appendHead(name, help, "gauge", text);
    text += fmt::format("{} {}\n", name, value);
}

void appendCounters(const Dictionary& report, std::string& text)
{
    std::string lastName;
    for (const ledger::CounterRow& row : ledger::counterRows()) {
        const std::string_view group = row.path.substr(0, row.path.rfind('.'));
        const std::string_view label = group == row.path ? "" : labelInside(group);
        const std::string_view named = label.empty() ? row.path : group;
        const std::string name = fmt::format("kesto_{}_total", snakeCase(named));
        if (name != lastName)
            appendHead(name, fmt::format("The count \"{}\" of the service.", named), "counter", text);
        const std::uint64_t value = ledger::numberIn(report, row.path);
        if (label.empty())
            text += fmt::format("{} {}\n", name, value);
        else
            text += fmt::format("{}{{{}=\"{}\"}} {}\n", name, label, row.path.substr(group.size() + 1), value);
        lastName = name;
    }
}

void appendProcess(const Dictionary& report, std::string& text)
{
    appendHead("kesto_build_info", "The version of the running service.", "gauge", text);
    text += fmt::format("kesto_build_info{{version=\"{}\",internal=\"{}\"}} 1\n", report.find("version")->text(),
                        report.find("internalBuild")->asBoolean());
    appendGauge("kesto_start_time_seconds", "When the service started, in seconds since 1970.",
                ledger::numberIn(report, "started"), text);
    appendGauge("kesto_connections", "Connections that are open now.", ledger::numberIn(report, "now.connections"),
                text);
    appendGauge("kesto_sessions", "Sessions that exist now.", ledger::numberIn(report, "now.sessions"), text);
    if (report.find("now")->dictionary()->contains("waitingCalls")) { // an earlier version does not tell it
        appendGauge("kesto_waiting_calls", "Calls that wait for the server queue or run.",
                    ledger::numberIn(report, "now.waitingCalls"), text);
        appendGauge("kesto_waiting_events", "Events that the store has taken and not written.",
                    ledger::numberIn(report, "now.waitingEvents"), text);
    }
    appendGauge("kesto_memory_used_bytes", "Memory that what clients sent takes.",
                ledger::numberIn(report, "memory.used"), text);
    appendGauge("kesto_memory_limit_bytes", "Memory that what clients send may take.",
                ledger::numberIn(report, "memory.limit"), text);
    appendGauge("kesto_losses", "What was lost or refused since the service started.",
                ledger::lossesIn(*report.find("sinceStart")->dictionary()), text);
}

} // namespace

std::string metricsText(const Dictionary& report)
{
    std::string text;
    const bool isRunning = report.find("running")->asBoolean();
    appendGauge("kesto_up", "Whether the service runs.", isRunning ? 1 : 0, text);
    if (isRunning)
        appendProcess(report, text);
    appendGauge("kesto_counting_since_seconds", "When the counting began, in seconds since 1970.",
                ledger::numberIn(report, "began"), text);
    if (const auto* const storing = report.find("storing"); storing != nullptr && !storing->isNull())
        appendGauge("kesto_store_enabled", "1 while events are stored, 0 while analytics.toml says enabled = false.",
                    storing->asBoolean() ? 1 : 0, text);
    appendGauge("kesto_store_events", "Events in the store.", ledger::numberIn(report, "store.events"), text);
    appendGauge("kesto_store_size_bytes", "The size of the store's files.", ledger::numberIn(report, "store.bytes"),
                text);
    if (const std::uint64_t oldest = ledger::numberIn(report, "store.oldest"); oldest != 0)
        appendGauge("kesto_store_oldest_event_seconds", "The time of the oldest stored event, in seconds since 1970.",
                    oldest, text);
    appendCounters(report, text);
    return text;
}
