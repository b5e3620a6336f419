#include <chrono>

#include "tests/restore/RestoreFixture.h"

namespace appsync {
namespace {

using namespace std::chrono_literals;
using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;

// How long a restore waits for placeholders.
class RestoreWait : public RestoreFixture {
  protected:
    using RestoreFixture::RestoreFixture;

    void promiseThree() {
        for (const char* identifier : {kA, kB, kC}) {
            client_->relocantSetPlaceHolderPromiseForRestoreAppBundle(identifier);
        }
    }
    void reportAfter(SimulatedTime delay, const std::string& identifier) {
        platform_.scheduler.spawnAfter(delay, "report", [this, identifier] {
            client_->tsDidInstallPlaceHolderForAppBundle(identifier);
        });
    }
    /// How much time it takes.
    SimulatedTime restoreNothing() {
        setRestoreInfo(PropertyList::map());
        const SimulatedTime start = platform_.now();
        EXPECT_TRUE(client_->reconcileRestoreOfType(3, nullptr));
        return platform_.now() - start;
    }
    SimulatedTime restoreThree() {
        setRestoreInfo(PropertyList::map({{kA, appInfo()}, {kB, appInfo()}, {kC, appInfo()}}));
        const SimulatedTime start = platform_.now();
        EXPECT_TRUE(client_->reconcileRestoreOfType(3, nullptr));
        return platform_.now() - start;
    }
    [[nodiscard]] std::set<std::string> awaited() {
        return AppsClientTestAccess::placeholdersForRestoringApps(*client_);
    }
};

TEST_F(RestoreWait, IsFiveSecondsForEachPlaceholderThatDoesNotCome) {
    promiseThree();
    EXPECT_EQ(restoreNothing(), 15s);
    EXPECT_TRUE(
        logged(LogLevel::Default, "Will wait for 15 seconds for 3 placeholders to install"));
    EXPECT_TRUE(logged(LogLevel::Default, "Finished waiting for placeholder installs"));
    EXPECT_TRUE(AppsClientTestAccess::finishedWaitingForPlaceHolderInstalls(*client_));
    EXPECT_THAT(awaited(), ElementsAre(kA, kB, kC)) << "they stay in the book";
    expectInfoMovedOnce();
    for (const char* identifier : {kA, kB, kC}) {
        client_->relocantCancelledCoordinatorForRestoreAppBundle(identifier);
    }
}

TEST_F(RestoreWait, EndsWhenTheLastPlaceholderHasCome) {
    promiseThree();
    reportAfter(4s, kC);
    reportAfter(11s, kA);
    reportAfter(7s, kB);
    EXPECT_EQ(restoreNothing(), 11s);
    EXPECT_THAT(awaited(), IsEmpty());
}

TEST_F(RestoreWait, GoesOnForTheOnesThatDoNotCome) {
    promiseThree();
    reportAfter(1s, kB);
    EXPECT_EQ(restoreNothing(), 15s);
    EXPECT_THAT(awaited(), ElementsAre(kA, kC));
}

TEST_F(RestoreWait, IsNoneWithoutPlaceholders) {
    EXPECT_EQ(restoreNothing(), 0s);
    EXPECT_THAT(platform_.callsTo({"WaitGroup.waitFor"}),
                ElementsAre("WaitGroup#4.waitFor(0 ms) -> yes"));
}

TEST_F(RestoreWait, IsNoneWhereTheServiceIsQuick) {
    coordinate();
    EXPECT_EQ(restoreThree(), 0s);
    EXPECT_THAT(platform_.registry.placeholderIdentifiers(), ElementsAre(kA, kB, kC));
    EXPECT_THAT(awaited(), IsEmpty());
}

TEST_F(RestoreWait, LastsItsWholeTimeInsideTheDaemon) {
    client_.reset();
    platform_.host.setMainBundleIdentifier("com.korvu.trd");
    coordinate();
    EXPECT_EQ(restoreThree(), 15s);
    EXPECT_THAT(platform_.registry.placeholderIdentifiers(), ElementsAre(kA, kB, kC));
    EXPECT_THAT(awaited(), ElementsAre(kA, kB, kC)) << "reports change nothing";
    EXPECT_THAT(platform_.messages(),
                Contains("coordinatorDidInstallPlaceholder for com.example.a with error (null)"));
}

/// Restores in which the service's threads and the host's come in any order.
class InterleavedRestore : public RestoreWait, public testing::WithParamInterface<unsigned> {
  protected:
    InterleavedRestore() : RestoreWait(Scheduling::seeded(GetParam())) { coordinate(); }
};

TEST_P(InterleavedRestore, ShowsEveryPlaceholderAndEndsInTime) {
    setDemotedApps(PropertyList::map({{"AutomaticDowngrades", PropertyList::array({kB})}}));
    // A placeholder that comes before it is awaited is waited for in vain.
    EXPECT_LE(restoreThree(), 15s + 1s);
    platform_.runUntilIdle();
    EXPECT_THAT(platform_.registry.placeholderIdentifiers(), ElementsAre(kA, kB, kC));
    expectInfoMovedOnce();
    for (const std::string& identifier : awaited()) {
        EXPECT_TRUE(
            logged(LogLevel::Error,
                   "Ignoring notification from TS about installing placeholder for " + identifier));
    }
}

INSTANTIATE_TEST_SUITE_P(Seeds, InterleavedRestore, testing::Range(0U, 50U));

}  // namespace
}  // namespace appsync
