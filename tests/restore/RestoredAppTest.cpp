#include <cerrno>

#include "tests/restore/RestoreFixture.h"

namespace appsync {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

// An application that is restored directly.
class RestoredAppPlaceholder : public RestoreFixture {
  protected:
    bool process(const PropertyList& metadata) { return processData(bytesOf(metadata)); }
    bool processData(const Bytes& metadata) {
        return client_->_processVessikRestoreInfoForApp(kA, metadata, &sinf_, &icon_);
    }
    [[nodiscard]] PropertyList info() {
        return platform_.propertyListAt(kBundle + "/Info.plist").value_or(PropertyList());
    }
    [[nodiscard]] PropertyList infoOf(const PropertyList& metadata) {
        EXPECT_TRUE(process(metadata));
        return info();
    }
    [[nodiscard]] std::string failureMessage() const {
        return "failed to process app restore info for 'com.example.a'. "
               "vessikMetadataDictionary={title = Shown; bundleVersion = 1.0;}";
    }
};

constexpr std::string_view kWholeRestore = R"(
8 default reconcileRestoreOfType 2
NamedNotifications.registerForState(com.korvu.deskora.trd.wsyncnotify)
8 default Notifying DK we are starting syncing
HomeScreenService.blockableConnection()
NamedNotifications.setState(1, 1)
NamedNotifications.post(com.korvu.deskora.trd.wsyncnotify)
FileSystem.createDirectory(/var/mobile/Library/ApplicationSync, with intermediates, (null))
FileSystem.itemExists(INFO)
FileSystem.readFile(INFO)
8 default processing vessik restore info
FileSystem.readFile(/var/mobile/Library/Preferences/com.korvu.Bakvia.DemotedApps.plist)
14 default Demoted Apps: {IntentionalDowngrades = (B);}
8 default processing vessik restore info for 'A' demotionStatus :0
AppRegistry.proxyForIdentifier(A, placeholders included)
8 default processing app restore info for 'A'
FileSystem.temporaryDirectory()
FileSystem.createDirectory(APPS/A.app, with intermediates, mobile:mobile)
8 default Created app directory for 'A' at APPS/A.app with err=(null)
FileSystem.createFile(APPS/A.app/Icon.png, mobile:mobile)
FileSystem.attributes(APPS/A.app/Icon.png)
8 default icon data for 'A' was writen to APPS/A.app/Icon.png with status:1 fileSize:4
8 default creating placeholder for 'A'. info.plist={BundleIdentifier = A; BundleVersion = 1.0; BundleExecutable = Shown; BundleDisplayName = Shown; BundleIconFile = Icon.png; VKPresselApp = 0; RGApplicationLaunchProhibited = 0;}
FileSystem.writeFileAtomically(APPS/A.app/Info.plist)
AppRegistry.installPlaceholderBundle(APPS/A.app, {PackageType = Placeholder; BundleIdentifier = A; RGInstallType = 2; StoreMetadata =; ApplicationSINF =;})
8 default Installed Placeholder app from path APPS/A.app: Shown [A 1.0] [isPressel: 0]
InstallTransactionLog.logScenario(Vessik App Restore, 0, yes, A, Installed placeholder)
8 default processing vessik restore info for 'B' demotionStatus :1
AppRegistry.proxyForIdentifier(B, placeholders included)
8 default processing app restore info for 'B'
FileSystem.temporaryDirectory()
FileSystem.createDirectory(APPS/B.app, with intermediates, mobile:mobile)
8 default Created app directory for 'B' at APPS/B.app with err=(null)
8 error no icon data for 'B'
8 default creating placeholder for 'B'. info.plist={BundleIdentifier = B; BundleVersion = 1.0; BundleExecutable = Shown; BundleDisplayName = Shown; BundleIconFile = Icon.png; VKPresselApp = 0; RGApplicationLaunchProhibited = 0;}
FileSystem.writeFileAtomically(APPS/B.app/Info.plist)
AppRegistry.installPlaceholderBundle(APPS/B.app, {PackageType = Placeholder; BundleIdentifier = B; RGInstallType = 2; StoreMetadata =; ApplicationSINF = (null);})
8 default Installed Placeholder app from path APPS/B.app: Shown [B 1.0] [isPressel: 0]
InstallTransactionLog.logScenario(Vessik App Restore, 0, yes, B, Installed placeholder)
8 default Will wait for 0 seconds for 0 placeholders to install
WaitGroup#4.waitFor(0 ms)
SerialQueue#4.sync()
8 default Finished waiting for placeholder installs
FileSystem.removeItem(MOVED)
FileSystem.moveItem(INFO, MOVED)
)";

