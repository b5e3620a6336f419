#include "device/database/DeviceDatabase.h"

#include <algorithm>
#include <chrono>
#include <iterator>
#include <system_error>

#include "device/database/Database.h"
#include "device/database/DatabaseCopy.h"
#include "device/database/DeviceSchema.h"
#include "device/values/DeviceError.h"

namespace appsync {

namespace {

constexpr std::chrono::milliseconds kLongestDelay{100};
// How often those that have come meanwhile join a transaction before it is committed.
constexpr int kMostJoins = 8;

Status makeReady(Database& database) {
    if (Status status = checkDeviceSchema(database); !status) return status;
    return database.execute("PRAGMA synchronous = FULL");
}

Result<std::unique_ptr<Database>> connect(const std::string& path,
                                          Database::Mode mode = Database::Mode::Existing) {
    Result<std::unique_ptr<Database>> database = Database::open(path, mode);
    if (!database) return database;
    if (Status status = makeReady(**database); !status) return status.error();
    return database;
}

}  // namespace

/// A change in the queue, and what became of it.
struct DeviceDatabase::Waiting {
    const Change& change;  // none in a flush
    Durability durability;
    std::condition_variable& wakes;  // of those that came together
    Status status = {};
    bool done = false;

    bool isFlush() const { return !change; }
};

Result<std::unique_ptr<DeviceDatabase>> DeviceDatabase::open(const std::string& path,
                                                             Sharing sharing) {
    if (const auto refused = whyNotWritable(path)) {
        if (sharing == Sharing::Always) return *refused;
        return openCopy(path, *refused);
    }
    Result<std::unique_ptr<Database>> reader = connect(path);
    const bool alone = !reader && sharing == Sharing::IfPossible &&
                       isDeviceError(reader.error(), DeviceErrorCode::NoSpace);
    if (!reader && !alone) return reader.error();
    if (alone) reader = std::unique_ptr<Database>();
    Result<std::unique_ptr<Database>> writer =
        connect(path, alone ? Database::Mode::Alone : Database::Mode::Existing);
    if (!writer) return writer.error();
    return std::unique_ptr<DeviceDatabase>(
        new DeviceDatabase(std::move(*reader), std::move(*writer)));
}

// The copy's files are needed by name no more once something was read of it.
Result<std::unique_ptr<DeviceDatabase>> DeviceDatabase::openCopy(
    const std::string& path, const ErrorRecord& whyNotWritable) {
    const Result<DatabaseCopy> copy = DatabaseCopy::make(path);
    if (!copy) return copy.error();
    Result<std::unique_ptr<Database>> reader = Database::openCopy(copy->path(), path);
    if (!reader) return reader.error();
    if (Status status = makeReady(**reader); !status) return status.error();
    std::unique_ptr<DeviceDatabase> database(new DeviceDatabase(*std::move(reader), nullptr));
    database->whyNotWritable_ = whyNotWritable;
    return database;
}

DeviceDatabase::DeviceDatabase(std::unique_ptr<Database> reader, std::unique_ptr<Database> writer)
    : reader_(std::move(reader)), writer_(std::move(writer)) {}

DeviceDatabase::~DeviceDatabase() {
    {
        const std::lock_guard lock(mutex_);
        closing_ = true;
        flusherWakes_.notify_all();
    }
    if (flusher_.joinable()) flusher_.join();
    flush().ignore();
}

/// Gives the writer back, also where the reading throws.
struct DeviceDatabase::Loan {
    explicit Loan(DeviceDatabase& lender) : database(lender) {}
    Loan(const Loan&) = delete;
    Loan& operator=(const Loan&) = delete;
    ~Loan() { database.giveWriterBack(); }

