#include <cerrno>
#include <chrono>

#include "tests/client/AppsClientFixture.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using Access = AppsClientTestAccess;

const std::string kArea(kWorkArea);
const std::string kLastSync(kLastSyncAppStatePath);

class SyncEnd : public AppsClientFixture {
  protected:
    SyncEnd() {
        platform_.addPropertyList(kLastSync, PropertyList::array());
        platform_.installer.addUninstalled(kA);
        static_cast<void>(client_->installedAssets());
        platform_.advance(std::chrono::seconds(60));
        platform_.clearRecording();
    }
};

TEST_F(SyncEnd, AfterAFailureTouchesNothing) {
    const auto before = platform_.files.modificationTime(kArea);
    client_->syncEndedWithSuccess(false);
    EXPECT_THAT(platform_.lines(), ElementsAre("8 default sync ended with success: n"));
    EXPECT_EQ(platform_.files.modificationTime(kArea), before);
    EXPECT_TRUE(Access::hasUninstalledApps(*client_));
    EXPECT_TRUE(platform_.files.exists(kLastSync));
}

TEST_F(SyncEnd, AfterASuccessClearsWhatTheSessionTookNoteOf) {
    client_->syncEndedWithSuccess(true);
    EXPECT_THAT(platform_.lines(),
                ElementsAre("8 default sync ended with success: y",
                            HasSubstr("FileSystem.setTimesToNow(" + kArea + ") -> ok"),
                            "8 default clearing uninstalled apps: (com.example.a)",
                            HasSubstr("InstallerService.clearUninstalled"),
                            "FileSystem.removeItem(" + kLastSync + ") -> ok"));
    EXPECT_EQ(platform_.installer.uninstalled(), PropertyList::map());
    EXPECT_FALSE(Access::hasUninstalledApps(*client_));
    EXPECT_FALSE(platform_.files.exists(kLastSync));
}

TEST_F(SyncEnd, RefreshesTheTimesOfTheWorkArea) {
    client_->syncEndedWithSuccess(true);
    ASSERT_TRUE(platform_.files.modificationTime(kArea));
    EXPECT_EQ(*platform_.files.modificationTime(kArea), platform_.now());
}

TEST_F(SyncEnd, GoesOnWhenTheTimesCannotBeSet) {
    platform_.files.failNext(FileOperation::SetTimesToNow, kWorkArea, EROFS);
    client_->syncEndedWithSuccess(true);
    EXPECT_THAT(platform_.messageLines(),
                testing::Contains("8 error Failed to update utimes of \"" + kArea +
                                  "\": Read-only file system"));
    EXPECT_FALSE(Access::hasUninstalledApps(*client_));
    EXPECT_FALSE(platform_.files.exists(kLastSync));
}

TEST_F(SyncEnd, KeepsTheUninstalledListThatCouldNotBeClearedForTheNextEnd) {
    platform_.installer.setClearable(false);
    client_->syncEndedWithSuccess(true);
    EXPECT_TRUE(logged(LogLevel::Error, "Failed to clear uninstalled apps from Pakmount."));
    EXPECT_TRUE(Access::hasUninstalledApps(*client_));
    platform_.installer.setClearable(true);
    client_->syncEndedWithSuccess(true);
    EXPECT_EQ(platform_.installer.uninstalled(), PropertyList::map());
    EXPECT_FALSE(Access::hasUninstalledApps(*client_));
}

TEST_F(SyncEnd, ClearsNothingWhenNothingWasTakenNoteOf) {
    client_->syncEndedWithSuccess(true);
    platform_.clearRecording();
    client_->syncEndedWithSuccess(true);
    EXPECT_THAT(platform_.callsTo({"InstallerService"}), IsEmpty());
}

}  // namespace
}  // namespace appsync
