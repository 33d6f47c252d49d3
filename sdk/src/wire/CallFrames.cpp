// SPDX-License-Identifier: Apache-2.0
// The shape of a call is known, so its frame is written directly from the caller's data, without values in between.
#include "wire/CallFrames.h"

#include "client/ServiceOperations.h"
#include "platform/linux/connection/FrameReader.h"

#include <cstring>
#include <span>

namespace libkesto {
namespace {

using foundation::Value;

void appendReporter(kesto_reporter reporter, std::string& out)
{
    foundation::appendCbor(Value(reporter), out);
}

void appendEntries(const Call& call, std::string& out)
{
    foundation::appendCborMapHead(call.head.entryCount, out);
    out += call.entries;
}

void appendReporters(const Call& call, std::string& out)
{
    if (!call.head.hasReporters)
        return foundation::appendCborNull(out);
    foundation::appendCborArrayHead(call.reporters.size(), out);
    for (const kesto_reporter reporter : call.reporters)
        appendReporter(reporter, out);
}

const client::ServiceOperation& operationOf(kesto_operation operation)
{
    return *client::serviceOperationNumbered(operation);
}

void appendArgument(client::OperationArgument argument, const Call& call, std::string& out)
{
    switch (argument) {
    case client::OperationArgument::ReporterID: return appendReporter(call.head.reporter, out);
    case client::OperationArgument::Configuration:
    case client::OperationArgument::Message: return appendEntries(call, out);
    case client::OperationArgument::Category: return foundation::appendCborInteger(call.head.category, out);
    case client::OperationArgument::ServiceType:
    case client::OperationArgument::Type: return foundation::appendCborInteger(call.head.type, out);
    case client::OperationArgument::ReporterIDs: return appendReporters(call, out);
    }
}

template <typename Integer> std::optional<Integer> integer(const Value* value)
{
    return value == nullptr ? std::nullopt : value->exactly<Integer>();
}

bool readReporters(const Value& value, kesto_answer& answer, std::vector<kesto_reporter>& reporters)
{
    const auto array = value.array();
    if (!array)
        return false;
    reporters.clear();
    for (const Value& element : *array) {
        const auto reporter = element.exactly<kesto_reporter>();
        if (!reporter)
            return false;
        reporters.push_back(*reporter);
    }
    answer.reporters = reporters.data();
    answer.reporter_count = reporters.size();
    return true;
}

bool readServiceType(const Value& value, kesto_answer& answer)
{
    const auto type = value.exactly<kesto_service_type>();
    answer.service_type = type.value_or(0);
    return type.has_value();
}

bool readValidity(const Value& value, kesto_answer& answer)
{
    const auto dictionary = value.dictionary();
    if (!dictionary)
        return false;
    const auto reporter = integer<kesto_reporter>(dictionary->find("reporterID"));
    const auto type = integer<kesto_service_type>(dictionary->find("serviceType"));
    answer.valid_reporter = reporter.value_or(0);
    answer.service_type = type.value_or(0);
    return reporter && type;
}

bool readSuccess(const Value& value, kesto_answer& answer)
{
    const auto number = value.number();
    answer.success = number && number->booleanValue();
    return number && number->kind() == foundation::Number::Kind::Boolean;
}

} // namespace

CallHead readHead(std::string_view record) noexcept
{
    CallHead head{};
    std::memcpy(&head, record.data(), sizeof head);
    return head;
}

void readCall(std::string_view record, Call& call)
{
    call.head = readHead(record);
    record.remove_prefix(sizeof call.head);
    call.reporters.resize(call.head.reporterCount);
    const std::size_t reporterBytes = call.reporters.size() * sizeof(kesto_reporter);
    if (reporterBytes > 0)
        std::memcpy(call.reporters.data(), record.data(), reporterBytes);
    record.remove_prefix(reporterBytes);
    call.entries = call.head.entries == nullptr ? record : std::string_view(*call.head.entries);
}

void appendCall(std::uint64_t number, const Call& call, std::string& out)
{
    std::string frame;
    frame.reserve(frameOverhead(call.reporters.size()) + call.entries.size());
    const auto arguments = operationOf(call.head.operation).arguments();
    foundation::appendCborArrayHead(2 + arguments.size(), frame);
    foundation::appendCborInteger(number, frame);
    foundation::appendCborInteger(static_cast<std::uint64_t>(call.head.operation), frame);
    for (const client::OperationArgument argument : arguments)
        appendArgument(argument, call, frame);
    platform::appendFrame(frame, out);
}

void appendTraceRequest(std::uint64_t number, std::string& out)
{
    std::string frame;
    foundation::appendCborArrayHead(2, frame);
    foundation::appendCborInteger(number, frame);
    foundation::appendCborText("trace", frame);
    platform::appendFrame(frame, out);
}

std::optional<AnswerFrame> readAnswer(std::string_view frame, foundation::CborDecoder& decoder)
{
    constexpr std::size_t headCount = 2; // the call's number and the error
    constexpr std::size_t errorCount = 2; // its domain and its code
    const auto item = decoder.decode(frame);
    const auto array = item ? item->array() : std::nullopt;
    if (!array || array->size() < headCount)
        return std::nullopt;
    const auto call = integer<std::uint64_t>(&(*array)[0]);
    if (!call)
        return std::nullopt;
    AnswerFrame answer{*call, std::nullopt, 0, *array};
    if ((*array)[1].isNull())
        return answer;
    const auto error = (*array)[1].array();
    if (!error || error->size() != errorCount)
        return std::nullopt;
    answer.errorDomain = (*error)[0].string();
    const auto code = integer<std::int64_t>(&(*error)[1]);
    if (!answer.errorDomain || !code)
        return std::nullopt;
    answer.errorCode = *code;
    return answer;
}

bool readResult(const AnswerFrame& frame, kesto_answer& answer, std::vector<kesto_reporter>& reporters)
{
    const std::span<const Value> values = frame.frame.values().subspan(2);
    const client::OperationResult result = operationOf(answer.operation).result();
    if (result == client::OperationResult::None)
        return values.empty();
    if (values.size() != 1)
        return false;
    const Value& value = values.front();
    switch (result) {
    case client::OperationResult::None: break;
    case client::OperationResult::Success: return readSuccess(value, answer);
    case client::OperationResult::ServiceType: return readServiceType(value, answer);
    case client::OperationResult::Validity: return readValidity(value, answer);
    case client::OperationResult::ReporterIDs: return readReporters(value, answer, reporters);
    }
    return false;
}

} // namespace libkesto
