// SPDX-License-Identifier: Apache-2.0
// The table of the operations says which arguments each takes, in order. The arguments are read one by one, up to the
// first wrong one. The tool's own table adds the name that a person uses for an operation, and the function to call.
#include "kesto/client/ClientCall.h"

#include "client/ServiceOperations.h"
#include "kesto/MessageKindNames.h"

#include <algorithm>
#include <array>
#include <fmt/format.h>
#include <rapidjson/document.h>
#include <rapidjson/error/en.h>

namespace {

using Json = rapidjson::Value;

using Argument = client::OperationArgument;

// An operation that takes only a reporter.
using ReporterOperation = kesto::Status (kesto::Client::*)(kesto::ReporterID reporter, kesto::AnswerCallback answered);

template <ReporterOperation operation>
kesto::Status submitReporter(kesto::Client& client, const ClientCall& call, kesto::AnswerCallback answered)
{
    return (client.*operation)(call.reporter, std::move(answered));
}

struct Form {
    std::string_view operation;
    std::string_view shortName;
    kesto::Status (*submit)(kesto::Client& client, const ClientCall& call, kesto::AnswerCallback answered);
};

// In the order of `client::serviceOperations`.
constexpr auto forms = std::to_array<Form>({
    {"createReportingSession", "create", submitReporter<&kesto::Client::createSession>},
    {"setServiceType", "setServiceType",
     [](kesto::Client& client, const ClientCall& call, kesto::AnswerCallback answered) {
         return client.setServiceType(call.serviceType, call.reporter, std::move(answered));
     }},
    {"getServiceNameForReporterID", "getServiceName", submitReporter<&kesto::Client::getServiceType>},
    {"setConfiguration", "setConfiguration",
     [](kesto::Client& client, const ClientCall& call, kesto::AnswerCallback answered) {
         return client.setConfiguration(call.message, call.reporter, std::move(answered));
     }},
    {"startReportingSessionForID", "start", submitReporter<&kesto::Client::startSession>},
    {"sendMessage", "send",
     [](kesto::Client& client, const ClientCall& call, kesto::AnswerCallback answered) {
         const auto to = call.reporters ? kesto::Reporters(*call.reporters) : kesto::Reporters::allStarted();
         return client.send(call.message, call.category, call.type, to, std::move(answered));
     }},
    {"stopReportingSessionForID", "stop", submitReporter<&kesto::Client::stopSession>},
    {"destroyReportingSession", "destroy", submitReporter<&kesto::Client::destroySession>},
    {"reporterID", "validate", submitReporter<&kesto::Client::validate>},
    {"getAllReporters", "getAllReporters",
     [](kesto::Client& client, const ClientCall&, kesto::AnswerCallback answered) {
         return client.getAllReporters(std::move(answered));
     }},
    {"killService", "kill",
     [](kesto::Client& client, const ClientCall&, kesto::AnswerCallback answered) {
         return client.killService(std::move(answered));
     }},
});
static_assert(std::ranges::equal(forms, client::serviceOperations, {}, &Form::operation,
                                 &client::ServiceOperation::name));

constexpr unsigned deepest = 30; // the most levels that the service accepts inside a call

std::string_view textOf(const Json& json)
{
    return {json.GetString(), json.GetStringLength()};
}

// Adds a value to the open array or, under its key, to the open dictionary. False if it is nested too deep.
bool append(kesto::Message& message, const Json& json, unsigned depth = 0)
{
    if (depth > deepest)
        return false;
    if (json.IsNull())
        message.append(nullptr);
    else if (json.IsBool())
        message.append(json.GetBool());
    else if (json.IsInt64())
        message.append(json.GetInt64());
    else if (json.IsUint64())
        message.append(json.GetUint64());
    else if (json.IsDouble())
        message.append(json.GetDouble());
    else if (json.IsString())
        message.append(textOf(json));
    else if (json.IsArray()) {
        message.beginArray();
        for (const Json& element : json.GetArray())
            if (!append(message, element, depth + 1))
                return false;
        message.end();
    } else {
        message.beginDictionary();
        for (const auto& [key, value] : json.GetObject()) {
            kesto_message_key(message.get(), key.GetString(), key.GetStringLength());
            if (!append(message, value, depth + 1))
                return false;
        }
        message.end();
    }
    return true;
}

bool readMessage(const Json& json, kesto::Message& message)
{
    if (!json.IsObject())
        return false;
    for (const auto& [key, value] : json.GetObject()) {
        kesto_message_key(message.get(), key.GetString(), key.GetStringLength());
        if (!append(message, value))
            return false;
    }
    return message.status() == kesto::Status::Ok;
}

// A number in the range of the enumeration, or a name that `named` knows.
template <typename Enumeration, typename Named> bool readNumberOrName(const Json& json, Enumeration& out, Named named)
{
    using Number = std::underlying_type_t<Enumeration>;
    if (json.IsUint64() && std::in_range<Number>(json.GetUint64())) {
        out = static_cast<Enumeration>(json.GetUint64());
        return true;
    }
    const auto number = json.IsString() ? named(textOf(json)) : std::nullopt;
    if (number)
        out = static_cast<Enumeration>(*number);
    return number.has_value();
}

bool readReporters(const Json& json, std::optional<std::vector<kesto::ReporterID>>& reporters)
{
    if (json.IsNull())
        return true;
    if (!json.IsArray())
        return false;
    reporters.emplace();
    for (const Json& reporter : json.GetArray()) {
        if (!reporter.IsInt64())
            return false;
        reporters->push_back(reporter.GetInt64());
    }
    return true;
}

bool read(Argument argument, const Json& json, ClientCall& call)
{
    switch (argument) {
    case Argument::ReporterID:
        if (json.IsInt64())
            call.reporter = json.GetInt64();
        return json.IsInt64();
    case Argument::ServiceType: return readNumberOrName(json, call.serviceType, serviceTypeNamed);
    case Argument::Category: return readNumberOrName(json, call.category, categoryNamed);
    case Argument::Type: return readNumberOrName(json, call.type, eventTypeNamed);
    case Argument::Configuration:
    case Argument::Message: return readMessage(json, call.message);
    case Argument::ReporterIDs: return readReporters(json, call.reporters);
    }
    return false;
}

std::string_view description(Argument argument)
{
    switch (argument) {
    case Argument::ReporterID: return "a reporter ID (a 64-bit integer)";
    case Argument::ServiceType: return "a service type (its number, or a name such as \"longformaudio\")";
    case Argument::Configuration: return "a configuration (an object)";
    case Argument::Message: return "a message (an object, at most 1 MiB, not too deep)";
    case Argument::Category: return "a category (its number, or a name such as \"Playback\" or \"DSP_Playback\")";
    case Argument::Type: return "an event type (its number, or a name such as \"Start\")";
    case Argument::ReporterIDs: return "a list of reporter IDs, or null for all";
    }
    return "nothing";
}

// The index of the operation in the table.
std::optional<std::size_t> placeNamed(std::string_view name)
{
    for (std::size_t place = 0; place < forms.size(); ++place)
        if (client::serviceOperations[place].name() == name || forms[place].shortName == name)
            return place;
    return std::nullopt;
}

// "create, start and kill"
std::string shortNames()
{
    std::string names;
    for (const Form& form : forms) {
        if (!names.empty())
            names += &form == &forms.back() ? " and " : ", ";
        names += form.shortName;
    }
    return names;
}

} // namespace

