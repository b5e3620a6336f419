#include <filesystem>

#include "device/values/DevicePaths.h"
#include "tests/device/DeviceFixture.h"

namespace appsync {
namespace {

class DevicePlaceholderTest : public DeviceFixture {
  protected:
    Status installFromBundle(const std::string& bundle, PropertyList options) {
        options.set(PackageTypeKey, PackageTypePlaceholder);
        options.set(BundleIdentifierKey, kAtlas);
        return device().registry().installPlaceholderBundle(*FileURL::fromPath(bundle, true),
                                                            options);
    }

    std::string stage() { return stagePlaceholder(kAtlas, "3.0"); }
};

TEST_F(DevicePlaceholderTest, theRegistryTakesItsOwnCopy) {
    const std::string bundle = stage();
    ASSERT_TRUE(succeeded(installFromBundle(bundle, PropertyList::map())));
    std::filesystem::remove_all(rootPath(bundle));
    const std::optional<AppProxy> proxy = either(kAtlas);
    ASSERT_TRUE(proxy);
    EXPECT_TRUE(proxy->state.placeholder);
    EXPECT_FALSE(proxy->state.installed);
    EXPECT_EQ(proxy->bundleVersion, "3.0");
    EXPECT_EQ(read(proxy->bundlePath + "/Info.plist"), infoOf(kAtlas, "3.0"));
    EXPECT_EQ(read(proxy->bundlePath + "/Icon.png"), "an icon");
}

TEST_F(DevicePlaceholderTest, theStoreMetadataGoesIntoTheContainer) {
    const Bytes metadata = {'m', 'e', 't', 'a'};
    const PropertyList options = PropertyList::map(
        {{StoreMetadataKey, metadata}, {AppSinfKey, PropertyList()}, {InstallTypeKey, 2U}});
    ASSERT_TRUE(succeeded(installFromBundle(stage(), options)));
    EXPECT_EQ(read(either(kAtlas)->bundleContainerPath + "/VessikMetadata.plist"), "meta");
    EXPECT_EQ(either(kAtlas)->installType, kInstallTypeRestore);
}

TEST_F(DevicePlaceholderTest, metadataThatIsNotDataIsRefused) {
    const PropertyList options = PropertyList::map({{StoreMetadataKey, "text"}});
    EXPECT_TRUE(refusedBy(installFromBundle(stage(), options), RegistryErrorCode::IllegalOptions));
    EXPECT_FALSE(either(kAtlas));
}

TEST_F(DevicePlaceholderTest, itCoversAnInstalledApplicationAndLeavesItUsable) {
    ASSERT_TRUE(succeeded(install(kAtlas, "1.0")));
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    EXPECT_TRUE(either(kAtlas)->state.placeholder);
    EXPECT_TRUE(application(kAtlas)->state.installed);
    EXPECT_EQ(read(application(kAtlas)->bundlePath + "/main"), "program 1.0");
    EXPECT_TRUE(succeeded(device().run(kAtlas)));
}

TEST_F(DevicePlaceholderTest, aProgressRecordComesWithIt) {
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    const auto record = progressOf(kAtlas);
    ASSERT_NE(record, nullptr);
    EXPECT_EQ(record->installState(), kInstallStateWaiting);
    EXPECT_EQ(record->installPhase(), kInstallPhaseLoading);
    EXPECT_EQ(record->totalUnitCount(), 1000);
    EXPECT_EQ(record->completedUnitCount(), 0);
}

TEST_F(DevicePlaceholderTest, aDemotedOneHasNoInstallUnderWay) {
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas, kInstallTypeIntentionalDowngrade)));
    EXPECT_EQ(progressOf(kAtlas), nullptr);
}

TEST_F(DevicePlaceholderTest, aSecondOneReplacesTheFirst) {
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    progressOf(kAtlas)->setCompletedUnitCount(500);
    ASSERT_TRUE(succeeded(installFromBundle(stage(), PropertyList::map({{InstallTypeKey, 4U}}))));
    EXPECT_EQ(either(kAtlas)->bundleVersion, "3.0");
    EXPECT_EQ(progressOf(kAtlas)->completedUnitCount(), 0);
    EXPECT_EQ(containers().size(), 1U);
}

TEST_F(DevicePlaceholderTest, aBundleWithoutInfoIsRefusedAndLeavesNothing) {
    const std::string bundle = stage();
    std::filesystem::remove(rootPath(bundle + "/Info.plist"));
    EXPECT_TRUE(refusedBy(installFromBundle(bundle, PropertyList::map()),
                          RegistryErrorCode::PlaceholderRefused, "Info.plist"));
    EXPECT_TRUE(containers().empty());
    EXPECT_TRUE(device().status(kAtlas)->lastFailure);
}

