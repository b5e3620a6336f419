#include <cerrno>

#include "tests/client/AppsClientFixture.h"

namespace appsync {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;

const std::string kStaging(kStagingArea);
const std::string kTodo(kTodoDirectory);
const std::string kDebugCopy(kTodoListDebugPath);

class SyncReconciliation : public AppsClientFixture {
  protected:
    bool reconcile() { return client_->reconcileSync({}, "anchor 1", {}, &error_); }
    [[nodiscard]] std::vector<std::string> uninstalls() const {
        return platform_.callsTo({"AppRegistry.uninstallApplication"});
    }

    std::optional<ErrorRecord> error_;
};

TEST_F(SyncReconciliation, WithoutAStagingAreaOnlyForgetsTheLastSession) {
    platform_.files.addFile(kTodo + "/ApplicationsSync.plist", "old");
    EXPECT_TRUE(reconcile());
    EXPECT_FALSE(platform_.files.exists(kTodo));
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("8 default starting to reconcile sync with new anchor anchor 1",
                            "8 default Nothing to do", "8 default finished reconcile sync"));
    EXPECT_THAT(platform_.callsTo({"HomeScreenService", "NamedNotifications"}), IsEmpty());
    EXPECT_EQ(error_, std::nullopt);
}

TEST_F(SyncReconciliation, FailsWhenTheWorkAreaCannotBeMade) {
    stage(PropertyList::array());
    platform_.files.failNext(FileOperation::CreateDirectory, kWorkArea, EROFS);
    EXPECT_FALSE(reconcile());
    EXPECT_TRUE(logged(LogLevel::Default, "can't create work area"));
    EXPECT_TRUE(logged(LogLevel::Default, "finished reconcile sync"));
    ASSERT_TRUE(error_);
    EXPECT_EQ(error_->code, EROFS);
    EXPECT_TRUE(platform_.files.exists(kStaging));
}

TEST_F(SyncReconciliation, FailsWhenTheStagingAreaCannotBeMoved) {
    stage(PropertyList::array());
    platform_.files.failNext(FileOperation::MoveItem, kStagingArea, EACCES);
    EXPECT_FALSE(reconcile());
    EXPECT_TRUE(logged(LogLevel::Default, "Can't move staging area"));
    EXPECT_TRUE(logged(LogLevel::Default, "finished reconcile sync"));
    ASSERT_TRUE(error_);
    EXPECT_EQ(error_->code, EACCES);
}

TEST_F(SyncReconciliation, FailsWithoutAnErrorOutParameterToo) {
    stage(PropertyList::array());
    platform_.files.failNext(FileOperation::MoveItem, kStagingArea, EACCES);
    EXPECT_FALSE(client_->reconcileSync({}, "anchor", {}, nullptr));
    platform_.files.failNext(FileOperation::CreateDirectory, kWorkArea, EACCES);
    EXPECT_FALSE(client_->reconcileSync({}, "anchor", {}, nullptr));
}

TEST_F(SyncReconciliation, IgnoresThatTheLastSessionCannotBeRemoved) {
    platform_.files.failNext(FileOperation::RemoveItem, kTodoDirectory, EIO);
    EXPECT_TRUE(reconcile());
    EXPECT_EQ(error_, std::nullopt);
}

TEST_F(SyncReconciliation, MovesTheStagingAreaAsItIs) {
    stage(PropertyList::array());
    platform_.files.addFile(kStaging + "/com.example.a/Info.plist", "info");
    EXPECT_TRUE(reconcile());
    EXPECT_FALSE(platform_.files.exists(kStaging));
    EXPECT_EQ(platform_.files.text(kTodo + "/com.example.a/Info.plist"), "info");
}

TEST_F(SyncReconciliation, RemovesThroughTheServiceWhereInstallsAreCoordinated) {
    makeCoordinatedClient();
    platform_.registry.addApplication(kA);
    platform_.registry.addApplication(kB);
    platform_.registry.failNextUninstall(kB, ErrorRecord::make(kRegistryErrorDomain, 1, "busy"));
    stage(PropertyList::array({todoEntry(kB, "remove"), todoEntry(kA, "remove")}));
    EXPECT_TRUE(reconcile());
    EXPECT_THAT(platform_.callsTo({"InstallCoordinatorService", "AppRegistry"}),
                ElementsAre("InstallCoordinatorService.uninstallApp(com.example.b)",
                            "InstallCoordinatorService.uninstallApp(com.example.a)"));
    platform_.runUntilIdle();
    EXPECT_THAT(platform_.registry.installedIdentifiers(), ElementsAre(kB));
    EXPECT_THAT(platform_.transactions.scenarios(), IsEmpty());
    EXPECT_THAT(platform_.transactions.records(), testing::SizeIs(4));
}

