// The order of claiming room and ringing.
#include "calls/Mailbox.h"

#include <utility>

namespace libkesto {

Mailbox::Mailbox(std::size_t bytes, platform::FileDescriptor doorbell)
    : bytes_(bytes),
      queue_(bytes),
      bell_(std::move(doorbell))
{
}

bool Mailbox::putMessage(const CallHead& head, std::string_view reporters, std::string_view entries) noexcept
{
    const std::size_t keptForOtherCalls = bytes_ / 8;
    if (!queue_.push({bytesOf(head), reporters, entries}, keptForOtherCalls))
        return false;
    if (startsUnderway_.load() == 0)
        bell_.ringIfAsleep();
    return true;
}

bool Mailbox::putCall(const CallHead& head) noexcept
{
    const bool isStart = head.operation == KESTO_OPERATION_START_SESSION;
    if (isStart)
        ++startsUnderway_;
    const bool hasRoom = queue_.push({bytesOf(head)});
    if (!hasRoom && isStart)
        --startsUnderway_;
    bell_.ring(); // even without room: messages may have relied on the ring of this start
    return hasRoom;
}

void Mailbox::popFront() noexcept
{
    const kesto_operation operation = readHead(*queue_.front()).operation;
    queue_.popFront();
    if (operation == KESTO_OPERATION_START_SESSION)
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
