#include <cerrno>
#include <ostream>
#include <utility>

#include "coordination/InstallErrors.h"
#include "restore/RestoredApp.h"
#include "tests/restore/RestoreFixture.h"

namespace appsync {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using testing::StartsWith;

// One application that is restored through a coordinator.
class CoordinatedRestore : public RestoreFixture {
  protected:
    CoordinatedRestore() { coordinate(); }

    SimulatedCoordination& service() { return platform_.coordination; }

    /// Lets the service do what there is to do.
    bool prepare(std::uint64_t demotionStatus, const PropertyList& metadata = storeMetadata()) {
        return prepareData(bytesOf(metadata), demotionStatus);
    }
    bool prepareData(const Bytes& metadata, std::uint64_t demotionStatus) {
        const bool status = client_->prepareAppForRestoreUsingCoordination(kA, metadata, &sinf_,
                                                                           &icon_, demotionStatus);
        platform_.runUntilIdle();
        return status;
    }
    bool prepareWithout(const Bytes* sinf, const Bytes* icon) {
        const Bytes metadata = bytesOf(storeMetadata());
        const bool status =
            client_->prepareAppForRestoreUsingCoordination(kA, metadata, sinf, icon, 0);
        platform_.runUntilIdle();
        return status;
    }

    [[nodiscard]] const SimulatedPlaceholderState& placeholder() {
        const SimulatedPlaceholderState* state = service().placeholder(kA);
        EXPECT_NE(state, nullptr);
        static const SimulatedPlaceholderState kNone;
        return state != nullptr ? *state : kNone;
    }
    [[nodiscard]] std::set<std::string> awaited() {
        return AppsClientTestAccess::placeholdersForRestoringApps(*client_);
    }
    static SimulatedCancel givenUp() {
        return {makeInstallError(InstallError::RestoreFailed), SyncClientID};
    }
    [[nodiscard]] std::vector<std::string> cancels() const {
        return platform_.callsTo({"InstallCoordinator.cancelForReason",
                                  "InstallPlaceholder.cancelForReason",
                                  "PathTransferPromise.cancelForReason"});
    }
    /// What all failed restores have in common, once they have a coordinator.
    void expectCoordinatorCancelled() {
        ASSERT_NE(service().ended(kA), nullptr);
        EXPECT_EQ(service().ended(kA)->cancelled, givenUp());
        EXPECT_THAT(awaited(), IsEmpty());
        EXPECT_FALSE(platform_.registry.placeholder(kA));
        EXPECT_TRUE(logged(LogLevel::Default,
                           "Cancelling coordinator for appBundleIdentifier:com.example.a"));
    }
    void expectFinished(const std::string& text) {
        EXPECT_THAT(platform_.messages(), Contains(StartsWith(text)));
    }

