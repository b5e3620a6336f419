#include <vector>

#include "tests/simulation/SimulationFixture.h"

namespace appsync {
namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;
using testing::IsEmpty;

class RecordingTest : public SimulationFixture {
  protected:
    void log(LogCategory category, LogLevel level, std::string_view format,
             const std::vector<LogArgument>& arguments) {
        platform_.log.write({category, level, format, arguments});
    }
    void logHello() {
        const std::string_view plugin = "com.example.plugin";
        log(LogCategory::Coordination, LogLevel::Error, "%s|hello %{public}@",
            {plugin, std::string_view("world")});
    }
};

TEST_F(RecordingTest, CallsShowArgumentsAndResults) {
    platform_.registry.addApplication(kA);
    (void)platform_.registry.isApplicationInstalled(kA);
    (void)platform_.files.readFile("/missing");
    EXPECT_THAT(platform_.calls(),
                ElementsAre("AppRegistry.isApplicationInstalled(com.example.a) -> yes",
                            "FileSystem.readFile(/missing) -> Error Domain=POSIX Code=2 "
                            "\"cannot read '/missing': No such file or directory\""));
}

TEST_F(RecordingTest, MessagesAreRenderedWithoutTheBundleIdentifier) {
    logHello();
    EXPECT_THAT(platform_.messages(), ElementsAre("hello world"));
    EXPECT_THAT(platform_.messageLines(), ElementsAre("8 error hello world"));
    EXPECT_EQ(platform_.recording().front().prefix, "com.example.plugin|");
    EXPECT_EQ(platform_.recording().front().format, "%s|hello %{public}@");
}

TEST_F(RecordingTest, AMessageWithoutBundleIdentifierIsKeptWhole) {
    log(LogCategory::General, LogLevel::Default, "unexpected type for %{public}@",
        {std::string_view("a|b")});
    EXPECT_THAT(platform_.messageLines(), ElementsAre("0 default unexpected type for a|b"));
    EXPECT_EQ(platform_.recording().front().prefix, "");
}

TEST_F(RecordingTest, CallsAndMessagesStandInOneOrder) {
    (void)platform_.coordination.isCoordinationEnabled();
    logHello();
    platform_.notifications.post("name");
    EXPECT_THAT(platform_.lines(),
                ElementsAre("InstallCoordinatorService.isCoordinationEnabled() -> no",
                            "8 error hello world", "NamedNotifications.post(name)"));
}

TEST_F(RecordingTest, AMessageIsFoundByLevelCategoryAndText) {
    logHello();
    EXPECT_TRUE(platform_.hasMessage(LogLevel::Error, LogCategory::Coordination, "hello world"));
    EXPECT_FALSE(platform_.hasMessage(LogLevel::Default, LogCategory::Coordination, "hello world"));
    EXPECT_FALSE(platform_.hasMessage(LogLevel::Error, LogCategory::Applications, "hello world"));
    EXPECT_FALSE(platform_.hasMessage(LogLevel::Error, LogCategory::Coordination, "hello"));
    EXPECT_EQ(platform_.countMessages("hello world"), 1U);
}

TEST_F(RecordingTest, CallsAreFilteredByServiceOrMethod) {
    const auto group = platform_.queues.makeWaitGroup();
    group->enter();
    group->leave();
    EXPECT_THAT(platform_.callsTo({"WaitGroup"}),
                ElementsAre("WaitGroup#1.enter()", "WaitGroup#1.leave()"));
    EXPECT_THAT(platform_.callsTo({"WaitGroup#1.leave"}), ElementsAre("WaitGroup#1.leave()"));
    EXPECT_THAT(platform_.callsTo({"WaitGroup#2", "AppRegistry"}), IsEmpty());
}

TEST_F(RecordingTest, AskingForACallThatIsNoneIsAFailure) {
    EXPECT_THAT(failureOf([&] { (void)platform_.callsTo({"Registry"}); }),
                testing::HasSubstr("Registry"));
    EXPECT_THAT(failureOf([&] { (void)platform_.callsTo({"FileSystem.open"}); }),
                testing::HasSubstr("FileSystem.open"));
    EXPECT_THAT(failureOf([&] { platform_.onCall("AppRegistry.install", {}); }),
                testing::HasSubstr("AppRegistry.install"));
}

TEST_F(RecordingTest, EntriesSayWhoWasRunningAndWhen) {
    platform_.queues.runAfter(30s, [&] { platform_.notifications.post("name"); });
    platform_.advance(30s);
    const RecordEntry& entry = platform_.recording().back();
    EXPECT_EQ(entry.task, "delayed work");
    EXPECT_EQ(entry.time, 30s);
}

TEST_F(RecordingTest, AHookRunsBeforeTheCallHasAnEffect) {
    std::vector<std::string> seen;
    platform_.onCall("FileSystem.removeItem", [&](const RecordEntry& entry) {
        seen.push_back(entry.arguments + (platform_.files.exists("/tmp/x") ? " is there" : ""));
    });
    platform_.files.addFile("/tmp/x", "text");
    EXPECT_TRUE(platform_.files.removeItem("/tmp/x"));
    EXPECT_THAT(seen, ElementsAre("/tmp/x is there"));
}

TEST_F(RecordingTest, AHookMayCallThePlatformAndEndItself) {
    platform_.onCall("Lock.lock", [&](const RecordEntry&) {
        platform_.onCall("Lock.lock", {});
        platform_.notifications.post("from the hook");
    });
    const auto lock = platform_.queues.makeLock();
    for (int i = 0; i < 2; ++i) {
        lock->lock();
        lock->unlock();
    }
    EXPECT_THAT(platform_.notifications.posts(), ElementsAre("from the hook=0"));
}

TEST_F(RecordingTest, ClearingForgetsAndLaterResultsFindNoWrongPlace) {
    const auto group = platform_.queues.makeWaitGroup();
    group->enter();
    platform_.queues.runAfter(1s, [&] {
        platform_.clearRecording();
        platform_.notifications.post("after");
        group->leave();
    });
    EXPECT_TRUE(group->waitFor(5s));
    EXPECT_THAT(platform_.calls(),
                ElementsAre("NamedNotifications.post(after)", "WaitGroup#1.leave()"));
}

TEST_F(RecordingTest, WithoutRecordingHooksStillRun) {
    int count = 0;
    platform_.recorder.setEnabled(false);
    platform_.onCall("NamedNotifications.post", [&](const RecordEntry&) { ++count; });
    platform_.notifications.post("name");
    EXPECT_EQ(count, 1);
    EXPECT_THAT(platform_.recording(), IsEmpty());
}

TEST_F(RecordingTest, PropertyListsAreFiles) {
    platform_.addPropertyList("/tmp/list.plist", PropertyList::array({1, "two"}));
    EXPECT_EQ(platform_.propertyListAt("/tmp/list.plist"), PropertyList::array({1, "two"}));
    EXPECT_EQ(platform_.propertyListAt("/tmp/missing.plist"), std::nullopt);
    platform_.files.addFile("/tmp/list.plist", "no list");
    EXPECT_EQ(platform_.propertyListAt("/tmp/list.plist"), std::nullopt);
}

/// What two tasks that log leave in the recording of a seed.
std::vector<std::string> linesOfSeed(std::uint64_t seed) {
    SystemPropertyLists codec;
    SimulatedPlatform platform(codec, Scheduling::seeded(seed));
    const auto operations = platform.queues.makeOperationQueue();
    for (const std::string name : {"a", "b", "c"}) {
        operations->add([&platform, name] {
            for (int i = 0; i < 3; ++i) platform.notifications.post(name);
        });
    }
    platform.runUntilIdle();
    return platform.lines();
}

TEST(RecordingOfASeedTest, IsTheSameEachTime) {
    for (std::uint64_t seed = 0; seed < 10; ++seed) {
        EXPECT_EQ(linesOfSeed(seed), linesOfSeed(seed));
    }
    EXPECT_NE(linesOfSeed(1), linesOfSeed(2));
}

}  // namespace
}  // namespace appsync
