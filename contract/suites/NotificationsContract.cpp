#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <memory>
#include <vector>

#include "contract/SystemContract.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

constexpr std::string_view kName = "com.example.notification";

/// The observers that a callback was called with, in order.
std::vector<void*> calledWith;

void callback(void* observer) { calledWith.push_back(observer); }

class NamedNotificationsContract : public SystemContract {};

APPSYNC_CONTRACT_SUITE(NamedNotificationsContract, systemPorts({OptionalService::Notifications}));

TEST_P(NamedNotificationsContract, AStateIsSeenByEverybody) {
    checks("platform/Notifications.h", "Every process sees it from now on.");
    NamedNotifications& notifications = system_->notifications();
    const auto registration = notifications.registerForState(kName);
    ASSERT_EQ(registration.status, 0U);
    notifications.setState(registration.token, 1);
    notifications.post(kName);
    EXPECT_EQ(system_->notificationState(kName), 1U);
    EXPECT_EQ(system_->notificationState("com.example.other"), 0U);
}

TEST_P(NamedNotificationsContract, EveryRegistrationOfANameSetsTheSameState) {
    checks("platform/Notifications.h", "All tokens of a name stand for one state.");
    NamedNotifications& notifications = system_->notifications();
    const auto first = notifications.registerForState(kName);
    const auto second = notifications.registerForState(kName);
    notifications.setState(first.token, 1);
    notifications.setState(second.token, 0);
    EXPECT_EQ(system_->notificationState(kName), 0U);
}

TEST_P(NamedNotificationsContract, TokensOfDifferentNamesAreDifferent) {
    checks("platform/Notifications.h", "Registers for a state token of the name.");
    NamedNotifications& notifications = system_->notifications();
    const auto one = notifications.registerForState(kName);
    const auto other = notifications.registerForState("com.example.other");
    notifications.setState(one.token, 5);
    notifications.setState(other.token, 7);
    EXPECT_EQ(system_->notificationState(kName), 5U);
}

class NotificationCenterContract : public SystemContract {
  protected:
    NotificationCenterContract() { calledWith.clear(); }

    void observe(const std::shared_ptr<int>& observer, std::string_view name) {
        system_->notificationCenter().addObserver(observer, name, callback,
                                                  NotificationCenter::SuspensionBehavior::Drop);
    }
};

APPSYNC_CONTRACT_SUITE(NotificationCenterContract,
                       systemPorts({OptionalService::NotificationCenter}));

TEST_P(NotificationCenterContract, AnObserverIsCalledForItsNameOnly) {
    checks("platform/Notifications.h",
           "From now on `callback` is called when a notification of the name is posted by anyone.");
    const auto observer = std::make_shared<int>(1);
    observe(observer, kName);
    system_->post("com.example.other");
    EXPECT_THAT(calledWith, IsEmpty());
    system_->post(kName);
    EXPECT_THAT(calledWith, ElementsAre(observer.get()));
}

TEST_P(NotificationCenterContract, EveryObserverOfANameIsCalled) {
    checks("platform/Notifications.h", "Calls every observer of the name.");
    const auto first = std::make_shared<int>(1);
    const auto second = std::make_shared<int>(2);
    observe(first, kName);
    observe(second, kName);
    system_->post(kName);
    EXPECT_THAT(calledWith, testing::UnorderedElementsAre(first.get(), second.get()));
}

TEST_P(NotificationCenterContract, ARemovedObserverIsNotCalled) {
    checks("platform/Notifications.h", "Ends that.");
    const auto observer = std::make_shared<int>(1);
    observe(observer, kName);
    system_->notificationCenter().removeObserver(observer.get(), kName);
    system_->post(kName);
    EXPECT_THAT(calledWith, IsEmpty());
}

TEST_P(NotificationCenterContract, AnObserverThatHasGoneIsCalledAsNull) {
    checks("platform/Notifications.h",
           "Called, on any thread, with the observer, which is kept alive meanwhile; with null "
           "when the observer has gone.");
    auto observer = std::make_shared<int>(1);
    observe(observer, kName);
    observer.reset();
    system_->post(kName);
    EXPECT_THAT(calledWith, ElementsAre(nullptr));
}

}  // namespace

void linkNotificationsContract() {}

}  // namespace appsync