    const ErrorRecord refusal_{"Coordination", 7, {}};
};

constexpr std::string_view kWholeRestore = R"(
8 default reconcileRestoreOfType 3
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
8 default processing app restore for non demoted bundle 'A' with install coordination
InstallTransactionLog.logStep(2, 1, 1, yes, A, Restore app)
InstallCoordinatorService.coordinator(restoring, A, 3, create if not existing)
InstallCoordinator.creatorIdentifier(A)
InstallCoordinator.appAssetPromiseResponsibleClient(A)
InstallCoordinator.setObserver(A)
InstallCoordinator.hasUserDataPromise(A)
InstallCoordinatorService.makeOutOfBandPromise(A-UserData, 3, 0)
OutOfBandPromise.setPercentComplete(A-UserData, 1)
OutOfBandPromise.setComplete(A-UserData)
InstallCoordinator.setUserDataPromise(A, A-UserData)
8 default Added out of band user data promise for for A
InstallCoordinator.hasPlaceholderPromise(A)
FileSystem.temporaryDirectory()
FileSystem.createDirectory(APPS/A.app, with intermediates, mobile:mobile)
8 default Created app directory for 'A' at APPS/A.app with err=(null)
FileSystem.createFile(APPS/A.app/Icon.png, mobile:mobile)
FileSystem.attributes(APPS/A.app/Icon.png)
8 default icon data for 'A' was writen to APPS/A.app/Icon.png with status:1 fileSize:4
InstallTransactionLog.logStep(4, 1, 1, yes, A, Create placeholder)
InstallCoordinatorService.makeAppPlaceholder(Shown, A, 2, 3)
InstallTransactionLog.logStep(4, 1, 2, yes, A, Finished creating placeholder)
8 default Created placeholder Placeholder(A) for 'A' of type 2
InstallCoordinatorService.makePathTransferPromise(A-Icon, 3, APPS/A.app/Icon.png, 4)
PathTransferPromise.setPercentComplete(A-Icon, 1)
PathTransferPromise.setComplete(A-Icon)
InstallPlaceholder.setIconPromise(A, A-Icon)
8 default Added icon promise to placeholder for 'A'
InstallPlaceholder.setAttributes(A, {}, version 1.0)
8 default set {info = {}; launchProhibited = 0; bundleVersion = 1.0;} placeholder attributes for A
InstallPlaceholder.setMetadata(A, {title = Shown; bundleVersion = 1.0;})
8 default set store metadata on placeholder for A
InstallPlaceholder.setSinf(A)
8 default set SINF data on placeholder for A
InstallPlaceholder.setConfigurationComplete(A)
8 default set placeholder configuration complete for A
InstallCoordinator.setPlaceholderPromise(A, Shown)
SerialQueue#6.sync()
WaitGroup#6.enter()
8 default Relocant will wait for TS to install placeholder for A, _restoringPlaceholderCount 1
8 default added placeholder promise for A
InstallCoordinator.setAppAssetPromiseResponsibleClient(A, 1)
8 default set CQClientAppStore to satisfy app asset promise for A
8 default processing app restore for A finished with status 1 error (null)
InstallTransactionLog.logStep(2, 1, 2, yes, A, Restore app)
8 default processing vessik restore info for 'B' demotionStatus :1
8 default processing app restore for demoted bundle 'B' with install coordination
InstallTransactionLog.logStep(2, 1, 1, yes, B, Restore demoted app)
InstallCoordinatorService.coordinator(restoring demoted, B, 3, create if not existing)
InstallCoordinator.creatorIdentifier(B)
InstallCoordinator.setObserver(B)
InstallCoordinator.hasUserDataPromise(B)
InstallCoordinatorService.makeOutOfBandPromise(B-UserData, 3, 0)
OutOfBandPromise.setPercentComplete(B-UserData, 1)
OutOfBandPromise.setComplete(B-UserData)
InstallCoordinator.setUserDataPromise(B, B-UserData)
8 default Added out of band user data promise for for B
InstallCoordinator.hasPlaceholderPromise(B)
FileSystem.temporaryDirectory()
FileSystem.createDirectory(APPS/B.app, with intermediates, mobile:mobile)
8 default Created app directory for 'B' at APPS/B.app with err=(null)
8 error no icon data for 'B'
InstallTransactionLog.logStep(4, 1, 1, yes, B, Create placeholder)
InstallCoordinatorService.makeAppPlaceholder(Shown, B, 8, 3)
InstallTransactionLog.logStep(4, 1, 2, yes, B, Finished creating placeholder)
8 default Created placeholder Placeholder(B) for 'B' of type 8
InstallPlaceholder.setAttributes(B, {}, version 1.0)
8 default set {info = {}; launchProhibited = 0; bundleVersion = 1.0;} placeholder attributes for B
InstallPlaceholder.setMetadata(B, {title = Shown; bundleVersion = 1.0;})
8 default set store metadata on placeholder for B
InstallPlaceholder.setConfigurationComplete(B)
8 default set placeholder configuration complete for B
InstallCoordinator.setPlaceholderPromise(B, Shown)
SerialQueue#6.sync()
WaitGroup#6.enter()
8 default Relocant will wait for TS to install placeholder for B, _restoringPlaceholderCount 2
8 default added placeholder promise for B
8 default processing app restore for demoted app B finished with status 1 error (null)
InstallTransactionLog.logStep(2, 1, 2, yes, B, Restore demoted app)
8 default Will wait for 10 seconds for 2 placeholders to install
WaitGroup#6.waitFor(10000 ms)
InstallCoordinatorObserver.coordinatorDidInstallPlaceholder(A)
InstallCoordinator.bundleIdentifier(A)
InstallCoordinator.error(A)
8 default coordinatorDidInstallPlaceholder for A with error (null)
SerialQueue#6.sync()
WaitGroup#6.leave()
8 default TS finished installing placeholder for A, _restoringPlaceholderCount 1
InstallCoordinatorObserver.coordinatorDidInstallPlaceholder(B)
InstallCoordinator.bundleIdentifier(B)
InstallCoordinator.error(B)
8 default coordinatorDidInstallPlaceholder for B with error (null)
SerialQueue#6.sync()
WaitGroup#6.leave()
8 default TS finished installing placeholder for B, _restoringPlaceholderCount 0
InstallCoordinatorObserver.coordinatorDidCompleteSuccessfully(B)
InstallCoordinator.bundleIdentifier(B)
InstallCoordinator.error(B)
8 default coordinatorDidCompleteSuccessfully for B with error (null)
Lock#5.lock()
FileSystem.readFile(/var/mobile/Library/ApplicationSync/VessikStuff/ApplicationsSync.plist)
Lock#5.unlock()
Lock#6.lock()
FileSystem.readFile(/var/mobile/Library/ApplicationSync/RestoreState.plist)
Lock#6.unlock()
SerialQueue#6.sync()
8 default Finished waiting for placeholder installs
FileSystem.removeItem(MOVED)
FileSystem.moveItem(INFO, MOVED)
)";

