#include <atomic>
#include <cerrno>
#include <functional>
#include <latch>
#include <thread>

#include "device/database/Database.h"
#include "device/database/DeviceDatabase.h"
#include "device/install/ApplicationInstall.h"
#include "device/install/Containers.h"
#include "device/install/DurabilityBarrier.h"
#include "device/install/InstallContext.h"
#include "device/install/JointCommits.h"
#include "device/install/KeptBundles.h"
#include "device/install/ProgressBook.h"
#include "device/install/recovery/Rollback.h"
#include "device/values/DevicePaths.h"
#include "system/file/PosixError.h"
#include "system/file/RootedFileSystem.h"
#include "system/property_list/PropertyListCodec.h"
#include "tests/device/DeviceFixture.h"

namespace appsync {
namespace {

/// Each of its syncs makes durable what was written when it began.
struct CountingDisk {
    std::atomic<int> written{0};
    std::atomic<int> durable{0};

    int sync() {
        const int seen = written;
        std::this_thread::yield();
        durable = seen;
        return 0;
    }
};

TEST(DurabilityBarrierTest, eachPassIsFollowedByASyncThatBeganAfterIt) {
    CountingDisk disk;
    DurabilityBarrier barrier([&] { return disk.sync(); });
    std::vector<std::thread> threads;
    for (int thread = 0; thread < 8; ++thread) {
        threads.emplace_back([&] {
            for (int round = 0; round < 50; ++round) {
                const int mine = ++disk.written;
                EXPECT_TRUE(succeeded(barrier.pass()));
                EXPECT_GE(disk.durable.load(), mine);
            }
        });
    }
    for (std::thread& thread : threads) thread.join();
    EXPECT_LE(barrier.syncs(), 400U);
}

TEST(DurabilityBarrierTest, whoeverComesDuringASyncWaitsForTheNext) {
    std::latch began(1);
    std::latch mayEnd(1);
    int syncs = 0;
    DurabilityBarrier barrier([&] {
        if (++syncs > 1) return 0;
        began.count_down();
        mayEnd.wait();
        return 0;
    });
    std::thread first([&] { EXPECT_TRUE(succeeded(barrier.pass())); });
    began.wait();
    std::thread second([&] { EXPECT_TRUE(succeeded(barrier.pass())); });
    mayEnd.count_down();
    first.join();
    second.join();
    EXPECT_EQ(barrier.syncs(), 2U);
}

TEST(DurabilityBarrierTest, aFailureIsToldToThoseWhomItConcernsAndNotToLaterOnes) {
    int answer = EIO;
    DurabilityBarrier barrier([&] { return answer; });
    const Status failed = barrier.pass();
    ASSERT_FALSE(failed);
    EXPECT_EQ(failed.error().code, EIO);
    answer = 0;
    EXPECT_TRUE(succeeded(barrier.pass()));
}

/// Installs on a device whose disk fails as a test wants it.
class FailingDiskTest : public DeviceFixture {
  protected:
    using Work = std::function<Status(const InstallContext& context)>;

    Status installWith(DurabilityBarrier& barrier) {
        const std::string package = std::string(kPublicStagingDirectory) + "/package.zip";
        return workWith(barrier, [&](const InstallContext& context) {
            write(package, packageOf(kAtlas, "2.0"));  // the end of a session would clear it
            return installApplication(context, kAtlas, *FileURL::fromPath(package, false), 0);
        });
    }

    Status workWith(DurabilityBarrier& barrier, const Work& work) {
        close();
        auto database = DeviceDatabase::open(devicePath(kDatabaseName));
        auto files = RootedFileSystem::open(rootPath(""), {{}, std::string(kTemporaryDirectory)});
        Containers containers(**files);
        KeptBundles kept(**files, devicePath());
        JointCommits commits(barrier, **database);
        ProgressBook progress(**database, {});
        SystemPropertyLists propertyLists;
        const std::string boot;
        const InstallContext context{**database, **files,  containers,    kept, barrier,
                                     commits,    progress, propertyLists, boot};
        return work(context);
    }
};

/// Changes that come together, on a device whose disk fails as a test wants it.
class JointCommitsTest : public DeviceFixture {
  protected:
    void SetUp() override {
        DeviceFixture::SetUp();
        close();
        auto opened = DeviceDatabase::open(devicePath(kDatabaseName));
        ASSERT_TRUE(opened);
        database_ = std::move(*opened);
    }

    static JointCommits::Change uninstalled(const std::string& identifier) {
        return [identifier](Database& database) {
            return database.query("INSERT INTO uninstalled (identifier, time) VALUES (?, 0)")
                .bind(identifier)
                .run();
        };
    }

    bool isThere(const std::string& identifier) {
        bool found = false;
        const Status read = database_->read([&](Database& database) {
            Query rows = database.query("SELECT 1 FROM uninstalled WHERE identifier = ?");
            rows.bind(identifier);
            found = rows.next();
            return rows.status();
        });
        EXPECT_TRUE(succeeded(read));
        return found;
    }

