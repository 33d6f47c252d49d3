// SPDX-License-Identifier: Apache-2.0
// The time zone of the process, for as long as the object lives.
#pragma once

#include <cstdlib>
#include <ctime>

namespace kesto_tool {

class ZoneForTest {
public:
    explicit ZoneForTest(const char* zone)
    {
        ::setenv("TZ", zone, 1);
        ::tzset();
    }
    ~ZoneForTest()
    {
        ::unsetenv("TZ");
        ::tzset();
    }
    ZoneForTest(const ZoneForTest&) = delete;
    ZoneForTest& operator=(const ZoneForTest&) = delete;
};

} // namespace kesto_tool
