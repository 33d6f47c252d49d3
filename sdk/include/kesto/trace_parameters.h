// SPDX-License-Identifier: Apache-2.0
// The keys and values of trace-parameters files, for programs in C and C++ that write them: property lists that name
// the events of the kernel's trace that begin and end each measurement of a session of the Kesto reporting service
// (docs/tracing.md).
//
//     {Children: [{Name: startup, Children: [{Name: first buffer, Type: Interval, KTraceCodeBegin: 0x21040010,
//                                             KTraceCodeEnd: 0x21040014, EventsMatchedBy: Thread}]}]}
//
// They are literals, so that they can be parts of longer ones. Programs that only emit events do not need them.
#ifndef KESTO_TRACE_PARAMETERS_H
#define KESTO_TRACE_PARAMETERS_H

// Of the file.
#define KESTO_TRACE_PARAM_CHILDREN_NODES "Children" // the traces

// Of each trace.
#define KESTO_TRACE_DATA_DESCRIPTION "Name"
#define KESTO_TRACE_DATA_TYPE "TraceType"
#define KESTO_TRACE_DATA_TYPE_KTRACE "ktrace" // all other types except the next count as this
#define KESTO_TRACE_DATA_TYPE_OS_SIGNPOST "OSSignpost" // collects nothing
#define KESTO_TRACE_DATA_IS_CRITICAL "IsCritical" // for readers of the file; the service ignores it
#define KESTO_TRACE_DATA_CHILDREN_NODES "Children" // its points

// Of each point. Codes are text in hexadecimal digits.
#define KESTO_TRACE_POINT_DESCRIPTION "Name"
#define KESTO_TRACE_POINT_TYPE "Type"
#define KESTO_TRACE_POINT_TYPE_INTERVAL "Interval"
#define KESTO_TRACE_POINT_TYPE_IMPULSE "Impulse"
#define KESTO_TRACE_POINT_TYPE_LEVEL "Level"
#define KESTO_TRACE_POINT_BEGIN_CODE "KTraceCodeBegin"
#define KESTO_TRACE_POINT_END_CODE "KTraceCodeEnd" // of an interval
#define KESTO_TRACE_POINT_EVENTS_MATCHED_BY "EventsMatchedBy"
#define KESTO_TRACE_POINT_EVENTS_MATCHED_BY_THREAD "Thread"
#define KESTO_TRACE_POINT_EVENTS_MATCHED_BY_PROCESS "Process" // means any thread, as does every value except "Thread"

#endif
