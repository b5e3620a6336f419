#include <chrono>

#include "tests/client/AppsClientFixture.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using Access = AppsClientTestAccess;

/// A client outside the daemon: it counts reports of placeholders.
class RestoringPlaceholders : public AppsClientFixture {
  protected:
    RestoringPlaceholders() {
        platform_.host.setMainBundleIdentifier("com.example.other");
        makeCoordinatedClient();
    }
    void promise(const std::string& identifier) {
        client_->relocantSetPlaceHolderPromiseForRestoreAppBundle(identifier);
    }
    void cancel(const std::string& identifier) {
        client_->relocantCancelledCoordinatorForRestoreAppBundle(identifier);
    }
    void install(const std::string& identifier) {
        client_->tsDidInstallPlaceHolderForAppBundle(identifier);
    }
    /// Whether the book shows this many, in each of its three places.
    void expectAwaited(std::size_t count) {
        EXPECT_EQ(Access::restoringPlaceholderCount(*client_), static_cast<std::int64_t>(count));
        EXPECT_EQ(Access::placeholdersForRestoringApps(*client_).size(), count);
        EXPECT_EQ(Access::restorePlaceHoldersWaitGroup(*client_).waitFor(std::chrono::seconds(0)),
                  count == 0);
    }
    void stopWaiting() { Access::finishedWaitingForPlaceHolderInstalls(*client_) = true; }
};

TEST_F(RestoringPlaceholders, AreCountedOnceHoweverOftenPromised) {
    promise(kA);
    promise(kA);
    expectAwaited(1);
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("8 default Relocant will wait for TS to install placeholder for "
                            "com.example.a, _restoringPlaceholderCount 1"));
    platform_.clearRecording();
    install(kA);
    expectAwaited(0);
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("8 default TS finished installing placeholder for com.example.a, "
                            "_restoringPlaceholderCount 0"));
}

TEST_F(RestoringPlaceholders, AreCountedOneByOne) {
    promise(kA);
    promise(kB);
    promise(kC);
    expectAwaited(3);
    install(kB);
    cancel(kC);
    expectAwaited(1);
    EXPECT_THAT(Access::placeholdersForRestoringApps(*client_), ElementsAre(kA));
    cancel(kA);
    expectAwaited(0);
}

TEST_F(RestoringPlaceholders, OfWhatWasNeverPromisedAreIgnored) {
    promise(kA);
    platform_.clearRecording();
    install(kB);
    expectAwaited(1);
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("8 error Ignoring notification from TS about installing placeholder "
                            "for com.example.b"));
}

TEST_F(RestoringPlaceholders, AreIgnoredWhenTheyComeTwice) {
    promise(kA);
    install(kA);
    install(kA);
    expectAwaited(0);
    EXPECT_TRUE(logged(LogLevel::Error,
                       "Ignoring notification from TS about installing placeholder for "
                       "com.example.a"));
}

TEST_F(RestoringPlaceholders, AreNoLongerAwaitedWhenCancelled) {
    promise(kA);
    platform_.clearRecording();
    cancel(kA);
    expectAwaited(0);
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("8 default Relocant cancelled coordinator for restoring app bundle "
                            "com.example.a _restoringPlaceholderCount 0"));
}

TEST_F(RestoringPlaceholders, ThatWereNeverPromisedAreCancelledSilently) {
    cancel(kA);
    expectAwaited(0);
    EXPECT_THAT(platform_.messages(), IsEmpty());
}

TEST_F(RestoringPlaceholders, MayBePromisedAgain) {
    promise(kA);
    install(kA);
    promise(kA);
    expectAwaited(1);
    cancel(kA);
    expectAwaited(0);
}

TEST_F(RestoringPlaceholders, ThatComeAfterTheWaitChangeNothing) {
    promise(kA);
    promise(kB);
    stopWaiting();
    platform_.clearRecording();
    install(kA);
    install(kC);
    expectAwaited(2);
    EXPECT_THAT(platform_.messages(), IsEmpty());
}

TEST_F(RestoringPlaceholders, AreStillCancelledAfterTheWait) {
    promise(kA);
    stopWaiting();
    cancel(kA);
    expectAwaited(0);
    EXPECT_TRUE(logged(LogLevel::Default,
                       "Relocant cancelled coordinator for restoring app bundle com.example.a "
                       "_restoringPlaceholderCount 0"));
}

TEST_F(RestoringPlaceholders, AreBookedOnTheRestoreQueue) {
    promise(kA);
    install(kA);
    cancel(kA);
    EXPECT_THAT(
        platform_.callsTo({"SerialQueue"}),
        ElementsAre("SerialQueue#4.sync()", "SerialQueue#4.sync()", "SerialQueue#4.sync()"));
    EXPECT_THAT(platform_.callsTo({"WaitGroup.enter", "WaitGroup.leave"}),
                ElementsAre("WaitGroup#4.enter()", "WaitGroup#4.leave()"));
}

TEST_F(RestoringPlaceholders, StillAwaitedAreNamedWhenTheClientGoes) {
    promise(kA);
    client_.reset();
    EXPECT_TRUE(logged(LogLevel::Error,
                       "<AppsClient> getting dealloc'd with (com.example.a)pending placeholder "
                       "install complete notifications"));
}

}  // namespace
}  // namespace appsync