TEST_F(SyncReconciliation, RemovesWhatTheHostAsksToRemoveInItsOrder) {
    platform_.registry.addApplication(kA);
    platform_.registry.addApplication(kB);
    stage(PropertyList::array(
        {todoEntry(kB, "remove"), todoEntry(kC, "install"), todoEntry(kA, "remove")}));
    EXPECT_TRUE(reconcile());
    EXPECT_THAT(platform_.registry.installedIdentifiers(), IsEmpty());
    EXPECT_THAT(uninstalls(),
                ElementsAre("AppRegistry.uninstallApplication(com.example.b, (null)) -> ok",
                            "AppRegistry.uninstallApplication(com.example.a, (null)) -> ok"));
    EXPECT_THAT(platform_.messages(),
                ElementsAre("starting to reconcile sync with new anchor anchor 1",
                            "com.example.b targeted for termination",
                            "com.example.a targeted for termination", "performing 2 deletions",
                            "Notifying DK we are starting syncing", "finished reconcile sync"));
    EXPECT_THAT(platform_.transactions.records(),
                ElementsAre("Vessik Sync|0|yes|com.example.b|Uninstall succeeded",
                            "Vessik Sync|0|yes|com.example.a|Uninstall succeeded"));
}

TEST_F(SyncReconciliation, GoesOnAfterAFailedUninstall) {
    platform_.registry.addApplication(kB);
    stage(PropertyList::array({todoEntry(kA, "remove"), todoEntry(kB, "remove")}));
    EXPECT_TRUE(reconcile());
    EXPECT_TRUE(logged(LogLevel::Error, "Uninstall of com.example.a failed."));
    EXPECT_THAT(platform_.transactions.records(),
                ElementsAre("Vessik Sync|0|no|com.example.a|Uninstall failed",
                            "Vessik Sync|0|yes|com.example.b|Uninstall succeeded"));
    EXPECT_EQ(error_, std::nullopt);
}

TEST_F(SyncReconciliation, DoesNotRemoveAnIdentifierThatIsNotSafe) {
    stage(PropertyList::array({todoEntry("com.example/../a", "remove"), todoEntry(7, "remove"),
                               todoEntry(PropertyList::array(), "remove")}));
    EXPECT_TRUE(reconcile());
    EXPECT_THAT(uninstalls(), IsEmpty());
    EXPECT_THAT(platform_.messages(), Not(Contains(HasSubstr("deletions"))));
}

TEST_F(SyncReconciliation, ComparesTheOperationExactly) {
    platform_.registry.addApplication(kA);
    stage(PropertyList::array({todoEntry(kA, "Remove"), todoEntry(kA, "removed")}));
    EXPECT_TRUE(reconcile());
    EXPECT_THAT(uninstalls(), IsEmpty());
}

TEST_F(SyncReconciliation, UnderAPolicyAgainstRemovalDoesAllButTheDeletions) {
    platform_.registry.addApplication(kA);
    platform_.policy.set(PolicyFeature::AppRemovalAllowed, PolicyAnswer::No);
    stage(PropertyList::array({todoEntry(kA, "remove")}));
    platform_.addPropertyList(kStaging + "/DeskoraIconState.plist", PropertyList::array({kA}));
    EXPECT_TRUE(reconcile());
    EXPECT_THAT(uninstalls(), IsEmpty());
    EXPECT_TRUE(
        logged(LogLevel::Default, "Not processing deletes because app removal is restricted"));
    EXPECT_THAT(platform_.notifications.posts(),
                ElementsAre("com.korvu.deskora.trd.wsyncnotify=1"));
    EXPECT_THAT(platform_.homeScreen.layout(), ElementsAre(kA));
    EXPECT_TRUE(platform_.files.exists(kDebugCopy));
}

TEST_F(SyncReconciliation, WithoutATodoListTellsTheHomeScreenAllTheSame) {
    platform_.files.addDirectory(kStaging);
    EXPECT_TRUE(reconcile());
    EXPECT_TRUE(logged(LogLevel::Default, "Nothing to do from Vessik"));
    EXPECT_THAT(platform_.notifications.posts(),
                ElementsAre("com.korvu.deskora.trd.wsyncnotify=1"));
    EXPECT_FALSE(platform_.files.exists(kDebugCopy));
    ASSERT_TRUE(error_);
    EXPECT_EQ(error_->code, ENOENT);
}

TEST_F(SyncReconciliation, GoesOnWithoutATodoListThatIsNoArray) {
    stage(PropertyList::map({{"identifier", kA}, {"operation", "remove"}}));
    EXPECT_TRUE(reconcile());
    EXPECT_TRUE(logged(LogLevel::Error, "todo list is not an array"));
    EXPECT_TRUE(logged(LogLevel::Default, "Nothing to do from Vessik"));
    EXPECT_FALSE(platform_.files.exists(kDebugCopy));
    EXPECT_THAT(uninstalls(), IsEmpty());
}

