// SPDX-License-Identifier: Apache-2.0
// The service is made as its entry point makes it, on fakes.
#include "support/ServiceHarness.h"

namespace support {

using foundation::Array;
using foundation::Value;

std::uint64_t TestClient::submit(Method method, const Array& arguments)
{
    std::vector<Value> frame{++lastCall_, static_cast<unsigned>(method)};
    frame.insert(frame.end(), arguments.begin(), arguments.end());
    const auto result = connection_->call(frame);
    EXPECT_TRUE(result) << result.error().reason;
    return lastCall_;
}

Answers TestClient::answersTo(std::uint64_t number) const
{
    Answers answers;
    for (const Array& frame : connection_->received())
        if (frame[0] == Value(number))
            answers.emplace_back(std::vector(frame.begin() + 1, frame.end()));
    return answers;
}

void TestClient::close()
{
    connection_->close();
    queues_->runAll();
}

void TestClient::breakOff()
{
    connection_->breakOff();
    queues_->runAll();
}

std::shared_ptr<KestoReportingSession> TestClient::session(std::int64_t reporterID) const
{
    const auto client = object();
    return client ? client->clientReportingSessionMap().find(reporterID) : nullptr;
}

ServiceHarness::ServiceHarness(const std::function<void(TestPlatform&)>& prepare)
{
    if (prepare)
        prepare(platform);
    service = KestoReportingServiceDelegate::make();
    listener.setDelegate(*service);
    forget();
}

TestClient ServiceHarness::connect(std::string processName, std::uint32_t user)
{
    const std::int32_t processIdentifier = nextPID_++;
    platform.processTable.add(processIdentifier, std::move(processName));
    auto connection = listener.connect(processIdentifier, user);
    platform.workQueues.runAll();
    forget();
    return {platform.workQueues, std::move(connection), service->getAllClients().back()};
}

void ServiceHarness::forget()
{
    platform.log.clear();
    platform.traceEmitter.take();
}

} // namespace support
