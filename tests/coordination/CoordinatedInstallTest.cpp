#include <cerrno>

#include "tests/coordination/CoordinationFixture.h"

namespace appsync {
namespace {

using testing::AllOf;
using testing::Contains;
using testing::ElementsAre;
using testing::EndsWith;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using testing::SizeIs;
using testing::StartsWith;
using Access = AppsClientTestAccess;

constexpr const char* kFinished =
    "processing app install for bundle com.example.a finished with status 1 error (null)";

class CoordinatedInstall : public PreparedAppFixture {};

TEST_F(CoordinatedInstall, IsPreparedInOrder) {
    EXPECT_TRUE(client_->prepareAppForInstallUsingCoordination(*asset_, false));
    EXPECT_THAT(
        platform_.messageLines(),
        ElementsAre(
            "14 default processing app install for bundle 'com.example.a', title Example "
            "assetplist {BundleDisplayName = Example;}, version 1.0 with install coordination",
            "8 default Created initiating coordinator Coordinator(com.example.a) "
            "(createIfNotExisting:1, existingApp:0) for com.example.a with error (null)",
            "8 default set install options on coordinator for com.example.a",
            "8 default set ZEL asset promise to install coordinator for com.example.a",
            "8 default Added app asset promise to coordinator for 'com.example.a'",
            "8 default Created app directory for 'com.example.a' at /tmp/com.korvu.trd.Apps/"
            "com.example.a.app with err=(null)",
            "8 default icon for com.example.a at /tmp/com.korvu.trd.Apps/com.example.a.app/"
            "Icon.png has a size of 4",
            "8 default Copied icon from /var/mobile/Media/a/icon.png to /tmp/com.korvu.trd.Apps/"
            "com.example.a.app/Icon.png with error (null) for 'com.example.a', sizeOnDisk:4",
            "8 default Created placeholder Placeholder(com.example.a) for 'com.example.a' of type "
            "4",
            "8 default Added icon promise to placeholder for 'com.example.a'",
            "8 default set {info = {BundleDisplayName = Example;}; launchProhibited = 0; "
            "bundleVersion = 1.0;} attributes on placeholder for com.example.a",
            "8 default set store metadata on placeholder for com.example.a",
            "8 default set placeholder configuration as complete for com.example.a",
            "8 default added placeholder promise to coordinator for com.example.a",
            std::string("8 default ") + kFinished));
    EXPECT_THAT(
        steps(),
        ElementsAre(
            "InstallTransactionLog.logStep(1, 1, 1, yes, com.example.a, Install App)",
            "InstallTransactionLog.logStep(3, 1, 1, yes, com.example.a, Create coordinator)",
            "InstallTransactionLog.logStep(3, 1, 2, yes, com.example.a, Finished creating "
            "coordinator)",
            "InstallTransactionLog.logStep(5, 1, 1, yes, com.example.a, Copying icon)",
            "InstallTransactionLog.logStep(5, 1, 2, yes, com.example.a, Copying icon)",
            "InstallTransactionLog.logStep(4, 1, 1, yes, com.example.a, Create placeholder)",
            "InstallTransactionLog.logStep(4, 1, 2, yes, com.example.a, Finished creating "
            "placeholder)",
            "InstallTransactionLog.logStep(1, 1, 2, yes, com.example.a, Install app)"));
}

TEST_F(CoordinatedInstall, SetsUpEveryPiece) {
    EXPECT_TRUE(prepare());
    ASSERT_NE(state(), nullptr);
    const InstallOptions options{{store_}, kInstallTypeSync, 1};
    EXPECT_EQ(state()->installOptions, options);
    ASSERT_TRUE(state()->initialODRAssets);
    EXPECT_THAT(*state()->initialODRAssets, IsEmpty());
    EXPECT_EQ(promise("-Asset").path, std::nullopt);
    EXPECT_EQ(state()->observer.lock(), client_);
    const SimulatedPlaceholderState& placeholder = *state()->placeholder;
    const PlaceholderAttributes attributes{info_, false, "1.0"};
    EXPECT_EQ(placeholder.name, "Example");
    EXPECT_EQ(placeholder.installType, kInstallTypeSync);
    EXPECT_EQ(placeholder.attributes, attributes);
    EXPECT_EQ(placeholder.metadata, StoreMetadata{store_});
    EXPECT_TRUE(placeholder.configurationComplete);
    EXPECT_EQ(promise("-Icon").diskSpaceNeeded, 4U);
    EXPECT_TRUE(state()->placeholderShown);
    EXPECT_THAT(platform_.registry.placeholderIdentifiers(), ElementsAre(kA));
}

TEST_F(CoordinatedInstall, OfAnUpdateEndsAsAnInstall) {
    platform_.registry.addApplication(kA, "0.9");
    EXPECT_TRUE(prepare(true));
    EXPECT_EQ(state()->kind, CoordinatorKind::Updating);
    EXPECT_EQ(steps().front(),
              "InstallTransactionLog.logStep(1, 1, 1, yes, com.example.a, Update app)");
    EXPECT_EQ(steps().back(),
              "InstallTransactionLog.logStep(1, 1, 2, yes, com.example.a, Install app)");
    EXPECT_TRUE(logged(LogLevel::Default, kFinished));
}

TEST_F(CoordinatedInstall, PreparedAgainChangesNothing) {
    EXPECT_TRUE(prepare());
    platform_.clearRecording();
    EXPECT_TRUE(prepare());
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre(HasSubstr("processing app install for bundle"),
                            HasSubstr("Created initiating coordinator"),
                            "8 default coordinator for com.example.a has install options",
                            "8 default coordinator for com.example.a has an ZEL app asset promise",
                            "8 default coordinator for com.example.a has an app asset promise",
                            "8 default coordinator for com.example.a has a placeholder promise",
                            std::string("8 default ") + kFinished));
    EXPECT_THAT(platform_.callsTo({"InstallCoordinatorService.makeAppPlaceholder",
                                   "InstallCoordinatorService.makePathTransferPromise",
                                   "InstallCoordinator.cancelForReason",
                                   "InstallCoordinator.setPlaceholderPromise"}),
                IsEmpty());
}

TEST_F(CoordinatedInstall, HearsAgainOfACoordinatorOfAnEarlierClient) {
    EXPECT_TRUE(prepare());
    makeClient();
    EXPECT_TRUE(prepare());
    EXPECT_EQ(state()->observer.lock(), client_);
}

TEST_F(CoordinatedInstall, GivesThePlaceholderNoMetadataWhenTheOptionsWereThere) {
    const auto earlier = coordinator();
    EXPECT_TRUE(earlier->setInstallOptions({{store_}, kInstallTypeSync, 1}).ok());
    EXPECT_TRUE(prepare());
    EXPECT_TRUE(state()->placeholder->metadataSet);
    EXPECT_EQ(state()->placeholder->metadata, std::nullopt);
    EXPECT_TRUE(logged(LogLevel::Default, "set store metadata on placeholder for com.example.a"));
}

TEST_F(CoordinatedInstall, TakesAnUnreadableStoreDictionaryForAnEmptyOne) {
    platform_.files.addFile(kStorePath, "damaged");
    EXPECT_TRUE(prepare());
    EXPECT_EQ(state()->installOptions->storeMetadata, StoreMetadata{});
    EXPECT_EQ(state()->placeholder->metadata, StoreMetadata{});
}

TEST_F(CoordinatedInstall, LogsAnInfoDictionaryThatCannotBeReadAsMissing) {
    platform_.files.addFile(kInfoPath, "damaged");
    EXPECT_TRUE(prepare());
    EXPECT_TRUE(loggedInApplications(
        LogLevel::Default,
        "processing app install for bundle 'com.example.a', title Example assetplist (null), "
        "version 1.0 with install coordination"));
    EXPECT_EQ(state()->placeholder->attributes->info, PropertyList::map());
}

TEST_F(CoordinatedInstall, NeedsNoSideFilesAndNoVersion) {
    asset_->infoPath.reset();
    asset_->storeMetadataPath.reset();
    asset_->variantOptions = PropertyList::map();
    EXPECT_TRUE(prepare());
    EXPECT_EQ(state()->placeholder->attributes, PlaceholderAttributes{});
    EXPECT_TRUE(state()->placeholderShown);
}

TEST_F(CoordinatedInstall, ProhibitsTheLaunchAsTheInfoDictionarySays) {
    platform_.addPropertyList(kInfoPath,
                              PropertyList::map({{"RGApplicationLaunchProhibited", true}}));
    EXPECT_TRUE(prepare());
    EXPECT_TRUE(state()->placeholder->attributes->launchProhibited);
}

TEST_F(CoordinatedInstall, NeedsNoIcon) {
    asset_->icon.reset();
    EXPECT_TRUE(prepare());
    EXPECT_EQ(service().promise(std::string(kA) + "-Icon"), nullptr);
    EXPECT_TRUE(state()->placeholder->attributes);
    EXPECT_TRUE(state()->placeholder->metadataSet);
    EXPECT_TRUE(state()->placeholder->configurationComplete);
    EXPECT_TRUE(state()->placeholderShown);
    EXPECT_THAT(steps(), Not(Contains(HasSubstr("Copying icon"))));
}

TEST_F(CoordinatedInstall, GoesOnWithoutAnIconThatCannotBeCopied) {
    platform_.files.remove(kIconPath);
    EXPECT_TRUE(prepare());
    EXPECT_EQ(service().promise(std::string(kA) + "-Icon"), nullptr);
    EXPECT_THAT(platform_.messages(),
                Contains(AllOf(HasSubstr("Copied icon from"), HasSubstr("Code=2"),
                               HasSubstr("for 'com.example.a', sizeOnDisk:0"))));
    EXPECT_THAT(steps(), Contains("InstallTransactionLog.logStep(5, 1, 2, yes, com.example.a, "
                                  "Copying icon)"));
    EXPECT_TRUE(state()->placeholderShown);
    // The last failure, although the install goes on.
    EXPECT_THAT(platform_.messages(),
                Contains(AllOf(HasSubstr("finished with status 1 error"), HasSubstr("Code=2"))));
}

TEST_F(CoordinatedInstall, GoesOnWithoutAnIconWhereOneIsLeftOver) {
    const std::string leftOver = kBundle + "/Icon.png";
    platform_.files.addFile(leftOver, "left over");
    EXPECT_TRUE(prepare());
    EXPECT_EQ(platform_.files.text(leftOver), "left over");
    EXPECT_EQ(service().promise(std::string(kA) + "-Icon"), nullptr);
    EXPECT_THAT(platform_.messages(), Contains(AllOf(StartsWith("Copied icon from "),
                                                     HasSubstr("Code=17"), EndsWith("OnDisk:0"))));
    EXPECT_TRUE(state()->placeholder->configurationComplete);
}

TEST_F(CoordinatedInstall, GoesOnWithoutAnIconOfUnknownSize) {
    platform_.files.failNext(FileOperation::Attributes, kBundle + "/Icon.png", EIO);
    EXPECT_TRUE(prepare());
    EXPECT_EQ(service().promise(std::string(kA) + "-Icon"), nullptr);
    EXPECT_TRUE(state()->placeholder->configurationComplete);
    EXPECT_THAT(platform_.messages(), Contains(AllOf(StartsWith("Copied icon from "),
                                                     HasSubstr("Code=5"), EndsWith("OnDisk:0"))));
}

TEST_F(CoordinatedInstall, OfAnApplicationWithANameOnlyIsTheServicesToRefuse) {
    asset_->identifier = "";
    EXPECT_FALSE(prepare());
    EXPECT_THAT(platform_.callsTo({"InstallCoordinatorService.coordinator"}), SizeIs(1));
}

TEST_F(CoordinatedInstall, GoesOnWithoutADirectoryForThePlaceholder) {
    platform_.files.failNext(FileOperation::CreateDirectory, kBundle, ENOSPC);
    EXPECT_TRUE(prepare());
    EXPECT_EQ(service().promise(std::string(kA) + "-Icon"), nullptr);
    EXPECT_THAT(steps(), Not(Contains(HasSubstr("Copying icon"))));
    EXPECT_TRUE(state()->placeholder->configurationComplete);
}

TEST_F(CoordinatedInstall, NamesThePlaceholderByTheIdentifierInTheLastResort) {
    asset_->prettyName.reset();
    EXPECT_TRUE(prepare());
    EXPECT_EQ(state()->placeholder->name, kA);
}

class CoordinatedUninstall : public CoordinationFixture {
  protected:
    static constexpr const char* kMessage =
        "Uninstall of com.example.a with install coordinator succeeded wiht error ";
};

TEST_F(CoordinatedUninstall, IsTheServices) {
    platform_.registry.addApplication(kA);
    client_->uninstallAppUsingCoordination(kA);
    EXPECT_THAT(
        platform_.lines(),
        ElementsAre("InstallTransactionLog.logStep(7, 1, 1, yes, com.example.a, Uninstall app)",
                    "InstallCoordinatorService.uninstallApp(com.example.a)"));
    platform_.runUntilIdle();
    EXPECT_THAT(platform_.registry.installedIdentifiers(), IsEmpty());
    EXPECT_TRUE(logged(LogLevel::Default, std::string(kMessage) + "(null)."));
    EXPECT_EQ(steps().back(),
              "InstallTransactionLog.logStep(7, 1, 2, yes, com.example.a, Uninstall app)");
}

TEST_F(CoordinatedUninstall, SaysThatItSucceededAlsoWhenItFailed) {
    platform_.registry.addApplication(kA);
    platform_.registry.failNextUninstall(kA, refusal_);
    client_->uninstallAppUsingCoordination(kA);
    platform_.runUntilIdle();
    EXPECT_TRUE(logged(LogLevel::Default,
                       std::string(kMessage) + "Error Domain=Coordination Code=7 \"(null)\"."));
    EXPECT_EQ(steps().back(),
              "InstallTransactionLog.logStep(7, 1, 2, no, com.example.a, Uninstall app)");
}

TEST_F(CoordinatedUninstall, IsRecordedWhenTheClientHasGone) {
    platform_.registry.addApplication(kA);
    client_->uninstallAppUsingCoordination(kA);
    client_.reset();
    platform_.runUntilIdle();
    EXPECT_TRUE(logged(LogLevel::Default, std::string(kMessage) + "(null)."));
}

}  // namespace
}  // namespace appsync
