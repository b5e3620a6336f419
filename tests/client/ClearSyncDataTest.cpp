#include "tests/client/AppsClientFixture.h"

namespace appsync {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;
using Access = AppsClientTestAccess;

class ClearSyncData : public AppsClientFixture {};

TEST_F(ClearSyncData, LeavesNothingToSyncWith) {
    platform_.files.addFile(std::string(kTodoListPath), "list");
    platform_.registry.addPlaceholder(kA, kInstallTypeSync);
    platform_.registry.addApplication(kB);
    platform_.installer.addUninstalled(kC);
    client_->clearSyncData();
    EXPECT_FALSE(platform_.files.exists(std::string(kWorkArea)));
    EXPECT_THAT(platform_.registry.placeholderIdentifiers(), IsEmpty());
    EXPECT_THAT(platform_.registry.installedIdentifiers(), ElementsAre(kB));
    EXPECT_EQ(platform_.installer.uninstalled(), PropertyList::map());
    EXPECT_THAT(platform_.messageLines(), ElementsAre("8 default blasting work area",
                                                      "8 default Uninstalling all placeholder apps",
                                                      "8 default Uninstall com.example.a = y"));
}

TEST_F(ClearSyncData, RemovesTheWorkAreaUnderBothLocks) {
    platform_.files.addDirectory(std::string(kWorkArea));
    client_->clearSyncData();
    EXPECT_THAT(platform_.callsTo({"Lock", "FileSystem"}),
                ElementsAre("Lock#1.lock()", "Lock#2.lock()",
                            "FileSystem.removeItem(" + std::string(kWorkArea) + ") -> ok",
                            "Lock#2.unlock()", "Lock#1.unlock()"));
}

TEST_F(ClearSyncData, GoesOnAfterAFailedUninstall) {
    platform_.registry.addPlaceholder(kA, kInstallTypeSync);
    platform_.registry.addPlaceholder(kB, kInstallTypeRestore);
    platform_.registry.failNextUninstall(kA, ErrorRecord::make(kRegistryErrorDomain, 5, "refused"));
    client_->clearSyncData();
    EXPECT_TRUE(logged(LogLevel::Default, "Uninstall com.example.a = n"));
    EXPECT_TRUE(logged(LogLevel::Default, "Uninstall com.example.b = y"));
    EXPECT_THAT(platform_.callsTo({"AppRegistry.uninstallApplication"}),
                Contains("AppRegistry.uninstallApplication(com.example.b, (null)) -> ok"));
}

TEST_F(ClearSyncData, SaysThatTheInstallerDoesNotAnswer) {
    platform_.installer.setUninstalled(std::nullopt);
    client_->clearSyncData();
    EXPECT_TRUE(logged(LogLevel::Error, "Failed to fetch uninstalled apps list to clear it"));
    EXPECT_THAT(platform_.callsTo({"InstallerService.clearUninstalled"}), IsEmpty());
}

TEST_F(ClearSyncData, SaysThatTheListCannotBeCleared) {
    platform_.installer.addUninstalled(kA);
    platform_.installer.setClearable(false);
    client_->clearSyncData();
    EXPECT_TRUE(logged(LogLevel::Error, "Failed to clear uninstalled apps list"));
}

TEST_F(ClearSyncData, LeavesTheKeptUninstalledListAlone) {
    platform_.installer.addUninstalled(kA);
    static_cast<void>(client_->installedAssets());
    client_->clearSyncData();
    EXPECT_TRUE(Access::hasUninstalledApps(*client_));
}

}  // namespace
}  // namespace appsync
