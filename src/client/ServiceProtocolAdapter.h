// SPDX-License-Identifier: Apache-2.0
// The adapter between the wire and the protocol: checks the array of values that a client sent, calls the operation
// that it names, and turns each reply into a frame.
//
// A call is [call, method, arguments...]; a reply is [call, error, values...], error being null or
// [domain, code]. Methods are numbered from 1 in the order of the protocol.
#pragma once

#include "client/KestoReportingServiceProtocol.h"
#include "ledger/Ledger.h"
#include "platform/Connection.h"

#include <expected>
#include <functional>
#include <memory>

namespace client {

// Each connection owns one and uses it on its thread.
class ServiceProtocolAdapter {
public:
    // Calls go to the exported object, and the ledger counts them.
    ServiceProtocolAdapter(std::shared_ptr<KestoReportingServiceProtocol> exportedObject, ledger::Ledger& ledger)
        : exportedObject_(std::move(exportedObject)),
          ledger_(ledger)
    {
    }

    // Carries out one call, or returns what is wrong with it.
    std::expected<void, platform::Connection::Violation> handleCall(platform::Connection::Call call);

private:
    std::shared_ptr<KestoReportingServiceProtocol> exportedObject_;
    std::reference_wrapper<ledger::Ledger> ledger_;
};

} // namespace client