TEST_F(CoordinatedRestore, MakesEveryCallAndWritesEveryMessageInOrder) {
    setRestoreInfo(PropertyList::map({{kA, appInfo()}, {kB, bareAppInfo()}}));
    setDemotedApps(PropertyList::map({{"IntentionalDowngrades", PropertyList::array({kB})}}));
    platform_.clearRecording();
    EXPECT_TRUE(client_->reconcileRestoreOfType(3, nullptr));
    EXPECT_EQ(abbreviatedRecording(), kWholeRestore);
}

// What a restore sets up.

TEST_F(CoordinatedRestore, LeavesThePackageToTheAppStore) {
    EXPECT_TRUE(prepare(0));
    const SimulatedCoordinatorState* state = service().state(kA);
    ASSERT_NE(state, nullptr);
    EXPECT_EQ(state->kind, CoordinatorKind::Restoring);
    EXPECT_EQ(state->creator, SyncClientID);
    EXPECT_EQ(state->responsibleClient, AppStoreClientID);
    EXPECT_EQ(state->appAsset, nullptr);
    ASSERT_NE(state->userData, nullptr);
    EXPECT_TRUE(state->userData->complete);
    EXPECT_EQ(state->userData->name, "com.example.a-UserData");
    EXPECT_EQ(platform_.registry.placeholder(kA)->installType, kInstallTypeRestore);
}

TEST_F(CoordinatedRestore, OfADemotedApplicationEndsWithItsPlaceholder) {
    EXPECT_TRUE(prepare(2));
    const SimulatedCoordinatorState* state = service().ended(kA);
    ASSERT_NE(state, nullptr);
    EXPECT_EQ(state->kind, CoordinatorKind::RestoringDemoted);
    EXPECT_EQ(state->responsibleClient, std::nullopt);
    EXPECT_EQ(state->error, std::nullopt);
    EXPECT_EQ(platform_.registry.placeholder(kA)->installType, kInstallTypeDowngrade);
    EXPECT_THAT(platform_.callsTo({"InstallCoordinator.setAppAssetPromiseResponsibleClient",
                                   "InstallCoordinator.appAssetPromiseResponsibleClient"}),
                IsEmpty());
}

TEST_F(CoordinatedRestore, GivesThePlaceholderEverythingThatTheBackupHas) {
    PropertyList metadata = storeMetadata();
    metadata.set("launchProhibited", true);
    metadata.set("other", 5);
    EXPECT_TRUE(prepare(0, metadata));
    EXPECT_EQ(placeholder().name, "Shown");
    EXPECT_EQ(placeholder().client, SyncClientID);
    EXPECT_EQ(placeholder().attributes, (PlaceholderAttributes{PropertyList::map(), true, "1.0"}));
    EXPECT_EQ(placeholder().metadata, StoreMetadata{metadata});
    EXPECT_EQ(placeholder().sinf, sinf_);
    ASSERT_NE(placeholder().icon, nullptr);
    EXPECT_EQ(placeholder().icon->diskSpaceNeeded, icon_.size());
    EXPECT_TRUE(placeholder().icon->complete);
    EXPECT_EQ(placeholder().iconBytes, icon_);
    EXPECT_TRUE(placeholder().configurationComplete);
    EXPECT_EQ(platform_.files.ownership(kBundle + "/Icon.png"), "mobile:mobile");
}

