#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <vector>

#include "contract/Sentence.h"
#include "contract/SystemContract.h"

namespace appsync {

void linkSystemDetailsContract() {}

namespace {

using testing::ContainsRegex;

class PropertyListDetailsContract : public SystemContract {
  protected:
    PropertyListSerialization& lists_ = system_->propertyLists();
};

APPSYNC_CONTRACT_SUITE(PropertyListDetailsContract, systemPorts());

TEST_P(PropertyListDetailsContract, ARefusalSaysWhere) {
    checks("platform/PropertyListSerialization.h",
           "says where (byte offset, or line and column) and what was expected.");
    for (const std::string text : {"bplist00", "<plist><dict><key>a</key></plist>"}) {
        const Result<PropertyList> read = lists_.parse(Bytes(text.begin(), text.end()));
        ASSERT_FALSE(read) << text;
        EXPECT_THAT(read.error().description(), ContainsRegex("[0-9]")) << text;
    }
}

TEST_P(PropertyListDetailsContract, WhatXmlCannotCarryIsRefused) {
    checks("platform/PropertyListSerialization.h",
           "Fails when the value holds a null marker, or a text that the encoding cannot carry.");
    const Result<Bytes> written = lists_.serialize("\x01", PropertyListFormat::Xml);
    ASSERT_FALSE(written);
    EXPECT_EQ(written.error().domain, kPropertyListErrorDomain);
}

TEST_P(PropertyListDetailsContract, AReplacedTextIsReadAndNothingElseHasChanged) {
    checks("platform/PropertyListSerialization.h",
           "False, with the bytes as they were, when that cannot be had for less than writing all "
           "of it, which the caller does then;");
    const auto listOf = [](const char* state) {
        return PropertyList::array({PropertyList::map({{"id", "a"}, {"state", "install"}}),
                                    PropertyList::map({{"id", "b"}, {"state", state}})});
    };
    const Result<Bytes> written = lists_.serialize(listOf("install"), PropertyListFormat::Binary);
    ASSERT_TRUE(written);
    Bytes bytes = *written;
    if (lists_.replaceText(bytes, 1, "state", "done")) {
        const Result<PropertyList> read = lists_.parse(bytes);
        ASSERT_TRUE(read);
        EXPECT_EQ(*read, listOf("done"));
    } else {
        EXPECT_EQ(bytes, *written);
    }
}

TEST_P(PropertyListDetailsContract, AnyThreadReadsAndWrites) {
    checks("platform/PropertyListSerialization.h", "Callable on any thread.");
    const auto operations = system_->queues().makeOperationQueue();
    operations->setMaximumConcurrentOperations(4);
    for (int operation = 0; operation < 8; ++operation) {
        operations->add([this, operation] {
            const PropertyList value = PropertyList::array({operation, "text"});
            const Result<Bytes> written = lists_.serialize(value, PropertyListFormat::Binary);
            ASSERT_TRUE(written);
            const Result<PropertyList> read = lists_.parse(*written);
            ASSERT_TRUE(read);
            EXPECT_EQ(*read, value);
        });
    }
}

class NotificationDetailsContract : public SystemContract {};

APPSYNC_CONTRACT_SUITE(NotificationDetailsContract,
                       systemPorts({OptionalService::Notifications,
                                    OptionalService::NotificationCenter}));

TEST_P(NotificationDetailsContract, AStateHasSixtyFourBits) {
    checks("platform/Notifications.h",
           "System-wide named notifications that carry a 64-bit state.");
    NamedNotifications& notifications = system_->notifications();
    const auto registration = notifications.registerForState("com.example.wide");
    notifications.setState(registration.token, (std::uint64_t{1} << 40) + 1);
    EXPECT_EQ(system_->notificationState("com.example.wide"), (std::uint64_t{1} << 40) + 1);
}

TEST_P(NotificationDetailsContract, WhoeverPostsReachesTheObserversThatAreLeft) {
    static int calls;
    calls = 0;
    NotificationCenter& center = system_->notificationCenter();
    const auto observer = std::make_shared<int>(1);
    for (const char* name : {"com.example.left", "com.example.ended"}) {
        center.addObserver(
            observer, name, [](void*) { ++calls; }, NotificationCenter::SuspensionBehavior::Drop);
    }
    checks("platform/Notifications.h", "Ends that.");
    center.removeObserver(observer.get(), "com.example.ended");
    center.post("com.example.ended");
    system_->post("com.example.ended");
    EXPECT_EQ(calls, 0);
    checks("platform/Notifications.h", "Calls every observer of the name.");
    center.post("com.example.left");
    system_->post("com.example.ended");  // returns when everybody has been told
    EXPECT_EQ(calls, 1);
}

/// Ends its observation when it is destroyed.
struct LeavingObserver {
    explicit LeavingObserver(NotificationCenter& from) : center(from) {}
    ~LeavingObserver() { center.removeObserver(this, "com.example.left"); }
    LeavingObserver(const LeavingObserver&) = delete;
    LeavingObserver& operator=(const LeavingObserver&) = delete;
    NotificationCenter& center;
};

TEST_P(NotificationDetailsContract, AnObserverMayRemoveItselfAtItsEnd) {
    static int calls;
    calls = 0;
    checks("platform/Notifications.h",
           "The observer is known by its address: it may be in its destructor.");
    NotificationCenter& center = system_->notificationCenter();
    auto observer = std::make_shared<LeavingObserver>(center);
    center.addObserver(
        observer, "com.example.left", [](void*) { ++calls; },
        NotificationCenter::SuspensionBehavior::Drop);
    observer.reset();
    system_->post("com.example.left");
    EXPECT_EQ(calls, 0);
}

}  // namespace
}  // namespace appsync
