#include "device/install/ProgressBook.h"

#include <map>
#include <mutex>

#include "device/database/Database.h"
#include "device/database/DeviceDatabase.h"

namespace appsync {

namespace {

Status storeProgress(Database& database, const std::string& identifier,
                     const InstallProgress& progress) {
    const auto thousandths = static_cast<std::int64_t>(progress.unpacked * kProgressUnits);
    return database
        .query(
            "UPDATE progress SET state = ?, phase = ?, total = ?, completed = ?, unpacked = ?"
            " WHERE identifier = ?")
        .bind(progress.state, progress.phase, progress.totalUnits, progress.completedUnits,
              thousandths, identifier)
        .run();
}

std::uint64_t phaseAfter(std::uint64_t phase) {
    return phase == kInstallPhaseInstallingPlaceholder ? kInstallPhaseLoading
                                                       : kInstallPhaseInstalling;
}

}  // namespace

InstallProgress readProgress(const Query& row, int column) {
    InstallProgress progress;
    progress.state = row.unsignedInteger(column);
    progress.phase = row.unsignedInteger(column + 1);
    progress.totalUnits = row.integer(column + 2);
    progress.completedUnits = row.integer(column + 3);
    progress.unpacked = static_cast<double>(row.integer(column + 4)) / kProgressUnits;
    return progress;
}

Result<std::optional<InstallProgress>> loadProgress(Database& database,
                                                    const std::string& identifier) {
    Query rows = database.query(
        "SELECT state, phase, total, completed, unpacked FROM progress WHERE identifier = ?");
    rows.bind(identifier);
    std::optional<InstallProgress> progress;
    if (rows.next()) progress = readProgress(rows, 0);
    if (Status status = rows.status(); !status) return status.error();
    return progress;
}

/// What the handles and the book have in common.
class ProgressBook::Shared : public std::enable_shared_from_this<Shared> {
  public:
    Shared(DeviceDatabase& database, std::function<void()> changed)
        : database_(&database), changed_(std::move(changed)) {}

    std::shared_ptr<Handle> handle(const std::string& identifier);
    void forget(const std::string& identifier, std::optional<std::uint64_t> finalState);
    /// The book is gone, and with it the database.
    void close();

    InstallProgress read(const Handle& handle) const;
    void edit(Handle& handle, const std::function<void(InstallProgress&)>& edit);

  private:
    std::optional<InstallProgress> load(const std::string& identifier);
    void storeLater(const std::shared_ptr<Handle>& handle);

