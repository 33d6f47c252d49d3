// SPDX-License-Identifier: Apache-2.0
// One line of `kesto client`: a JSON array that names an operation and its arguments.
#pragma once

#include <cstdint>
#include <expected>
#include <kesto/kesto.hpp>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

struct ClientCall {
    kesto::Operation operation = kesto::Operation::GetAllReporters;
    kesto::ReporterID reporter = 0;
    kesto::ServiceType serviceType = kesto::ServiceType::Generic;
    kesto::Category category = kesto::Category::Generic;
    kesto::EventType type = kesto::EventType::Unknown;
    std::optional<std::vector<kesto::ReporterID>> reporters = std::nullopt; // none: all started sessions
    kesto::Message message = {}; // the message or the configuration
};

// The call, or what is wrong with the line and what it should be.
[[nodiscard]] std::expected<ClientCall, std::string> parseClientCall(std::string_view line);

// Makes the client's call.
[[nodiscard]] kesto::Status submit(kesto::Client& client, const ClientCall& call, kesto::AnswerCallback answered);
