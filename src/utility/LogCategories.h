// SPDX-License-Identifier: Apache-2.0
// The log categories of the service, one for each subject, so that a reader of the log can follow one subject.
//
// Constant globals behind accessors: a disabled log statement costs a load and a branch.
#pragma once

#include "platform/Log.h"

namespace utility::logCategories {
constexpr std::string_view subsystem = "com.quarn.kesto";
inline constinit platform::LogCategory client{subsystem, "kerc"};
inline constinit platform::LogCategory serviceDelegate{subsystem, "kers"};
inline constinit platform::LogCategory session{subsystem, "kerr"};
inline constinit platform::LogCategory sessionBlinReporting{subsystem, "keri"};
inline constinit platform::LogCategory driverUtility{subsystem, "kerd"};
inline constinit platform::LogCategory trace{subsystem, "kert"};
inline constinit platform::LogCategory gimbo{subsystem, "kerp"};
inline constinit platform::LogCategory trelm{subsystem, "kera"};
inline constinit platform::LogCategory vorp{subsystem, "kerb"};
} // namespace utility::logCategories

// Client instances.
inline platform::LogCategory& KestoReportingClientCategory()
{
    return utility::logCategories::client;
}

// The service object.
inline platform::LogCategory& KestoReportingServiceDelegateCategory()
{
    return utility::logCategories::serviceDelegate;
}

// Sessions.
inline platform::LogCategory& KestoReportingSessionCategory()
{
    return utility::logCategories::session;
}

// Values that sessions derive from their messages.
inline platform::LogCategory& KestoReportingSessionBlinReportingCategory()
{
    return utility::logCategories::sessionBlinReporting;
}

// Driver statistics.
inline platform::LogCategory& KestoReportingDriverUtilityCategory()
{
    return utility::logCategories::driverUtility;
}

// Tracing.
inline platform::LogCategory& KestoReportingTraceCategory()
{
    return utility::logCategories::trace;
}

// The power-log path.
inline platform::LogCategory& KestoReportingGimboCategory()
{
    return utility::logCategories::gimbo;
}

// The diagnostics record.
inline platform::LogCategory& KestoReportingTrelmLogCategory()
{
    return utility::logCategories::trelm;
}

// The bug-capture state manager.
inline platform::LogCategory& KestoReportingVorpLogCategory()
{
    return utility::logCategories::vorp;
}
