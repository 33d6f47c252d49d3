// SPDX-License-Identifier: Apache-2.0
// Records the calls of a client's callbacks, and lets a test wait for them.
#pragma once

#include "foundation/Mutex.h"
#include "kesto/kesto.hpp"
#include "sdk/FakeService.h"

#include <chrono>
#include <string>
#include <vector>

namespace sdk_test {

// Any thread.
template <typename Entry> class Recorder {
public:
    void add(Entry entry)
    {
        const foundation::Lock lock(mutex_);
        entries_.push_back(std::move(entry));
        changed_.notifyAll();
    }

    // Waits for so many entries, or until the time is over, and returns all entries so far.
    [[nodiscard]] std::vector<Entry> waitFor(std::size_t count)
    {
        const auto deadline = std::chrono::steady_clock::now() + patience;
        const foundation::Lock lock(mutex_);
        while (entries_.size() < count && std::chrono::steady_clock::now() < deadline)
            changed_.waitUntil(mutex_, deadline);
        return entries_;
    }

    [[nodiscard]] std::vector<Entry> entries() { return waitFor(0); }

private:
    foundation::Mutex mutex_;
    foundation::Condition changed_;
    std::vector<Entry> entries_ KESTO_GUARDED_BY(mutex_);
};

// Answers as text: "create", or "create: the connection to the service was lost".
class Answers : public Recorder<std::string> {
public:
    [[nodiscard]] kesto::AnswerCallback named(std::string name)
    {
        return [this, name = std::move(name)](const kesto::Answer& answer) {
            if (answer.ok())
                add(name);
            else if (answer.errorDomain() == KESTO_ERROR_DOMAIN)
                add(name + ": " + kesto::errorText(answer.status()));
            else
                add(name + ": " + std::string(answer.errorDomain()) + " " + std::to_string(answer.errorCode()));
        };
    }
};

// States as they were reported.
class States : public Recorder<kesto::State> {
public:
    [[nodiscard]] kesto::StateCallback callback()
    {
        return [this](const kesto::StateChange& change) {
            reasons.add(change.reason);
            add(change.state);
        };
    }
    Recorder<kesto::Status> reasons;
};

} // namespace sdk_test
