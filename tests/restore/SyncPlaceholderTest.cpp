#include <cerrno>

#include "tests/client/AppsClientFixture.h"

namespace appsync {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::StartsWith;

class SyncPlaceholder : public AppsClientFixture {
  protected:
    SyncPlaceholder() {
        asset_.identifier = kA;
        asset_.prettyName = "Example";
        asset_.variantOptions = PropertyList::map({{"Version", "1.2"}});
        asset_.infoPath = "/side/Info.plist";
        asset_.icon = FileURL::fromPath("/side/icon.png", false);
        platform_.files.addFile("/side/icon.png", "icon");
    }
    void create() { client_->_createPlaceHolderApplication(asset_); }
    [[nodiscard]] PropertyList info() {
        return platform_.propertyListAt(kBundle + "/Info.plist").value_or(PropertyList());
    }
    [[nodiscard]] std::vector<std::string> installs() const {
        return platform_.callsTo({"AppRegistry.installPlaceholderBundle"});
    }

    SyncAsset asset_;
};

TEST_F(SyncPlaceholder, HoldsSevenEntriesInOrder) {
    platform_.addPropertyList(
        "/side/Info.plist",
        PropertyList::map({{"VKPresselApp", true}, {"RGApplicationLaunchProhibited", true}}));
    create();
    std::vector<std::string> keys;
    const PropertyList written = info();
    for (const auto& entry : written.entries()) keys.push_back(entry.key);
    EXPECT_THAT(keys, ElementsAre("BundleIdentifier", "BundleVersion", "BundleExecutable",
                                  "BundleDisplayName", "BundleIconFile", "VKPresselApp",
                                  "RGApplicationLaunchProhibited"));
    EXPECT_EQ(written, PropertyList::map({{"BundleIdentifier", kA},
                                          {"BundleVersion", "1.2"},
                                          {"BundleExecutable", "Example"},
                                          {"BundleDisplayName", "Example"},
                                          {"BundleIconFile", "Icon.png"},
                                          {"VKPresselApp", true},
                                          {"RGApplicationLaunchProhibited", true}}));
}

TEST_F(SyncPlaceholder, IsBuiltAndInstalledInOrder) {
    create();
    EXPECT_THAT(
        platform_.lines(),
        ElementsAre(
            "8 default plist /side/Info.plist", HasSubstr("FileSystem.readFile(/side/Info.plist)"),
            HasSubstr("FileSystem.temporaryDirectory()"),
            HasSubstr("FileSystem.createDirectory(" + kBundle),
            "8 default Created app directory for 'com.example.a' at " + kBundle +
                " with err=(null)",
            "FileSystem.copyItem(/side/icon.png, " + kBundle + "/Icon.png) -> ok",
            HasSubstr("serialize"),
            HasSubstr("FileSystem.writeFileAtomically(" + kBundle + "/Info.plist"),
            StartsWith("8 default creating placeholder for 'com.example.a'. "
                       "info.plist={BundleIdentifier = com.example.a; "),
            "AppRegistry.installPlaceholderBundle(" + kBundle +
                ", {PackageType = Placeholder; BundleIdentifier = com.example.a; RGInstallType = "
                "4;}) -> ok",
            "8 default Installed Placeholder app from path " + kBundle +
                ": Example [com.example.a 1.2] [isPressel: 0]",
            "InstallTransactionLog.logScenario(Install placeholder, 0, yes, com.example.a, "
            "Installed placeholder)"));
    EXPECT_EQ(platform_.registry.placeholder(kA)->installType, kInstallTypeSync);
}

TEST_F(SyncPlaceholder, BelongsToTheMobileAccountAndHasTheIcon) {
    create();
    EXPECT_EQ(platform_.files.ownership(kBundle), "mobile:mobile");
    EXPECT_EQ(platform_.files.text(kBundle + "/Icon.png"), "icon");
    EXPECT_TRUE(platform_.files.exists(kBundle)) << "it is left in place";
}

TEST_F(SyncPlaceholder, SaysFalseForFlagsThatAreAbsent) {
    platform_.addPropertyList("/side/Info.plist", PropertyList::map({{"Other", 1}}));
    create();
    EXPECT_EQ(info().find("VKPresselApp")->asBoolean(), false);
    EXPECT_EQ(info().find("RGApplicationLaunchProhibited")->asBoolean(), false);
    EXPECT_THAT(platform_.messages(), Contains(HasSubstr("[isPressel: 0]")));
}

TEST_F(SyncPlaceholder, ShowsThePresselFlag) {
    platform_.addPropertyList("/side/Info.plist", PropertyList::map({{"VKPresselApp", true}}));
    create();
    EXPECT_THAT(platform_.messages(), Contains(HasSubstr("[isPressel: 1]")));
}

TEST_F(SyncPlaceholder, HasNoEntryForAVersionThatIsNotKnown) {
    asset_.variantOptions = PropertyList::map();
    create();
    EXPECT_EQ(info().size(), 6U);
    EXPECT_EQ(info().find("BundleVersion"), nullptr);
    EXPECT_TRUE(platform_.registry.placeholder(kA));
    EXPECT_THAT(platform_.messages(), Contains(HasSubstr("Example [com.example.a (null)]")));
}

TEST_F(SyncPlaceholder, IsNotMadeWithoutAName) {
    asset_.prettyName = "";
    create();
    asset_.prettyName = std::nullopt;
    create();
    EXPECT_FALSE(platform_.files.exists("/tmp/com.korvu.trd.Apps"));
    EXPECT_THAT(platform_.messages(),
                ElementsAre("plist /side/Info.plist", "plist /side/Info.plist"));
}

TEST_F(SyncPlaceholder, IsNotMadeWithoutAnIdentifier) {
    asset_.identifier = "";
    asset_.infoPath.reset();
    create();
    EXPECT_FALSE(platform_.files.exists("/tmp/com.korvu.trd.Apps"));
    EXPECT_THAT(platform_.messages(), ElementsAre("plist (null)"));
}

TEST_F(SyncPlaceholder, IsGivenUpWhenItsDirectoryCannotBeMade) {
    platform_.files.failNext(FileOperation::CreateDirectory, kBundle, ENOSPC);
    create();
    EXPECT_THAT(installs(), IsEmpty());
    EXPECT_THAT(
        platform_.transactions.records(),
        ElementsAre("Vessik App Restore|0|no|com.example.a|Failed to create app directory"));
}

TEST_F(SyncPlaceholder, IsInstalledWithoutAnIconThatCannotBeCopied) {
    platform_.files.failNext(FileOperation::CopyItem, "/side/icon.png", ENOENT);
    create();
    EXPECT_THAT(platform_.messageLines(),
                Contains(StartsWith("8 error Copying icon from /side/icon.png to " + kBundle +
                                    "/Icon.png failed: Error Domain=POSIX")));
    EXPECT_TRUE(platform_.registry.placeholder(kA));
}

TEST_F(SyncPlaceholder, IsInstalledWithoutAnIconThatItWasNotGiven) {
    asset_.icon.reset();
    create();
    EXPECT_THAT(platform_.callsTo({"FileSystem.copyItem"}), IsEmpty());
    EXPECT_TRUE(platform_.registry.placeholder(kA));
}

TEST_F(SyncPlaceholder, IsGivenUpSilentlyWhenItsInfoCannotBeWritten) {
    platform_.files.failNext(FileOperation::WriteFileAtomically, kBundle + "/Info.plist", ENOSPC);
    create();
    EXPECT_THAT(installs(), IsEmpty());
    EXPECT_THAT(platform_.messages(), testing::SizeIs(2));
    EXPECT_THAT(platform_.transactions.records(), IsEmpty());
}

TEST_F(SyncPlaceholder, RecordsTheRefusalOfTheRegistry) {
    platform_.registry.failNextPlaceholderInstall(
        kA, ErrorRecord::make(kRegistryErrorDomain, 5, "refused"));
    create();
    EXPECT_TRUE(logged(LogLevel::Error, "Placeholder app install failed from path " + kBundle +
                                            ": Example [com.example.a 1.2] [isPressel: 0]"));
    EXPECT_THAT(
        platform_.transactions.records(),
        ElementsAre("Install placeholder|0|no|com.example.a|Failed to install placeholder"));
    EXPECT_TRUE(platform_.files.exists(kBundle + "/Info.plist")) << "nothing is cleaned up";
}

TEST_F(SyncPlaceholder, IsBuiltAgainInTheSamePlace) {
    create();
    asset_.prettyName = "Renamed";
    create();
    EXPECT_EQ(*info().findString("BundleDisplayName"), "Renamed");
    EXPECT_THAT(platform_.messages(), Contains(HasSubstr("Copying icon from")));
    EXPECT_EQ(platform_.registry.placeholder(kA)->displayName, "Renamed");
}

TEST_F(SyncPlaceholder, OfAnIdentifierThatNoPathCanHoldFails) {
    asset_.identifier = std::string("a\0b", 3);
    create();
    EXPECT_THAT(installs(), IsEmpty());
    EXPECT_FALSE(platform_.files.exists(kBundle));
}

TEST_F(SyncPlaceholder, IsNotInstalledFromAPathThatNoURLCanHold) {
    asset_.identifier = std::string("com\0example", 11);
    create();
    EXPECT_THAT(installs(), IsEmpty());
    EXPECT_THAT(platform_.messages(), Contains(HasSubstr("Error Domain=POSIX Code=22")));
    EXPECT_THAT(platform_.registry.placeholderIdentifiers(), IsEmpty());
}

}  // namespace
}  // namespace appsync