TEST_F(DevicePlaceholderTest, damagedInfoAndForeignIdentifiersAreRefused) {
    const std::string bundle = stage();
    write(bundle + "/Info.plist", "no property list");
    EXPECT_TRUE(refusedBy(installFromBundle(bundle, PropertyList::map()),
                          RegistryErrorCode::PlaceholderRefused));
    write(bundle + "/Info.plist", infoOf("com.example.other", "1.0"));
    EXPECT_TRUE(refusedBy(installFromBundle(bundle, PropertyList::map()),
                          RegistryErrorCode::PlaceholderRefused, "com.example.other"));
    EXPECT_TRUE(containers().empty());
}

TEST_F(DevicePlaceholderTest, withoutItsIconItIsStillInstalled) {
    const std::string bundle = stage();
    std::filesystem::remove(rootPath(bundle + "/Icon.png"));
    std::filesystem::create_directory(rootPath(bundle + "/Icon.png"));
    ASSERT_TRUE(succeeded(installFromBundle(bundle, PropertyList::map())));
    EXPECT_FALSE(exists(either(kAtlas)->bundlePath + "/Icon.png"));
}

TEST_F(DevicePlaceholderTest, anIconNameThatLeadsElsewhereIsNotFollowed) {
    const std::string bundle = stage();
    std::string info = infoOf(kAtlas, "1.0");
    info.replace(info.find("Icon.png"), 8, "../../secret");
    write(bundle + "/Info.plist", info);
    write("/var/secret", "secret");
    ASSERT_TRUE(succeeded(installFromBundle(bundle, PropertyList::map())));
    EXPECT_EQ(read(either(kAtlas)->bundlePath + "/Icon.png"), "an icon");
    EXPECT_EQ(containers().size(), 1U);
}

TEST_F(DevicePlaceholderTest, whatElseTheBundleHoldsIsNotCopied) {
    const std::string bundle = stage();
    write(bundle + "/program", "code");
    ASSERT_TRUE(succeeded(installFromBundle(bundle, PropertyList::map())));
    EXPECT_FALSE(exists(either(kAtlas)->bundlePath + "/program"));
}

TEST_F(DevicePlaceholderTest, onlyTheLeftoversOfSyncsAreRemovedBeforeASession) {
    ASSERT_TRUE(succeeded(installPlaceholder("com.example.sync", kInstallTypeSync)));
    ASSERT_TRUE(succeeded(installPlaceholder("com.example.restore", kInstallTypeRestore)));
    ASSERT_TRUE(
        succeeded(installPlaceholder("com.example.demoted", kInstallTypeIntentionalDowngrade)));
    const Result<std::vector<std::string>> removed = device().removeLeftoverSyncPlaceholders();
    ASSERT_TRUE(removed.ok());
    EXPECT_EQ(*removed, std::vector<std::string>{"com.example.sync"});
    EXPECT_EQ(device().applications()->size(), 2U);
    EXPECT_EQ(containers().size(), 2U);
}

TEST_F(DevicePlaceholderTest, aDemotedApplicationKeepsItsNameIconAndData) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    const std::string data = std::string(kDataDirectory) + "/" + kAtlas;
    std::filesystem::create_directory(rootPath(data));
    write(data + "/notes", "kept");
    ASSERT_TRUE(succeeded(device().demote(kAtlas, DemotedBy::Person)));
    EXPECT_FALSE(application(kAtlas));
    EXPECT_EQ(either(kAtlas)->installType, kInstallTypeIntentionalDowngrade);
    EXPECT_EQ(either(kAtlas)->displayName, "Name of com.example.atlas");
    EXPECT_EQ(read(either(kAtlas)->bundleContainerPath + "/VessikMetadata.plist"),
              "metadata of com.example.atlas");
    EXPECT_FALSE(exists(either(kAtlas)->bundlePath + "/main"));
    EXPECT_EQ(read(data + "/notes"), "kept");
    EXPECT_EQ(containers().size(), 1U);
}

TEST_F(DevicePlaceholderTest, theSystemDemotesWithATypeOfItsOwn) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    ASSERT_TRUE(succeeded(device().demote(kAtlas, DemotedBy::System)));
    EXPECT_EQ(either(kAtlas)->installType, kInstallTypeDowngrade);
    ASSERT_TRUE(succeeded(install(kAtlas)));
    EXPECT_EQ(application(kAtlas)->installType, kInstallTypeNone);
}

TEST_F(DevicePlaceholderTest, whatIsAbsentOrBeingUpdatedIsNotDemoted) {
    EXPECT_TRUE(
        refusedBy(device().demote(kAtlas, DemotedBy::Person), RegistryErrorCode::NothingInstalled));
    ASSERT_TRUE(succeeded(install(kAtlas)));
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    EXPECT_TRUE(refusedBy(device().demote(kAtlas, DemotedBy::Person),
                          RegistryErrorCode::UpdateUnderWay, "under way"));
    EXPECT_TRUE(application(kAtlas));
}

}  // namespace
}  // namespace appsync
