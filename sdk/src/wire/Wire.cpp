// A call's shape is known, so its frame is written straight from what the caller gave, without values in between.
#include "wire/Wire.h"

#include "platform/linux/connection/FrameReader.h"

#include <cassert>
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

void appendArguments(const Call& call, std::string& out)
{
    switch (call.head.operation) {
    case KESTO_OPERATION_SET_SERVICE_TYPE:
        foundation::appendCborInteger(call.head.type, out);
        return appendReporter(call.head.reporter, out);
    case KESTO_OPERATION_SET_CONFIGURATION: appendEntries(call, out); return appendReporter(call.head.reporter, out);
    case KESTO_OPERATION_SEND:
        appendEntries(call, out);
        foundation::appendCborInteger(call.head.category, out);
        foundation::appendCborInteger(call.head.type, out);
        return appendReporters(call, out);
    case KESTO_OPERATION_GET_ALL_REPORTERS:
    case KESTO_OPERATION_KILL_SERVICE: return;
    case KESTO_OPERATION_CREATE_SESSION:
    case KESTO_OPERATION_GET_SERVICE_TYPE:
    case KESTO_OPERATION_START_SESSION:
    case KESTO_OPERATION_STOP_SESSION:
    case KESTO_OPERATION_DESTROY_SESSION:
    case KESTO_OPERATION_VALIDATE: return appendReporter(call.head.reporter, out);
    }
}

std::uint64_t argumentCount(kesto_operation operation) noexcept
{
    switch (operation) {
    case KESTO_OPERATION_GET_ALL_REPORTERS:
    case KESTO_OPERATION_KILL_SERVICE: return 0;
    case KESTO_OPERATION_SET_SERVICE_TYPE:
    case KESTO_OPERATION_SET_CONFIGURATION: return 2;
    case KESTO_OPERATION_SEND: return 4;
    default: return 1;
    }
}

template <typename Integer> std::optional<Integer> integer(const Value* value)
{
    return value == nullptr ? std::nullopt : value->exactly<Integer>();
}

bool readReporters(const Value& value, std::vector<kesto_reporter>& reporters)
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
    return true;
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
    foundation::appendCborArrayHead(2 + argumentCount(call.head.operation), frame);
    foundation::appendCborInteger(number, frame);
    foundation::appendCborInteger(static_cast<std::uint64_t>(call.head.operation), frame);
    appendArguments(call, frame);
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
    if (answer.operation == KESTO_OPERATION_SEND)
        return values.empty();
    if (values.size() != 1)
        return false;
    const Value& value = values.front();
    switch (answer.operation) {
    case KESTO_OPERATION_GET_SERVICE_TYPE: {
        const auto type = integer<kesto_service_type>(&value);
        answer.service_type = type.value_or(0);
        return type.has_value();
    }
    case KESTO_OPERATION_VALIDATE: return readValidity(value, answer);
    case KESTO_OPERATION_GET_ALL_REPORTERS:
        if (!readReporters(value, reporters))
            return false;
        answer.reporters = reporters.data();
        answer.reporter_count = reporters.size();
        return true;
    default: return readSuccess(value, answer);
    }
}

} // namespace libkesto