TEST_F(SyncReconciliation, GoesOnWithoutATodoListThatIsDamaged) {
    platform_.files.addFile(kStaging + "/ApplicationsSync.plist", "<plist><array>");
    EXPECT_TRUE(reconcile());
    EXPECT_TRUE(logged(LogLevel::Error, "couldn't parse todo list"));
    EXPECT_TRUE(logged(LogLevel::Default, "Nothing to do from Vessik"));
    ASSERT_TRUE(error_);
    EXPECT_EQ(error_->domain, kPropertyListErrorDomain);
}

TEST_F(SyncReconciliation, AsksForThePolicyBeforeItReadsTheTodoList) {
    stage(PropertyList::array());
    EXPECT_TRUE(reconcile());
    EXPECT_THAT(platform_.callsTo({"DevicePolicyService", "FileSystem.readFile"}),
                ElementsAre(HasSubstr("DevicePolicyService.effectiveValue"),
                            HasSubstr("ApplicationsSync.plist"), HasSubstr("DeskoraIconState")));
}

TEST_F(SyncReconciliation, SendsTheIconLayout) {
    stage(PropertyList::array());
    platform_.files.addFile(kStaging + "/DeskoraIconState.plist", "layout");
    EXPECT_TRUE(reconcile());
    EXPECT_TRUE(logged(LogLevel::Default, "Sending iconlayout to DK"));
    const std::string layout = "layout";
    EXPECT_EQ(platform_.homeScreen.lastIconState(), Bytes(layout.begin(), layout.end()));
}

TEST_F(SyncReconciliation, DoesNotSendAnEmptyOrMissingIconLayout) {
    stage(PropertyList::array());
    platform_.files.addFile(kStaging + "/DeskoraIconState.plist", "");
    EXPECT_TRUE(reconcile());
    stage(PropertyList::array());
    EXPECT_TRUE(reconcile());
    EXPECT_EQ(platform_.homeScreen.lastIconState(), std::nullopt);
    EXPECT_THAT(platform_.messages(), Not(Contains("Sending iconlayout to DK")));
}

TEST_F(SyncReconciliation, GoesOnWhenTheHomeScreenIsNotThere) {
    platform_.homeScreen.setReachable(false);
    stage(PropertyList::array());
    platform_.files.addFile(kStaging + "/DeskoraIconState.plist", "layout");
    EXPECT_TRUE(reconcile());
    EXPECT_THAT(platform_.notifications.posts(),
                ElementsAre("com.korvu.deskora.trd.wsyncnotify=1"));
    EXPECT_EQ(platform_.homeScreen.lastIconState(), std::nullopt);
}

TEST_F(SyncReconciliation, WritesTheDebugCopyInTheBinaryEncoding) {
    const auto list = PropertyList::array({todoEntry(kA, "install")});
    stage(list);
    EXPECT_TRUE(reconcile());
    EXPECT_EQ(platform_.propertyListAt(kDebugCopy), list);
    EXPECT_TRUE(platform_.files.text(kDebugCopy)->starts_with("bplist00"));
}

TEST_F(SyncReconciliation, IgnoresThatTheDebugCopyCannotBeSerialised) {
    stage(PropertyList::array());
    platform_.propertyLists.failNextSerialize(ErrorRecord::make(kPropertyListErrorDomain, 1, "no"));
    EXPECT_TRUE(reconcile());
    EXPECT_EQ(error_, std::nullopt);
    EXPECT_FALSE(platform_.files.exists(kDebugCopy));
}

TEST_F(SyncReconciliation, IgnoresThatTheDebugCopyCannotBeWritten) {
    stage(PropertyList::array({todoEntry(kA, "install")}));
    platform_.files.failNext(FileOperation::WriteFileAtomically, kTodoListDebugPath, ENOSPC);
    EXPECT_TRUE(reconcile());
    EXPECT_EQ(error_, std::nullopt);
    EXPECT_FALSE(platform_.files.exists(kDebugCopy));
}

TEST_F(SyncReconciliation, ReadsATodoListInEitherEncoding) {
    platform_.registry.addApplication(kA);
    platform_.addPropertyList(kStaging + "/ApplicationsSync.plist",
                              PropertyList::array({todoEntry(kA, "remove")}),
                              PropertyListFormat::Binary);
    EXPECT_TRUE(reconcile());
    EXPECT_THAT(platform_.registry.installedIdentifiers(), IsEmpty());
}

TEST_F(SyncReconciliation, TakesTheAreaOverUnderTheLockOfTheTodoList) {
    stage(PropertyList::array());
    EXPECT_TRUE(reconcile());
    EXPECT_THAT(platform_.callsTo({"Lock#1", "FileSystem.removeItem", "FileSystem.moveItem"}),
                ElementsAre("Lock#1.lock()", HasSubstr("removeItem"), HasSubstr("moveItem"),
                            "Lock#1.unlock()"));
}

}  // namespace
}  // namespace appsync
