#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <algorithm>

#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "contract/DeviceContract.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

constexpr const char* kA = "com.example.a";
constexpr const char* kB = "com.example.b";

class InstallProgressContract : public DeviceContract {};

APPSYNC_CONTRACT_SUITE(InstallProgressContract, devicePorts());

TEST_P(InstallProgressContract, OnlyAnInstallUnderWayHasARecord) {
    checks("platform/AppRegistry.h", "null when no install is under way for it.");
    ASSERT_TRUE(installPackage({kA}));
    EXPECT_EQ(progress(kA), nullptr);
    ASSERT_TRUE(installPlaceholder({kB}, kInstallTypeSync));
    EXPECT_NE(progress(kB), nullptr);
}

TEST_P(InstallProgressContract, AnInstallBeginsByLoading) {
    checks("platform/AppRegistry.h",
           "An install begins waiting (0) or active (1), in the phase loading (0), with nothing "
           "completed;");
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    const auto record = progress(kA);
    ASSERT_NE(record, nullptr);
    EXPECT_LT(record->installState(), std::uint64_t{kInstallStatePaused});
    EXPECT_EQ(record->installPhase(), std::uint64_t{kInstallPhaseLoading});
    EXPECT_EQ(record->completedUnitCount(), 0);
}

TEST_P(InstallProgressContract, AChangeIsSeenByEverybodyAtOnce) {
    checks("platform/InstallProgressRecord.h",
           "Every call takes effect at once for everybody who looks.");
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    const auto one = progress(kA);
    const auto other = progress(kA);
    ASSERT_NE(one, nullptr);
    one->setInstallState(kInstallStateActive);
    one->setInstallPhase(kInstallPhaseRestoringData);
    one->setTotalUnitCount(1000);
    one->setCompletedUnitCount(456);
    EXPECT_EQ(other->installState(), std::uint64_t{kInstallStateActive});
    EXPECT_EQ(other->installPhase(), std::uint64_t{kInstallPhaseRestoringData});
    EXPECT_EQ(other->totalUnitCount(), 1000);
    EXPECT_EQ(other->completedUnitCount(), 456);
}

TEST_P(InstallProgressContract, FinishingTheLoadingPhaseBeginsTheInstalling) {
    checks("platform/AppRegistry.h",
           "Ends the install phase that the record is in: loading is over, installing begins.");
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    const auto record = progress(kA);
    ASSERT_NE(record, nullptr);
    registry_.finishInstallPhase(*record);
    EXPECT_EQ(record->installPhase(), std::uint64_t{kInstallPhaseInstalling});
}

TEST_P(InstallProgressContract, CancellingSaysSo) {
    checks("platform/InstallProgressRecord.h",
           "Cancels the install: its state becomes canceled (3).");
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    const auto record = progress(kA);
    ASSERT_NE(record, nullptr);
    record->cancel();
    EXPECT_EQ(record->installState(), std::uint64_t{kInstallStateCanceled});
    EXPECT_TRUE(preferred(kA)->state.placeholder);
}

TEST_P(InstallProgressContract, ARecordHasADescription) {
    checks("platform/InstallProgressRecord.h", "One line for a log.");
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    const std::string description = progress(kA)->description();
    EXPECT_FALSE(description.empty());
    EXPECT_EQ(description.find('\n'), std::string::npos);
}

TEST_P(InstallProgressContract, ARecordWhoseInstallIsOverChangesNothingAnyMore) {
    checks("platform/InstallProgressRecord.h",
           "from then on the record keeps its values and changes nothing any more.");
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    const auto record = progress(kA);
    ASSERT_NE(record, nullptr);
    record->setCompletedUnitCount(456);
    ASSERT_TRUE(registry_.uninstallApplication(kA, {}));
    const std::uint64_t state = record->installState();
    record->setCompletedUnitCount(789);
    record->setInstallState(kInstallStateActive);
    record->cancel();
    EXPECT_EQ(record->completedUnitCount(), 456);
    EXPECT_EQ(record->installState(), state);
}

TEST_P(InstallProgressContract, ANewInstallHasANewRecord) {
    checks("platform/AppRegistry.h",
           "An install begins waiting (0) or active (1), in the phase loading (0), with nothing "
           "completed;");
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    progress(kA)->setCompletedUnitCount(456);
    ASSERT_TRUE(registry_.uninstallApplication(kA, {}));
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    EXPECT_EQ(progress(kA)->completedUnitCount(), 0);
}