    mutable std::mutex mutex_;
    // Protected by mutex_.
    DeviceDatabase* database_;
    std::function<void()> changed_;
    std::map<std::string, std::shared_ptr<Handle>> handles_;
    std::uint64_t forgotten_ = 0;  // how often something was forgotten
};

/// A handle on one install. Its values are protected by the mutex of what is shared.
class ProgressBook::Handle final : public InstallProgressRecord,
                                   public std::enable_shared_from_this<Handle> {
  public:
    Handle(std::shared_ptr<Shared> shared, std::string identifier, InstallProgress progress)
        : shared_(std::move(shared)), identifier_(std::move(identifier)), progress_(progress) {}

    [[nodiscard]] std::uint64_t installState() const override { return read().state; }
    [[nodiscard]] std::uint64_t installPhase() const override { return read().phase; }
    [[nodiscard]] std::int64_t totalUnitCount() const override { return read().totalUnits; }
    [[nodiscard]] std::int64_t completedUnitCount() const override { return read().completedUnits; }

    void setInstallState(std::uint64_t state) override {
        edit([state](InstallProgress& progress) { progress.state = state; });
    }
    void setInstallPhase(std::uint64_t phase) override {
        edit([phase](InstallProgress& progress) { progress.phase = phase; });
    }
    void setTotalUnitCount(std::int64_t count) override {
        edit([count](InstallProgress& progress) { progress.totalUnits = count; });
    }
    void setCompletedUnitCount(std::int64_t count) override {
        edit([count](InstallProgress& progress) { progress.completedUnits = count; });
    }
    void cancel() override { setInstallState(kInstallStateCanceled); }

    [[nodiscard]] std::string description() const override {
        const InstallProgress now = read();
        return "install of " + identifier_ + ": state " + std::to_string(now.state) + ", phase " +
               std::to_string(now.phase) + ", " + std::to_string(now.completedUnits) + " of " +
               std::to_string(now.totalUnits);
    }

    [[nodiscard]] InstallProgress read() const { return shared_->read(*this); }
    void edit(const std::function<void(InstallProgress&)>& change) { shared_->edit(*this, change); }

  private:
    friend class Shared;

    const std::shared_ptr<Shared> shared_;
    const std::string identifier_;
    // Protected by the mutex of shared_.
    InstallProgress progress_;
    bool over_ = false;
    bool storing_ = false;  // the database is to hear of it already
};

std::optional<InstallProgress> ProgressBook::Shared::load(const std::string& identifier) {
    std::optional<InstallProgress> loaded;
    database_
        ->read([&](Database& database) -> Status {
            Result<std::optional<InstallProgress>> progress = loadProgress(database, identifier);
            if (!progress) return progress.error();
            loaded = *progress;
            return {};
        })
        .ignore();
    return loaded;
}

std::shared_ptr<ProgressBook::Handle> ProgressBook::Shared::handle(const std::string& identifier) {
    std::unique_lock lock(mutex_);
    for (;;) {
        if (const auto found = handles_.find(identifier); found != handles_.end()) {
            return found->second;
        }
        if (database_ == nullptr) return nullptr;
        const std::uint64_t before = forgotten_;
        lock.unlock();
        const std::optional<InstallProgress> loaded = load(identifier);
        lock.lock();
        // What was read is of no use when the row may have been made anew meanwhile.
        if (before != forgotten_) continue;
        if (!loaded) return nullptr;
        auto handle = std::make_shared<Handle>(shared_from_this(), identifier, *loaded);
        return handles_.try_emplace(identifier, std::move(handle)).first->second;
    }
}

void ProgressBook::Shared::forget(const std::string& identifier,
                                  std::optional<std::uint64_t> finalState) {
    std::function<void()> changed;
    {
        const std::lock_guard lock(mutex_);
        ++forgotten_;
        changed = changed_;
        if (const auto found = handles_.find(identifier); found != handles_.end()) {
            found->second->over_ = true;
            if (finalState) found->second->progress_.state = *finalState;
            handles_.erase(found);
        }
    }
    if (changed) changed();
}

void ProgressBook::Shared::close() {
    const std::lock_guard lock(mutex_);
    database_ = nullptr;
    changed_ = nullptr;
    for (const auto& [identifier, handle] : handles_) handle->over_ = true;
    handles_.clear();
}

InstallProgress ProgressBook::Shared::read(const Handle& handle) const {
    const std::lock_guard lock(mutex_);
    return handle.progress_;
}

void ProgressBook::Shared::edit(Handle& handle, const std::function<void(InstallProgress&)>& edit) {
    std::function<void()> changed;
    {
        const std::lock_guard lock(mutex_);
        if (handle.over_ || database_ == nullptr) return;
        const InstallProgress before = handle.progress_;
        edit(handle.progress_);
        if (before.state != handle.progress_.state) changed = changed_;
        if (!handle.storing_) storeLater(handle.shared_from_this());
    }
    if (changed) changed();
}

// One row is written for all changes that come until then.
void ProgressBook::Shared::storeLater(const std::shared_ptr<Handle>& handle) {
    handle->storing_ = true;
    database_->changeLater([shared = shared_from_this(), handle](Database& database) {
        InstallProgress now;
        {
            const std::lock_guard lock(shared->mutex_);
            handle->storing_ = false;
            if (handle->over_) return Status();
            now = handle->progress_;
        }
        return storeProgress(database, handle->identifier_, now);
    });
}

ProgressBook::ProgressBook(DeviceDatabase& database, std::function<void()> changed)
    : shared_(std::make_shared<Shared>(database, std::move(changed))) {}

ProgressBook::~ProgressBook() { shared_->close(); }

std::shared_ptr<InstallProgressRecord> ProgressBook::record(const std::string& identifier) {
    return shared_->handle(identifier);
}

std::optional<InstallProgress> ProgressBook::progress(const std::string& identifier) {
    const std::shared_ptr<Handle> handle = shared_->handle(identifier);
    if (handle == nullptr) return std::nullopt;
    return handle->read();
}

void ProgressBook::finishPhase(InstallProgressRecord& record) {
    auto* known = dynamic_cast<Handle*>(&record);
    if (known == nullptr) return;
    known->edit([](InstallProgress& progress) {
        if (progress.phase == kInstallPhaseInstalling) {
            progress.state = kInstallStateFinished;
        } else {
            progress.phase = phaseAfter(progress.phase);
        }
    });
}

void ProgressBook::forget(const std::string& identifier, std::optional<std::uint64_t> finalState) {
    shared_->forget(identifier, finalState);
}

bool ProgressBook::installing(InstallProgressRecord* record, double fraction) {
    auto* known = dynamic_cast<Handle*>(record);
    if (known == nullptr) return true;
    if (known->read().state == kInstallStateCanceled) return false;
    known->edit([fraction](InstallProgress& progress) {
        if (progress.state == kInstallStateWaiting) progress.state = kInstallStateActive;
        progress.phase = kInstallPhaseInstalling;
        progress.unpacked = fraction;
    });
    return true;
}

}  // namespace appsync