TEST_F(CoordinatedRestore, ChoosesTheInstallTypeByTheDemotionStatus) {
    const std::vector<std::pair<std::uint64_t, std::uint64_t>> types{
        {0, 2}, {1, 8}, {2, 7}, {5, 2}};
    for (const auto& [status, type] : types) {
        makeClient();
        if (service().state(kA) != nullptr) service().cancel(kA, refusal_, SyncClientID);
        EXPECT_TRUE(prepare(status)) << status;
        EXPECT_EQ(placeholder().installType, type) << status;
        const bool isDemoted = service().ended(kA) != nullptr &&
                               service().ended(kA)->kind == CoordinatorKind::RestoringDemoted;
        EXPECT_EQ(isDemoted, status != 0) << status;
    }
}

TEST_F(CoordinatedRestore, NamesThePlaceholderAfterTitleItemOrIdentifier) {
    const auto nameWith = [this](const PropertyList& metadata) {
        EXPECT_TRUE(prepare(1, metadata));
        return placeholder().name;
    };
    EXPECT_EQ(nameWith(PropertyList::map({{"title", "Title"}, {"itemName", "Item"}})), "Title");
    EXPECT_EQ(nameWith(PropertyList::map({{"itemName", "Item"}})), "Item");
    EXPECT_EQ(nameWith(PropertyList::map()), kA);
    EXPECT_EQ(nameWith(PropertyList::map({{"title", 7}, {"itemName", "Item"}})), kA);
}

TEST_F(CoordinatedRestore, GoesWithoutAnIcon) {
    const Bytes nothing;
    for (const Bytes* icon : {static_cast<const Bytes*>(nullptr), &nothing}) {
        makeClient();
        if (service().state(kA) != nullptr) service().cancel(kA, refusal_, SyncClientID);
        platform_.clearRecording();
        EXPECT_TRUE(prepareWithout(&sinf_, icon));
        EXPECT_EQ(placeholder().icon, nullptr);
        EXPECT_TRUE(placeholder().configurationComplete);
        EXPECT_THAT(platform_.callsTo({"InstallCoordinatorService.makePathTransferPromise"}),
                    IsEmpty());
    }
}

TEST_F(CoordinatedRestore, GoesWithoutAnIconThatCannotBeWritten) {
    platform_.files.failNext(FileOperation::CreateFile, kBundle + "/Icon.png", ENOSPC);
    EXPECT_TRUE(prepare(0));
    EXPECT_EQ(placeholder().icon, nullptr);
    EXPECT_TRUE(platform_.registry.placeholder(kA));
}

TEST_F(CoordinatedRestore, GoesWithoutSinfData) {
    EXPECT_TRUE(prepareWithout(nullptr, &icon_));
    EXPECT_EQ(placeholder().sinf, std::nullopt);
    EXPECT_THAT(platform_.callsTo({"InstallPlaceholder.setSinf"}), IsEmpty());
}

TEST_F(CoordinatedRestore, GoesWithoutAUserDataPromiseThatCannotBeMade) {
    service().makeNoneNext(CoordinationObject::OutOfBandPromise, "com.example.a-UserData");
    EXPECT_TRUE(prepare(0));
    EXPECT_EQ(service().state(kA)->userData, nullptr);
    EXPECT_THAT(platform_.callsTo({"InstallCoordinator.setUserDataPromise"}), IsEmpty());
}

// What is there already.

