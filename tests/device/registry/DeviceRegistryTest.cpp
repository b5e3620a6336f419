#include <condition_variable>
#include <mutex>
#include <thread>

#include "tests/device/DeviceFixture.h"

namespace appsync {
namespace {

std::vector<std::string> identifiersOf(const std::vector<AppProxy>& proxies) {
    std::vector<std::string> identifiers;
    for (const AppProxy& proxy : proxies) identifiers.push_back(proxy.applicationIdentifier);
    return identifiers;
}

/// Keeps the reports that it hears.
class Listener : public AppRegistryObserver {
  public:
    struct Report {
        std::vector<std::string> prioritized;
        std::vector<std::string> paused;
        std::thread::id thread;
    };

    void applicationInstallsArePrioritized(const std::vector<AppProxy>& prioritized,
                                           const std::vector<AppProxy>& paused) override {
        const std::lock_guard lock(mutex_);
        reports_.push_back(
            {identifiersOf(prioritized), identifiersOf(paused), std::this_thread::get_id()});
        heard_.notify_all();
    }
    void applicationInstallsDidCancel(const std::vector<AppProxy>& /*cancelled*/) override {}

    /// Waits for the report of that number, from 0.
    Report report(std::size_t number) {
        std::unique_lock lock(mutex_);
        heard_.wait(lock, [&] { return reports_.size() > number; });
        return reports_[number];
    }
    std::size_t count() {
        const std::lock_guard lock(mutex_);
        return reports_.size();
    }

  private:
    std::mutex mutex_;
    std::condition_variable heard_;
    std::vector<Report> reports_;
};

class DeviceRegistryTest : public DeviceFixture {
  protected:
    /// "identifier" or "identifier (placeholder)" of every bundle of the type.
    std::vector<std::string> bundles(AppRegistry::BundleType type) {
        std::vector<std::string> names;
        device().registry().enumerateBundles(type, [&](const AppProxy& proxy, bool&) {
            names.push_back(proxy.applicationIdentifier +
                            (proxy.state.placeholder ? " (placeholder)" : ""));
        });
        return names;
    }
    std::shared_ptr<Listener> listen() {
        auto listener = std::make_shared<Listener>();
        device().registry().addObserver(listener);
        return listener;
    }
};

TEST_F(DeviceRegistryTest, aLookUpPrefersThePlaceholderWhereItMayAnswerWithOne) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    EXPECT_TRUE(either(kAtlas)->state.installed);
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    EXPECT_TRUE(either(kAtlas)->state.placeholder);
    EXPECT_TRUE(application(kAtlas)->state.installed);
    ASSERT_TRUE(succeeded(installPlaceholder(kBrook)));
    EXPECT_FALSE(application(kBrook));
}

TEST_F(DeviceRegistryTest, anythingUnderTheIdentifierCountsAsInstalled) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    ASSERT_TRUE(succeeded(installPlaceholder(kBrook)));
    EXPECT_TRUE(device().registry().isApplicationInstalled(kAtlas));
    EXPECT_TRUE(device().registry().isApplicationInstalled(kBrook));
    EXPECT_FALSE(device().registry().isApplicationInstalled(kCrane));
    EXPECT_FALSE(device().registry().isApplicationInstalled("../etc"));
}

TEST_F(DeviceRegistryTest, bothRecordsOfAnUpdateAreEnumerated) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    ASSERT_TRUE(succeeded(install(kBrook)));
    const std::vector<std::string> all = {kAtlas, kBrook, std::string(kAtlas) + " (placeholder)"};
    EXPECT_EQ(bundles(AppRegistry::kEveryBundle), all);
    EXPECT_EQ(bundles(AppRegistry::kUserBundles), all);
    EXPECT_TRUE(bundles(AppRegistry::kSystemBundles).empty());
}

TEST_F(DeviceRegistryTest, systemApplicationsAndTheirPlaceholdersAreATypeOfTheirOwn) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    ASSERT_TRUE(succeeded(install(kBrook)));
    sql("UPDATE applications SET type = 'System' WHERE identifier = 'com.example.atlas'");
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    const std::vector<std::string> system = {kAtlas, std::string(kAtlas) + " (placeholder)"};
    EXPECT_EQ(bundles(AppRegistry::kSystemBundles), system);
    EXPECT_EQ(bundles(AppRegistry::kUserBundles), std::vector<std::string>{kBrook});
}

TEST_F(DeviceRegistryTest, theCallbackMayStopTheWalkAndCallTheRegistry) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    ASSERT_TRUE(succeeded(install(kBrook)));
    int calls = 0;
    device().registry().enumerateBundles(
        AppRegistry::kEveryBundle, [&](const AppProxy& proxy, bool& stop) {
            ++calls;
            stop = true;
            EXPECT_TRUE(succeeded(
                device().registry().uninstallApplication(proxy.applicationIdentifier, {})));
        });
    EXPECT_EQ(calls, 1);
    EXPECT_EQ(bundles(AppRegistry::kEveryBundle), std::vector<std::string>{kBrook});
}