TEST_F(RestoredAppPlaceholder, IsMadeByEveryCallAndMessageInOrder) {
    setRestoreInfo(PropertyList::map({{kA, appInfo()}, {kB, bareAppInfo()}}));
    setDemotedApps(PropertyList::map({{"IntentionalDowngrades", PropertyList::array({kB})}}));
    EXPECT_TRUE(client_->reconcileRestoreOfType(2, nullptr));
    EXPECT_EQ(abbreviatedRecording(), kWholeRestore);
}

TEST_F(RestoredAppPlaceholder, IsOfARestoreWhetherDemotedOrNot) {
    setRestoreInfo(PropertyList::map({{kA, appInfo()}, {kB, appInfo()}}));
    setDemotedApps(PropertyList::map({{"AutomaticDowngrades", PropertyList::array({kB})}}));
    restore();
    EXPECT_EQ(platform_.registry.placeholder(kA)->installType, kInstallTypeRestore);
    EXPECT_EQ(platform_.registry.placeholder(kB)->installType, kInstallTypeRestore);
}

TEST_F(RestoredAppPlaceholder, GetsMetadataAndSinfDataAsTheyCame) {
    // In the encoding of its own, and with entries that nobody reads.
    PropertyList entries = storeMetadata();
    entries.set("unread", Bytes{0, 255, 0});
    const Bytes metadata = *codec_.serialize(entries, PropertyListFormat::Xml);
    EXPECT_TRUE(processData(metadata));
    EXPECT_EQ(platform_.registry.placeholderOptions(kA),
              PropertyList::map({{"PackageType", "Placeholder"},
                                 {"BundleIdentifier", kA},
                                 {"RGInstallType", 2U},
                                 {"StoreMetadata", metadata},
                                 {"ApplicationSINF", sinf_}}));
}

TEST_F(RestoredAppPlaceholder, IsFoundByTheTransfersThatFollow) {
    setRestoreInfo(PropertyList::map({{kA, appInfo()}}));
    restore();
    platform_.registry.removeProgress(kA);
    platform_.clearRecording();
    EXPECT_THAT(client_->outstandingAssetTransfers(), IsEmpty());
    EXPECT_TRUE(logged(LogLevel::Default,
                       "Not creating a placeholder app for com.example.a because we already have "
                       "one"));
    EXPECT_THAT(platform_.messages(), Contains(HasSubstr("isRestore=y")));
}

TEST_F(RestoredAppPlaceholder, HoldsSevenEntriesInOrder) {
    const PropertyList written = infoOf(storeMetadata());
    std::vector<std::string> keys;
    for (const auto& entry : written.entries()) keys.push_back(entry.key);
    EXPECT_THAT(keys, ElementsAre("BundleIdentifier", "BundleVersion", "BundleExecutable",
                                  "BundleDisplayName", "BundleIconFile", "VKPresselApp",
                                  "RGApplicationLaunchProhibited"));
    EXPECT_EQ(platform_.files.ownership(kBundle), "mobile:mobile");
    EXPECT_EQ(platform_.files.contents(kBundle + "/Icon.png"), icon_);
    EXPECT_EQ(platform_.files.ownership(kBundle + "/Icon.png"), "mobile:mobile");
}

TEST_F(RestoredAppPlaceholder, IsNamedAfterTheItemWhereThereIsNoTitle) {
    const PropertyList written =
        infoOf(PropertyList::map({{"itemName", "Item"}, {"bundleVersion", "1.0"}}));
    EXPECT_EQ(*written.findString("BundleDisplayName"), "Item");
    EXPECT_EQ(*written.findString("BundleExecutable"), "Item");
    EXPECT_TRUE(logged(LogLevel::Default, "Installed Placeholder app from path " + kBundle +
                                              ": Item [com.example.a 1.0] [isPressel: 0]"));
}

TEST_F(RestoredAppPlaceholder, IsNamedAfterTheTitleWhereThereAreBoth) {
    PropertyList metadata = storeMetadata();
    metadata.set("itemName", "Item");
    EXPECT_EQ(*infoOf(metadata).findString("BundleDisplayName"), "Shown");
}

TEST_F(RestoredAppPlaceholder, NeedsATitleAndAVersion) {
    for (const char* missing : {"title", "bundleVersion"}) {
        PropertyList metadata = storeMetadata();
        metadata.erase(missing);
        platform_.clearRecording();
        EXPECT_FALSE(process(metadata));
        EXPECT_THAT(
            platform_.messageLines(),
            Contains(HasSubstr("8 default failed to create placeholder info at " + kBundle +
                               "/Info.plist with info {BundleIdentifier = com.example.a;")));
        EXPECT_THAT(platform_.messages().back(),
                    HasSubstr("failed to process app restore info for 'com.example.a'"));
        EXPECT_THAT(platform_.callsTo({"AppRegistry"}), IsEmpty());
    }
    EXPECT_THAT(scenarios(),
                testing::Each("Vessik App Restore|com.example.a|no|Failed to create placeholder "
                              "info"));
    EXPECT_THAT(scenarios(), testing::SizeIs(2));
    EXPECT_FALSE(platform_.files.exists(kBundle + "/Info.plist"));
}

