#include "device/coordination/LiveCoordinator.h"

#include <gmock/gmock.h>

#include "device/database/Database.h"
#include "device/database/DeviceDatabase.h"
#include "device/values/DeviceError.h"
#include "device/values/DevicePaths.h"
#include "tests/device/DeviceFixture.h"

namespace appsync {
namespace {

constexpr const char* kAtlas = "com.example.atlas";

/// A coordinator that this process has made, and the database that is to have it.
class LiveCoordinatorTest : public DeviceFixture {
  protected:
    LiveCoordinatorTest() {
        auto database = DeviceDatabase::open(devicePath(kDatabaseName));
        EXPECT_TRUE(database.ok());
        database_ = *std::move(database);
        StoredCoordinator stored;
        stored.id = 7;
        stored.identifier = kAtlas;
        stored.client = SyncClientID;
        coordinator_ = std::make_unique<LiveCoordinator>(stored, LiveCoordinator::Origin::New);
    }

    /// What saving it in a transaction of its own gives.
    bool save(LiveCoordinator::For what = LiveCoordinator::For::Life) {
        bool saved = false;
        const Status changed = database_->change(Durability::Soon, [&](Database& database) {
            const Result<bool> result = coordinator_->save(database, what);
            saved = result && *result;
            return Status();
        });
        EXPECT_TRUE(changed);
        return saved;
    }
    /// Saves it, and loses that again.
    void saveInVain(const std::function<Status(Database&)>& lose) {
        const Status changed = database_->change(Durability::Soon, [&](Database& database) {
            const Result<bool> saved = coordinator_->save(database);
            EXPECT_TRUE(saved && *saved);
            return lose(database);
        });
        EXPECT_FALSE(changed);
        EXPECT_EQ(rows(), 0);
    }
    std::int64_t rows() const { return number("SELECT count(*) FROM coordinators WHERE id = 7"); }

    static ErrorRecord noRoom() {
        return deviceError(DeviceErrorCode::NoSpace, "there is no room");
    }

    std::unique_ptr<DeviceDatabase> database_;
    std::unique_ptr<LiveCoordinator> coordinator_;
};

TEST_F(LiveCoordinatorTest, whatWasLostWithItsTransactionIsWrittenAgain) {
    saveInVain([](Database& database) {
        database.execute("ROLLBACK").ignore();
        return Status(noRoom());
    });
    EXPECT_TRUE(save());
    EXPECT_EQ(rows(), 1);
}

TEST_F(LiveCoordinatorTest, whatWasLostWithAChangeOfWhichItWasAPartIsWrittenAgain) {
    PromiseValues values;
    values.name = "package";
    const auto promise = std::make_shared<LivePromise>(values);
    ASSERT_TRUE(coordinator_->setPromise(PromiseRole::Asset, promise));
    saveInVain([](Database&) { return Status(noRoom()); });
    EXPECT_TRUE(save());
    EXPECT_EQ(number("SELECT count(*) FROM promises WHERE name = 'package'"), 1);
}

TEST_F(LiveCoordinatorTest, whatSomebodyElseCancelsIsOverThoughOthersLoseSomething) {
    ASSERT_TRUE(save());
    sql("DELETE FROM coordinators");
    sql("INSERT INTO cancellations (coordinator, identifier, client, domain, code, description)"
        " VALUES (7, 'com.example.atlas', 2, 'd', 1, 'cancelled')");
    EXPECT_FALSE(database_->change(Durability::Soon, [](Database&) { return Status(noRoom()); }));
    EXPECT_FALSE(save());
    EXPECT_EQ(rows(), 0);
}

TEST_F(LiveCoordinatorTest, whatIsGoneWithNothingLostIsOver) {
    ASSERT_TRUE(save());
    sql("DELETE FROM coordinators");
    ASSERT_TRUE(coordinator_->setResponsible(SyncClientID));
    EXPECT_FALSE(save());
}

TEST_F(LiveCoordinatorTest, whatWasLostIsWrittenOnceItDoesNotEndAfterAll) {
    saveInVain([](Database&) { return Status(noRoom()); });
    ASSERT_TRUE(coordinator_->beginEnding());
    static_cast<void>(save());
    EXPECT_EQ(rows(), 0);
    coordinator_->abandonEnding();
    EXPECT_TRUE(save());
    EXPECT_EQ(rows(), 1);
}

TEST_F(LiveCoordinatorTest, whatWasLostIsThereForWhoeverEndsIt) {
    saveInVain([](Database&) { return Status(noRoom()); });
    ASSERT_TRUE(coordinator_->beginEnding());
    EXPECT_TRUE(save(LiveCoordinator::For::End));
    EXPECT_EQ(rows(), 1);
}

TEST_F(LiveCoordinatorTest, whatWasLostWithTheInstallThatTookItAwayIsThereForWhoeverEndsIt) {
    saveInVain([&](Database& database) {
        const Result<bool> forgotten = coordinator_->forget(database);
        EXPECT_TRUE(forgotten && *forgotten);
        return Status(noRoom());
    });
    ASSERT_TRUE(coordinator_->beginEnding());
    static_cast<void>(save(LiveCoordinator::For::End));
    EXPECT_EQ(rows(), 0) << "the install may have been kept";
    coordinator_->stay();
    EXPECT_TRUE(save(LiveCoordinator::For::End));
    EXPECT_EQ(rows(), 1);
}

TEST_F(LiveCoordinatorTest, whatCameAfterAnotherIsOverThoughThatOneIsGoneAndSomethingIsLost) {
    StoredCoordinator another;
    another.id = 8;
    another.identifier = kAtlas;
    LiveCoordinator former(another, LiveCoordinator::Origin::New);
    ASSERT_TRUE(database_->change(Durability::Soon, [&](Database& database) {
        const Result<bool> saved = former.save(database);
        EXPECT_TRUE(saved && *saved);
        return Status();
    }));
    EXPECT_FALSE(save());
    sql("DELETE FROM coordinators");
    EXPECT_FALSE(database_->change(Durability::Soon, [](Database&) { return Status(noRoom()); }));
    ASSERT_TRUE(coordinator_->setResponsible(SyncClientID));
    EXPECT_FALSE(save());
    EXPECT_EQ(rows(), 0);
}

TEST_F(LiveCoordinatorTest, whatItsInstallHasTakenAwayIsNotWrittenAgain) {
    ASSERT_TRUE(save());
    ASSERT_TRUE(database_->change(Durability::Soon, [&](Database& database) {
        const Result<bool> forgotten = coordinator_->forget(database);
        EXPECT_TRUE(forgotten && *forgotten);
        return Status();
    }));
    EXPECT_FALSE(database_->change(Durability::Soon, [](Database&) { return Status(noRoom()); }));
    static_cast<void>(save());
    EXPECT_EQ(rows(), 0);
}

}  // namespace
}  // namespace appsync