TEST_F(DeviceRegistryTest, progressIsTheSameForEverybodyWhoLooks) {
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    progressOf(kAtlas)->setInstallState(kInstallStateActive);
    progressOf(kAtlas)->setCompletedUnitCount(456);
    EXPECT_EQ(progressOf(kAtlas)->installState(), kInstallStateActive);
    EXPECT_EQ(progressOf(kAtlas)->completedUnitCount(), 456);
    EXPECT_EQ(device().installProgress(kAtlas)->completedUnits, 456);
    EXPECT_NE(progressOf(kAtlas)->description().find("456 of 1000"), std::string::npos);
}

TEST_F(DeviceRegistryTest, progressReachesTheDatabase) {
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    progressOf(kAtlas)->setCompletedUnitCount(456);
    EXPECT_EQ(device().applications()->at(0).progress->completedUnits, 456);
    EXPECT_EQ(look()->installProgress(kAtlas)->completedUnits, 456);
}

TEST_F(DeviceRegistryTest, finishingAPhaseGoesOnToTheNext) {
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    const auto record = progressOf(kAtlas);
    device().registry().finishInstallPhase(*record);
    EXPECT_EQ(record->installPhase(), kInstallPhaseInstalling);
    record->setInstallPhase(kInstallPhaseRestoringData);
    device().registry().finishInstallPhase(*record);
    EXPECT_EQ(record->installPhase(), kInstallPhaseInstalling);
    device().registry().finishInstallPhase(*record);
    EXPECT_EQ(record->installState(), kInstallStateFinished);
}

TEST_F(DeviceRegistryTest, aFinishedInstallLeavesItsRecordBehind) {
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    const auto record = progressOf(kAtlas);
    record->setCompletedUnitCount(1000);
    ASSERT_TRUE(succeeded(install(kAtlas)));
    EXPECT_EQ(record->installState(), kInstallStateFinished);
    record->setInstallState(kInstallStatePaused);
    EXPECT_EQ(record->installState(), kInstallStateFinished);
    EXPECT_EQ(record->completedUnitCount(), 1000);
}

TEST_F(DeviceRegistryTest, aRecordOutlivesTheDevice) {
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    const auto record = progressOf(kAtlas);
    record->setCompletedUnitCount(7);
    close();
    record->setCompletedUnitCount(8);
    EXPECT_EQ(record->completedUnitCount(), 7);
    EXPECT_EQ(progressOf(kAtlas)->completedUnitCount(), 7);
}

TEST_F(DeviceRegistryTest, theFractionGoesFromTheTransferToTheUnpacking) {
    InstallProgress progress;
    progress.totalUnits = 1000;
    EXPECT_EQ(progress.fraction(), 0);
    progress.completedUnits = 1000;
    EXPECT_EQ(progress.fraction(), 0.5);
    progress.phase = kInstallPhaseInstalling;
    EXPECT_EQ(progress.fraction(), 0.5);
    progress.unpacked = 1;
    EXPECT_EQ(progress.fraction(), 1);
    progress.completedUnits = 5000;
    EXPECT_EQ(progress.fraction(), 1);
}

TEST_F(DeviceRegistryTest, anObserverHearsSoonAfterItWasAddedOnAThreadOfTheRegistry) {
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    ASSERT_TRUE(succeeded(installPlaceholder(kBrook)));
    progressOf(kBrook)->setInstallState(kInstallStatePaused);
    const auto listener = listen();
    const Listener::Report report = listener->report(0);
    EXPECT_EQ(report.prioritized, std::vector<std::string>{kAtlas});
    EXPECT_EQ(report.paused, std::vector<std::string>{kBrook});
    EXPECT_NE(report.thread, std::this_thread::get_id());
    device().registry().removeObserver(listener.get());
}

TEST_F(DeviceRegistryTest, anObserverHearsEvenWhenNothingIsUnderWay) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    EXPECT_TRUE(listen()->report(0).prioritized.empty());
}

TEST_F(DeviceRegistryTest, everyObserverHearsAgainWhenTheListsChange) {
    const auto first = listen();
    const auto second = listen();
    static_cast<void>(first->report(0));
    static_cast<void>(second->report(0));
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    EXPECT_EQ(first->report(1).prioritized, std::vector<std::string>{kAtlas});
    EXPECT_EQ(second->report(1).prioritized, std::vector<std::string>{kAtlas});
    progressOf(kAtlas)->cancel();
    EXPECT_TRUE(first->report(2).prioritized.empty());
}

TEST_F(DeviceRegistryTest, aRemovedObserverHearsNoMore) {
    const auto removed = listen();
    static_cast<void>(removed->report(0));
    device().registry().removeObserver(removed.get());
    const auto other = listen();
    static_cast<void>(other->report(0));
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    static_cast<void>(other->report(1));
    EXPECT_EQ(removed->count(), 1U);
}

TEST_F(DeviceRegistryTest, anObserverMayRemoveItselfInItsDestructor) {
    class Leaving : public Listener {
      public:
        explicit Leaving(AppRegistry& registry) : registry_(registry) {}
        ~Leaving() override { registry_.removeObserver(this); }

      private:
        AppRegistry& registry_;
    };
    for (int round = 0; round < 50; ++round) {
        device().registry().addObserver(std::make_shared<Leaving>(device().registry()));
        auto leaving = std::make_shared<Leaving>(device().registry());
        device().registry().addObserver(leaving);
    }
    EXPECT_TRUE(listen()->report(0).prioritized.empty());
}

}  // namespace
}  // namespace appsync
