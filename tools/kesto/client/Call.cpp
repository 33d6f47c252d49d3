// A table lists what each operation is called and which arguments it takes, in order; the arguments are read one by
// one, and the first that does not fit ends it.
#include "kesto/client/Call.h"

#include "kesto/Names.h"

#include <algorithm>
#include <array>
#include <fmt/format.h>
#include <rapidjson/document.h>
#include <rapidjson/error/en.h>

namespace {

using Json = rapidjson::Value;

enum class Argument : std::uint8_t { None, Reporter, ServiceType, Configuration, Message, Category, Type, Reporters };

struct Form {
    kesto::Operation operation;
    std::string_view name;
    std::string_view shortName;
    std::array<Argument, 4> arguments;
};

using enum Argument;
constexpr std::array<Form, 11> forms{{
    {kesto::Operation::CreateSession, "createReportingSession", "create", {Reporter}},
    {kesto::Operation::SetServiceType, "setServiceType", "setServiceType", {ServiceType, Reporter}},
    {kesto::Operation::GetServiceType, "getServiceNameForReporterID", "getServiceName", {Reporter}},
    {kesto::Operation::SetConfiguration, "setConfiguration", "setConfiguration", {Configuration, Reporter}},
    {kesto::Operation::StartSession, "startReportingSessionForID", "start", {Reporter}},
    {kesto::Operation::Send, "sendMessage", "send", {Message, Category, Type, Reporters}},
    {kesto::Operation::StopSession, "stopReportingSessionForID", "stop", {Reporter}},
    {kesto::Operation::DestroySession, "destroyReportingSession", "destroy", {Reporter}},
    {kesto::Operation::Validate, "reporterID", "validate", {Reporter}},
    {kesto::Operation::GetAllReporters, "getAllReporters", "getAllReporters", {}},
    {kesto::Operation::KillService, "killService", "kill", {}},
}};

constexpr unsigned deepest = 30; // what the service takes inside a call

std::string_view textOf(const Json& json)
{
    return {json.GetString(), json.GetStringLength()};
}

// Adds a value to the array or, under its key, to the dictionary that was begun last. False when it is too deep.
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

bool read(Argument argument, const Json& json, Call& call)
{
    switch (argument) {
    case Reporter:
        if (json.IsInt64())
            call.reporter = json.GetInt64();
        return json.IsInt64();
    case ServiceType: return readNumberOrName(json, call.serviceType, serviceTypeNamed);
    case Category: return readNumberOrName(json, call.category, categoryNamed);
    case Type: return readNumberOrName(json, call.type, eventTypeNamed);
    case Configuration:
    case Message: return readMessage(json, call.message);
    case Reporters: return readReporters(json, call.reporters);
    case None: break;
    }
    return false;
}

std::string_view description(Argument argument)
{
    switch (argument) {
    case Reporter: return "a reporter ID (a 64-bit integer)";
    case ServiceType: return "a service type (its number, or a name such as \"longformaudio\")";
    case Configuration: return "a configuration (an object)";
    case Message: return "a message (an object, at most 1 MiB, not too deep)";
    case Category: return "a category (its number, or a name such as \"Playback\" or \"DSP_Playback\")";
    case Type: return "an event type (its number, or a name such as \"Start\")";
    case Reporters: return "a list of reporter IDs, or null for all";
    case None: break;
    }
    return "nothing";
}

const Form* formNamed(std::string_view name)
{
    for (const Form& form : forms)
        if (form.name == name || form.shortName == name)
            return &form;
    return nullptr;
}

} // namespace

std::string_view operationName(kesto::Operation operation)
{
    for (const Form& form : forms)
        if (form.operation == operation)
            return form.name;
    return "unknown";
}

std::expected<Call, std::string> parseCall(std::string_view line)
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
    const Form* form = formNamed(textOf(document[0]));
    if (form == nullptr)
        return std::unexpected(
            fmt::format("unknown operation \"{}\"; there are create, setServiceType, getServiceName, setConfiguration, "
                        "start, send, stop, destroy, validate, getAllReporters and kill",
                        textOf(document[0])));

    const auto last = std::ranges::find(form->arguments, None);
    const auto expected = static_cast<rapidjson::SizeType>(last - form->arguments.begin());
    if (document.Size() - 1 != expected)
        return std::unexpected(
            fmt::format("{} takes {} arguments, not {}", form->shortName, expected, document.Size() - 1));
    Call call;
    call.operation = form->operation;
    for (rapidjson::SizeType index = 0; index < expected; ++index)
        if (!read(form->arguments[index], document[index + 1], call))
            return std::unexpected(fmt::format("argument {} of {} is not {}", index + 1, form->shortName,
                                               description(form->arguments[index])));
    return call;
}
