// SPDX-License-Identifier: Apache-2.0
// A caller's function with its user pointer, released exactly once, even if the call fails.
#pragma once

#include "kesto/kesto.h"

#include <utility>

namespace libkesto {

// Plain data: the form of a callback in the queue.
struct RawCallback {
    kesto_answer_callback function = nullptr;
    void* user = nullptr;
    kesto_release_callback release = nullptr;
};

// Owns the release. One thread at a time.
class Callback {
public:
    explicit Callback(RawCallback raw) noexcept : raw_(raw) { }
    Callback(Callback&& other) noexcept : raw_(std::exchange(other.raw_, {})) { }
    Callback& operator=(Callback&& other) noexcept
    {
        std::swap(raw_, other.raw_);
        return *this;
    }
    ~Callback()
    {
        if (raw_.release != nullptr)
            raw_.release(raw_.user);
    }

    void operator()(const kesto_answer& answer) const
    {
        if (raw_.function != nullptr)
            raw_.function(raw_.user, &answer);
    }

    // Passes the duty to release to the receiver of the raw callback.
    [[nodiscard]] const RawCallback& raw() const noexcept { return raw_; }
    void handOver() noexcept { raw_ = {}; }

private:
    RawCallback raw_;
};

} // namespace libkesto
