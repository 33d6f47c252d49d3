// SPDX-License-Identifier: Apache-2.0
// The answers that a start can still get depend on its session's state, so the table follows that state like the
// service.
#include "calls/CallTable.h"

#include <string>

namespace libkesto {
namespace {

kesto_answer answerTo(std::uint64_t number, kesto_operation operation, kesto_reporter reporter) noexcept
{
    kesto_answer answer{};
    answer.call = number;
    answer.operation = operation;
    answer.reporter = reporter;
    answer.service_type = KESTO_SERVICE_UNKNOWN;
    return answer;
}

// Whether the service answers the operation only after all its answers to earlier starts of the same reporter.
bool endsEarlierStarts(kesto_operation operation) noexcept
{
    return operation == KESTO_OPERATION_STOP_SESSION || operation == KESTO_OPERATION_DESTROY_SESSION
        || operation == KESTO_OPERATION_CREATE_SESSION;
}

} // namespace

void answerWithError(std::uint64_t number, kesto_operation operation, kesto_reporter reporter, const Callback& callback,
                     kesto_status status)
{
    kesto_answer answer = answerTo(number, operation, reporter);
    answer.error_domain = KESTO_ERROR_DOMAIN;
    answer.error_code = status;
    callback(answer);
}

CallTable::PendingCall::PendingCall(const CallHead& head) noexcept
    : operation(head.operation),
      reporter(head.reporter),
      answersLeft(head.operation == KESTO_OPERATION_GET_SERVICE_TYPE && head.reporter == 0 ? 2 : 1),
      callback(head.callback)
{
}

void CallTable::add(std::uint64_t number, const CallHead& head)
{
    const bool isStart = head.operation == KESTO_OPERATION_START_SESSION;
    if (isStart)
        startsByReporter_.emplace(head.reporter, number);
    (isStart ? starts_ : calls_).try_emplace(number, head); // last: it takes over the callback and cannot fail then
}

bool CallTable::answer(const AnswerFrame& frame)
{
    if (const auto start = starts_.find(frame.call); start != starts_.end()) {
        if (!deliver(frame, start->second))
            return false;
        deliverToStart(start);
        return true;
    }
    const auto call = calls_.find(frame.call);
    if (call == calls_.end()) {
        ++counters_.unexpectedAnswers;
        return true;
    }
    PendingCall& pending = call->second;
    if (endsEarlierStarts(pending.operation))
        endStarts(pending.reporter, frame.call);
    if (!deliver(frame, pending))
        return false;
    if (--pending.answersLeft == 0)
        calls_.erase(call);
    return true;
}

bool CallTable::deliver(const AnswerFrame& frame, const PendingCall& call)
{
    kesto_answer answer = answerTo(frame.call, call.operation, call.reporter);
    std::string domain;
    if (frame.errorDomain) {
        domain = frame.errorDomain->view();
        answer.error_domain = domain.c_str();
        answer.error_code = frame.errorCode;
    } else if (!readResult(frame, answer, reporters_)) {
        return false;
    }
    if (call.operation == KESTO_OPERATION_SEND) {
        ++counters_.answered;
        if (frame.errorDomain)
            ++counters_.refused;
    }
    call.callback(answer);
    return true;
}

// A start stays for a second answer. Only a reporter's oldest start can get one, because later ones found it started.
void CallTable::deliverToStart(Calls::iterator start)
{
    start->second.answersLeft = 0;
    if (hasOlderStart(start->second.reporter, start->first) || starts_.size() > mostAnsweredStarts)
        eraseStart(start);
}

bool CallTable::hasOlderStart(kesto_reporter reporter, std::uint64_t number) const
{
    return startsByReporter_.lower_bound({reporter, 0})->second < number;
}

void CallTable::endStarts(kesto_reporter reporter, std::uint64_t before)
{
    for (auto entry = startsByReporter_.lower_bound({reporter, 0});
         entry != startsByReporter_.end() && entry->first == reporter && entry->second < before;
         entry = startsByReporter_.lower_bound({reporter, 0})) {
        const auto start = starts_.find(entry->second);
        if (start->second.answersLeft > 0)
            answerWithError(start->first, start->second.operation, reporter, start->second.callback,
                            KESTO_SESSION_ENDED);
        eraseStart(start);
    }
}

void CallTable::eraseStart(Calls::iterator start)
{
    startsByReporter_.erase({start->second.reporter, start->first});
    starts_.erase(start);
}

void CallTable::endAll(kesto_status status)
{
    for (Calls* calls : {&calls_, &starts_}) {
        for (const auto& [number, call] : *calls) {
            if (call.operation == KESTO_OPERATION_SEND)
                ++counters_.lost;
            if (call.answersLeft > 0)
                answerWithError(number, call.operation, call.reporter, call.callback, status);
        }
        calls->clear();
    }
    startsByReporter_.clear();
}

} // namespace libkesto
