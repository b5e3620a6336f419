#include <random>

#include "tests/client/AppsClientFixture.h"

namespace appsync {
namespace {

using testing::IsEmpty;
using Access = AppsClientTestAccess;

constexpr int kApplications = 10;

std::string identifierOf(int number) { return "com.example.app" + std::to_string(number); }

/// What becomes of an application in a session.
enum class Fate { Installs, IsRefused, LosesItsTransfer, IsCancelled };

/// Whole sessions in which the host and the threads of the coordination service take turns at every
/// call across platform/, in an order that the seed decides; the seed also decides each fate.
class CoordinatedInterleaving : public AppsClientFixture, public testing::WithParamInterface<int> {
  protected:
    CoordinatedInterleaving()
        : AppsClientFixture(Scheduling::seeded(static_cast<std::uint64_t>(GetParam()))),
          random_(static_cast<unsigned>(GetParam())) {
        makeCoordinatedClient();
        client_->setupInstallCoordinatorObserver();
        PropertyList list = PropertyList::array();
        for (int i = 0; i < kApplications; ++i) {
            list.append(todoEntry(identifierOf(i), "install"));
            if (random_() % 2 == 0) platform_.registry.addApplication(identifierOf(i), "0.9");
            fates_.push_back(static_cast<Fate>(random_() % 4));
        }
        setTodoList(list);
    }
    [[nodiscard]] Fate fateOf(const std::string& identifier) const {
        return fates_.at(static_cast<std::size_t>(std::stoi(identifier.substr(15))));
    }
    void run() {
        const std::vector<SyncAssetPointer> assets = client_->outstandingAssetTransfers();
        EXPECT_EQ(assets.size(), static_cast<std::size_t>(kApplications));
        for (const SyncAssetPointer& asset : assets) decree(asset->identifier);
        for (const SyncAssetPointer& asset : assets) transfer(asset);
        client_->assetTransferEndedWithSuccess(true);
        platform_.runUntilIdle();
    }
    void decree(const std::string& identifier) {
        const ErrorRecord reason = ErrorRecord::make(kInstallerErrorDomain, 1, "refused");
        if (fateOf(identifier) == Fate::IsRefused) {
            platform_.registry.failNextInstall(identifier, reason);
        } else if (fateOf(identifier) == Fate::IsCancelled) {
            platform_.coordination.cancel(identifier, reason, AppStoreClientID);
        }
    }
    void transfer(const SyncAssetPointer& asset) {
        client_->assetTransferUpdatedProgress(asset, 0.5);
        if (fateOf(asset->identifier) == Fate::LosesItsTransfer) {
            // What is not on the device is not given up, so its placeholder must stand first.
            platform_.runUntilIdle();
            client_->assetTransferSucceeded(asset, false, nullptr);
            return;
        }
        asset->path = packagePath(asset->identifier);
        platform_.files.addFile(*asset->path, "package");
        client_->assetTransferSucceeded(asset, true, nullptr);
    }
    [[nodiscard]] std::string expectedOperation(const std::string& identifier) const {
        switch (fateOf(identifier)) {
            case Fate::Installs:
                return "INSTALLED";
            case Fate::IsRefused:
                return "FAILED";
            case Fate::LosesItsTransfer:
                return "install";
            case Fate::IsCancelled:
                return "DOWNLOADED";
        }
        return {};
    }

    std::mt19937 random_;
    std::vector<Fate> fates_;
};

TEST_P(CoordinatedInterleaving, EveryOutcomeReachesTheTodoList) {
    run();
    for (int i = 0; i < kApplications; ++i) {
        EXPECT_EQ(operationOf(identifierOf(i)), expectedOperation(identifierOf(i))) << i;
    }
}

TEST_P(CoordinatedInterleaving, NoCoordinatorAndNoPlaceholderIsLeft) {
    run();
    EXPECT_THAT(platform_.coordination.identifiers(), IsEmpty());
    EXPECT_THAT(platform_.registry.placeholderIdentifiers(), IsEmpty());
    EXPECT_THAT(Access::outstandingHFTTransfers(*client_), IsEmpty());
}

TEST_P(CoordinatedInterleaving, AClientThatIsLetGoLeavesItsInstallsToTheService) {
    const std::vector<SyncAssetPointer> assets = client_->outstandingAssetTransfers();
    for (const SyncAssetPointer& asset : assets) decree(asset->identifier);
    for (const SyncAssetPointer& asset : assets) transfer(asset);
    client_.reset();
    platform_.runUntilIdle();
    EXPECT_THAT(platform_.coordination.identifiers(), IsEmpty());
    EXPECT_THAT(platform_.coordination.appInstallObservers(), IsEmpty());
    EXPECT_EQ(platform_.registry.observers(), 0U);
}

INSTANTIATE_TEST_SUITE_P(Seeds, CoordinatedInterleaving, testing::Range(0, 50));

}  // namespace
}  // namespace appsync
