// SPDX-License-Identifier: Apache-2.0
// The contract of platform/Notifications.h: a post of a name calls its handlers on their queues, and they can read the
// posted state.
#include "platform/contract/Contract.h"
#include "platform/linux/queues/LinuxWorkQueues.h"
#include "platform/linux/settings/LinuxNotifications.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeLog.h"
#include "support/fakes/FakeNotifications.h"
#include "support/fakes/FakeWorkQueues.h"

#include <optional>
#include <vector>

namespace contract {
namespace {

class NotificationsSubject {
public:
    virtual ~NotificationsSubject() = default;
    [[nodiscard]] virtual platform::Notifications& notifications() = 0;
    [[nodiscard]] virtual platform::WorkQueues& queues() = 0;
    // Another process posts the name, with a state or with none.
    virtual void post(const std::string& name, std::optional<std::uint64_t> state) = 0;
    // A name that cannot be registered.
    [[nodiscard]] virtual std::string impossibleName() = 0;
    // Runs waiting items, if the queues have no threads.
    virtual void work() { }
};

class FakeNotificationsSubject final : public NotificationsSubject {
public:
    [[nodiscard]] platform::Notifications& notifications() override { return notifications_; }
    [[nodiscard]] platform::WorkQueues& queues() override { return queues_; }
    void post(const std::string& name, std::optional<std::uint64_t> state) override
    {
        if (state)
            notifications_.setState(name, *state);
        else
            notifications_.removeState(name);
        notifications_.post(name);
    }
    [[nodiscard]] std::string impossibleName() override
    {
        notifications_.failRegistration("impossible", 9);
        return "impossible";
    }
    void work() override { queues_.runAll(); }

private:
    support::FakeClock clock_;
    support::FakeWorkQueues queues_{clock_};
    support::FakeNotifications notifications_;
};

class LinuxNotificationsSubject final : public NotificationsSubject {
public:
    [[nodiscard]] platform::Notifications& notifications() override { return notifications_; }
    [[nodiscard]] platform::WorkQueues& queues() override { return queues_; }
    void post(const std::string& name, std::optional<std::uint64_t> state) override
    {
        support::writeFile(directory_ / "notifications" / name, state ? std::to_string(*state) : "");
    }
    [[nodiscard]] std::string impossibleName() override { return "../name"; }

private:
    const support::TemporaryDirectory directory_;
    support::FakeLog log_;
    platform::ConfigurationWatcher watcher_{directory_ / "configuration", platform::ProviderLog(log_)};
    platform::LinuxWorkQueues queues_;
    platform::LinuxNotifications notifications_{directory_ / "notifications", watcher_, platform::ProviderLog(log_)};
};

// One call of a handler.
struct Told {
    std::int32_t token;
    bool isOnItsQueue;
    std::optional<std::uint64_t> state; // read by the handler
};

// Registers a name and keeps the calls of its handler, which may outlive this object.
class NotificationListener {
public:
    NotificationListener(NotificationsSubject& subject, const std::string& name,
                         const std::shared_ptr<platform::WorkQueue>& queue)
        : subject_(subject)
    {
        auto& notifications = subject.notifications();
        const auto registration = notifications.registerNotification(
            name, queue, [&notifications, record = record_, onQueue = queue.get()](std::int32_t told) {
                record->progress.change([&] {
                    if (record->isClosed)
                        return;
                    const auto state = notifications.state(told);
                    record->told.push_back({told, onQueue->isCurrent(), state ? std::optional(*state) : std::nullopt});
                });
            });
        EXPECT_EQ(registration.status, 0U);
        EXPECT_NE(registration.token, 0);
        token = registration.token;
    }
    ~NotificationListener()
    {
        record_->progress.change([&] { record_->isClosed = true; });
    }
    NotificationListener(const NotificationListener&) = delete;
    NotificationListener& operator=(const NotificationListener&) = delete;

    [[nodiscard]] bool waitForMoreThan(std::size_t count)
    {
        subject_.work();
        return record_->progress.waitFor([&] { return record_->told.size() > count; });
    }
    [[nodiscard]] std::vector<Told> told()
    {
        return record_->progress.look([&] { return record_->told; });
    }

    std::int32_t token = 0;

private:
    struct Record {
        support::Progress progress;
        bool isClosed = false;
        std::vector<Told> told;
    };
    NotificationsSubject& subject_;
    const std::shared_ptr<Record> record_ = std::make_shared<Record>();
};

class NotificationsContract : public Suite<NotificationsSubject> {
protected:
    // Returns after all earlier posts were handled, because they are handled in order.
    void settle()
    {
        NotificationListener fence(*subject, "fence", queue);
        subject->post("fence", 0);
        ASSERT_TRUE(fence.waitForMoreThan(0));
    }

