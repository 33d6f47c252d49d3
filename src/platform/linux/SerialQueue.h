// A serial work queue: one thread that sleeps while there is nothing to do, and otherwise takes all that has
// gathered under one lock. What it takes at once is a turn.
//
// The end of a turn is the moment to do once what would be dear to do for every item, such as committing to
// the disk and writing to sockets; whoever wants that gives the queue a turn-end handler.
#pragma once

#include "platform/WorkQueue.h"

#include <functional>
#include <memory>
#include <string_view>
#include <thread>

namespace platform {

// Any thread.
class SerialQueue final : public WorkQueue {
public:
    // The handler may be empty. It is called on the queue's thread after every turn, when the turn's items and
    // all that they held are gone.
    SerialQueue(std::string_view name, QualityOfService quality, std::function<void()> turnEndHandler);
    // Waits until everything submitted has been run. The queue may go while one of its own items runs: the
    // thread then ends by itself afterwards.
    ~SerialQueue() override;
    SerialQueue(const SerialQueue&) = delete;
    SerialQueue& operator=(const SerialQueue&) = delete;

    void submit(WorkItem item) override;
    [[nodiscard]] bool isCurrent() const override;

    // Whether the calling thread runs a turn for whose end a handler waits.
    [[nodiscard]] static bool isTurnRunning() noexcept;

private:
    class Work;

    std::shared_ptr<Work> work_; // the thread has it too, for it may outlive the queue
    std::thread thread_;
};

} // namespace platform
