// SPDX-License-Identifier: Apache-2.0
// The power-log sink. It accepts every message and does nothing with it: with this entry point such a service can be
// added without a change in the path of a message.
#pragma once

#include "sinks/SinkSession.h"

#include <memory>

// Keeps no state. Any thread.
class KestoReportingGimboUtility {
public:
    static void handleEvent(const foundation::Dictionary& /*message*/, AudioEventCategory /*category*/,
                            AudioEventType /*type*/, const std::shared_ptr<const sinks::SinkSession>& /*session*/)
    {
    }
};
