// SPDX-License-Identifier: Apache-2.0
// A reporting service that only records its calls.
#pragma once

#include "kesto-pipewire/ReportingService.h"
#include "utility/MessageKinds.h"

#include <fmt/format.h>

#include <algorithm>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace kesto_pipewire {

class FakeReportingService : public ReportingService {
public:
    struct Call {
        ReporterID session = 0;
        std::string
            what; // "create", "service type", "configuration", "start", "Playback Start", ..., "stop", "destroy"
        Payload payload; // of messages and configurations; a service type is under "type"

        // The value under the key; nothing if it is missing or has another type.
        template <typename Value> [[nodiscard]] std::optional<Value> get(std::string_view key) const
        {
            for (const auto& [name, value] : payload)
                if (const auto* found = std::get_if<Value>(&value); found && name == key)
                    return *found;
            return std::nullopt;
        }
        [[nodiscard]] bool has(std::string_view key) const
        {
            return std::ranges::any_of(payload, [key](const auto& entry) { return entry.first == key; });
        }
        [[nodiscard]] double time() const { return get<double>("kestoreporting_timestamp").value_or(0); }
        [[nodiscard]] bool isMessage() const { return has("kestoreporting_timestamp"); }
        // The message without its time stamps.
        [[nodiscard]] Payload content() const
        {
            auto rest = payload;
            std::erase_if(rest, [](const auto& entry) {
                return entry.first == "kestoreporting_timestamp" || entry.first == "systemuptime_sec";
            });
            return rest;
        }
    };

    void create(ReporterID session) override { calls.push_back({session, "create", {}}); }
    void setServiceType(ReporterID session, ServiceType type) override
    {
        calls.push_back({session, "service type", {{"type", static_cast<std::int64_t>(type)}}});
    }
    void setConfiguration(ReporterID session, const Payload& configuration) override
    {
        calls.push_back({session, "configuration", configuration});
    }
    void start(ReporterID session) override { calls.push_back({session, "start", {}}); }
    void send(ReporterID session, Category category, EventType type, const Payload& message) override
    {
        calls.push_back(
            {session,
             fmt::format("{} {}", KestoReportingUtilityCategoryString(static_cast<AudioEventCategory>(category)),
                         KestoReportingUtilityTypeString(static_cast<AudioEventType>(type))),
             message});
    }
    void stop(ReporterID session) override { calls.push_back({session, "stop", {}}); }
    void destroy(ReporterID session) override { calls.push_back({session, "destroy", {}}); }

    // The calls in order, messages with their time since `origin`, such as "Playback Start 10.5".
    [[nodiscard]] std::vector<std::string> told(double origin) const
    {
        std::vector<std::string> texts;
        for (const auto& call : calls)
            texts.push_back(call.isMessage() ? fmt::format("{} {:.6g}", call.what, call.time() - origin) : call.what);
        return texts;
    }
    [[nodiscard]] std::vector<Call> callsOf(std::string_view what) const
    {
        std::vector<Call> found;
        for (const auto& call : calls)
            if (call.what == what)
                found.push_back(call);
        return found;
    }

    std::vector<Call> calls;
};

} // namespace kesto_pipewire
