#include "device/database/DeviceDatabase.h"

#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <filesystem>
#include <new>
#include <string_view>
#include <thread>
#include <vector>

#include "device/database/Database.h"
#include "device/values/DeviceError.h"
#include "device/values/DevicePaths.h"
#include "tests/device/DeviceFixture.h"

namespace appsync {
namespace {

class DeviceDatabaseTest : public DeviceFixture {
  protected:
    std::unique_ptr<DeviceDatabase> open() {
        auto database = DeviceDatabase::open(devicePath(kDatabaseName));
        EXPECT_TRUE(database.ok());
        return std::move(*database);
    }
    static Status insert(Database& database, const std::string& identifier) {
        return database.query("INSERT INTO restore_data (identifier) VALUES (?)")
            .bind(identifier)
            .run();
    }
    std::int64_t rows() const { return number("SELECT count(*) FROM restore_data"); }

    static constexpr std::string_view kNoRoom = "there is no room";
    /// Fails as a statement does that takes the transaction with it.
    static Status loseTransaction(Database& database) {
        database.execute("ROLLBACK").ignore();
        return deviceError(DeviceErrorCode::NoSpace, kNoRoom);
    }
    /// Has the commit fail, as a promise of no coordinator is noticed there.
    static Status loseCommit(Database& database) {
        if (Status deferred = database.execute("PRAGMA defer_foreign_keys = ON"); !deferred) {
            return deferred;
        }
        return database.execute("INSERT INTO promises VALUES (99, 0, 0, 'n', 1, NULL, 0, 0, 0, 0)");
    }
};

TEST_F(DeviceDatabaseTest, aChangeIsSeenByEverybodyWhenTheCallReturns) {
    const auto database = open();
    for (const Durability durability : {Durability::OnDisk, Durability::Soon, Durability::OnDisk}) {
        const std::int64_t before = rows();
        ASSERT_TRUE(succeeded(database->change(
            durability, [&](Database& writer) { return insert(writer, std::to_string(before)); })));
        EXPECT_EQ(rows(), before + 1);
    }
}

TEST_F(DeviceDatabaseTest, nothingIsCommittedOnceItIsFrozen) {
    const pid_t child = ::fork();
    if (child == 0) {
        DeviceDatabase* database = open().release();
        std::atomic<bool> isAtWork = false;
        std::atomic<bool> mayEnd = false;
        std::thread([&] {
            database
                ->change(Durability::Soon,
                         [&](Database& writer) {
                             isAtWork = true;
                             while (!mayEnd) std::this_thread::yield();
                             return insert(writer, "first");
                         })
                .ignore();
        }).detach();
        while (!isAtWork) std::this_thread::yield();
        for (const char* late : {"second", "third"}) {
            std::thread([=] {
                database
                    ->change(Durability::OnDisk,
                             [=](Database& writer) { return insert(writer, late); })
                    .ignore();
            }).detach();
        }
        if (database->freeze(std::chrono::milliseconds(1))) ::_exit(1);
        mayEnd = true;
        if (!database->freeze(std::chrono::minutes(1))) ::_exit(2);
        database->changeLater([](Database& writer) { return insert(writer, "later"); });
        for (int times = 0; times < 1000; ++times) {
            if (!database->flush()) ::_exit(3);
            std::this_thread::yield();
        }
        ::_exit(0);
    }
    int status = -1;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
    EXPECT_EQ(rows(), 1);
}

TEST_F(DeviceDatabaseTest, aChangeThatFailsChangesNothing) {
    const auto database = open();
    const Status status = database->change(Durability::OnDisk, [](Database& writer) -> Status {
        if (Status inserted = insert(writer, "first"); !inserted) return inserted;
        return ErrorRecord::make("test", 7, "changed its mind");
    });
    ASSERT_FALSE(status);
    EXPECT_EQ(status.error().code, 7);
    EXPECT_EQ(rows(), 0);
    EXPECT_FALSE(database->failure()) << "a refusal is no failure of the database";
}

TEST_F(DeviceDatabaseTest, oneThatIsAloneNeedsNoSharedMemoryFile) {
    const auto alone = Database::open(devicePath(kDatabaseName), Database::Mode::Alone);
    ASSERT_TRUE(alone.ok());
    ASSERT_TRUE(succeeded(insert(**alone, "first")));
    EXPECT_EQ(*(*alone)->integer("SELECT count(*) FROM restore_data"), 1);
    EXPECT_FALSE(std::filesystem::exists(devicePath("device.db-shm")));
}

TEST_F(DeviceDatabaseTest, oneThatWantsToBeAloneWaitsForTheOthersAndSeesWhatTheyDid) {
    auto other = Database::open(devicePath(kDatabaseName), Database::Mode::Existing);
    ASSERT_TRUE(other.ok());
    ASSERT_EQ(*(*other)->integer("SELECT count(*) FROM restore_data"), 0);
    std::int64_t seen = -1;
    std::thread late([&] {
        const auto alone = Database::open(devicePath(kDatabaseName), Database::Mode::Alone);
        const auto count = (*alone)->integer("SELECT count(*) FROM restore_data");
        if (count) seen = *count;
    });
    ASSERT_TRUE(succeeded(insert(**other, "first")));
    other->reset();
    late.join();
    EXPECT_EQ(seen, 1);
}

TEST_F(DeviceDatabaseTest, whoComesWhileOneIsAloneWaitsAndSeesWhatThatDid) {
    auto alone = Database::open(devicePath(kDatabaseName), Database::Mode::Alone);
    ASSERT_TRUE(alone.ok());
    ASSERT_TRUE(succeeded((*alone)->execute("BEGIN IMMEDIATE")));
    std::int64_t seen = -1;
    std::thread late([&] {
        const auto other = Database::open(devicePath(kDatabaseName), Database::Mode::Existing);
        const auto count = (*other)->integer("SELECT count(*) FROM restore_data");
        if (count) seen = *count;
    });
    ASSERT_TRUE(succeeded(insert(**alone, "first")));
    ASSERT_TRUE(succeeded((*alone)->execute("COMMIT")));
    alone->reset();
    late.join();
    EXPECT_EQ(seen, 1);
}

TEST_F(DeviceDatabaseTest, changesAtTheSameTimeAreIndependent) {
    const auto database = open();
    constexpr int kThreads = 10;
    constexpr int kEach = 25;
    std::atomic<int> unexpected{0};
    std::vector<std::thread> threads;
    for (int thread = 0; thread < kThreads; ++thread) {
        threads.emplace_back([&, thread] {
            for (int number = 0; number < kEach; ++number) {
                const bool fails = number % 5 == 0;
                const Status status =
                    database->change(Durability::OnDisk, [&](Database& writer) -> Status {
                        Status inserted = insert(writer, std::to_string(thread * kEach + number));
                        if (!fails) return inserted;
                        return ErrorRecord::make("test", 1, "fails");
                    });
                if (status.ok() == fails) ++unexpected;
            }
        });
    }
    for (std::thread& thread : threads) thread.join();
    EXPECT_EQ(unexpected, 0);
    EXPECT_EQ(rows(), kThreads * kEach * 4 / 5);
}

TEST_F(DeviceDatabaseTest, aReadingWaitsForNoOther) {
    const auto database = open();
    const auto readNothing = [&] {
        EXPECT_TRUE(succeeded(database->read([](Database&) { return Status(); })));
    };
    ASSERT_TRUE(succeeded(database->read([&](Database&) {
        std::thread(readNothing).join();
        return Status();
    })));
}

TEST_F(DeviceDatabaseTest, whatWasLeftForLaterGoesWithTheNextChange) {
    const auto database = open();
    database->changeLater([](Database& writer) { return insert(writer, "later"); });
    ASSERT_TRUE(succeeded(database->change(
        Durability::OnDisk, [](Database& writer) { return insert(writer, "now"); })));
    EXPECT_EQ(rows(), 2);
}

TEST_F(DeviceDatabaseTest, whatWasLeftForLaterIsWrittenWithoutAnybodysHelp) {
    const auto database = open();
    database->changeLater([](Database& writer) { return insert(writer, "later"); });
    while (rows() == 0) std::this_thread::yield();
    EXPECT_EQ(rows(), 1);
}

TEST_F(DeviceDatabaseTest, closingWritesWhatWasLeftForLater) {
    open()->changeLater([](Database& writer) { return insert(writer, "later"); });
    EXPECT_EQ(rows(), 1);
}

TEST_F(DeviceDatabaseTest, aLaterChangeThatFailsHoldsNobodyUp) {
    const auto database = open();
    database->changeLater([](Database&) -> Status { return ErrorRecord::make("test", 1, "no"); });
    database->changeLater([](Database& writer) { return insert(writer, "later"); });
    EXPECT_TRUE(succeeded(database->flush()));
    EXPECT_EQ(rows(), 1);
}

TEST_F(DeviceDatabaseTest, aFailureThatEndsTheTransactionFailsAllOfItsChanges) {
    const auto database = open();
    const DeviceDatabase::Change before = [](Database& writer) { return insert(writer, "before"); };
    const DeviceDatabase::Change after = [](Database& writer) { return insert(writer, "after"); };
    const DeviceDatabase::Change losing = loseTransaction;
    std::vector<DeviceDatabase::Joint> changes;
    changes.push_back({before, {}});
    changes.push_back({losing, {}});
    changes.push_back({after, {}});
    database->changeAll(Durability::OnDisk, changes);
    for (const DeviceDatabase::Joint& each : changes) {
        ASSERT_FALSE(each.status);
        EXPECT_EQ(each.status.error().description(), kNoRoom);
    }
    EXPECT_EQ(rows(), 0);
    EXPECT_TRUE(succeeded(database->change(Durability::OnDisk, after)));
    EXPECT_EQ(rows(), 1);
}

TEST_F(DeviceDatabaseTest, aLaterChangeThatEndsTheTransactionTellsWhy) {
    const auto database = open();
    database->changeLater(loseTransaction);
    const Status status = database->change(
        Durability::OnDisk, [](Database& writer) { return insert(writer, "with it"); });
    ASSERT_FALSE(status);
    EXPECT_EQ(status.error().description(), kNoRoom);
    EXPECT_EQ(rows(), 0);
}

TEST_F(DeviceDatabaseTest, whatWasLeftForLaterWaitsUntilATransactionCanBegin) {
    const auto database = open();
    const auto perform = [&](const char* statement) {
        return database->read([&](Database& writer) { return writer.execute(statement); });
    };
    ASSERT_TRUE(succeeded(perform("BEGIN")));  // so none can begin within it
    database->changeLater([](Database& writer) { return insert(writer, "later"); });
    EXPECT_FALSE(database->flush());
    while (!perform("ROLLBACK")) std::this_thread::yield();
    EXPECT_TRUE(succeeded(database->flush()));
    EXPECT_EQ(rows(), 1);
}

TEST_F(DeviceDatabaseTest, whatWasLeftForLaterIsMadeAgainWhereTheCommitFails) {
    const auto database = open();
    const Status status = database->change(Durability::Soon, [&](Database& writer) {
        for (const char* left : {"later", "and later"}) {  // they join this transaction
            database->changeLater([=](Database& own) { return insert(own, left); });
        }
        return loseCommit(writer);
    });
    EXPECT_FALSE(status);
    EXPECT_TRUE(succeeded(database->flush()));
    EXPECT_EQ(rows(), 2);
    EXPECT_EQ(number("SELECT rowid FROM restore_data WHERE identifier = 'later'"), 1)
        << "in their order";
}

TEST_F(DeviceDatabaseTest, whatIsLeftAndAlwaysLostHoldsNobodyElseUp) {
    const auto database = open();
    database->changeLater(loseTransaction);
    EXPECT_FALSE(database->flush());
    for (const char* name : {"first", "second"}) {
        EXPECT_TRUE(succeeded(database->change(
            Durability::Soon, [&](Database& writer) { return insert(writer, name); })));
        EXPECT_FALSE(database->flush()) << "it is not forgotten";
    }
    EXPECT_EQ(rows(), 2);
}

TEST_F(DeviceDatabaseTest, whatWasLeftAndLostGoesWithTheNextChangeOnceItIsKept) {
    const auto database = open();
    bool fails = true;  // written by whoever has the transaction
    database->changeLater([&fails](Database& writer) {
        return fails ? loseTransaction(writer) : insert(writer, "later");
    });
    EXPECT_FALSE(database->flush());
    EXPECT_TRUE(succeeded(database->change(Durability::Soon, [&](Database&) {
        fails = false;
        return Status();
    })));
    EXPECT_TRUE(succeeded(database->flush()));
    EXPECT_EQ(rows(), 1);
    const Status status = database->change(Durability::Soon, [&](Database& writer) {
        database->changeLater([](Database& own) { return insert(own, "joins"); });
        return insert(writer, "next");
    });
    EXPECT_TRUE(succeeded(status));
    EXPECT_EQ(rows(), 3);
}

TEST_F(DeviceDatabaseTest, aLaterChangeThatFailsInPartIsALoss) {
    const auto database = open();
    std::uint64_t before = 0;
    std::uint64_t after = 0;
    const auto losses = [&](std::uint64_t& result) {
        return database->change(Durability::Soon, [&](Database& writer) {
            result = writer.losses();
            return Status();
        });
    };
    ASSERT_TRUE(succeeded(losses(before)));
    database->changeLater([](Database&) -> Status { return ErrorRecord::make("test", 1, "no"); });
    ASSERT_TRUE(succeeded(losses(after)));
    EXPECT_EQ(after, before + 1);
}

TEST_F(DeviceDatabaseTest, aReadingThatThrowsHoldsNobodyUp) {
    const auto database = open();
    const auto lacksMemory = [](Database&) -> Status { throw std::bad_alloc(); };
    EXPECT_THROW(database->read(lacksMemory).ignore(), std::bad_alloc);
    EXPECT_TRUE(succeeded(database->change(
        Durability::OnDisk, [](Database& writer) { return insert(writer, "next"); })));
}

TEST_F(DeviceDatabaseTest, aChangeThatThrowsEndsTheProcess) {
    const auto database = open();
    const auto lacksMemory = [](Database&) -> Status { throw std::bad_alloc(); };
    EXPECT_EXIT(database->change(Durability::OnDisk, lacksMemory).ignore(),
                testing::KilledBySignal(SIGABRT), "");
    EXPECT_EQ(rows(), 0);
}

TEST_F(DeviceDatabaseTest, aFailureOfTheDatabaseIsRemembered) {
    const auto database = open();
    sql("DROP TABLE restore_data");
    EXPECT_FALSE(
        database->change(Durability::OnDisk, [](Database& writer) { return insert(writer, "x"); }));
    ASSERT_TRUE(database->failure());
    EXPECT_NE(database->failure()->description().find("restore_data"), std::string::npos);
}

TEST_F(DeviceDatabaseTest, aKilledProcessLeavesWhatItCommittedAndNothingElse) {
    int ends[2] = {-1, -1};
    ASSERT_EQ(::pipe(ends), 0);
    const pid_t child = ::fork();
    if (child == 0) {
        auto database = DeviceDatabase::open(devicePath(kDatabaseName));
        const bool done = database && (*database)->change(Durability::Soon, [](Database& writer) {
            return insert(writer, "committed");
        });
        const Status never = (*database)->change(Durability::OnDisk, [&](Database& writer) {
            Status inserted = insert(writer, "not committed");
            static_cast<void>(::write(ends[1], done ? "y" : "n", 1) + 1);
            for (;;) ::pause();
            return inserted;
        });
        ::_exit(never.ok() ? 0 : 1);
    }
    char answer = 0;
    ASSERT_EQ(::read(ends[0], &answer, 1), 1);
    ::kill(child, SIGKILL);
    ASSERT_EQ(::waitpid(child, nullptr, 0), child);
    EXPECT_EQ(answer, 'y');
    EXPECT_EQ(rows(), 1);
    ::close(ends[0]);
    ::close(ends[1]);
}

TEST_F(DeviceDatabaseTest, whatSomebodyHasPutBesideTheTablesIsRefused) {
    for (const auto& [made, removed] : {std::pair{"TABLE extra (a)", "TABLE extra"},
                                        {"VIEW extra AS SELECT 1", "VIEW extra"},
                                        {"INDEX extra ON history (time)", "INDEX extra"},
                                        {"TRIGGER extra AFTER INSERT ON session BEGIN"
                                         " DELETE FROM applications; END",
                                         "TRIGGER extra"}}) {
        sql(std::string("CREATE ") + made);
        const auto refused = DeviceDatabase::open(devicePath(kDatabaseName));
        ASSERT_FALSE(refused.ok()) << made;
        EXPECT_NE(refused.error().description().find("'extra' is not that of a device"),
                  std::string::npos);
        sql(std::string("DROP ") + removed);
        EXPECT_TRUE(DeviceDatabase::open(devicePath(kDatabaseName)).ok()) << removed;
    }
}

TEST_F(DeviceDatabaseTest, triggersThatComeLaterDoNotRun) {
    const auto database = open();
    sql("CREATE TRIGGER late AFTER INSERT ON restore_data BEGIN DELETE FROM restore_data; END");
    ASSERT_TRUE(succeeded(database->change(
        Durability::OnDisk, [](Database& writer) { return insert(writer, "stays"); })));
    EXPECT_EQ(rows(), 1);
}

TEST_F(DeviceDatabaseTest, textsAndBytesComeBackAsTheyWere) {
    const auto database = Database::open(path("scratch.db"), Database::Mode::Create);
    ASSERT_TRUE(database.ok());
    ASSERT_TRUE(succeeded((*database)->execute("CREATE TABLE t (a TEXT, b BLOB, c TEXT)")));
    const std::string text("with\0null", 9);
    const Bytes bytes = {0, 255, 0};
    ASSERT_TRUE(succeeded((*database)
                              ->query("INSERT INTO t VALUES (?, ?, ?)")
                              .bind(text, bytes, std::optional<std::string>())
                              .run()));
    Query row = (*database)->query("SELECT a, b, c FROM t");
    ASSERT_TRUE(row.next());
    EXPECT_EQ(row.text(0), text);
    EXPECT_EQ(row.blob(1), bytes);
    EXPECT_EQ(row.optionalText(2), std::nullopt);
    EXPECT_FALSE(row.next());
}

TEST_F(DeviceDatabaseTest, aWrongStatementIsAnErrorAndNotAnEmptyAnswer) {
    const auto database = Database::open(path("scratch.db"), Database::Mode::Create);
    Query rows = (*database)->query("SELECT nothing FROM nowhere");
    rows.bind("a parameter");
    EXPECT_FALSE(rows.next());
    EXPECT_FALSE(rows.status());
    EXPECT_FALSE((*database)->integer("SELECT nothing FROM nowhere").ok());
}

}  // namespace
}  // namespace appsync