TEST_F(CoordinatedRestore, TouchesNothingThatIsLeftToTheAppStoreAlready) {
    EXPECT_TRUE(prepare(0));
    platform_.clearRecording();
    EXPECT_TRUE(prepare(0));
    EXPECT_THAT(
        platform_.lines(),
        ElementsAre(
            "8 default processing app restore for non demoted bundle 'com.example.a' with install "
            "coordination",
            "InstallTransactionLog.logStep(2, 1, 1, yes, com.example.a, Restore app)",
            StartsWith("PropertyListSerialization.parse("),
            "InstallCoordinatorService.coordinator(restoring, com.example.a, 3, create if not "
            "existing) -> com.example.a, existing",
            "InstallCoordinator.creatorIdentifier(com.example.a) -> 3",
            "InstallCoordinator.appAssetPromiseResponsibleClient(com.example.a) -> 1",
            "8 default App asset DRI for com.example.a is set to 1 - nothing more for trd to do",
            "InstallTransactionLog.logStep(2, 1, 2, yes, com.example.a, Restore app)"));
}

TEST_F(CoordinatedRestore, AddsNothingToADemotedCoordinatorThatHasBothPromises) {
    service().addCoordinator(CoordinatorKind::RestoringDemoted, kA, SyncClientID);
    service().setHas(CoordinationStep::UserDataPromise, kA, true);
    service().setHas(CoordinationStep::PlaceholderPromise, kA, true);
    EXPECT_TRUE(prepare(1));
    EXPECT_THAT(
        platform_.messageLines(),
        ElementsAre(HasSubstr("processing app restore for demoted bundle 'com.example.a' with "
                              "install coordination"),
                    "8 default Coordinator for com.example.a has a valid user data promise",
                    "8 default Coordinator for com.example.a has a valid placeholder promise",
                    "8 default processing app restore for demoted app com.example.a finished with "
                    "status 1 error "
                    "(null)"));
    EXPECT_THAT(platform_.callsTo({"InstallCoordinatorService.makeAppPlaceholder", "FileSystem"}),
                IsEmpty());
}

TEST_F(CoordinatedRestore, GoesOnWithAPlaceholderThatIsThere) {
    service().addCoordinator(CoordinatorKind::Restoring, kA, SyncClientID);
    service().setHas(CoordinationStep::PlaceholderPromise, kA, true);
    EXPECT_TRUE(prepare(0));
    EXPECT_EQ(service().state(kA)->responsibleClient, AppStoreClientID);
    EXPECT_THAT(platform_.callsTo({"InstallCoordinatorService.makeAppPlaceholder"}), IsEmpty());
    EXPECT_THAT(awaited(), IsEmpty());
}

// What goes wrong.

TEST_F(CoordinatedRestore, OfDamagedMetadataIsGivenUpWithoutACoordinator) {
    client_->relocantSetPlaceHolderPromiseForRestoreAppBundle(kA);
    for (const std::uint64_t status : {0U, 1U}) {
        platform_.clearRecording();
        EXPECT_FALSE(prepareData(Bytes{'x'}, status));
        EXPECT_THAT(platform_.messageLines(),
                    Contains(StartsWith("8 error failed to parse vessik metadata for "
                                        "'com.example.a'. err=Error Domain=PropertyList")));
        EXPECT_THAT(platform_.callsTo({"InstallCoordinatorService", "InstallCoordinator"}),
                    IsEmpty());
        EXPECT_THAT(awaited(), IsEmpty()) << "it is taken out of the book";
    }
}

TEST_F(CoordinatedRestore, OfMetadataThatIsNoMapIsGivenUp) {
    EXPECT_FALSE(prepare(0, PropertyList::array({1})));
    expectFinished("processing app restore for com.example.a finished with status 0 error Error");
}

TEST_F(CoordinatedRestore, TakesACoordinatorOfAnotherClientForNone) {
    for (const std::uint64_t status : {kNotDemoted, kIntentionallyDemoted}) {
        const bool isDemoted = status != kNotDemoted;
        makeClient();
        service().addCoordinator(
            isDemoted ? CoordinatorKind::RestoringDemoted : CoordinatorKind::Restoring, kA, 2);
        platform_.clearRecording();
        EXPECT_FALSE(prepare(status));
        EXPECT_TRUE(
            logged(LogLevel::Error, "Error (null) creating restore coordinator for com.example.a"));
        ASSERT_NE(service().state(kA), nullptr);
        EXPECT_EQ(service().state(kA)->cancelled, std::nullopt);
        EXPECT_THAT(platform_.callsTo({"InstallCoordinator"}),
                    ElementsAre(StartsWith("InstallCoordinator.creatorIdentifier")));
        service().cancel(kA, refusal_, 2);
    }
}

