#include <filesystem>

#include "device/values/DevicePaths.h"
#include "tests/device/DeviceFixture.h"

namespace appsync {
namespace {

class DeviceUninstallTest : public DeviceFixture {
  protected:
    Status uninstall(const PropertyList& options = {}) {
        return device().registry().uninstallApplication(kAtlas, options);
    }
    static PropertyList placeholderOnly() {
        return PropertyList::map({{UninstallPlaceholderOnlyKey, true}});
    }
    std::string makeData() {
        std::filesystem::create_directory(rootPath(data()));
        write(data() + "/notes", "data");
        return data();
    }
    static std::string data() { return std::string(kDataDirectory) + "/" + kAtlas; }
};

TEST_F(DeviceUninstallTest, anApplicationGoesWithItsFilesAndItsData) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    makeData();
    ASSERT_TRUE(succeeded(uninstall()));
    EXPECT_FALSE(either(kAtlas));
    EXPECT_TRUE(containers().empty());
    EXPECT_FALSE(exists(data()));
}

TEST_F(DeviceUninstallTest, aContainerThatIsAPathTakesNothingElseAlong) {
    for (const char* container : {"/", ".", "..", "../../../mobile", "a/../../../../mobile"}) {
        ASSERT_TRUE(succeeded(install(kAtlas)));
        sql(std::string("UPDATE applications SET container = '") + container + "'");
        ASSERT_TRUE(succeeded(uninstall()));
        EXPECT_TRUE(exists(std::string(kPublicStagingDirectory))) << container;
        EXPECT_FALSE(containers().empty()) << container;
    }
}

TEST_F(DeviceUninstallTest, thePlaceholderGoesFirst) {
    ASSERT_TRUE(succeeded(install(kAtlas, "1.0")));
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    makeData();
    ASSERT_TRUE(succeeded(uninstall()));
    EXPECT_EQ(either(kAtlas)->bundleVersion, "1.0");
    EXPECT_TRUE(either(kAtlas)->state.installed);
    EXPECT_TRUE(exists(data()));
    ASSERT_TRUE(succeeded(uninstall()));
    EXPECT_FALSE(either(kAtlas));
}

/// The uninstall that clears up after an install that has failed.
class UninstallAfterFailure : public DeviceUninstallTest {
  protected:
    void failToInstall() {
        EXPECT_FALSE(installFrom(stagePackage("com.example.other"), kAtlas).ok());
    }
};

TEST_F(UninstallAfterFailure, leavesTheApplicationThatWasThere) {
    ASSERT_TRUE(succeeded(install(kAtlas, "1.0")));
    makeData();
    failToInstall();
    EXPECT_TRUE(refusedBy(uninstall(), RegistryErrorCode::NothingInstalled, kAtlas));
    EXPECT_EQ(application(kAtlas)->bundleVersion, "1.0");
    EXPECT_TRUE(exists(data()));
    EXPECT_TRUE(succeeded(uninstall())) << "the next one is an uninstall like any other";
    EXPECT_FALSE(either(kAtlas));
}

TEST_F(UninstallAfterFailure, leavesAnOffloadedOrRestoredApplicationWithItsData) {
    for (const std::uint64_t type :
         {kInstallTypeIntentionalDowngrade, kInstallTypeDowngrade, kInstallTypeRestore}) {
        ASSERT_TRUE(succeeded(installPlaceholder(kAtlas, type)));
        makeData();
        failToInstall();
        EXPECT_FALSE(uninstall().ok());
        EXPECT_EQ(either(kAtlas)->installType, type);
        EXPECT_TRUE(exists(data()));
    }
}

TEST_F(UninstallAfterFailure, takesThePlaceholderOfTheSync) {
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas, kInstallTypeSync)));
    failToInstall();
    EXPECT_TRUE(succeeded(uninstall()));
    EXPECT_FALSE(either(kAtlas));
}

TEST_F(UninstallAfterFailure, isOneLikeAnyOtherOnceAnInstallHasSucceeded) {
    failToInstall();
    ASSERT_TRUE(succeeded(install(kAtlas, "1.0")));
    EXPECT_TRUE(succeeded(uninstall()));
    EXPECT_FALSE(either(kAtlas));
}

TEST_F(DeviceUninstallTest, placeholderOnlyNeverTouchesTheApplication) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    EXPECT_TRUE(refusedBy(uninstall(placeholderOnly()), RegistryErrorCode::NothingInstalled));
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    EXPECT_TRUE(succeeded(uninstall(placeholderOnly())));
    EXPECT_TRUE(application(kAtlas));
    EXPECT_EQ(containers().size(), 1U);
}

TEST_F(DeviceUninstallTest, placeholderOnlyThatIsFalseIsNoOption) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    EXPECT_TRUE(succeeded(uninstall(PropertyList::map({{UninstallPlaceholderOnlyKey, false}}))));
    EXPECT_FALSE(application(kAtlas));
}