TEST_F(RestoredAppPlaceholder, TakesATitleOfAnotherTypeForNoNameAtAll) {
    PropertyList metadata = storeMetadata();
    metadata.set("title", 7);
    EXPECT_FALSE(process(metadata));
    metadata.set("itemName", "Item");
    EXPECT_FALSE(process(metadata)) << "the item's name is only looked at without a title";
}

TEST_F(RestoredAppPlaceholder, SaysWhetherItMayBeStarted) {
    const auto prohibited = [this](const PropertyList& metadata) {
        return infoOf(metadata).find("RGApplicationLaunchProhibited")->asBoolean();
    };
    PropertyList metadata = storeMetadata();
    EXPECT_EQ(prohibited(metadata), false);
    metadata.set("launchProhibited", true);
    EXPECT_EQ(prohibited(metadata), true);
    metadata.set("RGApplicationLaunchProhibited", false);
    EXPECT_EQ(prohibited(metadata), false) << "the second key is only looked at without the first";
    metadata.set("launchProhibited", false);
    metadata.set("RGApplicationLaunchProhibited", true);
    EXPECT_EQ(prohibited(metadata), true);
}

TEST_F(RestoredAppPlaceholder, ShowsThePresselFlag) {
    PropertyList metadata = storeMetadata();
    metadata.set("VKPresselApp", true);
    EXPECT_EQ(infoOf(metadata).find("VKPresselApp")->asBoolean(), true);
    EXPECT_THAT(platform_.messages(), Contains(HasSubstr("[isPressel: 1]")));
}

TEST_F(RestoredAppPlaceholder, OfDamagedMetadataCountsAsDone) {
    EXPECT_TRUE(processData(Bytes{'x'}));
    EXPECT_THAT(scenarios(),
                ElementsAre("Vessik App Restore|com.example.a|no|Failed to parse vessik metadata"));
    EXPECT_THAT(platform_.callsTo({"FileSystem", "AppRegistry"}), IsEmpty());
}

TEST_F(RestoredAppPlaceholder, TakesMetadataThatIsNoMapForDamaged) {
    EXPECT_TRUE(process(PropertyList::array({1})));
    EXPECT_THAT(platform_.messages().back(), HasSubstr("the top level is not a map"));
}

TEST_F(RestoredAppPlaceholder, IsGivenUpWhenItsDirectoryCannotBeMade) {
    platform_.files.failNext(FileOperation::CreateDirectory, kBundle, ENOSPC);
    EXPECT_FALSE(process(storeMetadata()));
    EXPECT_THAT(scenarios(),
                ElementsAre("Vessik App Restore|com.example.a|no|Failed to create app directory",
                            "Vessik App Restore|com.example.a|no|Failed to create app directory"));
    EXPECT_TRUE(logged(LogLevel::Default,
                       "failed to create app directory for 'com.example.a'. err=(null)"));
    EXPECT_TRUE(logged(LogLevel::Default, failureMessage()));
    EXPECT_THAT(platform_.callsTo({"FileSystem.createFile", "AppRegistry"}), IsEmpty());
}

TEST_F(RestoredAppPlaceholder, IsInstalledWithoutAnIconThatCannotBeWritten) {
    platform_.files.failNext(FileOperation::CreateFile, kBundle + "/Icon.png", ENOSPC);
    EXPECT_TRUE(process(storeMetadata()));
    EXPECT_TRUE(platform_.registry.placeholder(kA));
}

TEST_F(RestoredAppPlaceholder, IsGivenUpWhenItsInfoCannotBeWritten) {
    platform_.files.failNext(FileOperation::WriteFileAtomically, kBundle + "/Info.plist", ENOSPC);
    EXPECT_FALSE(process(storeMetadata()));
    EXPECT_THAT(
        scenarios(),
        ElementsAre("Vessik App Restore|com.example.a|no|Failed to create placeholder info"));
    EXPECT_TRUE(logged(LogLevel::Default, failureMessage()));
}

TEST_F(RestoredAppPlaceholder, RecordsTheRefusalOfTheRegistry) {
    platform_.registry.failNextPlaceholderInstall(
        kA, ErrorRecord::make(kRegistryErrorDomain, 5, "refused"));
    EXPECT_FALSE(process(storeMetadata()));
    EXPECT_TRUE(logged(LogLevel::Error, "Placeholder app install failed from path " + kBundle +
                                            ": Shown [com.example.a 1.0] [isPressel: 0]"));
    EXPECT_THAT(scenarios(),
                ElementsAre("Vessik App Restore|com.example.a|no|Failed to install placeholder"));
    EXPECT_TRUE(logged(LogLevel::Default, failureMessage()));
}

}  // namespace
}  // namespace appsync
