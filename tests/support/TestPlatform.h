// The whole platform on fakes, installed as long as it lives.
#pragma once

#include "platform/Platform.h"
#include "support/FakeAnalytics.h"
#include "support/FakeBugCapture.h"
#include "support/FakeClock.h"
#include "support/FakeFiles.h"
#include "support/FakeKernelTrace.h"
#include "support/FakeLog.h"
#include "support/FakeNotifications.h"
#include "support/FakeReportingChannels.h"
#include "support/FakeSettings.h"
#include "support/FakeTraceMarkers.h"
#include "support/FakeWorkQueues.h"

namespace support {

// One at a time. Whatever uses the platform is declared after it, so that it goes first.
class TestPlatform {
public:
    TestPlatform();
    ~TestPlatform();
    TestPlatform(const TestPlatform&) = delete;
    TestPlatform& operator=(const TestPlatform&) = delete;

    FakeLog log;
    FakeClock clock;
    FakeWorkQueues workQueues{clock};
    FakePreferences preferences;
    FakeFeatureFlags featureFlags;
    FakeDeviceProperties deviceProperties;
    FakeProcessTable processTable;
    FakeNotifications notifications;
    FakeAnalytics analytics;
    FakeTraceMarkers traceMarkers;
    FakeReportingChannels reportingChannels;
    FakeBugCapture bugCapture;
    FakeKernelTrace kernelTrace;
    FakeFileSystem fileSystem{&workQueues};
    FakePerformanceWriter performanceWriter{fileSystem};
};

} // namespace support
