// SPDX-License-Identifier: Apache-2.0
// The table of the operations that the service offers to clients. The service, the client library and the tool read it.
//
// A row holds all that a frame needs: the operation's number on the wire, its arguments and its result. Both ends of a
// connection use the table, so they cannot disagree.
#pragma once

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <initializer_list>
#include <span>
#include <string_view>
#include <utility>

namespace client {

enum class OperationArgument : std::uint8_t {
    ReporterID, // a signed integer of 64 bits
    ServiceType, // an unsigned integer of 16 bits
    Configuration, // a map
    Message, // a map
    Category, // an unsigned integer of 32 bits
    Type, // an unsigned integer of 16 bits
    ReporterIDs // an array of reporter IDs, or null
};

enum class OperationResult : std::uint8_t {
    None, // the reply has no value
    Success, // a truth value
    ServiceType, // an unsigned integer of 16 bits
    Validity, // a map of a reporter ID and a service type
    ReporterIDs // an array of reporter IDs
};

class ServiceOperation {
public:
    consteval ServiceOperation(std::string_view name, std::initializer_list<OperationArgument> arguments,
                               OperationResult result)
        : name_(name),
          argumentCount_(arguments.size()),
          result_(result)
    {
        std::ranges::copy(arguments, arguments_.begin());
    }

    [[nodiscard]] constexpr std::string_view name() const { return name_; }
    // In the order in which they stand in a call.
    [[nodiscard]] constexpr std::span<const OperationArgument> arguments() const
    {
        return std::span(arguments_).first(argumentCount_);
    }
    [[nodiscard]] constexpr OperationResult result() const { return result_; }

private:
    static constexpr std::size_t mostArguments = 4;

    std::string_view name_;
    std::array<OperationArgument, mostArguments> arguments_ = {};
    std::size_t argumentCount_;
    OperationResult result_;
};

// In the order that numbers them on the wire, from 1.
inline constexpr auto serviceOperations = [] {
    using enum OperationArgument;
    using Result = OperationResult;
    return std::to_array<ServiceOperation>({
        {"createReportingSession", {ReporterID}, Result::Success},
        {"setServiceType", {ServiceType, ReporterID}, Result::Success},
        {"getServiceNameForReporterID", {ReporterID}, Result::ServiceType},
        {"setConfiguration", {Configuration, ReporterID}, Result::Success},
        {"startReportingSessionForID", {ReporterID}, Result::Success},
        {"sendMessage", {Message, Category, Type, ReporterIDs}, Result::None},
        {"stopReportingSessionForID", {ReporterID}, Result::Success},
        {"destroyReportingSession", {ReporterID}, Result::Success},
        {"reporterID", {ReporterID}, Result::Validity},
        {"getAllReporters", {}, Result::ReporterIDs},
        {"killService", {}, Result::Success},
    });
}();

// The operation of that number, or null.
[[nodiscard]] constexpr const ServiceOperation* serviceOperationNumbered(std::int64_t number)
{
    if (number < 1 || std::cmp_greater(number, serviceOperations.size()))
        return nullptr;
    return &serviceOperations[static_cast<std::size_t>(number) - 1];
}

// A message to more reporters is refused: each of them costs as much work as the message, but only a byte of the frame.
inline constexpr std::size_t mostReportersOfAMessage = 10'000;

} // namespace client
