// Both halves of the handshake between callers and a thread that goes to sleep.
#include "calls/Mailbox.h"

#include <sys/eventfd.h>
#include <utility>

namespace libkesto {

Mailbox::Mailbox(std::size_t bytes, platform::FileDescriptor doorbell)
    : bytes_(bytes),
      queue_(bytes),
      doorbell_(std::move(doorbell))
{
}

bool Mailbox::putMessage(const CallHead& head, std::string_view reporters, std::string_view entries) noexcept
{
    const std::size_t keptForOtherCalls = bytes_ / 8;
    if (!queue_.push({bytesOf(head), reporters, entries}, keptForOtherCalls))
        return false;
    if (isAsleep_.load() && startsUnderway_.load() == 0 && isAsleep_.exchange(false))
        ring();
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
    ring(); // without room too: for messages that counted on this start to ring
    return hasRoom;
}

void Mailbox::ring() noexcept
{
    eventfd_write(doorbell_.get(), 1); // fails only when it has been rung 2^64 times and not been heard
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
    isAsleep_.store(true);
    if (queue_.isEmpty())
        return true;
    isAsleep_.store(false);
    return false;
}

void Mailbox::wakeUp(bool hasRung) noexcept
{
    isAsleep_.store(false);
    eventfd_t rings = 0;
    if (hasRung)
        eventfd_read(doorbell_.get(), &rings);
}

} // namespace libkesto