TEST_P(InstallProgressContract, ASecondPlaceholderBeginsItsInstallAnew) {
    checks("platform/AppRegistry.h",
           "a placeholder that stands already is replaced, and its install begins anew, with a new "
           "record.");
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    const auto first = progress(kA);
    ASSERT_NE(first, nullptr);
    first->setCompletedUnitCount(456);
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    const auto second = progress(kA);
    ASSERT_NE(second, nullptr);
    EXPECT_EQ(second->completedUnitCount(), 0);
    first->setCompletedUnitCount(789);
    EXPECT_EQ(second->completedUnitCount(), 0);
}

TEST_P(InstallProgressContract, NoInstallIsUnderWayForADemotedApplication) {
    checks("platform/AppRegistry.h",
           "The placeholder of a demoted application (`InstallType` 7, 8) awaits no install.");
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeDowngrade));
    ASSERT_TRUE(installPlaceholder({kB}, kInstallTypeIntentionalDowngrade));
    EXPECT_EQ(progress(kA), nullptr);
    EXPECT_EQ(progress(kB), nullptr);
}

TEST_P(InstallProgressContract, InstallingThePackageEndsTheInstall) {
    checks("platform/InstallProgressRecord.h",
           "When the install ends, the state becomes finished (5), failed (4) or canceled (3);");
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    const auto record = progress(kA);
    ASSERT_NE(record, nullptr);
    ASSERT_TRUE(installPackage({kA}));
    EXPECT_EQ(progress(kA), nullptr);
    EXPECT_EQ(record->installState(), std::uint64_t{kInstallStateFinished});
}

/// Keeps the reports that it hears; the test waits for those that it expects.
class ReportKeeper : public AppRegistryObserver {
  public:
    using Identifiers = std::vector<std::string>;

    explicit ReportKeeper(WorkQueues& queues)
        : lock_(queues.makeLock()), heard_(queues.makeSemaphore(0)) {}

    void applicationInstallsArePrioritized(const std::vector<AppProxy>& prioritized,
                                           const std::vector<AppProxy>& paused) override {
        {
            const std::lock_guard<Lock> held(*lock_);
            prioritized_ = identifiersOf(prioritized);
            paused_ = identifiersOf(paused);
            ++reports_;
        }
        heard_->signal();
    }
    void applicationInstallsDidCancel(const std::vector<AppProxy>&) override {}

    /// Returns once a report has said this; never when none does.
    void waitFor(const Identifiers& prioritized, const Identifiers& paused) {
        while (!says(prioritized, paused)) EXPECT_TRUE(heard_->wait());
    }
    [[nodiscard]] int reports() {
        const std::lock_guard<Lock> held(*lock_);
        return reports_;
    }

  private:
    static Identifiers identifiersOf(const std::vector<AppProxy>& proxies) {
        Identifiers identifiers;
        for (const AppProxy& proxy : proxies) identifiers.push_back(proxy.applicationIdentifier);
        std::sort(identifiers.begin(), identifiers.end());  // they come in no particular order
        return identifiers;
    }
    bool says(const Identifiers& prioritized, const Identifiers& paused) {
        const std::lock_guard<Lock> held(*lock_);
        return reports_ > 0 && prioritized_ == prioritized && paused_ == paused;
    }

    const std::unique_ptr<Lock> lock_;
    const std::unique_ptr<Semaphore> heard_;
    // Protected by lock_.
    Identifiers prioritized_;
    Identifiers paused_;
    int reports_ = 0;
};

class RegistryObserverContract : public DeviceContract {
  protected:
    std::shared_ptr<ReportKeeper> observe() {
        auto keeper = std::make_shared<ReportKeeper>(services_.queues);
        registry_.addObserver(keeper);
        return keeper;
    }
};

APPSYNC_CONTRACT_SUITE(RegistryObserverContract, devicePorts());

TEST_P(RegistryObserverContract, AFirstReportComesEvenWhenNothingIsUnderWay) {
    checks("platform/AppRegistry.h",
           "Comes once soon after the observer was added, also when both lists are empty,");
    const auto keeper = observe();
    keeper->waitFor({}, {});
    EXPECT_EQ(keeper->reports(), 1);
    registry_.removeObserver(keeper.get());
}

TEST_P(RegistryObserverContract, AReportNamesTheInstallsUnderWay) {
    checks("platform/AppRegistry.h",
           "An install is under way from the moment when its placeholder stands until its package "
           "is installed, has failed or was cancelled, or the placeholder is gone.");
    ASSERT_TRUE(installPackage({"com.example.installed"}));
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    ASSERT_TRUE(installPlaceholder({kB}, kInstallTypeSync));
    const auto keeper = observe();
    keeper->waitFor({kA, kB}, {});
    registry_.removeObserver(keeper.get());
}