TEST_F(CoordinatedRestore, NeedsACoordinator) {
    service().failNext(CoordinationStep::LookUp, kA, refusal_);
    EXPECT_FALSE(prepare(0));
    EXPECT_THAT(platform_.messageLines(),
                Contains(testing::MatchesRegex("8 error Error .* creating restore coordinator for "
                                               "com.example.a")));
    service().makeNoneNext(CoordinationObject::Coordinator, kA);
    EXPECT_FALSE(prepare(1));
    EXPECT_TRUE(
        logged(LogLevel::Error, "Error (null) creating restore coordinator for com.example.a"));
    EXPECT_THAT(cancels(), IsEmpty());
    EXPECT_THAT(platform_.files.names("/tmp"), IsEmpty());
}

struct Refusal {
    CoordinationStep step;
    std::string message;  // contains
    friend void PrintTo(const Refusal& refusal, std::ostream* out) { *out << refusal.message; }
};

/// The pieces of a placeholder, and what is logged when it does not take them.
class RefusedPiece : public CoordinatedRestore, public testing::WithParamInterface<Refusal> {};

TEST_P(RefusedPiece, CancelsThePlaceholderAndThenTheCoordinator) {
    for (const std::uint64_t status : {0U, 2U}) {
        platform_.clearRecording();
        service().failNext(GetParam().step, kA, refusal_);
        EXPECT_FALSE(prepare(status));
        EXPECT_THAT(
            platform_.messageLines(),
            Contains(testing::AllOf(StartsWith("8 error Error "), HasSubstr(GetParam().message))));
        EXPECT_EQ(placeholder().cancelled, givenUp());
        expectCoordinatorCancelled();
        EXPECT_THAT(cancels().back(), StartsWith("InstallCoordinator.cancelForReason"));
        EXPECT_THAT(platform_.messages(), Not(Contains(StartsWith("Cancelling placeholder for"))));
        expectFinished(status == 0
                           ? "processing app restore for com.example.a finished with status 0"
                           : "processing app restore for demoted app com.example.a finished with "
                             "status 0");
    }
}

INSTANTIATE_TEST_SUITE_P(
    Each, RefusedPiece,
    testing::Values(
        Refusal{CoordinationStep::IconPromise, "adding icon promise to placeholder for"},
        Refusal{CoordinationStep::Attributes, "setting placeholder attributes for 'com.example.a'"},
        Refusal{CoordinationStep::Metadata, "setting store metadata for 'com.example.a'"},
        Refusal{CoordinationStep::Sinf, "setting SINF data for 'com.example.a'"},
        Refusal{CoordinationStep::ConfigurationComplete,
                "setting placeholder configuration as complete for 'com.example.a'"}));

TEST_F(CoordinatedRestore, CancelsARefusedIconPromiseAsPartOfARestore) {
    service().failNext(CoordinationStep::IconPromise, kA, refusal_);
    EXPECT_FALSE(prepare(0));
    EXPECT_THAT(
        cancels().front(),
        testing::AllOf(StartsWith("PathTransferPromise.cancelForReason(com.example.a-Icon, "),
                       HasSubstr("TRError"), HasSubstr("29"), testing::EndsWith(", 3)")));
}

TEST_F(CoordinatedRestore, NeedsADirectoryForThePlaceholder) {
    platform_.files.failNext(FileOperation::CreateDirectory, kBundle, ENOSPC);
    EXPECT_FALSE(prepare(0));
    EXPECT_EQ(service().placeholder(kA), nullptr);
    expectCoordinatorCancelled();
}

TEST_F(CoordinatedRestore, NeedsAPlaceholder) {
    service().makeNoneNext(CoordinationObject::Placeholder, kA);
    EXPECT_FALSE(prepare(0));
    expectCoordinatorCancelled();
}

TEST_F(CoordinatedRestore, IsGivenUpWhenItsUserDataPromiseIsRefused) {
    for (const std::uint64_t status : {0U, 1U}) {
        platform_.clearRecording();
        service().failNext(CoordinationStep::UserDataPromise, kA, refusal_);
        EXPECT_FALSE(prepare(status));
        EXPECT_THAT(platform_.messageLines(),
                    Contains(testing::MatchesRegex(
                        "8 error Error .* adding out of band data promise for 'com.example.a'")));
        expectCoordinatorCancelled();
        EXPECT_EQ(service().placeholder(kA), nullptr);
    }
}

