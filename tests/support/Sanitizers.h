// SPDX-License-Identifier: Apache-2.0
// Skips tests that a sanitizer would make fail.
#pragma once

#include <gtest/gtest.h>

// The undefined-behaviour sanitizer opens a pipe when it first checks an object's dynamic type: a test that leaves the
// process without descriptors would fail.
#ifdef KESTO_UNDEFINED_SANITIZER
#define KESTO_SKIP_WHERE_TYPES_ARE_CHECKED() GTEST_SKIP() << "the sanitizer needs the descriptors that this test takes"
#else
#define KESTO_SKIP_WHERE_TYPES_ARE_CHECKED() static_cast<void>(0)
#endif

// The thread sanitizer makes its own system calls, and has a thread that never rests. With clang it brings an operator
// new that a program cannot replace.
#if defined(__SANITIZE_THREAD__)
#define KESTO_THREADS_ARE_WATCHED
#elif defined(__has_feature)
#if __has_feature(thread_sanitizer)
#define KESTO_THREADS_ARE_WATCHED
#endif
#endif
#ifdef KESTO_THREADS_ARE_WATCHED
constexpr bool threadSanitizerWatches = true;
#else
constexpr bool threadSanitizerWatches = false;
#endif
#define KESTO_SKIP_WHERE_THREADS_ARE_WATCHED() \
    if (!threadSanitizerWatches) {             \
    } else                                     \
        GTEST_SKIP() << "the thread sanitizer has its own thread, which never rests"

// The address sanitizer keeps released memory, to find later uses, and the thread sanitizer records the last access to
// all memory.
#if defined(__SANITIZE_ADDRESS__)
constexpr bool addressSanitizerWatches = true;
#elif defined(__has_feature)
constexpr bool addressSanitizerWatches = __has_feature(address_sanitizer);
#else
constexpr bool addressSanitizerWatches = false;
#endif
#define KESTO_SKIP_WHERE_MEMORY_IS_WATCHED()                   \
    if (!addressSanitizerWatches && !threadSanitizerWatches) { \
    } else                                                     \
        GTEST_SKIP() << "the sanitizer takes memory of its own"
