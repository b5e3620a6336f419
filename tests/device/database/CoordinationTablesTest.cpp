#include "device/database/CoordinationTables.h"

#include <functional>
#include <memory>
#include <string>

#include "device/database/Database.h"
#include "device/database/DeviceDatabase.h"
#include "device/values/DevicePaths.h"
#include "tests/device/DeviceFixture.h"

namespace appsync {
namespace {

class CoordinationTablesTest : public DeviceFixture {
  protected:
    CoordinationTablesTest() : database_(*DeviceDatabase::open(devicePath(kDatabaseName))) {}

    std::int64_t reserve(std::int64_t count) {
        return made<std::int64_t>(
            [&](Database& writer) { return reserveCoordinatorIds(writer, count); });
    }
    std::int64_t insert(const std::string& identifier) {
        return made<std::int64_t>([&](Database& writer) {
            return insertCoordinator(writer, identifier, CoordinatorKind::Initiating, 1);
        });
    }
    bool insertWith(std::int64_t id, const std::string& identifier) {
        StoredCoordinator coordinator;
        coordinator.id = id;
        coordinator.identifier = identifier;
        return made<bool>([&](Database& writer) { return insertReserved(writer, coordinator); });
    }

  private:
    /// What comes of a statement that must not fail.
    template <typename Value>
    Value made(const std::function<Result<Value>(Database&)>& statement) {
        Result<Value> result = ErrorRecord::make("test", 1, "it was not made");
        const Status status = database_->change(Durability::Soon, [&](Database& writer) -> Status {
            result = statement(writer);
            return result ? Status() : Status(result.error());
        });
        EXPECT_TRUE(succeeded(status));
        return *result;
    }

    const std::unique_ptr<DeviceDatabase> database_;
};

TEST_F(CoordinationTablesTest, idsThatAreReservedAreNobodyElses) {
    EXPECT_EQ(reserve(64), 1);
    EXPECT_EQ(insert("com.example.a"), 65);
    EXPECT_EQ(reserve(64), 66);
    EXPECT_TRUE(insertWith(3, "com.example.b"));
    EXPECT_EQ(insert("com.example.c"), 130);
}

TEST_F(CoordinationTablesTest, whoeverWasFasterHasTheCoordinator) {
    const std::int64_t id = reserve(1);
    const std::int64_t theirs = insert("com.example.a");
    EXPECT_FALSE(insertWith(id, "com.example.a"));
    EXPECT_EQ(number("SELECT id FROM coordinators"), theirs);
}

}  // namespace
}  // namespace appsync