    std::shared_ptr<platform::WorkQueue> queue = subject->queues().makeSerialQueue("test", {});
};
KESTO_CONTRACT(NotificationsContract, (provider<NotificationsSubject, FakeNotificationsSubject>("Fake")),
               (provider<NotificationsSubject, LinuxNotificationsSubject>("Linux")));

TEST_P(NotificationsContract, CallTheHandlerOnItsQueueWithItsTokenAndTheStateThatWasPosted)
{
    NotificationListener ringer(*subject, "ringer", queue);
    subject->post("ringer", 1);
    ASSERT_TRUE(ringer.waitForMoreThan(0));
    EXPECT_EQ(ringer.told()[0].token, ringer.token);
    EXPECT_TRUE(ringer.told()[0].isOnItsQueue);
    EXPECT_EQ(ringer.told()[0].state, 1U);
}

TEST_P(NotificationsContract, CallTheHandlerOnceForEachPostAlsoOfTheSameState)
{
    NotificationListener ringer(*subject, "ringer", queue);
    for (std::size_t posts = 1; posts <= 3; ++posts) {
        subject->post("ringer", 1);
        settle();
        EXPECT_EQ(ringer.told().size(), posts);
    }
}

TEST_P(NotificationsContract, CallTheHandlerAfterTheLastOfPostsThatComeCloseTogether)
{
    NotificationListener ringer(*subject, "ringer", queue);
    for (std::uint64_t state = 1; state <= 100; ++state)
        subject->post("ringer", state);
    settle();
    ASSERT_FALSE(ringer.told().empty());
    EXPECT_EQ(ringer.told().back().state, 100U);
}

TEST_P(NotificationsContract, CallEveryHandlerOfTheNameAndNoneOfAnother)
{
    NotificationListener first(*subject, "ringer", queue);
    NotificationListener second(*subject, "ringer", queue);
    NotificationListener other(*subject, "other", queue);
    EXPECT_NE(first.token, second.token);
    EXPECT_NE(first.token, other.token);
    EXPECT_NE(second.token, other.token);
    subject->post("ringer", 1);
    settle();
    ASSERT_EQ(first.told().size(), 1U);
    ASSERT_EQ(second.told().size(), 1U);
    EXPECT_EQ(first.told()[0].token, first.token);
    EXPECT_EQ(second.told()[0].token, second.token);
    EXPECT_EQ(other.told().size(), 0U);
}

TEST_P(NotificationsContract, TellNothingOfWhatWasPostedBefore)
{
    subject->post("ringer", 1);
    settle();
    NotificationListener ringer(*subject, "ringer", queue);
    settle();
    EXPECT_EQ(ringer.told().size(), 0U);
    EXPECT_EQ(subject->notifications().state(ringer.token), 1U) << "but its state is there";
}

TEST_P(NotificationsContract, HaveNoStateUnlessOneWasPosted)
{
    NotificationListener ringer(*subject, "ringer", queue);
    ASSERT_FALSE(subject->notifications().state(ringer.token));
    EXPECT_NE(subject->notifications().state(ringer.token).error(), 0U);
    subject->post("ringer", std::nullopt);
    ASSERT_TRUE(ringer.waitForMoreThan(0)) << "it still counts as a post";
    EXPECT_EQ(ringer.told()[0].state, std::nullopt);
}

TEST_P(NotificationsContract, CarryStatesOf64Bits)
{
    const NotificationListener ringer(*subject, "ringer", queue);
    for (const std::uint64_t state : {~std::uint64_t{0}, std::uint64_t{0}}) {
        subject->post("ringer", state);
        settle();
        EXPECT_EQ(subject->notifications().state(ringer.token), state);
    }
}

TEST_P(NotificationsContract, HaveNoStateForAnUnknownToken)
{
    const NotificationListener ringer(*subject, "ringer", queue);
    subject->post("ringer", 1);
    for (const std::int32_t token : {0, -1, 99}) {
        ASSERT_FALSE(subject->notifications().state(token)) << token;
        EXPECT_NE(subject->notifications().state(token).error(), 0U);
    }
}

TEST_P(NotificationsContract, SayThatARegistrationFailedAndGiveTokenZero)
{
    const auto failed = subject->notifications().registerNotification(subject->impossibleName(), queue,
                                                                      [](std::int32_t) { ADD_FAILURE(); });
    EXPECT_NE(failed.status, 0U);
    EXPECT_EQ(failed.token, 0);
    const NotificationListener other(*subject, "ringer", queue);
    EXPECT_NE(other.token, 0);
}

TEST_P(NotificationsContract, KeepTheQueueForWhatIsStillToCome)
{
    NotificationListener ringer(*subject, "ringer", queue);
    const std::weak_ptr<platform::WorkQueue> held = queue;
    queue.reset();
    EXPECT_FALSE(held.expired());
    subject->post("ringer", 1);
    EXPECT_TRUE(ringer.waitForMoreThan(0));
}

} // namespace
} // namespace contract
