// SPDX-License-Identifier: Apache-2.0
// The heap of a thread that works for clients.
//
// Each thread has its own heap, which no other thread can tidy. Memory that one thread allocated may be freed by
// another, so no thread knows whether its heap holds much free memory: every thread tidies its heap when asked, and a
// sleeping thread is woken for it.
#pragma once

#include <atomic>
#include <functional>

namespace platform {

// Only its own thread makes, uses and destroys it.
class ThreadHeap {
public:
    // `wake` makes the thread call `tidyIfAsked` soon, even if it sleeps. Any thread may call `wake` while this object
    // exists.
    explicit ThreadHeap(std::function<void()> wake);
    ~ThreadHeap();
    ThreadHeap(const ThreadHeap&) = delete;
    ThreadHeap& operator=(const ThreadHeap&) = delete;

    // Any thread.
    [[nodiscard]] bool isAsked() const noexcept { return isAsked_; }
    // Returns the heap's free memory to the system, once for each request. Whether there was a request.
    bool tidyIfAsked();

    // Asks all threads with such a heap. Any thread.
    static void askAll();

private:
    const std::function<void()> wake_;
    std::atomic<bool> isAsked_ = false;
};

} // namespace platform
