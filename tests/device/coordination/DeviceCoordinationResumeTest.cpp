#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <functional>

#include "device/values/DevicePaths.h"
#include "tests/device/coordination/DeviceCoordinationFixture.h"

namespace appsync {
namespace {

using Texts = std::vector<std::string>;

constexpr std::chrono::seconds kLong{60};

class DeviceCoordinationResumeTest : public DeviceCoordinationFixture {
  protected:
    /// Does something in a process of its own, which is killed then: nothing of it is put in order.
    void beforeACrash(const std::function<void()>& work) {
        const pid_t child = ::fork();
        if (child == 0) {
            work();
            ::kill(::getpid(), SIGKILL);
        }
        int how = 0;
        ASSERT_EQ(::waitpid(child, &how, 0), child);
        ASSERT_TRUE(WIFSIGNALED(how));
    }
    /// The package is delivered, as far as the database knows, and the install has not begun.
    void markDelivered(const std::string& identifier) {
        const std::string package =
            std::string(kPublicStagingDirectory) + "/" + identifier + ".zip";
        write(package, packageOf(identifier, "2.0"));
        sql("UPDATE promises SET complete = 1, percent = 1000, path = '" + package +
            "' WHERE name = '" + identifier + "-Asset'");
    }
};

TEST_F(DeviceCoordinationResumeTest, whatWasPreparedIsThereAfterACrash) {
    beforeACrash([this] { static_cast<void>(prepare(kAtlas)); });
    EXPECT_TRUE(hasPlaceholder(kAtlas));
    const auto found = service().coordinator(CoordinatorKind::Initiating, kAtlas, SyncClientID,
                                             InstallCoordinatorService::Creation::OnlyExisting);
    ASSERT_NE(found.coordinator, nullptr);
    EXPECT_TRUE(found.coordinator->hasInstallOptions());
    EXPECT_TRUE(found.coordinator->hasInitialODRAssetPromises());
    EXPECT_TRUE(found.coordinator->hasPlaceholderPromise());
    ASSERT_NE(found.coordinator->appAssetPromise(), nullptr);
    EXPECT_EQ(found.coordinator->appAssetPromise()->name(), "com.example.atlas-Asset");
    EXPECT_FALSE(found.coordinator->appAssetPromise()->isComplete());
}

TEST_F(DeviceCoordinationResumeTest, aResumedCoordinatorGoesOnWhereItStopped) {
    beforeACrash([this] { static_cast<void>(prepare(kAtlas)); });
    const auto found = coordinator(kAtlas, CoordinatorKind::Initiating);
    deliver(*found, stagePackage(kAtlas, "2.0"));
    EXPECT_EQ(listener_->waitFor(1), Texts{"complete com.example.atlas"});
    EXPECT_EQ(application(kAtlas)->bundleVersion, "2.0");
}

TEST_F(DeviceCoordinationResumeTest, whatWasDeliveredIsInstalledOnceTheServiceIsStarted) {
    beforeACrash([this] { static_cast<void>(prepare(kAtlas)); });
    markDelivered(kAtlas);
    EXPECT_FALSE(application(kAtlas));
    ASSERT_TRUE(device().startCoordination());
    EXPECT_TRUE(device().waitForCoordinatedInstalls(kLong));
    EXPECT_EQ(application(kAtlas)->bundleVersion, "2.0");
    EXPECT_FALSE(hasPlaceholder(kAtlas));
    EXPECT_FALSE(recordOf(kAtlas));
}

TEST_F(DeviceCoordinationResumeTest, aClientThatAttachesHearsOfWhatIsResumed) {
    beforeACrash([this] {
        static_cast<void>(prepare(kAtlas));
        static_cast<void>(prepare(kBoat));
    });
    markDelivered(kAtlas);
    write("/var/mobile/Media/PublicStaging/com.example.boat.zip", "no package");
    sql("UPDATE promises SET complete = 1, path ="
        " '/var/mobile/Media/PublicStaging/com.example.boat.zip'"
        " WHERE name = 'com.example.boat-Asset'");
    const auto registration =
        service().makeAppInstallObserver("com.example.test", {SyncClientID}, listener_);
    Texts heard = listener_->waitFor(2);
    std::sort(heard.begin(), heard.end());
    EXPECT_EQ(heard, (Texts{"complete com.example.atlas", "failed com.example.boat"}));
}

TEST_F(DeviceCoordinationResumeTest, aDelegateOfAnotherClientHearsNothing) {
    beforeACrash([this] { static_cast<void>(prepare(kAtlas)); });
    markDelivered(kAtlas);
    const auto registration =
        service().makeAppInstallObserver("com.example.test", {AppStoreClientID}, listener_);
    EXPECT_TRUE(device().waitForCoordinatedInstalls(kLong));
    EXPECT_TRUE(listener_->heard().empty());
}

TEST_F(DeviceCoordinationResumeTest, whatWaitsIsNotInstalled) {
    beforeACrash([this] { static_cast<void>(prepare(kAtlas)); });
    ASSERT_TRUE(device().startCoordination());
    EXPECT_TRUE(device().coordinatedInstallsUnderWay().empty());
    EXPECT_TRUE(device().waitForCoordinatedInstalls(kLong));
    EXPECT_TRUE(hasPlaceholder(kAtlas));
    EXPECT_FALSE(recordOf(kAtlas)->isComplete);
}

TEST_F(DeviceCoordinationResumeTest, aPackageThatWasNotDeliveredIsClearedAndOneThatWasIsKept) {
    beforeACrash([this] {
        static_cast<void>(prepare(kAtlas));
        static_cast<void>(prepare(kBoat));
    });
    markDelivered(kAtlas);
    write("/var/mobile/Media/PublicStaging/com.example.boat.zip", "half of it");
    static_cast<void>(device());
    EXPECT_TRUE(exists("/var/mobile/Media/PublicStaging/com.example.atlas.zip"));
    EXPECT_FALSE(exists("/var/mobile/Media/PublicStaging/com.example.boat.zip"));
}

TEST_F(DeviceCoordinationResumeTest, aCrashAtAnyMomentOfAnInstallLeavesItDoneOrToBeDone) {
    for (int round = 0; round < 8; ++round) {
        const std::string identifier = "com.example.app" + std::to_string(round);
        beforeACrash([&] {
            const auto made = prepare(identifier);
            deliver(*made, stagePackage(identifier, "2.0"));
            // Killed at once, or a little later, or with the install done.
            for (int turn = 0; turn < round * round * 40; ++turn) {
                if (application(identifier)) break;
            }
        });
        ASSERT_TRUE(device().startCoordination());
        EXPECT_TRUE(device().waitForCoordinatedInstalls(kLong));
        EXPECT_TRUE(application(identifier)) << round;
        EXPECT_FALSE(hasPlaceholder(identifier));
        EXPECT_FALSE(recordOf(identifier));
        EXPECT_EQ(containers().size(), static_cast<std::size_t>(round) + 1);
        endAndForget();
    }
}

TEST_F(DeviceCoordinationResumeTest, aDeviceThatIsClosedInTheMiddleGoesOnLater) {
    for (int number = 0; number < 12; ++number) {
        const std::string identifier = "com.example.app" + std::to_string(number);
        deliver(*prepare(identifier), stagePackage(identifier));
    }
    endAndForget();
    ASSERT_TRUE(device().startCoordination());
    EXPECT_TRUE(device().waitForCoordinatedInstalls(kLong));
    EXPECT_EQ(number("SELECT count(*) FROM applications"), 12);
    EXPECT_EQ(containers().size(), 12U);
}

TEST_F(DeviceCoordinationResumeTest, anUnconfiguredPlaceholderIsKeptAndNotShownAfterACrashEither) {
    beforeACrash([this] {
        const auto made = coordinator(kAtlas, CoordinatorKind::Initiating);
        static_cast<void>(made->setPlaceholderPromise(placeholder(kAtlas)));
    });
    EXPECT_TRUE(recordOf(kAtlas)->hasPlaceholder);
    EXPECT_FALSE(recordOf(kAtlas)->placeholderStands);
    EXPECT_FALSE(hasPlaceholder(kAtlas));
}

TEST_F(DeviceCoordinationResumeTest, aCoordinatorWhosePlaceholderIsLostGoes) {
    beforeACrash([this] { static_cast<void>(prepare(kAtlas)); });
    sql("UPDATE placeholders SET unsynced_boot = 'another boot'");
    static_cast<void>(device());
    EXPECT_FALSE(recordOf(kAtlas));
    EXPECT_EQ(containers().size(), 0U);
}

TEST_F(DeviceCoordinationResumeTest, aSyncsPlaceholderWithoutACoordinatorGoes) {
    beforeACrash([this] { static_cast<void>(prepare(kAtlas)); });
    sql("DELETE FROM coordinators");
    EXPECT_FALSE(hasPlaceholder(kAtlas));
    EXPECT_EQ(containers().size(), 0U);
}

TEST_F(DeviceCoordinationResumeTest, whatTheDirectPathHasRestoredIsLeftToTheStore) {
    ASSERT_TRUE(look()->change({.coordination = false}));
    ASSERT_TRUE(installPlaceholder(kAtlas, kInstallTypeRestore));
    ASSERT_TRUE(device().setRestoreDataExpected(kAtlas, true));
    close();
    ASSERT_TRUE(look()->change({.coordination = true}));
    static_cast<void>(device());
    ASSERT_TRUE(recordOf(kAtlas));
    EXPECT_EQ(recordOf(kAtlas)->kind, "restoring");
    EXPECT_EQ(recordOf(kAtlas)->client, SyncClientID);
    EXPECT_EQ(recordOf(kAtlas)->waitsForClient, AppStoreClientID);
    EXPECT_TRUE(recordOf(kAtlas)->placeholderStands);
    EXPECT_FALSE(device().status(kAtlas)->awaitsRestoreData);
    close();
    static_cast<void>(device());
    EXPECT_TRUE(hasPlaceholder(kAtlas)) << "once more changes nothing";
    EXPECT_EQ(device().coordinators()->size(), 1U);
}

TEST_F(DeviceCoordinationResumeTest, whatAnotherClientHasInHandIsNotTakenOver) {
    ASSERT_TRUE(look()->change({.coordination = false}));
    ASSERT_TRUE(installPlaceholder(kAtlas, kInstallTypeRestore));
    close();
    ASSERT_TRUE(look()->change({.coordination = true}));
    ASSERT_TRUE(look()->createCoordinator(kAtlas, 7));
    static_cast<void>(device());
    EXPECT_EQ(recordOf(kAtlas)->client, 7U);
    EXPECT_TRUE(hasPlaceholder(kAtlas));
}

TEST_F(DeviceCoordinationResumeTest, theFilesOfPlaceholdersAreClearedWhenASessionOpens) {
    beforeACrash([this] { stageIcon(kAtlas); });
    static_cast<void>(device());
    EXPECT_FALSE(exists(std::string(kPlaceholderFilesDirectory)));
}

TEST_F(DeviceCoordinationResumeTest, theCleanUpOfTheDirectPathLeavesPlaceholdersOfCoordinators) {
    const auto made = prepare(kAtlas);
    ASSERT_TRUE(installPlaceholder(kBoat));
    const Result<Texts> removed = device().removeLeftoverSyncPlaceholders();
    ASSERT_TRUE(removed.ok());
    EXPECT_EQ(*removed, Texts{kBoat});
    EXPECT_TRUE(hasPlaceholder(kAtlas));
}

TEST_F(DeviceCoordinationResumeTest, whereCoordinationWasTurnedOffTheNextSessionHasNoCoordinators) {
    beforeACrash([this] { static_cast<void>(prepare(kAtlas)); });
    markDelivered(kAtlas);
    ASSERT_TRUE(look()->change({.coordination = false}));
    ASSERT_TRUE(device().startCoordination());
    EXPECT_FALSE(recordOf(kAtlas));
    EXPECT_FALSE(either(kAtlas));
    EXPECT_EQ(containers().size(), 0U);
    EXPECT_FALSE(exists("/var/mobile/Media/PublicStaging/com.example.atlas.zip"));
}

}  // namespace
}  // namespace appsync
