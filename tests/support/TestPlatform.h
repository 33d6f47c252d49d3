// SPDX-License-Identifier: Apache-2.0
// The whole platform on fakes, installed as long as this object exists.
#pragma once

#include "platform/Platform.h"
#include "support/fakes/FakeAnalytics.h"
#include "support/fakes/FakeBugCapture.h"
#include "support/fakes/FakeClock.h"
#include "support/fakes/FakeFiles.h"
#include "support/fakes/FakeKernelTrace.h"
#include "support/fakes/FakeLog.h"
#include "support/fakes/FakeMemory.h"
#include "support/fakes/FakeNotifications.h"
#include "support/fakes/FakeReportingChannels.h"
#include "support/fakes/FakeSettings.h"
#include "support/fakes/FakeTraceEmitter.h"
#include "support/fakes/FakeWorkQueues.h"

namespace support {

// One at a time. Declare users of the platform after it, so that they are destroyed first.
class TestPlatform {
public:
    TestPlatform();
    ~TestPlatform();
    TestPlatform(const TestPlatform&) = delete;
    TestPlatform& operator=(const TestPlatform&) = delete;

    FakeLog log;
    ledger::Ledger ledger; // a real one: it needs nothing of a system
    FakeClock clock;
    FakeWorkQueues workQueues{clock};
    platform::Turn turn; // for calls outside any queue; what it gathers goes nowhere
    FakePreferences preferences;
    FakeFeatureFlags featureFlags;
    FakeDeviceProperties deviceProperties;
    FakeProcessTable processTable;
    FakeNotifications notifications;
    FakeAnalytics analytics{ledger};
    FakeTraceEmitter traceEmitter;
    FakeReportingChannels reportingChannels;
    FakeBugCapture bugCapture;
    FakeKernelTrace kernelTrace;
    FakeFileSystem fileSystem{&workQueues};
    FakeMemory memory;
    FakePerformanceWriter performanceWriter{fileSystem};
};

} // namespace support
