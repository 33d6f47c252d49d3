// SPDX-License-Identifier: Apache-2.0
// Finding a session over all clients, compared with its definition: a walk over the registry that stops at the first
// client with the ID.
#include "service/ReporterIndex.h"
#include "support/ServiceHarness.h"
#include "utility/ServerQueue.h"

#include <gtest/gtest.h>
#include <memory>
#include <rapidcheck/gtest.h>
#include <vector>

namespace {

using namespace support;

std::shared_ptr<KestoReportingSession> walk(const KestoReportingServiceDelegate& service, std::int64_t reporterID)
{
    if (reporterID == 0)
        return nullptr;
    for (const auto& client : service.getAllClients())
        if (auto session = client->clientReportingSessionMap().find(reporterID))
            return session;
    return nullptr;
}

RC_GTEST_PROP(ReporterIndex, FindsWhatAWalkOverTheRegistryFinds, ())
{
    ServiceHarness harness;
    std::vector<TestClient> clients;
    const auto operation = rc::gen::tuple(rc::gen::weightedElement<char>({{3, '+'}, {1, '-'}, {8, 'c'}, {5, 'd'}}),
                                          rc::gen::inRange<std::size_t>(0, 100), rc::gen::inRange<std::int64_t>(-2, 4));
    for (const auto& [what, choice, reporterID] :
         *rc::gen::container<std::vector<std::tuple<char, std::size_t, std::int64_t>>>(operation)) {
        if (what == '+' || clients.empty()) {
            clients.push_back(harness.connect());
            continue;
        }
        const auto chosen = clients.begin() + static_cast<std::ptrdiff_t>(choice % clients.size());
        if (what == '-') {
            if (choice % 2 == 0)
                chosen->close();
            else
                chosen->breakOff();
            clients.erase(chosen);
        } else {
            chosen->call(what == 'c' ? CreateReportingSession : DestroyReportingSession, reporterID);
        }
        for (std::int64_t other = -2; other < 4; ++other)
            RC_ASSERT(harness.find(other) == walk(*harness.service, other));
    }
}

class BareIndexTest : public testing::Test {
protected:
    BareIndexTest()
    {
        utility::createServerQueue();
        for (const std::int32_t process : {1001, 1002}) {
            clients_.push_back(std::make_unique<KestoReportingClientServerInstance>(process, nobody_));
            sessions_.push_back(std::make_shared<KestoReportingSession>(42, std::vector{process}));
        }
    }

    [[nodiscard]] const KestoReportingClientServerInstance& client(std::size_t number) const
    {
        return *clients_[number];
    }
    // The client's session 42.
    [[nodiscard]] const std::shared_ptr<KestoReportingSession>& session(std::size_t number) const
    {
        return sessions_[number];
    }
    void add(std::size_t number) { index.add(42, client(number), session(number)); }
    // The session that the index finds, or null.
    [[nodiscard]] std::shared_ptr<KestoReportingSession> found() const
    {
        const auto* holder = index.find(42);
        return holder == nullptr ? nullptr : holder->session.lock();
    }

    service::ReporterIndex index;

private:
    const TestPlatform platform_;
    const std::weak_ptr<KestoReportingServiceDelegateProtocol> nobody_;
    std::vector<std::unique_ptr<KestoReportingClientServerInstance>> clients_;
    std::vector<std::shared_ptr<KestoReportingSession>> sessions_;
};

TEST_F(BareIndexTest, DoesNotCountClientsThatAreNotRegistered)
{
    add(0);
    EXPECT_EQ(found(), nullptr);
    index.remove(42, client(0));
}

TEST_F(BareIndexTest, KeepsTheOrderOfRegistrationForAnyOrderOfCreation)
{
    index.registerClient(client(1));
    index.registerClient(client(0));
    add(0);
    EXPECT_EQ(found(), session(0));
    add(1);
    EXPECT_EQ(found(), session(1));
    index.remove(42, client(1));
    EXPECT_EQ(found(), session(0));
}

TEST_F(BareIndexTest, CountsAnIDOnceAndForgetsItAtOnce)
{
    index.registerClient(client(0));
    add(0);
    add(0);
    index.remove(42, client(0));
    EXPECT_EQ(found(), nullptr);
    index.remove(42, client(0));
    EXPECT_EQ(found(), nullptr);
}

TEST_F(BareIndexTest, FindsTheSessionThatReplacedAnother)
{
    index.registerClient(client(0));
    index.registerClient(client(1));
    add(0);
    index.add(42, client(0), session(1));
    EXPECT_EQ(found(), session(1));
    EXPECT_EQ(index.find(42)->client, &client(0));
    add(1);
    index.add(42, client(1), session(0));
    index.remove(42, client(0));
    EXPECT_EQ(found(), session(0));
    EXPECT_EQ(index.find(42)->client, &client(1));
}

TEST_F(BareIndexTest, AClientThatCameLaterGoesWithoutATrace)
{
    index.registerClient(client(0));
    index.registerClient(client(1));
    add(0);
    add(1);
    index.remove(42, client(1));
    EXPECT_EQ(found(), session(0));
    index.remove(42, client(0));
    EXPECT_EQ(found(), nullptr);
}

TEST_F(BareIndexTest, PutsAClientThatComesAgainBehindTheOthers)
{
    index.registerClient(client(0));
    index.registerClient(client(1));
    index.unregisterClient(client(0));
    index.registerClient(client(0));
    add(0);
    add(1);
    EXPECT_EQ(found(), session(1));
}

} // namespace
