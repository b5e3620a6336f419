#pragma once

// device/database: the one room that knows SQLite. `Database` is a connection and `Query` a
// statement (Database.h); DeviceSchema.h makes and checks the tables; RegistryTables.h,
// KeptTable.h, SumTable.h and CoordinationTables.h are their statements, as functions that run
// inside a transaction of the caller's. `DeviceDatabase` (this header) is what the other rooms
// hold: it reads, and it makes changes whole, with as few waits for the disk as their durability
// allows. JoinedLog.h writes a transaction at once, and DatabaseCopy.h is for those who may only
// read.
//
// A new table, or a new column, begins in DeviceSchema.cpp, with a new schema version, and in
// docs/device-format.md. Includes device/values, system/ and SQLite. Called by screen, services,
// install, registry, coordination and `Device`, never by host/.

#include <chrono>
#include <condition_variable>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "platform/Result.h"

namespace appsync {

class Database;

/// When a change is safe from a loss of power. It survives the end of this process, and everybody
/// sees it, in either case.
enum class Durability {
    OnDisk,  // when the call returns
    Soon,    // with the next change that is OnDisk, or when the system gets to it
};

/// A device's database: one connection that reads, one that writes; on a full disk, and for those
/// who may only read, a single one.
///
/// Writers that come at the same time share one transaction and one sync: the first of them
/// commits for all that wait by then, or come before the commit. Callable on any thread. The
/// functions that are passed in may run on another thread than the caller's, but not after the call
/// has returned; they must not call this object. A change that throws ends the process.
class DeviceDatabase {
  public:
    using Change = std::function<Status(Database&)>;
    using Reading = std::function<Status(Database&)>;

    /// Whether others may use the database at the same time.
    enum class Sharing {
        Always,
        /// Where there is no space for what sharing needs, nobody else can use it as long as this
        /// object has it open. Where it may not be written, this object reads a copy, and refuses
        /// every change.
        IfPossible,
    };

    /// Opens the database and checks that it is one that this version can use.
    [[nodiscard]] static Result<std::unique_ptr<DeviceDatabase>> open(
        const std::string& path, Sharing sharing = Sharing::Always);

    /// Makes the changes that were left for later, if the database takes them.
    ~DeviceDatabase();
    DeviceDatabase(const DeviceDatabase&) = delete;
    DeviceDatabase& operator=(const DeviceDatabase&) = delete;

    /// Reads what is committed.
    Status read(const Reading& reading);

    /// Makes a change, whole: when it fails, or the commit does, nothing has changed. Everybody
    /// sees it once the call has returned.
    Status change(Durability durability, const Change& change);

    /// One of several changes that come together.
    struct Joint {
        const Change& change;
        Status status;  // what became of it
    };
    /// As many calls of `change` that come at the same time: one transaction, and each change is
    /// made whole or not at all, whatever becomes of the others.
    void changeAll(Durability durability, std::vector<Joint>& changes);

    /// Leaves a change for later: it goes with the next change of anyone's, at the latest a tenth
    /// of a second from now, or when the database takes changes again. It runs after those that
    /// were left before it. A statement that fails changes nothing; what the change did before is
    /// kept. Where the transaction is lost it is made again, without what others change, until it
    /// is kept; so it may run more than once. A crash may lose it. It may run after this call has
    /// returned.
    void changeLater(Change change);

    /// Makes the changes that were left for later, now.
    Status flush();

    /// From now on no change is begun, whoever asks for one waits for ever. False when one that is
    /// under way does not end within the time.
    [[nodiscard]] bool freeze(std::chrono::milliseconds longest);

    /// The first failure of the database itself, whoever met it.
    [[nodiscard]] std::optional<ErrorRecord> failure() const;

  private:
    struct Waiting;
    struct Loan;

    DeviceDatabase(std::unique_ptr<Database> reader, std::unique_ptr<Database> writer);

    [[nodiscard]] static Result<std::unique_ptr<DeviceDatabase>> openCopy(
        const std::string& path, const ErrorRecord& whyNotWritable);

    [[nodiscard]] bool borrowWriter();
    void giveWriterBack();
    void wakeNext();
    void makeInTurn(std::vector<Waiting>& own);
    void lead(std::unique_lock<std::mutex>& lock);
    void join(std::vector<Waiting*>& batch, std::vector<Change>& later, Durability atMost);
    [[nodiscard]] std::size_t countTogether() const;
    bool commitTogether(std::vector<Waiting*>& batch, std::vector<Change>& later) noexcept;
    Status makeAll(std::vector<Waiting*>& batch, std::vector<Change>& later, Durability durability);
    Status whyLost(const Status& last) const;
    void leaveAgain(std::vector<Change> later);
    void joinArrived(std::vector<Waiting*>& batch, std::vector<Change>& later,
                     Durability durability);
    Status beginTransaction(Durability durability);
    Status makeChange(const Change& change);
    Status commit();
    Status noteFailure(Status status);
    void flushNowAndThen();

    std::mutex readerMutex_;
    const std::unique_ptr<Database> reader_;     // protected by readerMutex_; none when not shared
    const std::unique_ptr<Database> writer_;     // used by whoever has set isWriterInUse_
    std::optional<ErrorRecord> whyNotWritable_;  // where there is no writer_
    Durability writerDurability_ = Durability::OnDisk;  // likewise

    mutable std::mutex mutex_;
    // Protected by mutex_.
    std::condition_variable writerIsFree_;  // told of where it is frozen
    std::deque<Waiting*> queue_;
    std::vector<Change> later_;
    bool laterFailed_ = false;    // their transaction did
    bool isWriterInUse_ = false;  // somebody commits, or reads by way of it
    bool isFrozen_ = false;
    std::optional<ErrorRecord> failure_;
    std::condition_variable flusherWakes_;
    bool flusherIsIdle_ = false;  // it waits for the first change, not for the time to make it
    bool closing_ = false;
    std::thread flusher_;  // started with the first change that is left for later
};

}  // namespace appsync
