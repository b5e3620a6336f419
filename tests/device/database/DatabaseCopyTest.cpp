#include "device/database/DatabaseCopy.h"

#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>

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

// Where copies are made: what is found there, and whose it is.
class AbandonedCopies : public DatabaseCopyTest {
  protected:
    AbandonedCopies() {
        fs::create_directory(place);
        ::setenv("TMPDIR", place.c_str(), 1);
    }
    ~AbandonedCopies() override { ::unsetenv("TMPDIR"); }
    AbandonedCopies(const AbandonedCopies&) = delete;
    AbandonedCopies& operator=(const AbandonedCopies&) = delete;

    [[nodiscard]] std::size_t count() const {
        return static_cast<std::size_t>(
            std::distance(fs::directory_iterator(place), fs::directory_iterator()));
    }
    /// A process that looks at the device, and is killed amid its copy.
    void lookAndBeKilled() const {
        const pid_t child = ::fork();
        if (child == 0) {
            const auto copy = DatabaseCopy::make(devicePath("device.db"), [] { ::raise(SIGKILL); });
            ::_exit(0);
        }
        int status = 0;
        ASSERT_EQ(::waitpid(child, &status, 0), child);
        ASSERT_TRUE(WIFSIGNALED(status));
    }
    [[nodiscard]] fs::path makeDirectory(const char* name, fs::perms mode) const {
        fs::path made = place / name;
        fs::create_directory(made);
        fs::permissions(made, mode);
        std::ofstream(made / "device.db") << "a database";
        return made;
    }

    const fs::path place = path("copies");
};

TEST_F(AbandonedCopies, goWithTheNextCopy) {
    lookAndBeKilled();
    lookAndBeKilled();
    EXPECT_EQ(count(), 1U) << "the second has cleared what the first has left";
    EXPECT_TRUE(DatabaseCopy::make(devicePath("device.db")));
    EXPECT_EQ(count(), 0U);
}

TEST_F(AbandonedCopies, areNoneThatAreInUse) {
    const Result<DatabaseCopy> first = DatabaseCopy::make(devicePath("device.db"), [this] {
        EXPECT_TRUE(DatabaseCopy::make(devicePath("device.db")));
    });
    EXPECT_TRUE(DatabaseCopy::make(devicePath("device.db")));
    ASSERT_TRUE(first);
    EXPECT_TRUE(fs::exists(first->path()));
    EXPECT_EQ(count(), 1U);
}

TEST_F(AbandonedCopies, areNothingThatLooksLikeOne) {
    const fs::path control = makeDirectory("appsync-look-000000", fs::perms::owner_all);
    const fs::path filled = makeDirectory("appsync-look-000001", fs::perms::owner_all);
    std::ofstream(filled / "letter.txt") << "Dear";
    const fs::path shared = makeDirectory("appsync-look-000002", fs::perms::all);
    const fs::path longer = makeDirectory("appsync-look-0000034", fs::perms::owner_all);
    const fs::path other = makeDirectory("appsync-loot-000005", fs::perms::owner_all);
    const fs::path target = makeDirectory("target", fs::perms::owner_all);
    fs::create_directory_symlink(target, place / "appsync-look-000006");
    std::ofstream(place / "appsync-look-000007") << "a file";
    EXPECT_TRUE(DatabaseCopy::make(devicePath("device.db")));
    EXPECT_FALSE(fs::exists(control));
    for (const fs::path& each : {filled, shared, longer, other, target}) {
        EXPECT_TRUE(fs::exists(each / "device.db")) << each;
    }
    EXPECT_EQ(count(), 7U);
}

TEST_F(AbandonedCopies, areNoneOfSomebodyElse) {
    if (::geteuid() != 0) GTEST_SKIP() << "only root can give something away";
    const fs::path others = makeDirectory("appsync-look-000000", fs::perms::owner_all);
    constexpr uid_t kSomebody = 65534;
    ASSERT_EQ(::chown(others.c_str(), kSomebody, kSomebody), 0);
    EXPECT_TRUE(DatabaseCopy::make(devicePath("device.db")));
    EXPECT_TRUE(fs::exists(others / "device.db"));
}

TEST_F(DatabaseCopyTest, missesADatabaseThatIsNotThere) {
    EXPECT_FALSE(DatabaseCopy::make(path("none.db")));
    EXPECT_FALSE(whyNotWritable(path("none.db")));
    EXPECT_FALSE(whyNotWritable(devicePath("device.db")));
}

}  // namespace
}  // namespace appsync