    DeviceDatabase& database;
};

Status DeviceDatabase::read(const Reading& reading) {
    if (!reader_) return change(Durability::Soon, reading);
    if (borrowWriter()) {
        const Loan loan(*this);
        return noteFailure(reading(*writer_));
    }
    const std::lock_guard lock(readerMutex_);
    return noteFailure(reading(*reader_));
}

// Its cache holds what it has written; the reader has to fetch that anew after each commit.
bool DeviceDatabase::borrowWriter() {
    const std::lock_guard lock(mutex_);
    if (!writer_ || isWriterInUse_ || isFrozen_ || !queue_.empty()) return false;
    isWriterInUse_ = true;
    return true;
}

void DeviceDatabase::giveWriterBack() {
    const std::lock_guard lock(mutex_);
    isWriterInUse_ = false;
    wakeNext();
}

// With the lock held.
void DeviceDatabase::wakeNext() {
    if (isFrozen_) {
        writerIsFree_.notify_all();
    } else if (!queue_.empty()) {
        queue_.front()->wakes.notify_one();
    }
}

Status DeviceDatabase::change(Durability durability, const Change& change) {
    std::vector<Joint> changes;
    changes.push_back({change, {}});
    changeAll(durability, changes);
    return std::move(changes.front().status);
}

void DeviceDatabase::changeAll(Durability durability, std::vector<Joint>& changes) {
    std::condition_variable wakes;
    std::vector<Waiting> own;
    own.reserve(changes.size());
    for (const Joint& each : changes) own.push_back({each.change, durability, wakes});
    if (writer_) {
        makeInTurn(own);
    } else {
        for (Waiting& each : own) each.status = *whyNotWritable_;
    }
    for (std::size_t index = 0; index < own.size(); ++index) {
        changes[index].status = noteFailure(std::move(own[index].status));
    }
}

// They enter the queue together, and so they leave it.
void DeviceDatabase::makeInTurn(std::vector<Waiting>& own) {
    if (own.empty()) return;
    const Waiting& first = own.front();
    std::unique_lock lock(mutex_);
    for (Waiting& each : own) queue_.push_back(&each);
    first.wakes.wait(lock, [&] {
        return first.done || (queue_.front() == &first && !isWriterInUse_ && !isFrozen_);
    });
    if (!first.done) lead(lock);
}

// Commits for everybody in the queue, the caller being the first of them.
void DeviceDatabase::lead(std::unique_lock<std::mutex>& lock) {
    std::vector<Waiting*> batch;
    std::vector<Change> later;
    join(batch, later, Durability::OnDisk);
    isWriterInUse_ = true;
    lock.unlock();
    const bool kept = commitTogether(batch, later);
    lock.lock();
    isWriterInUse_ = false;
    if (!later.empty()) laterFailed_ = !kept;
    if (!kept) leaveAgain(std::move(later));
    queue_.erase(queue_.begin(), queue_.begin() + static_cast<std::ptrdiff_t>(batch.size()));
    for (Waiting* waiting : batch) {
        waiting->done = true;
        waiting->wakes.notify_one();
    }
    wakeNext();
}

// Takes those that have come since, up to one that has to be safer, and what was left. With the
// lock held.
void DeviceDatabase::join(std::vector<Waiting*>& batch, std::vector<Change>& later,
                          Durability atMost) {
    const std::size_t together = countTogether();
    while (batch.size() < together) {
        Waiting* arrived = queue_[batch.size()];
        if (arrived->durability == Durability::OnDisk && atMost == Durability::Soon) break;
        batch.push_back(arrived);
    }
    if (laterFailed_ && !queue_.front()->isFlush()) return;
    std::move(later_.begin(), later_.end(), std::back_inserter(later));
    later_.clear();
}

// What was left and could not be kept may be more than the disk takes: it is tried again by flushes
// alone, so that nobody else's change fails with it. With the lock held.
std::size_t DeviceDatabase::countTogether() const {
    if (!laterFailed_) return queue_.size();
    const auto flush = std::find_if(queue_.begin(), queue_.end(),
                                    [](const Waiting* waiting) { return waiting->isFlush(); });
    return std::max<std::size_t>(1, static_cast<std::size_t>(flush - queue_.begin()));
}

// What throws ends the process: others wait for what it was part of. False when nothing was kept.
bool DeviceDatabase::commitTogether(std::vector<Waiting*>& batch,
                                    std::vector<Change>& later) noexcept {
    const bool onDisk = std::any_of(batch.begin(), batch.end(), [](const Waiting* waiting) {
        return waiting->durability == Durability::OnDisk;
    });
    const Durability durability = onDisk ? Durability::OnDisk : Durability::Soon;
    Status whole = beginTransaction(durability);
    if (whole) whole = makeAll(batch, later, durability);
    if (whole) whole = commit();
    if (whole) return true;
    for (Waiting* waiting : batch) {
        if (waiting->status) waiting->status = whole;
    }
    return false;
}

// Those that come until the commit begins join.
Status DeviceDatabase::makeAll(std::vector<Waiting*>& batch, std::vector<Change>& later,
                               Durability durability) {
    std::size_t made = 0;
    std::size_t madeLater = 0;
    for (int joins = kMostJoins; made < batch.size() || madeLater < later.size(); --joins) {
        for (; madeLater < later.size(); ++madeLater) {
            const Status done = noteFailure(later[madeLater](*writer_));
            if (!done) writer_->noteLoss();  // what it did not get to
            if (Status lost = whyLost(done); !lost) return lost;
        }
        for (; made < batch.size(); ++made) {
            batch[made]->status = makeChange(batch[made]->change);
            if (Status lost = whyLost(batch[made]->status); !lost) return lost;
        }
        if (joins > 0) joinArrived(batch, later, durability);
    }
    return {};
}

// Some failures (a full disk) end the transaction on their own, with all that was done in it.
Status DeviceDatabase::whyLost(const Status& last) const {
    if (writer_->inTransaction()) return {};
    if (!last) return last;
    return deviceError(DeviceErrorCode::CannotUse,
                       "the device's database " + writer_->path() +
                           " did not keep what was written; check the disk, and run it again");
}

// They were left before what is left now. With the lock held.
void DeviceDatabase::leaveAgain(std::vector<Change> later) {
    std::move(later_.begin(), later_.end(), std::back_inserter(later));
    later_ = std::move(later);
}

void DeviceDatabase::joinArrived(std::vector<Waiting*>& batch, std::vector<Change>& later,
                                 Durability durability) {
    const std::lock_guard lock(mutex_);
    if (!isFrozen_) join(batch, later, durability);
}

Status DeviceDatabase::beginTransaction(Durability durability) {
    if (durability != writerDurability_) {
        const bool onDisk = durability == Durability::OnDisk;
        const char* pragma = onDisk ? "PRAGMA synchronous = FULL" : "PRAGMA synchronous = NORMAL";
        if (Status status = writer_->execute(pragma); !status) return status;
        writerDurability_ = durability;
    }
    return writer_->query("BEGIN IMMEDIATE").run();
}

Status DeviceDatabase::makeChange(const Change& change) {
    if (!change) return {};
    if (Status status = writer_->query("SAVEPOINT change").run(); !status) return status;
    Status status = change(*writer_);
    if (!writer_->inTransaction()) return status;
    if (!status) writer_->undoSince("ROLLBACK TO change");
    if (Status released = writer_->query("RELEASE change").run(); !released && status) {
        return released;
    }
    return status;
}

Status DeviceDatabase::commit() {
    Status committed = writer_->query("COMMIT").run();
    if (!committed && writer_->inTransaction()) writer_->query("ROLLBACK").run().ignore();
    return committed;
}

void DeviceDatabase::changeLater(Change change) {
    if (!writer_) return;
    const std::lock_guard lock(mutex_);
    later_.push_back(std::move(change));
    if (flusherIsIdle_) flusherWakes_.notify_all();
    if (flusher_.joinable() || closing_) return;
    try {
        flusher_ = std::thread([this] { flushNowAndThen(); });
    } catch (const std::system_error&) {
        // Without a thread they go with the next change, or when the database is closed.
        return;
    }
}

void DeviceDatabase::flushNowAndThen() {
    std::unique_lock lock(mutex_);
    while (!closing_) {
        flusherIsIdle_ = true;
        flusherWakes_.wait(lock, [this] { return closing_ || !later_.empty(); });
        flusherIsIdle_ = false;
        flusherWakes_.wait_for(lock, kLongestDelay, [this] { return closing_; });
        if (later_.empty()) continue;
        lock.unlock();
        flush().ignore();
        lock.lock();
    }
}

Status DeviceDatabase::flush() {
    {
        const std::lock_guard lock(mutex_);
        if (isFrozen_ || (later_.empty() && queue_.empty())) return {};
    }
    return change(Durability::Soon, nullptr);
}

bool DeviceDatabase::freeze(std::chrono::milliseconds longest) {
    std::unique_lock lock(mutex_);
    isFrozen_ = true;
    return writerIsFree_.wait_for(lock, longest, [this] { return !isWriterInUse_; });
}

std::optional<ErrorRecord> DeviceDatabase::failure() const {
    const std::lock_guard lock(mutex_);
    return failure_;
}

Status DeviceDatabase::noteFailure(Status status) {
    if (status || status.error().domain != kDeviceErrorDomain) return status;
    const std::lock_guard lock(mutex_);
    if (!failure_) failure_ = status.error();
    return status;
}

}  // namespace appsync
