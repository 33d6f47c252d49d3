// SPDX-License-Identifier: Apache-2.0
// A whole service on fakes, and clients that speak its protocol to it by number, through the adapter that a real
// connection uses.
//
//     ServiceHarness harness;
//     auto player = harness.connect("player");
//     EXPECT_EQ(player.call(CreateReportingSession, 42), answeredOnce(succeeded));
#pragma once

#include "client/KestoReportingClientServerInstance.h"
#include "service/KestoReportingServiceDelegate.h"
#include "support/TestPlatform.h"
#include "support/fakes/FakeConnection.h"
#include "utility/ServerQueue.h"

#include <cstdint>
#include <functional>
#include <future>
#include <memory>
#include <string>
#include <type_traits>
#include <utility>
#include <vector>

namespace support {

// The protocol's operations by their numbers.
enum Method : std::uint8_t {
    CreateReportingSession = 1,
    SetServiceType,
    GetServiceNameForReporterID,
    SetConfiguration,
    StartReportingSessionForID,
    SendMessage,
    StopReportingSessionForID,
    DestroyReportingSession,
    ValidReporterID,
    GetAllReporters,
    KillService
};

// The answers to one call, in order: each [error, values...].
using Answers = std::vector<foundation::Array>;
inline const foundation::Value null{};
inline const foundation::Array succeeded{null, true};
inline const foundation::Array delivered{null};
inline Answers answeredOnce(foundation::Array answer)
{
    return {std::move(answer)};
}
inline const Answers unanswered;

// Runs the work in a turn of the server queue, and returns its result.
template <typename Work> auto onServerQueue(FakeWorkQueues& queues, Work work)
{
    auto inTurn = [&work](platform::Turn& turn) {
        if constexpr (std::is_invocable_v<Work, platform::Turn&>)
            return work(turn);
        else
            return work();
    };
    std::packaged_task<std::invoke_result_t<decltype(inTurn), platform::Turn&>(platform::Turn&)> task(inTurn);
    auto result = task.get_future();
    utility::serverQueue()->submit([&task](platform::Turn& turn) { task(turn); });
    queues.runAll();
    return result.get();
}

// A client process. Declare it after its service, so that it is destroyed first.
class TestClient {
public:
    TestClient(FakeWorkQueues& queues, std::shared_ptr<FakeConnection> connection,
               const std::shared_ptr<KestoReportingClientServerInstance>& object)
        : queues_(&queues),
          connection_(std::move(connection)),
          object_(object)
    {
    }

    // Makes the call, lets the service work until it is idle, and returns the answers.
    template <typename... Arguments> Answers call(Method method, const Arguments&... arguments)
    {
        const std::uint64_t number = submit(method, {foundation::Value(arguments)...});
        queues_->runAll();
        return answersTo(number);
    }
    // Only makes the call; returns its number.
    std::uint64_t submit(Method method, const foundation::Array& arguments);
    [[nodiscard]] Answers answersTo(std::uint64_t number) const;

    // Ends the connection, and lets the service handle this.
    void close();
    void breakOff();

    [[nodiscard]] FakeConnection& connection() const { return *connection_; }
    // The client as the service sees it; null once it is gone.
    [[nodiscard]] std::shared_ptr<KestoReportingClientServerInstance> object() const { return object_.lock(); }
    // The client's own session of that ID, or null.
    [[nodiscard]] std::shared_ptr<KestoReportingSession> session(std::int64_t reporterID) const;

private:
    FakeWorkQueues* queues_;
    std::shared_ptr<FakeConnection> connection_;
    std::weak_ptr<KestoReportingClientServerInstance> object_;
    std::uint64_t lastCall_ = 0;
};

class ServiceHarness {
public:
    // `prepare` sets the device up before the service starts.
    explicit ServiceHarness(const std::function<void(TestPlatform&)>& prepare = {});

    // A new process connects and is registered. Clears the log and the trace of it.
    TestClient connect(std::string processName = "player", std::uint32_t user = 0);
    // Forgets the log and the trace so far.
    void forget();
    // Finds a session in the service, as the delivery of a message does.
    std::shared_ptr<KestoReportingSession> find(std::int64_t reporterID)
    {
        return onServerQueue(platform.workQueues, [&] { return service->findReportingSessionForID(reporterID); });
    }

    TestPlatform platform;
    FakeConnectionListener listener;
    std::shared_ptr<KestoReportingServiceDelegate> service;

    static constexpr std::int32_t firstPID = 1001; // of the clients, which count up from here

private:
    std::int32_t nextPID_ = firstPID;
};

} // namespace support
