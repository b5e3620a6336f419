#include "system/SystemNotifications.h"

#include <memory>
#include <thread>

#include <gtest/gtest.h>

namespace appsync {
namespace {

TEST(SystemNotificationsTest, AStateIsSetByTokenAndReadByName) {
    SystemNotifications notifications;
    const auto registration = notifications.registerForState("sync");
    EXPECT_EQ(registration.status, 0U);
    EXPECT_EQ(notifications.stateOf("sync"), 0U);
    notifications.setState(registration.token, 1);
    EXPECT_EQ(notifications.stateOf("sync"), 1U);
    EXPECT_EQ(notifications.stateOf("other"), 0U);
}

TEST(SystemNotificationsTest, EveryRegistrationOfANameReachesOneState) {
    SystemNotifications notifications;
    const int first = notifications.registerForState("sync").token;
    const int other = notifications.registerForState("other").token;
    const int second = notifications.registerForState("sync").token;
    notifications.setState(first, 1);
    notifications.setState(second, 2);
    notifications.setState(other, 3);
    EXPECT_EQ(notifications.stateOf("sync"), 2U);
    EXPECT_EQ(notifications.stateOf("other"), 3U);
}

TEST(SystemNotificationsTest, AnEmptyNameIsRefused) {
    SystemNotifications notifications;
    EXPECT_NE(notifications.registerForState("").status, 0U);
}

TEST(SystemNotificationsTest, ATokenThatWasNeverGivenOutChangesNothing) {
    SystemNotifications notifications;
    const int token = notifications.registerForState("sync").token;
    for (const int wrong : {-1, 0, token + 1}) notifications.setState(wrong, 7);
    EXPECT_EQ(notifications.stateOf("sync"), 0U);
}

TEST(SystemNotificationsTest, PostsAreCountedAndHeardWithTheStateOfThatMoment) {
    SystemNotifications notifications;
    std::vector<std::pair<std::string, std::uint64_t>> heard;
    notifications.setListener(
        [&](std::string_view name, std::uint64_t state) { heard.emplace_back(name, state); });
    const int token = notifications.registerForState("sync").token;
    notifications.setState(token, 1);
    notifications.post("sync");
    notifications.setState(token, 0);
    notifications.post("sync");
    notifications.post("other");
    EXPECT_EQ(notifications.postCount("sync"), 2U);
    EXPECT_EQ(notifications.postCount("never"), 0U);
    const decltype(heard) expected{{"sync", 1}, {"sync", 0}, {"other", 0}};
    EXPECT_EQ(heard, expected);
}

TEST(SystemNotificationsTest, AListenerMayUseTheNotificationsAndEnd) {
    SystemNotifications notifications;
    int calls = 0;
    notifications.setListener([&](std::string_view name, std::uint64_t) {
        ++calls;
        notifications.registerForState(name);
        notifications.setListener({});
    });
    notifications.post("sync");
    notifications.post("sync");
    EXPECT_EQ(calls, 1);
}

TEST(SystemNotificationsTest, ServesManyThreads) {
    SystemNotifications notifications;
    std::vector<std::thread> threads;
    for (int i = 0; i < 4; ++i) {
        threads.emplace_back([&, i] {
            for (int round = 0; round < 100; ++round) {
                const int token = notifications.registerForState("n" + std::to_string(i)).token;
                notifications.setState(token, 1);
                notifications.post("sync");
            }
        });
    }
    for (std::thread& thread : threads) thread.join();
    EXPECT_EQ(notifications.postCount("sync"), 400U);
}

struct Observer {
    int calls = 0;
};
int callsWithoutObserver = 0;

void notice(void* observer) {
    if (observer == nullptr) {
        ++callsWithoutObserver;
    } else {
        ++static_cast<Observer*>(observer)->calls;
    }
}

class SystemNotificationCenterTest : public ::testing::Test {
  protected:
    SystemNotificationCenterTest() { callsWithoutObserver = 0; }

    void observe(std::string_view name) {
        center_.addObserver(observer_, name, notice, NotificationCenter::SuspensionBehavior::Drop);
    }

    std::shared_ptr<Observer> observer_ = std::make_shared<Observer>();
    SystemNotificationCenter center_;
};

TEST_F(SystemNotificationCenterTest, CallsTheObserversOfTheName) {
    observe("started");
    center_.post("started");
    center_.post("other");
    center_.post("started");
    EXPECT_EQ(observer_->calls, 2);
}

TEST_F(SystemNotificationCenterTest, AnObserverThatIsRemovedHearsNothing) {
    observe("started");
    observe("other");
    center_.removeObserver(observer_.get(), "started");
    center_.post("started");
    EXPECT_EQ(observer_->calls, 0);
    center_.post("other");
    EXPECT_EQ(observer_->calls, 1);
}

TEST_F(SystemNotificationCenterTest, AnObserverThatHasGoneIsNull) {
    observe("started");
    observer_.reset();
    center_.post("started");
    EXPECT_EQ(callsWithoutObserver, 1);
}

TEST_F(SystemNotificationCenterTest, AnObserverThatHasGoneCanBeRemoved) {
    observe("started");
    const void* address = observer_.get();
    observer_.reset();
    center_.removeObserver(address, "started");
    center_.post("started");
    EXPECT_EQ(callsWithoutObserver, 0);
}

}  // namespace
}  // namespace appsync