TEST_F(CoordinatedRestore, CancelsTheCoordinatorBeforeAPlaceholderThatItRefuses) {
    service().failNext(CoordinationStep::PlaceholderPromise, kA, refusal_);
    EXPECT_FALSE(prepare(1));
    EXPECT_THAT(platform_.messageLines(),
                Contains(testing::MatchesRegex(
                    "8 error Error .* setting placeholder promise for 'com.example.a'")));
    EXPECT_THAT(cancels(), ElementsAre(StartsWith("InstallCoordinator.cancelForReason"),
                                       StartsWith("InstallPlaceholder.cancelForReason")));
    EXPECT_TRUE(
        logged(LogLevel::Default, "Cancelling placeholder for appBundleIdentifier:com.example.a"));
    EXPECT_EQ(placeholder().cancelled, givenUp());
    expectCoordinatorCancelled();
}

TEST_F(CoordinatedRestore, CancelsOnlyTheCoordinatorWhenTheAppStoreIsRefused) {
    service().failNext(CoordinationStep::AppAssetPromiseResponsibleClient, kA, refusal_);
    EXPECT_FALSE(prepare(0));
    EXPECT_THAT(platform_.messageLines(),
                Contains(testing::MatchesRegex("8 error Error .* setting CQClientAppStore to "
                                               "satisfy app data promise for 'com.example.a'")));
    EXPECT_THAT(cancels(), ElementsAre(StartsWith("InstallCoordinator.cancelForReason")));
    expectCoordinatorCancelled();
    expectFinished(
        "processing app restore for com.example.a finished with status 0 error Error "
        "Domain=Coordination Code=7");
}

TEST_F(CoordinatedRestore, RestoresTheOthersAllTheSame) {
    setRestoreInfo(PropertyList::map({{kA, appInfo()},
                                      {"no map", 1},
                                      {"no metadata", PropertyList::map()},
                                      {"damaged", PropertyList::map({{"VessikMetadata", sinf_}})},
                                      {kB, appInfo()}}));
    service().failNext(CoordinationStep::Sinf, kA, refusal_);
    restore();
    EXPECT_THAT(service().identifiers(), ElementsAre(kB));
    EXPECT_TRUE(platform_.registry.placeholder(kB));
    EXPECT_THAT(awaited(), IsEmpty());
    EXPECT_EQ(platform_.now(), SimulatedTime(0));
    expectInfoMovedOnce();
}

TEST_F(CoordinatedRestore, OfAnIdentifierThatNoApplicationCanHaveIsRefused) {
    const std::vector<std::string> identifiers{
        "", ".", "..", "a/../../b", "a/b", std::string("a\0b", 3), "a\nb", std::string(300, 'a')};
    PropertyList info = PropertyList::map();
    for (const std::string& identifier : identifiers) info.set(identifier, appInfo());
    info.set(kB, appInfo());
    setRestoreInfo(info);
    restore();
    for (const std::string& identifier : identifiers) {
        EXPECT_THAT(platform_.messages(),
                    Contains(testing::AllOf(
                        StartsWith("Error Error Domain="),
                        testing::EndsWith(" creating restore coordinator for " + identifier))));
    }
    EXPECT_THAT(service().identifiers(), ElementsAre(kB));
    EXPECT_THAT(platform_.files.names("/tmp/com.korvu.trd.Apps"), ElementsAre("com.example.b.app"));
    expectInfoMovedOnce();
}

TEST_F(CoordinatedRestore, AsksTheRegistryForNoPlaceholder) {
    platform_.registry.addPlaceholder(kA, kInstallTypeSync);
    setRestoreInfo(PropertyList::map({{kA, appInfo()}}));
    platform_.clearRecording();
    restore();
    EXPECT_THAT(platform_.callsTo({"AppRegistry.enumerateBundles"}), IsEmpty());
    EXPECT_NE(service().state(kA), nullptr);
}

}  // namespace
}  // namespace appsync
