// SPDX-License-Identifier: Apache-2.0
// The values that events of one code carry in one of their arguments. It is part of the model of traces. The runner of
// this service makes intervals only, so only tests make it.
#pragma once

#include "tracing/TraceData.h"

class TracePoint final : public TraceData {
public:
    // The arguments of an event are 1 to 4; any other index selects nothing.
    TracePoint(std::string name, std::uint32_t eventCode, std::uint32_t argumentIndex)
        : TraceData(std::move(name)),
          beginCode_(eventCode),
          argumentIndex_(argumentIndex)
    {
    }

    [[nodiscard]] std::uint32_t beginCode() const { return beginCode_; }
    [[nodiscard]] std::uint32_t argumentIndex() const { return argumentIndex_; }

    void processTracepoints(const platform::KernelTraceSession& session, std::span<const trace_point> events) override;

private:
    const std::uint32_t beginCode_;
    const std::uint32_t argumentIndex_;
};
