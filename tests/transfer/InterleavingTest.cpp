#include <chrono>
#include <random>

#include "tests/client/AppsClientFixture.h"

namespace appsync {
namespace {

using testing::IsEmpty;
using Access = AppsClientTestAccess;

constexpr int kApplications = 10;

std::string identifierOf(int number) { return "com.example.app" + std::to_string(number); }

/// Tasks take turns at every call across platform/, in an order that the seed decides.
class Interleaving : public AppsClientFixture, public testing::WithParamInterface<int> {
  protected:
    Interleaving() : AppsClientFixture(Scheduling::seeded(static_cast<std::uint64_t>(GetParam()))) {
        PropertyList list = PropertyList::array();
        for (int i = 0; i < kApplications; ++i) list.append(todoEntry(identifierOf(i), "install"));
        setTodoList(list);
        for (int i = 0; i < kApplications; ++i) {
            platform_.registry.addPlaceholder(identifierOf(i), kInstallTypeSync);
        }
    }
    void transferAll() {
        for (int i = 0; i < kApplications; ++i) {
            const SyncAssetPointer asset = receivedAsset(identifierOf(i));
            client_->assetTransferUpdatedProgress(asset, 1.0);
            client_->assetTransferSucceeded(asset, true, nullptr);
        }
    }
    void refuse(const std::string& identifier) {
        platform_.registry.failNextInstall(identifier,
                                           ErrorRecord::make(kInstallerErrorDomain, 1, "refused"));
    }
    void expectNothingIsLeft() {
        EXPECT_THAT(platform_.homeScreen.heldAssertions(), IsEmpty());
        EXPECT_THAT(Access::outstandingHFTTransfers(*client_), IsEmpty());
        EXPECT_FALSE(platform_.files.exists(std::string(kRestoreStatePath)));
        for (int i = 0; i < kApplications; ++i) {
            EXPECT_FALSE(platform_.files.exists(packagePath(identifierOf(i))));
        }
        client_.reset();
        platform_.runUntilIdle();
        EXPECT_EQ(platform_.registry.observers(), 0U);
    }
};

TEST_P(Interleaving, TenInstallsThatFinishAtOnceLoseNoEditOfTheTodoList) {
    transferAll();
    client_->assetTransferEndedWithSuccess(true);
    for (int i = 0; i < kApplications; ++i) {
        EXPECT_EQ(operationOf(identifierOf(i)), "INSTALLED") << i;
    }
    expectNothingIsLeft();
}

TEST_P(Interleaving, EveryOutcomeReachesTheTodoList) {
    std::mt19937 random(static_cast<unsigned>(GetParam()));
    std::vector<const char*> expected;
    for (int i = 0; i < kApplications; ++i) {
        const std::string identifier = identifierOf(i);
        platform_.homeScreen.scriptTermination(identifier,
                                               std::vector<int>(random() % 3, 1 /* denied */));
        const bool refused = random() % 2 == 0;
        if (refused) refuse(identifier);
        expected.push_back(refused ? "FAILED" : "INSTALLED");
    }
    transferAll();
    client_->assetTransferEndedWithSuccess(true);
    for (int i = 0; i < kApplications; ++i) {
        EXPECT_EQ(operationOf(identifierOf(i)), expected[static_cast<std::size_t>(i)]) << i;
    }
    expectNothingIsLeft();
}

TEST_P(Interleaving, RestoreStatesOfOtherApplicationsAreKept) {
    const std::string version = "1.0";
    for (int i = 0; i < kApplications; ++i) {
        client_->_enqueueAssetInstall(receivedAsset(identifierOf(i)));
        client_->_setRestoreStatePropertyValue("/kept", "path", "kept" + std::to_string(i),
                                               &version);
    }
    client_->assetTransferEndedWithSuccess(true);
    for (int i = 0; i < kApplications; ++i) {
        EXPECT_TRUE(
            client_->_restoreStatePropertyForKey("path", "kept" + std::to_string(i), &version))
            << i;
    }
}

TEST_P(Interleaving, CancelledRestoresMeetTheTransfersOfTheHost) {
    for (int i = 0; i < kApplications; ++i) {
        platform_.registry.addPlaceholder("restore" + std::to_string(i), kInstallTypeRestore);
        client_->assetTransferUpdatedProgress(receivedAsset("restore" + std::to_string(i)), 0.5);
        platform_.registry.cancelInstalls({"restore" + std::to_string(i)});
    }
    transferAll();
    platform_.runUntilIdle();
    client_->assetTransferEndedWithSuccess(true);
    EXPECT_THAT(Access::outstandingHFTTransfers(*client_), IsEmpty());
    for (int i = 0; i < kApplications; ++i) {
        EXPECT_EQ(operationOf(identifierOf(i)), "INSTALLED") << i;
    }
}

TEST_P(Interleaving, AClientThatIsLetGoFinishesItsInstalls) {
    transferAll();
    client_.reset();
    platform_.advance(std::chrono::minutes(1));
    for (int i = 0; i < kApplications; ++i) {
        EXPECT_EQ(operationOf(identifierOf(i)), "INSTALLED") << i;
    }
    EXPECT_EQ(platform_.registry.observers(), 0U);
}

TEST_P(Interleaving, ANewSessionIsNotOverwrittenByInstallsOfTheLast) {
    const auto next = PropertyList::array({todoEntry("com.example.next", "install")});
    transferAll();
    stage(next);
    EXPECT_TRUE(client_->reconcileSync({}, "anchor", {}, nullptr));
    client_->assetTransferEndedWithSuccess(true);
    EXPECT_EQ(platform_.propertyListAt(std::string(kTodoListPath)), next);
}

INSTANTIATE_TEST_SUITE_P(Seeds, Interleaving, testing::Range(0, 50));

}  // namespace
}  // namespace appsync
