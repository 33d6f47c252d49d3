// SPDX-License-Identifier: Apache-2.0
// A mutex with annotations, by which clang proves that guarded fields are used only under their lock; and a condition
// on which a thread waits while it holds the mutex.
#pragma once

#include <chrono>
#include <condition_variable>
#include <mutex>

#if defined(__clang__)
#define KESTO_THREAD_ANNOTATION(annotation) __attribute__((annotation))
#else
#define KESTO_THREAD_ANNOTATION(annotation)
#endif

// A field that is only read and written while the mutex is held.
#define KESTO_GUARDED_BY(mutex) KESTO_THREAD_ANNOTATION(guarded_by(mutex))
// A function that is only called while the mutex is held.
#define KESTO_REQUIRES(mutex) KESTO_THREAD_ANNOTATION(requires_capability(mutex))

namespace foundation {

class KESTO_THREAD_ANNOTATION(capability("mutex")) Mutex {
public:
    void lock() KESTO_THREAD_ANNOTATION(acquire_capability()) { mutex_.lock(); }
    void unlock() KESTO_THREAD_ANNOTATION(release_capability()) { mutex_.unlock(); }

private:
    friend class Condition;
    std::mutex mutex_;
};

// Holds a mutex as long as it lives.
class KESTO_THREAD_ANNOTATION(scoped_lockable) Lock {
public:
    explicit Lock(Mutex& mutex) KESTO_THREAD_ANNOTATION(acquire_capability(mutex)) : mutex_(mutex)
    {
        mutex_.lock();
        count(1);
    }
    ~Lock() KESTO_THREAD_ANNOTATION(release_capability())
    {
        mutex_.unlock();
        count(-1);
    }
    Lock(const Lock&) = delete;
    Lock& operator=(const Lock&) = delete;

#ifndef NDEBUG
    // Whether the calling thread holds any. For assertions, so that only debug builds count.
    [[nodiscard]] static bool isAnyHeld() noexcept { return heldByThisThread != 0; }
#endif

private:
#ifndef NDEBUG
    static void count(int change) noexcept { heldByThisThread += change; }
    static inline thread_local int heldByThisThread = 0;
#else
    static void count(int) noexcept { }
#endif

    Mutex& mutex_;
};

// A thread sleeps on it until another thread signals a change of guarded data. It may wake without a signal: wait in a
// loop.
class Condition {
public:
    void wait(Mutex& mutex) KESTO_REQUIRES(mutex)
    {
        std::unique_lock lock(mutex.mutex_, std::adopt_lock);
        condition_.wait(lock);
        lock.release(); // the caller goes on holding it
    }
    // Returns whether it woke because of the deadline.
    std::cv_status waitUntil(Mutex& mutex, std::chrono::steady_clock::time_point deadline) KESTO_REQUIRES(mutex)
    {
        std::unique_lock lock(mutex.mutex_, std::adopt_lock);
        const std::cv_status status = condition_.wait_until(lock, deadline);
        lock.release();
        return status;
    }
    void notifyOne() noexcept { condition_.notify_one(); }
    void notifyAll() noexcept { condition_.notify_all(); }

private:
    std::condition_variable condition_;
};

} // namespace foundation
