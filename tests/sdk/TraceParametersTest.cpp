// SPDX-License-Identifier: Apache-2.0
// The public header and the service have the same words for trace-parameters files.
#include "tracing/TraceParams.h"

#include <gtest/gtest.h>
#include <kesto/trace_parameters.h>

namespace {

TEST(TraceParameters, AreWrittenInTheWordsInWhichTheServiceReadsThem)
{
    EXPECT_EQ(KESTO_TRACE_PARAM_CHILDREN_NODES, TraceParamChildrenNodes);
    EXPECT_EQ(KESTO_TRACE_DATA_DESCRIPTION, TraceDataDescription);
    EXPECT_EQ(KESTO_TRACE_DATA_TYPE, TraceDataType);
    EXPECT_EQ(KESTO_TRACE_DATA_TYPE_KTRACE, TraceDataTypekTrace);
    EXPECT_EQ(KESTO_TRACE_DATA_TYPE_OS_SIGNPOST, TraceDataTypeOSSignpost);
    EXPECT_EQ(KESTO_TRACE_DATA_IS_CRITICAL, TraceDataIsCritical);
    EXPECT_EQ(KESTO_TRACE_DATA_CHILDREN_NODES, TraceDataChildrenNodes);
    EXPECT_EQ(KESTO_TRACE_POINT_DESCRIPTION, TracePointDescription);
    EXPECT_EQ(KESTO_TRACE_POINT_TYPE, TracePointType);
    EXPECT_EQ(KESTO_TRACE_POINT_TYPE_INTERVAL, TracePointTypeInterval);
    EXPECT_EQ(KESTO_TRACE_POINT_TYPE_IMPULSE, TracePointTypeImpulse);
    EXPECT_EQ(KESTO_TRACE_POINT_TYPE_LEVEL, TracePointTypeLevel);
    EXPECT_EQ(KESTO_TRACE_POINT_BEGIN_CODE, TracePointBeginCode);
    EXPECT_EQ(KESTO_TRACE_POINT_END_CODE, TracePointEndCode);
    EXPECT_EQ(KESTO_TRACE_POINT_EVENTS_MATCHED_BY, TracePointEventsMatchedBy);
    EXPECT_EQ(KESTO_TRACE_POINT_EVENTS_MATCHED_BY_THREAD, TracePointEventsMatchedByThread);
    EXPECT_EQ(KESTO_TRACE_POINT_EVENTS_MATCHED_BY_PROCESS, TracePointEventsMatchedByProcess);
}

} // namespace
