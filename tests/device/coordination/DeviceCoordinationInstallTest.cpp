#include <signal.h>
#include <sys/resource.h>

#include <random>
#include <thread>

#include "device/values/DevicePaths.h"
#include "platform/FileSystem.h"
#include "platform/FileURL.h"
#include "platform/PropertyListSerialization.h"
#include "tests/device/coordination/DeviceCoordinationFixture.h"
#include "tests/device/package/PackageZip.h"

namespace appsync {
namespace {

using Texts = std::vector<std::string>;

class DeviceCoordinationInstallTest : public DeviceCoordinationFixture {
  protected:
    /// What the registry tells of installs under way: "identifier state phase".
    Texts installsUnderWay() {
        Texts texts;
        device().registry().enumerateBundles(
            AppRegistry::kEveryBundle, [&](const AppProxy& proxy, bool&) {
                const auto record = device().registry().installProgress(proxy, 0);
                if (record == nullptr) return;
                texts.push_back(proxy.applicationIdentifier + " " +
                                std::to_string(record->installState()) + " " +
                                std::to_string(record->installPhase()));
            });
        return texts;
    }
};

TEST_F(DeviceCoordinationInstallTest, aNewCoordinatorIsFoundBeforeAnythingOfItIsWritten) {
    for (int turn = 0; turn < 100; ++turn) {
        const std::string identifier = kAtlas + std::to_string(turn);
        static_cast<void>(coordinator(identifier, CoordinatorKind::Initiating));
        const auto again =
            service().coordinator(CoordinatorKind::Initiating, identifier, SyncClientID,
                                  InstallCoordinatorService::Creation::CreateIfNotExisting);
        ASSERT_NE(again.coordinator, nullptr);
        EXPECT_FALSE(again.wasCreated);
        EXPECT_NE(service().existingCoordinator(identifier, SyncClientID), nullptr);
    }
    EXPECT_EQ(device().coordinators()->size(), 100U);
}

TEST_F(DeviceCoordinationInstallTest, ofTwoProcessesThatBeginAnInstallOneHasIt) {
    const auto beside = look();
    const auto made = coordinator(kAtlas, CoordinatorKind::Initiating);
    const Status theirs = beside->createCoordinator(kAtlas, AppStoreClientID);
    const auto shown = placeholder(kAtlas);
    EXPECT_TRUE(succeeded(shown->setConfigurationComplete()));
    const Status ours = made->setPlaceholderPromise(shown);
    EXPECT_NE(ours.ok(), theirs.ok());
    EXPECT_EQ(number("SELECT count(*) FROM coordinators"), 1);
    EXPECT_EQ(hasPlaceholder(kAtlas), ours.ok());
}

TEST_F(DeviceCoordinationInstallTest, whatBesideASessionCannotBeWrittenWasNotCreated) {
    const auto beside = look();
    InstallCoordinatorService& theirs = platformOf(*beside).coordination;
    const auto create = [&](const char* identifier) {
        return theirs.coordinator(CoordinatorKind::Initiating, identifier, AppStoreClientID,
                                  InstallCoordinatorService::Creation::CreateIfNotExisting);
    };
    ASSERT_NE(create(kBoat).coordinator, nullptr);
    EXPECT_EQ(number("SELECT id FROM coordinators"), 1);
    sql("INSERT INTO coordinators (id, identifier, kind, client, created)"
        " VALUES (2, 'com.example.in.the.way', 0, 1, 0)");
    const auto made = create(kAtlas);
    EXPECT_EQ(made.coordinator, nullptr);
    EXPECT_TRUE(made.error);
}

TEST_F(DeviceCoordinationInstallTest, aConfiguredPlaceholderStandsAtOnceWithAllThatItWasGiven) {
    const auto made = prepare(kAtlas);
    const std::optional<AppProxy> proxy = either(kAtlas);
    ASSERT_TRUE(proxy);
    EXPECT_TRUE(proxy->state.placeholder);
    EXPECT_EQ(proxy->installType, kInstallTypeSync);
    EXPECT_EQ(proxy->displayName, "Atlas");
    EXPECT_EQ(proxy->bundleVersion, "2.0");
    EXPECT_EQ(read(proxy->bundlePath + "/Icon.png"), "icon of com.example.atlas");
    const auto metadata =
        device().files().readFile(proxy->bundleContainerPath + "/VessikMetadata.plist");
    ASSERT_TRUE(metadata.ok());
    const auto list = device().propertyLists().parse(*metadata);
    ASSERT_TRUE(list.ok());
    EXPECT_EQ(*list->findString("title"), "Atlas of the World");
    EXPECT_EQ(listener_->waitFor(1), Texts{"placeholder com.example.atlas"});
}

TEST_F(DeviceCoordinationInstallTest, theServiceTakesItsCopiesAndClearsTheFilesOfThePlaceholder) {
    const auto made = prepare(kAtlas);
    EXPECT_FALSE(exists(std::string(kPlaceholderFilesDirectory) + "/com.example.atlas.app"));
}

TEST_F(DeviceCoordinationInstallTest, theSinfIsKeptWithThePlaceholder) {
    const auto made = coordinator(kAtlas, CoordinatorKind::Initiating);
    const auto shown = placeholder(kAtlas);
    ASSERT_TRUE(shown->setSinf(Bytes{1, 2, 3}));
    ASSERT_TRUE(shown->setConfigurationComplete());
    ASSERT_TRUE(made->setPlaceholderPromise(shown));
    EXPECT_EQ(number("SELECT sinf = x'010203' FROM placeholders"), 1);
}

TEST_F(DeviceCoordinationInstallTest, aPlaceholderMayBeConfiguredAfterItWasHandedIn) {
    const auto made = coordinator(kAtlas, CoordinatorKind::Initiating);
    const auto shown = placeholder(kAtlas);
    ASSERT_TRUE(made->setPlaceholderPromise(shown));
    EXPECT_FALSE(hasPlaceholder(kAtlas));
    ASSERT_TRUE(shown->setConfigurationComplete());
    EXPECT_TRUE(hasPlaceholder(kAtlas));
    EXPECT_EQ(listener_->waitFor(1), Texts{"placeholder com.example.atlas"});
}

TEST_F(DeviceCoordinationInstallTest, aPlaceholderWithoutItsIconStillStands) {
    const auto made = coordinator(kAtlas, CoordinatorKind::Initiating);
    const auto shown = placeholder(kAtlas);
    ASSERT_TRUE(shown->setConfigurationComplete());
    ASSERT_TRUE(device().files().removeItem(std::string(kPlaceholderFilesDirectory)));
    ASSERT_TRUE(made->setPlaceholderPromise(shown));
    EXPECT_TRUE(hasPlaceholder(kAtlas));
}

TEST_F(DeviceCoordinationInstallTest, anIconPathThatLeavesTheDeviceGivesNoIcon) {
    write("/../../outside.png", "outside");
    const auto made = coordinator(kAtlas, CoordinatorKind::Initiating);
    const auto shown =
        service().makeAppPlaceholder("Atlas", kAtlas, kInstallTypeSync, SyncClientID);
    const auto icon = service().makePathTransferPromise(
        "icon", SyncClientID, FileURL::fromPath("/../../outside.png", false), 1);
    icon->setComplete();
    ASSERT_TRUE(shown->setIconPromise(icon));
    ASSERT_TRUE(shown->setConfigurationComplete());
    ASSERT_TRUE(made->setPlaceholderPromise(shown));
    EXPECT_FALSE(exists(either(kAtlas)->bundlePath + "/Icon.png"));
    EXPECT_TRUE(exists("/../../outside.png"));
}

TEST_F(DeviceCoordinationInstallTest, aPlaceholderThatWaitsIsNoInstallThatThePluginWouldSkip) {
    const auto made = prepare(kAtlas);
    made->appAssetPromise()->setPercentComplete(0.5);
    EXPECT_EQ(installsUnderWay(),
              Texts{"com.example.atlas " + std::to_string(kInstallStateWaiting) + " " +
                    std::to_string(kInstallPhaseLoading)});
}

TEST_F(DeviceCoordinationInstallTest, progressOfThePackageIsShownOnTheHomeScreen) {
    const auto made = prepare(kAtlas);
    made->appAssetPromise()->setPercentComplete(0.5);
    ASSERT_TRUE(device().installProgress(kAtlas));
    EXPECT_DOUBLE_EQ(device().installProgress(kAtlas)->fraction(), 0.25);
}

TEST_F(DeviceCoordinationInstallTest, aDeliveredPackageIsInstalledAndItsFileRemoved) {
    const auto made = prepare(kAtlas);
    const std::string package = stagePackage(kAtlas, "2.0");
    deliver(*made, package);
    EXPECT_EQ(listener_->waitFor(2),
              (Texts{"placeholder com.example.atlas", "complete com.example.atlas"}));
    EXPECT_EQ(application(kAtlas)->bundleVersion, "2.0");
    EXPECT_EQ(application(kAtlas)->installType, kInstallTypeSync);
    EXPECT_FALSE(hasPlaceholder(kAtlas));
    EXPECT_FALSE(exists(package));
    EXPECT_FALSE(recordOf(kAtlas));
    EXPECT_EQ(containers().size(), 1U);
}

TEST_F(DeviceCoordinationInstallTest, anUpdateLeavesTheOldVersionUsableUntilItIsDone) {
    ASSERT_TRUE(install(kAtlas, "1.0"));
    const auto made = prepare(kAtlas, CoordinatorKind::Updating);
    EXPECT_TRUE(hasPlaceholder(kAtlas));
    EXPECT_EQ(application(kAtlas)->bundleVersion, "1.0");
    deliver(*made, stagePackage(kAtlas, "2.0"));
    EXPECT_EQ(listener_->waitFor(2).back(), "complete com.example.atlas");
    EXPECT_EQ(application(kAtlas)->bundleVersion, "2.0");
    EXPECT_EQ(containers().size(), 1U);
}

TEST_F(DeviceCoordinationInstallTest, manyInstallsGoOnAtOnceAndShareTheirTransactions) {
    std::vector<std::shared_ptr<InstallCoordinator>> all;
    Texts packages;
    for (int number = 0; number < 24; ++number) {
        const std::string identifier = "com.example.app" + std::to_string(number);
        all.push_back(prepare(identifier));
        packages.push_back(stagePackage(identifier));
    }
    std::vector<std::thread> deliveries;
    for (std::size_t first = 0; first < 4; ++first) {
        deliveries.emplace_back([&, first] {
            for (std::size_t index = first; index < all.size(); index += 4) {
                deliver(*all[index], packages[index]);
            }
        });
    }
    for (std::thread& delivery : deliveries) delivery.join();
    EXPECT_TRUE(device().waitForCoordinatedInstalls(std::chrono::seconds(60)));
    EXPECT_EQ(number("SELECT count(*) FROM applications"), 24);
    EXPECT_EQ(number("SELECT count(*) FROM coordinators"), 0);
    EXPECT_EQ(number("SELECT count(*) FROM placeholders"), 0);
    EXPECT_EQ(listener_->heard().size(), 48U);
}

TEST_F(DeviceCoordinationInstallTest, nothingIsInstalledBeforeTheLastPieceIsThere) {
    const auto made = prepare(kAtlas);
    const auto data = service().makeOutOfBandPromise("data", SyncClientID, 0);
    ASSERT_TRUE(made->setUserDataPromise(data));
    deliver(*made, stagePackage(kAtlas));
    EXPECT_EQ(device().coordinatedInstallsUnderWay(), Texts{kAtlas});
    EXPECT_FALSE(device().waitForCoordinatedInstalls(std::chrono::milliseconds(0)));
    EXPECT_FALSE(application(kAtlas));
    EXPECT_EQ(recordOf(kAtlas)->waitsForClient, SyncClientID);
    data->setComplete();
    EXPECT_TRUE(device().waitForCoordinatedInstalls(std::chrono::seconds(60)));
    EXPECT_TRUE(application(kAtlas));
}

TEST_F(DeviceCoordinationInstallTest,
       thePlaceholderOfADemotedApplicationOutlivesACancelledInstall) {
    ASSERT_TRUE(install(kAtlas));
    ASSERT_TRUE(device().demote(kAtlas, DemotedBy::Person));
    const auto made = prepare(kAtlas);
    EXPECT_EQ(either(kAtlas)->installType, kInstallTypeIntentionalDowngrade);
    made->cancelForReason(ErrorRecord::make("Test", 1, "no"), SyncClientID);
    EXPECT_EQ(either(kAtlas)->installType, kInstallTypeIntentionalDowngrade);
    installCoordinated(kAtlas);
    EXPECT_TRUE(application(kAtlas));
    EXPECT_FALSE(hasPlaceholder(kAtlas));
}

TEST_F(DeviceCoordinationInstallTest,
       theRestoreOfADemotedApplicationIsDoneWhenItsPlaceholderStands) {
    auto made = coordinator(kAtlas, CoordinatorKind::RestoringDemoted);
    const auto shown =
        service().makeAppPlaceholder("Atlas", kAtlas, kInstallTypeDowngrade, SyncClientID);
    ASSERT_TRUE(shown->setConfigurationComplete());
    ASSERT_TRUE(made->setPlaceholderPromise(shown));
    made.reset();
    EXPECT_EQ(listener_->waitFor(2),
              (Texts{"placeholder com.example.atlas", "complete com.example.atlas"}));
    EXPECT_TRUE(hasPlaceholder(kAtlas));
    EXPECT_FALSE(recordOf(kAtlas));
}

TEST_F(DeviceCoordinationInstallTest, newsOfARestoreComesOnceItsClientLetsGoOfTheCoordinator) {
    auto made = coordinator(kAtlas, CoordinatorKind::RestoringDemoted);
    const auto shown =
        service().makeAppPlaceholder("Atlas", kAtlas, kInstallTypeDowngrade, SyncClientID);
    ASSERT_TRUE(shown->setConfigurationComplete());
    ASSERT_TRUE(made->setPlaceholderPromise(shown));
    // News comes in the order in which things happened, but for what is held back.
    const auto later = prepare(kBoat);
    EXPECT_EQ(listener_->waitFor(1), Texts{"placeholder com.example.boat"});
    made.reset();
    EXPECT_EQ(listener_->waitFor(3),
              (Texts{"placeholder com.example.boat", "placeholder com.example.atlas",
                     "complete com.example.atlas"}));
}

TEST_F(DeviceCoordinationInstallTest, newsOfARestoreComesOnceSomebodyIsResponsible) {
    const auto made = coordinator(kAtlas, CoordinatorKind::Restoring);
    const auto shown = placeholder(kAtlas);
    ASSERT_TRUE(shown->setConfigurationComplete());
    ASSERT_TRUE(made->setPlaceholderPromise(shown));
    const auto later = prepare(kBoat);
    EXPECT_EQ(listener_->waitFor(1), Texts{"placeholder com.example.boat"});
    ASSERT_TRUE(made->setAppAssetPromiseResponsibleClient(AppStoreClientID));
    EXPECT_EQ(listener_->waitFor(2),
              (Texts{"placeholder com.example.boat", "placeholder com.example.atlas"}));
}

// Failures.

TEST_F(DeviceCoordinationInstallTest, aFailedRestoreKeepsItsPlaceholderAndWaitsForItsPackageAgain) {
    auto made = coordinator(kAtlas, CoordinatorKind::Restoring);
    const auto data = service().makeOutOfBandPromise("data", SyncClientID, 0);
    data->setComplete();
    ASSERT_TRUE(made->setUserDataPromise(data));
    const auto shown = placeholder(kAtlas);
    ASSERT_TRUE(shown->setConfigurationComplete());
    ASSERT_TRUE(made->setPlaceholderPromise(shown));
    ASSERT_TRUE(made->setAppAssetPromiseResponsibleClient(AppStoreClientID));
    ASSERT_TRUE(made->setAppAssetPromise(pathPromise("package")));
    const std::string package = stagePackage(kAtlas, "2.0");
    write(package, "no package at all");
    deliver(*made, package);
    EXPECT_EQ(listener_->waitFor(2).back(), "failed com.example.atlas");
    EXPECT_TRUE(made->error());
    EXPECT_TRUE(hasPlaceholder(kAtlas));
    EXPECT_EQ(number("SELECT state = 0 AND phase = 0 FROM progress"), 1);
    const Result<ApplicationStatus> status = device().status(kAtlas);
    ASSERT_TRUE(status.ok());
    EXPECT_TRUE(status->lastFailure);
    ASSERT_TRUE(status->coordinator);
    EXPECT_EQ(status->coordinator->waitsForClient, AppStoreClientID);
    EXPECT_EQ(status->coordinator->promises.size(), 1U);
    // Also in the next session.
    made.reset();
    endAndForget();
    const auto again = service().existingCoordinator(kAtlas, AppStoreClientID);
    ASSERT_NE(again, nullptr);
    EXPECT_FALSE(again->error());
    ASSERT_TRUE(again->setAppAssetPromise(pathPromise("package")));
    deliver(*again, stagePackage(kAtlas, "2.0"));
    EXPECT_TRUE(device().waitForCoordinatedInstalls(std::chrono::seconds(60)));
    EXPECT_EQ(application(kAtlas)->bundleVersion, "2.0");
    EXPECT_FALSE(recordOf(kAtlas));
}

TEST_F(DeviceCoordinationInstallTest, aFailedUpdateKeepsTheOldVersionAndTheReason) {
    ASSERT_TRUE(install(kAtlas, "1.0"));
    const auto made = prepare(kAtlas, CoordinatorKind::Updating);
    const std::string package = stagePackage(kAtlas, "2.0");
    write(package, "no package at all");
    deliver(*made, package);
    EXPECT_EQ(listener_->waitFor(2).back(), "failed com.example.atlas");
    EXPECT_TRUE(made->error());
    EXPECT_EQ(application(kAtlas)->bundleVersion, "1.0");
    EXPECT_FALSE(hasPlaceholder(kAtlas));
    EXPECT_FALSE(exists(package));
    EXPECT_FALSE(recordOf(kAtlas));
    const Result<ApplicationStatus> status = device().status(kAtlas);
    ASSERT_TRUE(status.ok());
    ASSERT_TRUE(status->lastFailure);
    EXPECT_EQ(status->lastFailure->error.code, made->error()->code);
    EXPECT_EQ(containers().size(), 1U);
}

TEST_F(DeviceCoordinationInstallTest, aPackageThatIsGoneIsAFailure) {
    const auto made = prepare(kAtlas);
    deliver(*made, "/var/mobile/Media/PublicStaging/gone.zip");
    EXPECT_EQ(listener_->waitFor(2).back(), "failed com.example.atlas");
    EXPECT_FALSE(either(kAtlas));
}

TEST_F(DeviceCoordinationInstallTest, aPackageOfAnotherApplicationIsAFailure) {
    const auto made = prepare(kAtlas);
    deliver(*made, stagePackage(kBoat));
    EXPECT_EQ(listener_->waitFor(2).back(), "failed com.example.atlas");
    EXPECT_FALSE(either(kAtlas));
    EXPECT_FALSE(either(kBoat));
}

TEST_F(DeviceCoordinationInstallTest,
       aPackagePathThatLeavesTheDeviceIsAFailureAndNothingIsRemoved) {
    static_cast<void>(device());
    write("/../../outside.zip", packageOf(kAtlas, "1.0"));
    const auto made = prepare(kAtlas);
    deliver(*made, "/../../outside.zip");
    EXPECT_EQ(listener_->waitFor(2).back(), "failed com.example.atlas");
    EXPECT_TRUE(exists("/../../outside.zip"));
}

TEST_F(DeviceCoordinationInstallTest, aDirectoryInThePlaceOfThePackageIsNotRemoved) {
    const auto made = prepare(kAtlas);
    deliver(*made, "/var/mobile/Media");
    EXPECT_EQ(listener_->waitFor(2).back(), "failed com.example.atlas");
    EXPECT_TRUE(exists("/var/mobile/Media"));
}

TEST_F(DeviceCoordinationInstallTest, aDiskThatTakesNoMoreIsAFailureOfThatInstallAlone) {
    const auto made = prepare(kAtlas);
    const auto other = prepare(kBoat);
    std::string noise(8'000'000, '\0');
    std::mt19937 random(1);
    for (char& byte : noise) byte = static_cast<char>(random());
    const std::string package = "/var/mobile/Media/PublicStaging/com.example.atlas.zip";
    write(package,
          ZipBuilder()
              .add({zipDirectory("App.app/"), zipFile("App.app/Info.plist", infoOf(kAtlas, "1.0")),
                    zipFile("App.app/main", noise)})
              .bytes());
    ::signal(SIGXFSZ, SIG_IGN);
    rlimit limit = {};
    ASSERT_EQ(::getrlimit(RLIMIT_FSIZE, &limit), 0);
    const rlimit small = {.rlim_cur = 4'000'000, .rlim_max = limit.rlim_max};
    ASSERT_EQ(::setrlimit(RLIMIT_FSIZE, &small), 0);
    deliver(*made, package);
    deliver(*other, stagePackage(kBoat));
    EXPECT_TRUE(device().waitForCoordinatedInstalls(std::chrono::seconds(60)));
    ASSERT_EQ(::setrlimit(RLIMIT_FSIZE, &limit), 0);
    EXPECT_TRUE(made->error());
    EXPECT_FALSE(either(kAtlas));
    EXPECT_TRUE(application(kBoat));
    EXPECT_EQ(containers().size(), 1U);
}

TEST_F(DeviceCoordinationInstallTest, aPlaceholderThatCannotBeMadeEndsItsCoordinator) {
    const auto made = coordinator(kAtlas, CoordinatorKind::Initiating);
    const auto shown =
        service().makeAppPlaceholder("Atlas", kAtlas, kInstallTypeSync, SyncClientID);
    PlaceholderAttributes attributes;
    attributes.info.set("Nothing", PropertyList());  // no encoding can carry it
    ASSERT_TRUE(shown->setAttributes(attributes));
    ASSERT_TRUE(shown->setConfigurationComplete());
    EXPECT_FALSE(made->setPlaceholderPromise(shown));
    EXPECT_EQ(listener_->waitFor(2),
              (Texts{"no placeholder com.example.atlas", "failed com.example.atlas"}));
    EXPECT_FALSE(recordOf(kAtlas));
}

}  // namespace
}  // namespace appsync
