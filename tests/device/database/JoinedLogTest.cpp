#include "device/database/JoinedLog.h"

#include <filesystem>
#include <fstream>
#include <memory>
#include <string>

#include "device/database/Database.h"
#include "tests/device/DeviceFixture.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

/// A database of one table, beside the device.
class JoinedLogTest : public DeviceFixture {
  protected:
    static constexpr std::int64_t kRows = 60;

    void SetUp() override {
        DeviceFixture::SetUp();
        first_ = connect(path_, Database::Mode::Create);
        run(*first_, "PRAGMA journal_mode = WAL");
        run(*first_, "PRAGMA synchronous = NORMAL");
        run(*first_, "CREATE TABLE things (id INTEGER PRIMARY KEY, text BLOB)");
        fill(*first_);
    }

    static std::unique_ptr<Database> connect(const std::string& path, Database::Mode mode) {
        auto database = Database::open(path, mode);
        EXPECT_TRUE(database.ok());
        return std::move(*database);
    }
    std::unique_ptr<Database> another() const { return connect(path_, Database::Mode::Existing); }

    static void run(Database& database, const char* sql) {
        EXPECT_TRUE(succeeded(database.execute(sql)));
    }
    /// A transaction of one page for each row.
    static void fill(Database& database) {
        run(database, "BEGIN IMMEDIATE");
        for (std::int64_t id = 1; id <= kRows; ++id) put(database, id);
        run(database, "COMMIT");
    }
    static void put(Database& database, std::int64_t id) {
        EXPECT_TRUE(
            succeeded(database.query("INSERT OR REPLACE INTO things VALUES (?, randomblob(3000))")
                          .bind(id)
                          .run()));
    }
    /// What the rows are, in short.
    static std::string sum(Database& database) {
        Query rows = database.query(
            "SELECT group_concat(id || ' ' || length(text) || ' ' || hex(substr(text, 1, 4)) || ' '"
            " || hex(substr(text, -4))) FROM (SELECT * FROM things ORDER BY id)");
        EXPECT_TRUE(rows.next());
        return rows.text(0);
    }
    /// What is there after a crash at this moment.
    std::string sumAfterCrash() const {
        const std::string copy = path_ + ".copy";
        for (const char* part : {"", "-wal"}) {
            fs::copy_file(path_ + part, copy + part, fs::copy_options::overwrite_existing);
        }
        const auto database = connect(copy, Database::Mode::Existing);
        Query lines = database->query("PRAGMA integrity_check");
        EXPECT_TRUE(lines.next());
        EXPECT_EQ(lines.text(0), "ok");
        return sum(*database);
    }
    static std::int64_t writingCalls() {
        std::ifstream lines("/proc/self/io");
        std::string name;
        std::int64_t count = 0;
        while (lines >> name >> count) {
            if (name == "syscw:") return count;
        }
        ADD_FAILURE() << "the system does not count the calls that write";
        return 0;
    }

    const std::string path_ = devicePath("things.db");
    std::unique_ptr<Database> first_;
};

TEST_F(JoinedLogTest, aTransactionIsWrittenAtOnce) {
    const std::int64_t before = writingCalls();
    fill(*first_);
    EXPECT_LE(writingCalls() - before, 4) << "of pieces of 128 KiB, for " << kRows << " pages";
}

TEST_F(JoinedLogTest, aTransactionIsThereForOthersAndAfterACrashOnceItIsCommitted) {
    const auto second = another();
    for (int times = 0; times < 3; ++times) {
        put(*first_, 1);
        EXPECT_EQ(sum(*second), sum(*first_));
        EXPECT_EQ(sumAfterCrash(), sum(*first_));
        fill(*second);
        EXPECT_EQ(sum(*first_), sum(*second));
        EXPECT_EQ(sumAfterCrash(), sum(*first_));
    }
}

TEST_F(JoinedLogTest, aTransactionThatTheCacheCannotHoldIsWhole) {
    run(*first_, "PRAGMA cache_size = 10");
    run(*first_, "BEGIN IMMEDIATE");
    for (std::int64_t times = 0; times < 4; ++times) {
        for (std::int64_t id = 1; id <= kRows; ++id) put(*first_, id);
    }
    run(*first_, "COMMIT");
    EXPECT_EQ(sum(*another()), sum(*first_));
    EXPECT_EQ(sumAfterCrash(), sum(*first_));
}

TEST_F(JoinedLogTest, whatIsGivenUpIsNeverWrittenOverWhatOthersCommit) {
    const auto second = another();
    run(*first_, "PRAGMA cache_size = 10");
    // What is read from the log writes what is held.
    run(*first_, "PRAGMA wal_checkpoint(TRUNCATE)");
    run(*first_, "BEGIN IMMEDIATE");
    for (std::int64_t id = 1; id <= kRows; ++id) put(*first_, id);
    run(*first_, "ROLLBACK");
    fill(*second);
    const std::string expected = sum(*second);
    EXPECT_EQ(sum(*first_), expected);
    put(*first_, 1);
    EXPECT_EQ(sum(*second), sum(*first_));
    EXPECT_EQ(sumAfterCrash(), sum(*first_));
}

TEST_F(JoinedLogTest, aLogThatBeginsAnewIsWrittenAtOnceToo) {
    run(*first_, "PRAGMA wal_checkpoint(RESTART)");
    put(*first_, 1);
    const std::int64_t before = writingCalls();
    fill(*first_);
    EXPECT_LE(writingCalls() - before, 4);
    EXPECT_EQ(sumAfterCrash(), sum(*first_));
}

}  // namespace
}  // namespace appsync
