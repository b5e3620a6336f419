#include "device/database/DatabaseCopy.h"

#include <filesystem>

#include "device/database/Database.h"
#include "device/database/DeviceDatabase.h"
#include "tests/device/DeviceFixture.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

class DatabaseCopyTest : public DeviceFixture {
  protected:
    [[nodiscard]] std::unique_ptr<Database> open() const {
        return *Database::open(devicePath("device.db"), Database::Mode::Existing);
    }
    /// The largest of the settings, as a copy shows it.
    [[nodiscard]] std::int64_t largestInCopy(const DatabaseCopy::Interlude& interlude = {}) const {
        const Result<DatabaseCopy> copy = DatabaseCopy::make(devicePath("device.db"), interlude);
        return *(*Database::openCopy(copy->path(), devicePath("device.db")))
                    ->integer("SELECT max(value) FROM settings");
    }
    static void run(Database& database, const char* sql) {
        ASSERT_TRUE(succeeded(database.execute(sql)));
    }
    /// What the log holds comes into the database, and the log begins anew.
    static void beginLogAnew(Database& database) {
        run(database, "PRAGMA wal_checkpoint(RESTART);");
        run(database, "INSERT INTO restore_data VALUES (hex(randomblob(9)))");
    }
};

TEST_F(DatabaseCopyTest, holdsWhatStandsInTheLogAlone) {
    const std::unique_ptr<Database> original = open();
    run(*original, "PRAGMA wal_autocheckpoint = 0; INSERT INTO settings VALUES ('one', 7)");
    EXPECT_EQ(largestInCopy(), 7);
}

TEST_F(DatabaseCopyTest, holdsWhatComesIntoTheDatabaseMeanwhile) {
    const std::unique_ptr<Database> original = open();
    run(*original, "INSERT INTO settings VALUES ('one', 1)");
    EXPECT_EQ(largestInCopy(
                  [&] { run(*original, "UPDATE settings SET value = 2; PRAGMA wal_checkpoint"); }),
              2);
}

TEST_F(DatabaseCopyTest, isMadeAgainWhereTheLogHasBegunAnew) {
    const std::unique_ptr<Database> original = open();
    run(*original, "INSERT INTO settings VALUES ('one', 1)");
    int copies = 0;
    EXPECT_EQ(largestInCopy([&] {
                  if (++copies > 1) return;
                  run(*original, "UPDATE settings SET value = 2");
                  beginLogAnew(*original);
              }),
              2);
    EXPECT_EQ(copies, 2);
}

TEST_F(DatabaseCopyTest, isMadeAgainWhereTheLogHasGoneOrCome) {
    run(*open(), "INSERT INTO settings VALUES ('one', 1)");
    int copies = 0;
    EXPECT_EQ(largestInCopy([&] {
                  if (++copies == 1) run(*open(), "UPDATE settings SET value = 2");
              }),
              2);
    EXPECT_EQ(copies, 2);
    std::unique_ptr<Database> original = open();
    run(*original, "UPDATE settings SET value = 3");
    EXPECT_EQ(largestInCopy([&] { original.reset(); }), 3);
}

TEST_F(DatabaseCopyTest, isGivenUpWhereTheDatabaseIsNeverLeftAlone) {
    const std::unique_ptr<Database> original = open();
    const Result<DatabaseCopy> copy =
        DatabaseCopy::make(devicePath("device.db"), [&] { beginLogAnew(*original); });
    ASSERT_FALSE(copy);
    EXPECT_TRUE(isDeviceError(copy.error(), DeviceErrorCode::InUse));
}

TEST_F(DatabaseCopyTest, goesWithItsObjectAndStaysForWhoHasReadOfIt) {
    std::string path;
    std::unique_ptr<Database> copy;
    {
        const Result<DatabaseCopy> made = DatabaseCopy::make(devicePath("device.db"));
        path = made->path();
        copy = *Database::openCopy(path, devicePath("device.db"));
        EXPECT_EQ(*copy->integer("PRAGMA user_version"), number("PRAGMA user_version"));
        EXPECT_EQ(fs::status(fs::path(path).parent_path()).permissions(), fs::perms::owner_all);
    }
    EXPECT_FALSE(fs::exists(fs::path(path).parent_path()));
    EXPECT_EQ(*copy->integer("SELECT count(*) FROM applications"), 0);
    EXPECT_EQ(copy->path(), devicePath("device.db")) << "messages name the original";
}

TEST_F(DatabaseCopyTest, missesADatabaseThatIsNotThere) {
    EXPECT_FALSE(DatabaseCopy::make(path("none.db")));
    EXPECT_FALSE(whyNotWritable(path("none.db")));
    EXPECT_FALSE(whyNotWritable(devicePath("device.db")));
}

}  // namespace
}  // namespace appsync
