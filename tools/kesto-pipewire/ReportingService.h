// SPDX-License-Identifier: Apache-2.0
// The reporting service as the reporter sees it: the operations on one session.
//
// An interface, so that the reporter can be tested without a service.
#pragma once

#include <kesto/kesto.hpp>

#include <cstdint>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

namespace kesto_pipewire {

using kesto::Category;
using kesto::EventType;
using kesto::ReporterID;
using kesto::ServiceType;

// Keys are constants of the program.
using PayloadValue = std::variant<bool, std::int64_t, double, std::string>;
using Payload = std::vector<std::pair<std::string_view, PayloadValue>>;

// Calls take effect in their order, some time later; they do not report failures to the caller.
class ReportingService {
public:
    virtual ~ReportingService() = default;

    virtual void create(ReporterID session) = 0;
    virtual void setServiceType(ReporterID session, ServiceType type) = 0;
    virtual void setConfiguration(ReporterID session, const Payload& configuration) = 0;
    virtual void start(ReporterID session) = 0;
    virtual void send(ReporterID session, Category category, EventType type, const Payload& message) = 0;
    virtual void stop(ReporterID session) = 0;
    virtual void destroy(ReporterID session) = 0;
};

} // namespace kesto_pipewire
