// What a sanitizer needs of the process that it watches.
#pragma once

#include <gtest/gtest.h>

// The undefined-behaviour sanitizer opens a pipe each time it looks at an object's dynamic type for the first time: a
// test that leaves the process without descriptors would fail for that.
#ifdef KESTO_UNDEFINED_SANITIZER
#define KESTO_SKIP_WHERE_TYPES_ARE_CHECKED() GTEST_SKIP() << "the sanitizer needs the descriptors that this test takes"
#else
#define KESTO_SKIP_WHERE_TYPES_ARE_CHECKED() static_cast<void>(0)
#endif
