// SPDX-License-Identifier: Apache-2.0
// The content of a trace-parameters file: which kernel events delimit the intervals that a trace measures; and the keys
// and values of such files, for programs that write them.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

// Of the file.
inline constexpr std::string_view TraceParamChildrenNodes = "Children"; // the traces

// Of each trace.
inline constexpr std::string_view TraceDataDescription = "Name";
inline constexpr std::string_view TraceDataType = "TraceType";
inline constexpr std::string_view TraceDataTypekTrace = "ktrace"; // any type but the next counts as this
inline constexpr std::string_view TraceDataTypeOSSignpost = "OSSignpost";
inline constexpr std::string_view TraceDataIsCritical = "IsCritical"; // for other programs; never read here
inline constexpr std::string_view TraceDataChildrenNodes = "Children"; // its points

// Of each point. Codes are text in hexadecimal digits.
inline constexpr std::string_view TracePointDescription = "Name";
inline constexpr std::string_view TracePointType = "Type";
inline constexpr std::string_view TracePointTypeInterval = "Interval";
inline constexpr std::string_view TracePointTypeImpulse = "Impulse";
inline constexpr std::string_view TracePointTypeLevel = "Level";
inline constexpr std::string_view TracePointBeginCode = "KTraceCodeBegin";
inline constexpr std::string_view TracePointEndCode = "KTraceCodeEnd";
inline constexpr std::string_view TracePointEventsMatchedBy = "EventsMatchedBy";
inline constexpr std::string_view TracePointEventsMatchedByThread = "Thread";
inline constexpr std::string_view TracePointEventsMatchedByProcess = "Process"; // as any but "Thread": any thread

// The first and last of the collected codes, which clients emit for tracing.
inline constexpr std::uint32_t firstTraceCode = 0x21040000;
inline constexpr std::uint32_t lastTraceCode = 0x2104408A;

// One point: the codes of the events that begin and end its measurement.
struct TraceDataParams {
    static constexpr std::uint32_t impulse = 0;
    static constexpr std::uint32_t interval = 1;
    static constexpr std::uint32_t level = 2;

    // An impulse ends with the event that begins it; its end code is ignored.
    TraceDataParams(std::string givenName, std::uint32_t type, std::uint32_t begin, std::uint32_t end, bool byThread)
        : name(std::move(givenName)),
          pointType(type),
          beginCode(begin),
          endCode(type != impulse ? end : begin),
          matchByThread(byThread)
    {
    }

    std::string name;
    std::uint32_t pointType;
    std::uint32_t beginCode;
    std::uint32_t endCode;
    bool matchByThread; // whether both events must come from one thread
    bool isTypeKnown = true; // else the point has the type and the codes of the point before it

    friend bool operator==(const TraceDataParams&, const TraceDataParams&) = default;
};

// One file: the points of all its traces, under the name of the first that has one.
struct TraceParams {
    static constexpr std::int32_t kernelTrace = 0;
    static constexpr std::int32_t signpostTrace = 1;

    std::string name;
    std::int32_t traceType = kernelTrace;
    std::vector<TraceDataParams> traceDataParams; // in the order of the file
    // The first error of the file, as in the log: it cannot be read, or a value in it has a wrong kind. Empty if the
    // whole file was read.
    std::string problem = {};
    std::size_t leftOut = 0; // traces and points beyond the limit
};