    std::unique_ptr<DeviceDatabase> database_;
};

TEST_F(JointCommitsTest, eachIsSyncedBeforeItsChangeIsMadeAndIsThereAfterTheCall) {
    CountingDisk disk;
    DurabilityBarrier barrier([&] { return disk.sync(); });
    JointCommits commits(barrier, *database_);
    std::vector<std::thread> threads;
    for (int thread = 0; thread < 8; ++thread) {
        threads.emplace_back([&, thread] {
            for (int round = 0; round < 10; ++round) {
                const std::string name = "t" + std::to_string(thread) + "." + std::to_string(round);
                const int mine = ++disk.written;
                const auto outcome = commits.commit([&](Database& database) {
                    EXPECT_GE(disk.durable.load(), mine);
                    return uninstalled(name)(database);
                });
                EXPECT_TRUE(succeeded(outcome.synced));
                EXPECT_TRUE(succeeded(outcome.committed));
                EXPECT_TRUE(isThere(name));
            }
        });
    }
    for (std::thread& thread : threads) thread.join();
    EXPECT_LE(barrier.syncs(), 80U);
}

TEST_F(JointCommitsTest, withoutASyncNothingChanges) {
    DurabilityBarrier barrier([] { return EIO; });
    JointCommits commits(barrier, *database_);
    const auto outcome = commits.commit(uninstalled(kAtlas));
    ASSERT_FALSE(outcome.synced);
    EXPECT_EQ(outcome.synced.error().code, EIO);
    EXPECT_FALSE(isThere(kAtlas));
}

TEST_F(JointCommitsTest, aChangeThatFailsTakesNoOtherAlong) {
    const DeviceDatabase::Change fails = [](Database& database) {
        const Status made = uninstalled("com.example.lost")(database);
        return made ? Status(posixError(EPERM, "change", "the test's database")) : made;
    };
    const DeviceDatabase::Change works = uninstalled(kAtlas);
    std::vector<DeviceDatabase::Joint> changes;
    changes.push_back({fails, {}});
    changes.push_back({works, {}});
    database_->changeAll(Durability::OnDisk, changes);
    ASSERT_FALSE(changes[0].status);
    EXPECT_EQ(changes[0].status.error().code, EPERM);
    EXPECT_TRUE(succeeded(changes[1].status));
    EXPECT_FALSE(isThere("com.example.lost"));
    EXPECT_TRUE(isThere(kAtlas));
}

TEST_F(FailingDiskTest, afterAFailedSyncTheFilesAreWrittenAnew) {
    ASSERT_TRUE(succeeded(install(kAtlas, "1.0")));
    int syncs = 0;
    DurabilityBarrier barrier([&] { return ++syncs == 1 ? EIO : 0; });
    EXPECT_TRUE(succeeded(installWith(barrier)));
    EXPECT_EQ(syncs, 2);
    EXPECT_EQ(containers().size(), 1U);
    EXPECT_EQ(application(kAtlas)->bundleVersion, "2.0");
}

TEST_F(FailingDiskTest, aDiskThatGoesOnFailingLeavesTheOldVersion) {
    ASSERT_TRUE(succeeded(install(kAtlas, "1.0")));
    const auto before = containers();
    DurabilityBarrier barrier([] { return EIO; });
    const Status status = installWith(barrier);
    ASSERT_FALSE(status);
    EXPECT_EQ(status.error().code, EIO);
    EXPECT_EQ(containers(), before);
    EXPECT_EQ(application(kAtlas)->bundleVersion, "1.0");
}

TEST_F(FailingDiskTest, aRollbackIsNotCommittedBeforeItsFilesAreInTheirPlaceOnDisk) {
    ASSERT_TRUE(succeeded(install(kAtlas, "1.0")));
    ASSERT_TRUE(succeeded(install(kAtlas, "2.0")));
    const auto before = containers();
    std::vector<std::string> atTheSync;
    DurabilityBarrier barrier([&] {
        atTheSync = containers();
        return EIO;
    });
    const Status status = workWith(barrier, [](const InstallContext& context) {
        const auto done = rollBackApplication(context, kAtlas);
        return done ? Status() : Status(done.error());
    });
    ASSERT_FALSE(status);
    EXPECT_EQ(status.error().code, EIO);
    EXPECT_EQ(atTheSync.size(), 2U);
    EXPECT_EQ(containers(), before);
    EXPECT_EQ(application(kAtlas)->bundleVersion, "2.0");
    EXPECT_TRUE(device().rollBack(kAtlas)) << "what was kept is kept";
}

TEST_F(FailingDiskTest, aDatabaseThatFailsAtTheLastStepLeavesTheOldVersion) {
    ASSERT_TRUE(succeeded(install(kAtlas, "1.0")));
    const auto before = containers();
    sql("CREATE INDEX refuse ON applications"
        " (abs(CASE version WHEN '2.0' THEN -9223372036854775808 ELSE 1 END))");  // overflows
    const Status status = install(kAtlas, "2.0");
    sql("DROP INDEX refuse");
    EXPECT_TRUE(refusedBy(status, RegistryErrorCode::DatabaseFailed));
    EXPECT_TRUE(device().databaseFailure());
    EXPECT_EQ(containers(), before);
    EXPECT_EQ(application(kAtlas)->bundleVersion, "1.0");
}

}  // namespace
}  // namespace appsync