kesto::Status submit(kesto::Client& client, const ClientCall& call, kesto::AnswerCallback answered)
{
    return forms[static_cast<std::size_t>(call.operation) - 1].submit(client, call, std::move(answered));
}

std::expected<ClientCall, std::string> parseClientCall(std::string_view line)
{
    rapidjson::Document document;
    document.Parse<rapidjson::kParseIterativeFlag | rapidjson::kParseValidateEncodingFlag
                   | rapidjson::kParseFullPrecisionFlag>(line.data(), line.size());
    if (document.HasParseError())
        return std::unexpected(fmt::format("not JSON: {} (at character {})",
                                           rapidjson::GetParseError_En(document.GetParseError()),
                                           document.GetErrorOffset() + 1));
    if (!document.IsArray() || document.Empty() || !document[0].IsString())
        return std::unexpected(R"(a call is an array that begins with an operation, such as ["create", 42])");
    const auto place = placeNamed(textOf(document[0]));
    if (!place)
        return std::unexpected(
            fmt::format("unknown operation \"{}\"; there are {}", textOf(document[0]), shortNames()));

    const auto arguments = client::serviceOperations[*place].arguments();
    const std::string_view name = forms[*place].shortName;
    if (document.Size() - 1 != arguments.size())
        return std::unexpected(
            fmt::format("{} takes {} arguments, not {}", name, arguments.size(), document.Size() - 1));
    ClientCall call;
    call.operation = static_cast<kesto::Operation>(*place + 1);
    for (rapidjson::SizeType index = 0; index < arguments.size(); ++index)
        if (!read(arguments[index], document[index + 1], call))
            return std::unexpected(
                fmt::format("argument {} of {} is not {}", index + 1, name, description(arguments[index])));
    return call;
}
