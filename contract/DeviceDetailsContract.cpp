#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <memory>
#include <mutex>
#include <set>
#include <string>
#include <vector>

#include "contract/DeviceContract.h"
#include "contract/Sentence.h"

namespace appsync {

void linkDeviceDetailsContract() {}

namespace {

using testing::ElementsAre;

constexpr const char* kA = "com.example.a";
constexpr const char* kB = "com.example.b";

class BackupDetailsContract : public DeviceContract {};

APPSYNC_CONTRACT_SUITE(BackupDetailsContract, devicePorts({OptionalService::Backup}));

TEST_P(BackupDetailsContract, OneRestoreIsGivenUpAndTheOthersAreNot) {
    checks("platform/BackupService.h", "Gives the application's restore up.");
    device_->addRestoreData(kA);
    device_->addRestoreData(kB);
    const auto manager = services_.backup.makeManager();
    EXPECT_TRUE(manager->restoreDataExists(kA));
    EXPECT_TRUE(manager->restoreDataExists(kB));
    manager->cancelApplicationRestore(kA);
    EXPECT_FALSE(manager->restoreDataExists(kA));
    EXPECT_TRUE(manager->restoreDataExists(kB));
}

class CoordinationDetailsContract : public DeviceContract {};

APPSYNC_CONTRACT_SUITE(CoordinationDetailsContract, devicePorts({OptionalService::Coordination}));

// The completion needs the lock that the caller holds: it would wait for itself.
TEST_P(CoordinationDetailsContract, AnUninstallIsNotCompletedByItsCaller) {
    checks("platform/InstallCoordinatorService.h", "Called on a thread of the service's;");
    ASSERT_TRUE(installPackage({kA}));
    const std::shared_ptr<Lock> lock = services_.queues.makeLock();
    const std::shared_ptr<Semaphore> done = services_.queues.makeSemaphore(0);
    std::vector<std::string> notes;
    {
        const std::lock_guard<Lock> guard(*lock);
        services_.coordination.uninstallApp(kA, [&notes, lock, done](const ErrorRecord* error) {
            {
                const std::lock_guard<Lock> inner(*lock);
                notes.emplace_back(error == nullptr ? "removed" : "not removed");
            }
            done->signal();
        });
        notes.emplace_back("returned");
    }
    EXPECT_TRUE(done->wait());
    EXPECT_THAT(notes, ElementsAre("returned", "removed"));
}

}  // namespace
}  // namespace appsync
