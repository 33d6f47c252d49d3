// SPDX-License-Identifier: Apache-2.0
// The order of claiming room and ringing.
#include "calls/Mailbox.h"

#include <utility>

namespace libkesto {
namespace {

bool beginsSession(kesto_operation operation) noexcept
{
    return operation == KESTO_OPERATION_START_SESSION || operation == streamStart;
}

} // namespace

Mailbox::Mailbox(std::size_t bytes, platform::FileDescriptor doorbell)
    : bytes_(bytes),
      queue_(bytes),
      bell_(std::move(doorbell))
{
}

bool Mailbox::putMessage(const CallHead& head, std::string_view reporters, std::string_view entries,
                         std::string_view stamps) noexcept
{
    if (!queue_.push({bytesOf(head), reporters, entries, stamps}, roomForCalls()))
        return false;
    if (startsUnderway_.load() == 0)
        bell_.ringIfAsleep();
    return true;
}

bool Mailbox::putCall(const CallHead& head) noexcept
{
    const bool isStart = beginsSession(head.operation);
    if (isStart)
        ++startsUnderway_;
    const bool hasRoom = queue_.push({bytesOf(head)});
    if (!hasRoom && isStart)
        --startsUnderway_;
    bell_.ring(); // even without room: messages may have relied on the ring of this start
    return hasRoom;
}

bool Mailbox::putStreamRecord(kesto_operation operation, std::string_view record, std::string_view device,
                              std::string_view encoding, bool usesKeptRoom) noexcept
{
    const CallHead head{.operation = operation};
    const bool isStart = beginsSession(operation);
    if (isStart)
        ++startsUnderway_;
    const bool hasRoom = queue_.push({bytesOf(head), record, device, encoding}, usesKeptRoom ? 0 : roomForCalls());
    if (!hasRoom && isStart)
        --startsUnderway_;
    if (isStart || startsUnderway_.load() == 0)
        bell_.ringIfAsleep(); // a start even without room: messages may have relied on its ring
    return hasRoom;
}

void Mailbox::popFront() noexcept
{
    const kesto_operation operation = readHead(*queue_.front()).operation;
    queue_.popFront();
    if (beginsSession(operation))
        --startsUnderway_;
}

bool Mailbox::fallAsleep() noexcept
{
    bell_.fallAsleep();
    if (queue_.isEmpty())
        return true;
    bell_.stayAwake();
    return false;
}

} // namespace libkesto
