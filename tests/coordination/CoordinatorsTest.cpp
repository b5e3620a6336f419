#include "tests/coordination/CoordinationFixture.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class Coordinators : public CoordinationFixture {};

TEST_F(Coordinators, AreCreatedForAFirstInstall) {
    std::optional<ErrorRecord> error = refusal_;
    EXPECT_NE(coordinator(false, &error), nullptr);
    EXPECT_EQ(error, std::nullopt);
    EXPECT_EQ(service().state(kA)->kind, CoordinatorKind::Initiating);
    EXPECT_EQ(service().state(kA)->creator, SyncClientID);
    EXPECT_THAT(
        platform_.lines(),
        ElementsAre(
            "InstallTransactionLog.logStep(3, 1, 1, yes, com.example.a, Create coordinator)",
            "InstallCoordinatorService.coordinator(initiating, com.example.a, 3, create if not "
            "existing) -> com.example.a, created",
            "InstallCoordinator.creatorIdentifier(com.example.a) -> 3",
            "8 default Created initiating coordinator Coordinator(com.example.a) "
            "(createIfNotExisting:1, existingApp:0) for com.example.a with error (null)",
            "InstallTransactionLog.logStep(3, 1, 2, yes, com.example.a, Finished creating "
            "coordinator)"));
}

TEST_F(Coordinators, AreCreatedForAnUpdate) {
    platform_.registry.addApplication(kA);
    EXPECT_NE(coordinator(true), nullptr);
    EXPECT_EQ(service().state(kA)->kind, CoordinatorKind::Updating);
    EXPECT_TRUE(logged(LogLevel::Default,
                       "Created updating coordinator Coordinator(com.example.a) "
                       "(createIfNotExisting:1, existingApp:1) for com.example.a with error "
                       "(null)"));
}

TEST_F(Coordinators, AreUsedAgain) {
    EXPECT_NE(coordinator(), nullptr);
    platform_.clearRecording();
    EXPECT_NE(client_->_initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier(
                  kA, false, false, nullptr),
              nullptr);
    EXPECT_TRUE(logged(LogLevel::Default,
                       "Created initiating coordinator Coordinator(com.example.a) "
                       "(createIfNotExisting:0, existingApp:0) for com.example.a with error "
                       "(null)"));
}

TEST_F(Coordinators, AreOnlyLookedUpWhenNoneIsToBeCreated) {
    std::optional<ErrorRecord> error = refusal_;
    EXPECT_EQ(client_->_initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier(kA, false,
                                                                                     false, &error),
              nullptr);
    EXPECT_EQ(error, std::nullopt);
    EXPECT_THAT(platform_.messages(), IsEmpty());
    EXPECT_THAT(
        steps(),
        ElementsAre(
            "InstallTransactionLog.logStep(3, 1, 1, yes, com.example.a, Create coordinator)",
            "InstallTransactionLog.logStep(3, 1, 2, no, com.example.a, Finished creating "
            "coordinator)"));
}

TEST_F(Coordinators, TellWhyThereIsNone) {
    service().failNext(CoordinationStep::LookUp, kA, refusal_);
    std::optional<ErrorRecord> error;
    EXPECT_EQ(coordinator(false, &error), nullptr);
    EXPECT_EQ(error, refusal_);
    EXPECT_THAT(platform_.messages(), IsEmpty());
}

TEST_F(Coordinators, OfAnotherClientAreLeftAlone) {
    service().addCoordinator(CoordinatorKind::Initiating, kA, 2);
    std::optional<ErrorRecord> error;
    EXPECT_EQ(coordinator(false, &error), nullptr);
    EXPECT_EQ(error, std::nullopt);
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("8 default TS returned initiating coordinator "
                            "Coordinator(com.example.a) (createIfNotExisting:1, existingApp:0, "
                            "creatorIdentifier=2) for com.example.a with error (null) - Will not "
                            "perform install/update for this bundle"));
    EXPECT_EQ(service().state(kA)->cancelled, std::nullopt);
    EXPECT_EQ(steps().back(),
              "InstallTransactionLog.logStep(3, 1, 2, no, com.example.a, Finished creating "
              "coordinator)");
}