TEST_F(DeviceUninstallTest, aSyncsPlaceholderLeavesDataThatItDidNotBring) {
    makeData();
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas, kInstallTypeSync)));
    ASSERT_TRUE(succeeded(uninstall()));
    EXPECT_TRUE(exists(data()));
}

TEST_F(DeviceUninstallTest, theDataOfADemotedApplicationGoesWithItsPlaceholder) {
    makeData();
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas, kInstallTypeIntentionalDowngrade)));
    ASSERT_TRUE(succeeded(uninstall()));
    EXPECT_FALSE(exists(data()));
}

TEST_F(DeviceUninstallTest, theProgressOfARemovedPlaceholderIsCancelledAndKeepsItsValues) {
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    const auto record = progressOf(kAtlas);
    record->setCompletedUnitCount(400);
    ASSERT_TRUE(succeeded(uninstall()));
    EXPECT_EQ(record->installState(), kInstallStateCanceled);
    record->setCompletedUnitCount(900);
    EXPECT_EQ(record->completedUnitCount(), 400);
}

TEST_F(DeviceUninstallTest, nothingToRemoveIsAnError) {
    EXPECT_TRUE(refusedBy(uninstall(), RegistryErrorCode::NothingInstalled, kAtlas));
    EXPECT_TRUE(refusedBy(device().uninstall(kAtlas), RegistryErrorCode::NothingInstalled));
    EXPECT_TRUE(
        refusedBy(device().uninstall("../../escape"), RegistryErrorCode::IllegalIdentifier));
}

TEST_F(DeviceUninstallTest, systemApplicationsStay) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    sql("UPDATE applications SET type = 'System'");
    EXPECT_TRUE(refusedBy(uninstall(), RegistryErrorCode::SystemApplication));
    EXPECT_TRUE(refusedBy(device().uninstall(kAtlas), RegistryErrorCode::SystemApplication));
    EXPECT_TRUE(application(kAtlas));
}

TEST_F(DeviceUninstallTest, aPersonRemovesApplicationAndPlaceholderAtOnce) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    ASSERT_TRUE(succeeded(device().run(kAtlas)));
    ASSERT_TRUE(succeeded(look()->uninstall(kAtlas)));
    EXPECT_FALSE(either(kAtlas));
    EXPECT_TRUE(containers().empty());
    EXPECT_EQ(number("SELECT count(*) FROM running"), 0);
    EXPECT_TRUE(device().status(kAtlas)->uninstalled);
}

TEST_F(DeviceUninstallTest, anInstallThatIsUnderWayDoesNotBringItBack) {
    ASSERT_TRUE(succeeded(install(kAtlas, "1.0")));
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    ASSERT_TRUE(succeeded(look()->uninstall(kAtlas)));
    EXPECT_TRUE(refusedBy(install(kAtlas, "2.0"), RegistryErrorCode::Uninstalled, kAtlas));
    EXPECT_FALSE(either(kAtlas));
    EXPECT_TRUE(containers().empty());
    EXPECT_EQ(number("SELECT count(*) FROM progress"), 0);
    EXPECT_TRUE(device().status(kAtlas)->uninstalled);
}

TEST_F(DeviceUninstallTest, theNextSessionBringsItBack) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    ASSERT_TRUE(succeeded(device().uninstall(kAtlas)));
    close();
    EXPECT_TRUE(succeeded(install(kAtlas)));
}

TEST_F(DeviceUninstallTest, aClockThatWasSetBackDoesNotMakeAnUninstallOneOfThisSession) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    ASSERT_TRUE(succeeded(device().uninstall(kAtlas)));
    close();
    static_cast<void>(device());
    sql("UPDATE uninstalled SET time = time + 86400000");
    EXPECT_TRUE(succeeded(install(kAtlas)));
}

TEST_F(DeviceUninstallTest, aClockThatIsSetBackDoesNotMakeAnUninstallOneOfBefore) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    ASSERT_TRUE(succeeded(look()->uninstall(kAtlas)));
    sql("UPDATE uninstalled SET time = time - 86400000");
    EXPECT_TRUE(refusedBy(install(kAtlas), RegistryErrorCode::Uninstalled, kAtlas));
}

TEST_F(DeviceUninstallTest, oneThatTheHostHasTakenNoteOfLeavesItsNumberToNobody) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    ASSERT_TRUE(succeeded(install(kBrook)));
    ASSERT_TRUE(succeeded(device().uninstall(kAtlas)));
    close();
    static_cast<void>(device());
    sql("DELETE FROM uninstalled");
    ASSERT_TRUE(succeeded(look()->uninstall(kBrook)));
    EXPECT_TRUE(refusedBy(install(kBrook), RegistryErrorCode::Uninstalled, kBrook));
}

TEST_F(DeviceUninstallTest, whatTheRegistryRemovesIsNotOnTheInstallersList) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    ASSERT_TRUE(succeeded(uninstall()));
    EXPECT_FALSE(device().status(kAtlas)->uninstalled);
}

}  // namespace
}  // namespace appsync