TEST_P(RegistryObserverContract, PausedInstallsStandInTheirOwnList) {
    checks("platform/AppRegistry.h",
           "the installs under way, in two lists: the paused ones (their record's state is 2), and "
           "all others, in no particular order.");
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    ASSERT_TRUE(installPlaceholder({kB}, kInstallTypeSync));
    progress(kA)->setInstallState(kInstallStatePaused);
    const auto keeper = observe();
    keeper->waitFor({kB}, {kA});
    registry_.removeObserver(keeper.get());
}

TEST_P(RegistryObserverContract, ChangesAreReported) {
    checks("platform/AppRegistry.h",
           "then again whenever the lists change, which several changes may share.");
    const auto keeper = observe();
    keeper->waitFor({}, {});
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    keeper->waitFor({kA}, {});
    progress(kA)->setInstallState(kInstallStatePaused);
    keeper->waitFor({}, {kA});
    ASSERT_TRUE(installPackage({kA}));
    keeper->waitFor({}, {});
    registry_.removeObserver(keeper.get());
}

TEST_P(RegistryObserverContract, EveryObserverGetsItsOwnFirstReport) {
    checks("platform/AppRegistry.h",
           "Comes once soon after the observer was added, also when both lists are empty,");
    const auto first = observe();
    first->waitFor({}, {});
    const auto second = observe();
    second->waitFor({}, {});
    registry_.removeObserver(first.get());
    registry_.removeObserver(second.get());
}

TEST_P(RegistryObserverContract, ARemovedObserverHearsNoMore) {
    checks("platform/AppRegistry.h", "No call begins after this one has returned.");
    const auto removed = observe();
    removed->waitFor({}, {});
    registry_.removeObserver(removed.get());
    const int before = removed->reports();
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    const auto other = observe();
    other->waitFor({kA}, {});
    EXPECT_EQ(removed->reports(), before);
    registry_.removeObserver(other.get());
}

/// Asks the registry, and leaves it, while it is being told something.
class AskingObserver : public AppRegistryObserver {
  public:
    AskingObserver(AppRegistry& registry, Semaphore& done) : registry_(registry), done_(done) {}

    void applicationInstallsArePrioritized(const std::vector<AppProxy>&,
                                           const std::vector<AppProxy>&) override {
        const auto proxy = registry_.proxyForIdentifier(kA, AppRegistry::Placeholders::Included);
        if (proxy) record_ = registry_.installProgress(*proxy, kWholeInstall);
        registry_.removeObserver(this);
        done_.signal();
    }
    void applicationInstallsDidCancel(const std::vector<AppProxy>&) override {}

    [[nodiscard]] bool foundARecord() const { return record_ != nullptr; }

  private:
    AppRegistry& registry_;
    Semaphore& done_;
    std::shared_ptr<InstallProgressRecord> record_;
};

TEST_P(RegistryObserverContract, AnObserverMayAskAndLeaveWhileItIsTold) {
    checks("platform/AppRegistry.h",
           "It may call the registry and remove itself meanwhile, so a registry holds no lock when "
           "it calls.");
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    const auto done = services_.queues.makeSemaphore(0);
    const auto observer = std::make_shared<AskingObserver>(registry_, *done);
    registry_.addObserver(observer);
    ASSERT_TRUE(done->wait());
    EXPECT_TRUE(observer->foundARecord());
}

/// Removes itself when it is destroyed.
class SelfRemovingObserver : public ReportKeeper {
  public:
    SelfRemovingObserver(AppRegistry& registry, WorkQueues& queues, Semaphore& destroyed)
        : ReportKeeper(queues), registry_(registry), destroyed_(destroyed) {}
    ~SelfRemovingObserver() override {
        registry_.removeObserver(this);
        destroyed_.signal();
    }

  private:
    AppRegistry& registry_;
    Semaphore& destroyed_;
};

TEST_P(RegistryObserverContract, AnObserverIsNotKeptAliveAndMayRemoveItselfAtItsEnd) {
    checks("platform/AppRegistry.h",
           "Known by its address: it may be called from the observer's destructor.");
    const auto destroyed = services_.queues.makeSemaphore(0);
    auto observer = std::make_shared<SelfRemovingObserver>(registry_, services_.queues, *destroyed);
    registry_.addObserver(observer);
    observer.reset();
    EXPECT_TRUE(destroyed->wait());
}

}  // namespace

void linkInstallProgressContract() {}

}  // namespace appsync