class Placeholders : public CoordinationFixture {};

TEST_F(Placeholders, AreMadeInThePluginsName) {
    EXPECT_NE(placeholder(), nullptr);
    EXPECT_THAT(
        platform_.lines(),
        ElementsAre(
            "InstallTransactionLog.logStep(4, 1, 1, yes, com.example.a, Create placeholder)",
            "InstallCoordinatorService.makeAppPlaceholder(Example, com.example.a, 4, 3) -> a "
            "placeholder",
            "InstallTransactionLog.logStep(4, 1, 2, yes, com.example.a, Finished creating "
            "placeholder)",
            "8 default Created placeholder Placeholder(com.example.a) for 'com.example.a' of type "
            "4"));
}

TEST_F(Placeholders, AreLoggedAlsoWhenThereIsNone) {
    service().makeNoneNext(CoordinationObject::Placeholder, kA);
    EXPECT_EQ(placeholder(), nullptr);
    EXPECT_EQ(steps().back(),
              "InstallTransactionLog.logStep(4, 1, 2, no, com.example.a, Finished creating "
              "placeholder)");
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("8 default Created placeholder (null) for 'com.example.a' of type 4"));
}

class AppAssetPromise : public CoordinationFixture {
  protected:
    bool make(const std::optional<std::string>& path, InstallCoordinator* coordinator) {
        platform_.clearRecording();
        return client_->_createAppAssetPromiseForBundleIdentifier(kA, path, coordinator) != nullptr;
    }
};

TEST_F(AppAssetPromise, NeedsNoPath) {
    const Coordinator owner = coordinator();
    EXPECT_TRUE(make(std::nullopt, owner.get()));
    EXPECT_EQ(promise("-Asset").client, SyncClientID);
    EXPECT_EQ(promise("-Asset").path, std::nullopt);
    EXPECT_EQ(promise("-Asset").diskSpaceNeeded, 0U);
    EXPECT_FALSE(promise("-Asset").complete);
    EXPECT_EQ(service().state(kA)->appAsset.get(), &promise("-Asset"));
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("8 default Added app asset promise to coordinator for "
                            "'com.example.a'"));
}

TEST_F(AppAssetPromise, TakesAPath) {
    const Coordinator owner = coordinator();
    EXPECT_TRUE(make("/a.zip", owner.get()));
    EXPECT_EQ(promise("-Asset").path, FileURL::fromPath("/a.zip", false));
}

TEST_F(AppAssetPromise, IsNoneWithoutACoordinator) {
    EXPECT_FALSE(make("/a.zip", nullptr));
    EXPECT_THAT(platform_.lines(), IsEmpty());
}

TEST_F(AppAssetPromise, MayNotBeMade) {
    const Coordinator owner = coordinator();
    service().makeNoneNext(CoordinationObject::PathTransferPromise, std::string(kA) + "-Asset");
    EXPECT_FALSE(make("/a.zip", owner.get()));
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("8 error Error creating asset promise for 'com.example.a'"));
}

TEST_F(AppAssetPromise, IsNotMadeForAPathThatNoUrlCanHold) {
    const Coordinator owner = coordinator();
    EXPECT_FALSE(make(std::string("/a\0b", 4), owner.get()));
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("8 error Error creating asset promise for 'com.example.a'"));
}

TEST_F(AppAssetPromise, IsCancelledWhenTheCoordinatorRefusesIt) {
    const Coordinator owner = coordinator();
    service().failNext(CoordinationStep::AppAssetPromise, kA, refusal_);
    EXPECT_FALSE(make("/a.zip", owner.get()));
    EXPECT_EQ(promise("-Asset").cancelled, cancelledWith(InstallError::InstallFailed));
    EXPECT_THAT(
        platform_.messageLines(),
        ElementsAre(
            "8 error Error Error Domain=Coordination Code=7 \"(null)\" adding app asset promise at "
            "/a.zip to 'com.example.a'",
            "8 error Cancelling asset promise for 'com.example.a'"));
}

