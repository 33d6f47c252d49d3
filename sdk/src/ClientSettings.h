// SPDX-License-Identifier: Apache-2.0
// A client's options with their defaults filled in.
#pragma once

#include "AttachableEmitter.h"
#include "kesto/kesto.h"

#include <chrono>
#include <cstddef>
#include <memory>
#include <string>
#include <utility>
#include <vector>

namespace libkesto {

// Called at every change of state, and released once. One thread at a time.
class StateListener {
public:
    StateListener(kesto_state_callback function, void* user, kesto_release_callback release) noexcept
        : function_(function),
          user_(user),
          release_(release)
    {
    }
    StateListener(StateListener&& other) noexcept
        : function_(std::exchange(other.function_, nullptr)),
          user_(other.user_),
          release_(std::exchange(other.release_, nullptr))
    {
    }
    StateListener& operator=(StateListener&&) = delete;
    ~StateListener()
    {
        if (release_ != nullptr)
            release_(user_);
    }

    void operator()(const kesto_state_change& change) const
    {
        if (function_ != nullptr)
            function_(user_, &change);
    }

private:
    kesto_state_callback function_;
    void* user_;
    kesto_release_callback release_;
};

struct ClientSettings {
    std::vector<std::string> paths;
    std::size_t queueBytes;
    std::size_t unansweredLimit;
    bool wakeOnSend;
    bool reconnect;
    bool stampsMessages;
    std::chrono::milliseconds firstRetry;
    std::chrono::milliseconds longestRetry;
    StateListener stateChanged;
    std::unique_ptr<AttachableEmitter> emitter; // null: the client emits no trace events
};

} // namespace libkesto
