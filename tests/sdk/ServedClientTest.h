// SPDX-License-Identifier: Apache-2.0
// A client and the service that it talks to, for tests of the library's calls.
#pragma once

#include "kesto/kesto.hpp"
#include "sdk/FakeService.h"
#include "sdk/Recorder.h"
#include "support/TemporaryDirectory.h"

#include <gtest/gtest.h>
#include <optional>
#include <string>

namespace sdk_test {

class ServedClientTest : public testing::Test {
protected:
    // The service starts and the client opens when a test says so.
    kesto::Options options()
    {
        kesto::Options options;
        options.socketPath = path_;
        options.stateChanged = states_.callback();
        return options;
    }

    const support::TemporaryDirectory directory_;
    const std::string path_ = directory_ / "service";
    std::optional<FakeService> service_;
    Answers answers_;
    States states_;
    kesto::Client client_; // its callbacks use what stands above
};

} // namespace sdk_test