class IconPromise : public CoordinationFixture {
  protected:
    bool make(InstallPlaceholder* owner, bool forAppInstall) {
        platform_.clearRecording();
        return client_->_createIconPromiseForBundleIdentifier(kA, "/icon.png", 12, owner,
                                                              forAppInstall) != nullptr;
    }
    /// How a promise that the placeholder refuses is given up.
    std::vector<std::string> cancelsWhenRefused(bool forAppInstall) {
        const auto owner = placeholder();
        service().failNext(CoordinationStep::IconPromise, kA, refusal_);
        EXPECT_FALSE(make(owner.get(), forAppInstall));
        return platform_.callsTo({"PathTransferPromise.cancelForReason"});
    }
};

TEST_F(IconPromise, IsKeptFromTheBeginning) {
    const auto owner = placeholder();
    EXPECT_TRUE(make(owner.get(), true));
    EXPECT_EQ(promise("-Icon").client, SyncClientID);
    EXPECT_EQ(promise("-Icon").path, FileURL::fromPath("/icon.png", false));
    EXPECT_EQ(promise("-Icon").diskSpaceNeeded, 12U);
    EXPECT_EQ(promise("-Icon").percent, 1.0);
    EXPECT_TRUE(promise("-Icon").complete);
    EXPECT_EQ(service().placeholder(kA)->icon.get(), &promise("-Icon"));
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("8 default Added icon promise to placeholder for 'com.example.a'"));
}

TEST_F(IconPromise, NeedsAPlaceholder) {
    EXPECT_FALSE(make(nullptr, true));
    EXPECT_THAT(platform_.lines(),
                ElementsAre("8 error Placeholder to add icon promise is nil for 'com.example.a'"));
}

TEST_F(IconPromise, MayNotBeMade) {
    const auto owner = placeholder();
    service().makeNoneNext(CoordinationObject::PathTransferPromise, std::string(kA) + "-Icon");
    EXPECT_FALSE(make(owner.get(), true));
    EXPECT_THAT(platform_.messages(), IsEmpty());
}

TEST_F(IconPromise, IsCancelledWithCode30WhenAnInstallsPlaceholderRefusesIt) {
    EXPECT_THAT(cancelsWhenRefused(true),
                ElementsAre("PathTransferPromise.cancelForReason(com.example.a-Icon, Error "
                            "Domain=TRError Code=30 \"(null)\", 3)"));
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("8 error Error Error Domain=Coordination Code=7 \"(null)\" adding icon "
                            "promise to placeholder "
                            "for 'com.example.a'"));
}

TEST_F(IconPromise, IsCancelledWithCode29WhenARestoresPlaceholderRefusesIt) {
    EXPECT_THAT(cancelsWhenRefused(false),
                ElementsAre("PathTransferPromise.cancelForReason(com.example.a-Icon, Error "
                            "Domain=TRError Code=29 \"(null)\", 3)"));
}

class UserDataPromise : public CoordinationFixture {};

TEST_F(UserDataPromise, IsKeptFromTheBeginning) {
    EXPECT_NE(client_->_userDataPromiseForBundleIdentifier(kA), nullptr);
    EXPECT_EQ(promise("-UserData").client, SyncClientID);
    EXPECT_EQ(promise("-UserData").diskSpaceNeeded, 0U);
    EXPECT_EQ(promise("-UserData").percent, 1.0);
    EXPECT_TRUE(promise("-UserData").complete);
    EXPECT_THAT(platform_.messages(), IsEmpty());
}

TEST_F(UserDataPromise, MayNotBeMade) {
    service().makeNoneNext(CoordinationObject::OutOfBandPromise, std::string(kA) + "-UserData");
    EXPECT_EQ(client_->_userDataPromiseForBundleIdentifier(kA), nullptr);
}

}  // namespace
}  // namespace appsync
