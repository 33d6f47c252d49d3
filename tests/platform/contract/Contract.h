// SPDX-License-Identifier: Apache-2.0
// The common part of the contracts. A contract is a suite of tests that is written once, for an interface of
// src/platform, and runs on the fake and on the provider of Linux: a failure is a defect of that provider, or of the
// interface's comments.
//
// A suite uses both through a subject, which makes the service and causes events from outside: a peer that connects, a
// file that changes, an event of the kernel.
#pragma once

#include "support/Progress.h"

#include <chrono>
#include <gtest/gtest.h>
#include <memory>
#include <ostream>
#include <string>
#include <string_view>
#include <thread>

namespace contract {

// One of the providers on which a suite runs.
template <typename Subject> struct Provider {
    std::string_view name;
    std::unique_ptr<Subject> (*make)();

    friend void PrintTo(const Provider& provider, std::ostream* out) { *out << provider.name; }
};

template <typename Subject, typename Made> [[nodiscard]] Provider<Subject> provider(std::string_view name)
{
    return {name, []() -> std::unique_ptr<Subject> { return std::make_unique<Made>(); }};
}

template <typename Subject> class Suite : public testing::TestWithParam<Provider<Subject>> {
protected:
    const std::unique_ptr<Subject> subject = this->GetParam().make();
};

// Waits until the condition holds; another thread may have to make it true.
template <typename Condition> [[nodiscard]] bool eventually(Condition condition)
{
    const auto deadline = std::chrono::steady_clock::now() + support::longestWait;
    while (!condition()) {
        if (std::chrono::steady_clock::now() > deadline)
            return false;
        std::this_thread::yield();
    }
    return true;
}

} // namespace contract

// Runs the suite on these providers: KESTO_CONTRACT(ClockContract, provider<Clock, FakeClock>("Fake"), ...)
#define KESTO_CONTRACT(suite, ...)                                      \
    INSTANTIATE_TEST_SUITE_P(Both, suite, testing::Values(__VA_ARGS__), \
                             [](const auto& instance) { return std::string(instance.param.name); })
