#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "contract/DeviceContract.h"
#include "contract/suites/Applications.h"

namespace appsync {
namespace {

using namespace std::chrono_literals;

/// Keeps the reports that it hears; the test waits for those that it expects.
class ReportKeeper : public AppRegistryObserver {
  public:
    using Identifiers = std::vector<std::string>;

    explicit ReportKeeper(WorkQueues& queues)
        : lock_(queues.makeLock()),
          heard_(queues.makeSemaphore(0)),
          heardOfCancels_(queues.makeSemaphore(0)) {}

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
    void applicationInstallsDidCancel(const std::vector<AppProxy>& cancelled) override {
        {
            const std::lock_guard<Lock> held(*lock_);
            cancelled_ = identifiersOf(cancelled);
        }
        heardOfCancels_->signal();
    }

    /// Returns once a report has said this; never when none does.
    void waitFor(const Identifiers& prioritized, const Identifiers& paused) {
        while (!says(prioritized, paused)) EXPECT_TRUE(heard_->wait());
    }
    /// Returns when it was told of cancels.
    void waitForCancels() { EXPECT_TRUE(heardOfCancels_->wait()); }
    [[nodiscard]] Identifiers cancelled() {
        const std::lock_guard<Lock> held(*lock_);
        return cancelled_;
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
    const std::unique_ptr<Semaphore> heardOfCancels_;
    // Protected by lock_.
    Identifiers prioritized_;
    Identifiers paused_;
    Identifiers cancelled_;
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

TEST_P(RegistryObserverContract, AnObserverMayBeRemovedAgain) {
    checks("platform/AppRegistry.h",
           "Nothing happens where it observes no more: it may be removed twice.");
    const auto removed = observe();
    const auto other = observe();
    registry_.removeObserver(removed.get());
    registry_.removeObserver(removed.get());
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    other->waitFor({kA}, {});
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

TEST_P(RegistryObserverContract, TheFirstReportComesOnce) {
    checks("platform/AppRegistry.h",
           "Comes once soon after the observer was added, also when both lists are empty,");
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    const auto keeper = observe();
    keeper->waitFor({kA}, {});
    pause(services_.queues, 20ms);
    EXPECT_EQ(keeper->reports(), 1);
    registry_.removeObserver(keeper.get());
}

/// Takes a lock when it is called.
class LockingObserver : public AppRegistryObserver {
  public:
    explicit LockingObserver(WorkQueues& queues)
        : lock_(queues.makeLock()), called_(queues.makeSemaphore(0)) {}

    void applicationInstallsArePrioritized(const std::vector<AppProxy>&,
                                           const std::vector<AppProxy>&) override {
        { const std::lock_guard<Lock> held(*lock_); }
        called_->signal();
    }
    void applicationInstallsDidCancel(const std::vector<AppProxy>&) override {}

    [[nodiscard]] Lock& lock() { return *lock_; }
    void waitForOne() { EXPECT_TRUE(called_->wait()); }

  private:
    const std::unique_ptr<Lock> lock_;
    const std::unique_ptr<Semaphore> called_;
};

// Were it called on this thread it could never take the lock.
TEST_P(RegistryObserverContract, AnObserverIsNotCalledOnTheThreadThatAddsIt) {
    checks("platform/AppRegistry.h",
           "never on the thread that added it before `addObserver` has returned;");
    const auto observer = std::make_shared<LockingObserver>(services_.queues);
    {
        const std::lock_guard<Lock> held(observer->lock());
        registry_.addObserver(observer);
    }
    observer->waitForOne();
    registry_.removeObserver(observer.get());
}

/// While it is being told something, has somebody else ask the registry, and waits for the answer.
class DelegatingObserver : public AppRegistryObserver {
  public:
    DelegatingObserver(AppRegistry& registry, WorkQueues& queues)
        : registry_(registry),
          answered_(queues.makeSemaphore(0)),
          done_(queues.makeSemaphore(0)),
          operations_(queues.makeOperationQueue()) {}

    void applicationInstallsArePrioritized(const std::vector<AppProxy>&,
                                           const std::vector<AppProxy>&) override {
        operations_->add([this] {
            isThere_ = registry_.isApplicationInstalled(kA);
            answered_->signal();
        });
        EXPECT_TRUE(answered_->wait());
        done_->signal();
    }
    void applicationInstallsDidCancel(const std::vector<AppProxy>&) override {}

    [[nodiscard]] bool wasAnswered() {
        EXPECT_TRUE(done_->wait());
        return isThere_;
    }

  private:
    AppRegistry& registry_;
    const std::unique_ptr<Semaphore> answered_;
    const std::unique_ptr<Semaphore> done_;
    std::atomic<bool> isThere_ = false;
    const std::unique_ptr<OperationQueue> operations_;
};

TEST_P(RegistryObserverContract, NoLockIsHeldWhileAnObserverIsCalled) {
    checks("platform/AppRegistry.h",
           "It may call the registry and remove itself meanwhile, so a registry holds no lock "
           "when it calls.");
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    const auto observer = std::make_shared<DelegatingObserver>(registry_, services_.queues);
    registry_.addObserver(observer);
    EXPECT_TRUE(observer->wasAnswered());
    registry_.removeObserver(observer.get());
}

TEST_P(RegistryObserverContract, WhatHasFailedIsNotUnderWay) {
    checks("platform/AppRegistry.h",
           "An install is under way from the moment when its placeholder stands until its "
           "package is installed, has failed or was cancelled, or the placeholder is gone.");
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    ASSERT_TRUE(installPlaceholder({kB}, kInstallTypeSync));
    const auto keeper = observe();
    keeper->waitFor({kA, kB}, {});
    EXPECT_FALSE(installFrom(device_->addPackage({kB}), kA));
    keeper->waitFor({kB}, {});
    progress(kB)->cancel();
    keeper->waitFor({}, {});
    registry_.removeObserver(keeper.get());
}

class RegistryObserverCancelContract : public RegistryObserverContract {};

APPSYNC_CONTRACT_SUITE(RegistryObserverCancelContract,
                       devicePorts({OptionalService::CancelByPerson}));

TEST_P(RegistryObserverCancelContract, WhatAPersonCancelsIsTold) {
    checks("platform/AppRegistry.h",
           "`applicationInstallsDidCancel:`: somebody on the device cancelled these installs.");
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    ASSERT_TRUE(installPlaceholder({kB}, kInstallTypeSync));
    const auto keeper = observe();
    keeper->waitFor({kA, kB}, {});
    if (!device_->cancelAsPerson(kA)) {
        registry_.removeObserver(keeper.get());
        GTEST_SKIP() << "nobody on this device cancels an install";
    }
    keeper->waitForCancels();
    EXPECT_EQ(keeper->cancelled(), ReportKeeper::Identifiers{kA});
    registry_.removeObserver(keeper.get());
}

}  // namespace

void linkRegistryObserverContract() {}

}  // namespace appsync
