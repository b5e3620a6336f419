#include <gtest/gtest.h>

#include <chrono>
#include <memory>
#include <mutex>
#include <set>
#include <string>
#include <thread>
#include <vector>

#include "contract/DeviceContract.h"
#include "contract/Sentence.h"
#include "contract/suites/Applications.h"

namespace appsync {

void linkRegistryDetailsContract() {}

namespace {

class AppRegistryDetailsContract : public DeviceContract {};

APPSYNC_CONTRACT_SUITE(AppRegistryDetailsContract, devicePorts());

TEST_P(AppRegistryDetailsContract, AWalkGoesOnTheCallersThread) {
    checks("platform/AppRegistry.h",
           "Calls back, on the calling thread and before it returns, once for each record of the "
           "type, in no particular order.");
    ASSERT_TRUE(installPackage({kA}));
    const auto caller = std::this_thread::get_id();
    registry_.enumerateBundles(AppRegistry::kEveryBundle, [&](const AppProxy&, bool&) {
        EXPECT_EQ(std::this_thread::get_id(), caller);
    });
}

TEST_P(AppRegistryDetailsContract, APlaceholderOfAnotherPackageTypeIsRefused) {
    checks("platform/AppRegistry.h",
           "`options` is a map: `PackageTypeKey` = `PackageTypePlaceholder` (any other is "
           "refused), `BundleIdentifierKey`, `InstallTypeKey`, and optionally `StoreMetadataKey` "
           "and `AppSinfKey`.");
    const FileURL bundle = FileURL::fromPath(addPlaceholderBundle({kA}), true).value();
    PropertyList options = placeholderOptions(kA, kInstallTypeSync);
    options.set(PackageTypeKey, PackageTypeCustomer);
    EXPECT_FALSE(registry_.installPlaceholderBundle(bundle, options));
    EXPECT_FALSE(registry_.installPlaceholderBundle(bundle, {}));
    EXPECT_FALSE(registry_.isApplicationInstalled(kA));
}

TEST_P(AppRegistryDetailsContract, ACoveredApplicationAndItsPlaceholderHaveStatesOfTheirOwn) {
    checks("platform/AppRegistry.h",
           "That of a placeholder is never `installed`, also where it covers an installed "
           "application.");
    ASSERT_TRUE(installPackage({kA}));
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    int installed = 0;
    int placeholders = 0;
    registry_.enumerateBundles(AppRegistry::kEveryBundle, [&](const AppProxy& proxy, bool&) {
        EXPECT_NE(proxy.state.installed, proxy.state.placeholder);
        ++(proxy.state.installed ? installed : placeholders);
    });
    EXPECT_EQ(installed, 1);
    EXPECT_EQ(placeholders, 1);
}

class InstallProgressDetailsContract : public DeviceContract {};

APPSYNC_CONTRACT_SUITE(InstallProgressDetailsContract, devicePorts());

TEST_P(InstallProgressDetailsContract, ALookChangesNothing) {
    checks("platform/InstallProgressRecord.h",
           "Every call takes effect at once for everybody who looks.");
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    const auto record = progress(kA);
    ASSERT_NE(record, nullptr);
    record->setTotalUnitCount(1000);
    record->setCompletedUnitCount(456);
    for (int look = 0; look < 3; ++look) EXPECT_EQ(record->completedUnitCount(), 456);
}

TEST_P(InstallProgressDetailsContract, AnInstallThatFailsSaysSo) {
    checks("platform/InstallProgressRecord.h",
           "When the install ends, the state becomes finished (5), failed (4) or canceled (3);");
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    const auto record = progress(kA);
    ASSERT_NE(record, nullptr);
    ASSERT_FALSE(installFrom(device_->addPackage({kB}), kA));
    EXPECT_EQ(record->installState(), std::uint64_t{kInstallStateFailed});
}

/// Keeps whom it has heard of, and whether two reports were there at once.
class KeepingObserver : public AppRegistryObserver {
  public:
    explicit KeepingObserver(WorkQueues& queues)
        : queues_(queues), lock_(queues.makeLock()), heard_(queues.makeSemaphore(0)) {}

    void applicationInstallsArePrioritized(const std::vector<AppProxy>& prioritized,
                                           const std::vector<AppProxy>& paused) override {
        begin();
        {
            const std::lock_guard<Lock> held(*lock_);
            for (const auto* list : {&prioritized, &paused}) {
                for (const AppProxy& proxy : *list) named_.insert(proxy.applicationIdentifier);
            }
        }
        end();
        heard_->signal();
    }
    void applicationInstallsDidCancel(const std::vector<AppProxy>&) override {
        begin();
        end();
    }

    void waitForOne() { EXPECT_TRUE(heard_->wait()); }
    [[nodiscard]] bool heardTwoAtOnce() {
        const std::lock_guard<Lock> held(*lock_);
        return twoAtOnce_;
    }
    [[nodiscard]] bool hasHeardOf(const std::string& identifier) {
        const std::lock_guard<Lock> held(*lock_);
        return named_.contains(identifier);
    }

  private:
    void begin() {
        {
            const std::lock_guard<Lock> held(*lock_);
            twoAtOnce_ = twoAtOnce_ || inside_;
            inside_ = true;
        }
        // Others that would come now have the time to.
        const auto nobody = queues_.makeWaitGroup();
        nobody->enter();
        EXPECT_FALSE(nobody->waitFor(std::chrono::milliseconds(5)));
        nobody->leave();
    }
    void end() {
        const std::lock_guard<Lock> held(*lock_);
        inside_ = false;
    }

    WorkQueues& queues_;
    const std::unique_ptr<Lock> lock_;
    const std::unique_ptr<Semaphore> heard_;
    // Protected by lock_.
    std::set<std::string> named_;
    bool inside_ = false;
    bool twoAtOnce_ = false;
};

class RegistryObserverDetailsContract : public DeviceContract {
  protected:
    std::shared_ptr<KeepingObserver> observe() {
        auto observer = std::make_shared<KeepingObserver>(services_.queues);
        registry_.addObserver(observer);
        return observer;
    }
};

APPSYNC_CONTRACT_SUITE(RegistryObserverDetailsContract, devicePorts());

TEST_P(RegistryObserverDetailsContract, NobodyHearsOfDemotedApplications) {
    checks("platform/AppRegistry.h",
           "The placeholder of a demoted application (`InstallType` 7, 8) awaits no install.");
    ASSERT_TRUE(installPlaceholder({"com.example.seven"}, kInstallTypeDowngrade));
    ASSERT_TRUE(installPlaceholder({"com.example.eight"}, kInstallTypeIntentionalDowngrade));
    const auto observer = observe();
    observer->waitForOne();
    registry_.removeObserver(observer.get());
    EXPECT_FALSE(observer->hasHeardOf("com.example.seven"));
    EXPECT_FALSE(observer->hasHeardOf("com.example.eight"));
}

TEST_P(RegistryObserverDetailsContract, OneReportComesAtATime) {
    checks("platform/AppRegistry.h",
           "Hears from the registry, on a thread of the registry's, one call at a time for one "
           "observer.");
    const auto observer = observe();
    for (const char* identifier : {kA, kB, "com.example.c"}) {
        observer->waitForOne();
        ASSERT_TRUE(installPlaceholder({identifier}, kInstallTypeSync));
    }
    observer->waitForOne();
    registry_.removeObserver(observer.get());
    EXPECT_FALSE(observer->heardTwoAtOnce());
}

}  // namespace
}  // namespace appsync
