#include "device/coordination/CoordinatedInstaller.h"

#include <algorithm>
#include <system_error>
#include <utility>

#include "device/coordination/CoordinationBook.h"
#include "device/coordination/LiveCoordinator.h"
#include "device/database/CoordinationTables.h"
#include "device/database/Database.h"
#include "device/database/DeviceDatabase.h"
#include "device/install/ApplicationInstall.h"
#include "device/screen/DeviceHomeScreen.h"
#include "device/values/DeviceError.h"
#include "platform/FileURL.h"

namespace appsync {

namespace {

/// So many installs at a time, as many as on the direct path: most of them wait for the disk, and
/// the more wait, the more share a sync and a commit.
constexpr std::size_t kWorkers = 10;
constexpr std::chrono::milliseconds kWatchInterval{100};
/// Why the service wants an application to end: the reason that every install gives.
constexpr std::uint64_t kAssertionReason = 1;

}  // namespace

CoordinatedInstaller::CoordinatedInstaller(const InstallContext& context, CoordinationBook& book,
                                           DeviceHomeScreen& homeScreen,
                                           std::chrono::seconds retryInterval)
    : context_(context), book_(book), homeScreen_(homeScreen), retryInterval_(retryInterval) {}

CoordinatedInstaller::~CoordinatedInstaller() { close(); }

void CoordinatedInstaller::start() {
    const std::lock_guard lock(mutex_);
    startThreads();
}

void CoordinatedInstaller::install(const Coordinator& coordinator) {
    const std::lock_guard lock(mutex_);
    installs_.push_back(coordinator);
    startThreads();
    wakes_.notify_one();
}

void CoordinatedInstaller::hold() {
    const std::lock_guard lock(mutex_);
    held_ = true;
}

void CoordinatedInstaller::letGo() {
    const std::lock_guard lock(mutex_);
    held_ = false;
    wakes_.notify_all();
}

bool CoordinatedInstaller::isHeld() const {
    const std::lock_guard lock(mutex_);
    return held_;
}

// With the lock held.
bool CoordinatedInstaller::mayInstall() const { return !held_ && !installs_.empty(); }

void CoordinatedInstaller::post(std::function<void()> task) {
    {
        const std::lock_guard lock(mutex_);
        startThreads();
        if (!closing_ && !workers_.empty()) {
            tasks_.push_back(std::move(task));
            wakes_.notify_one();
            return;
        }
    }
    task();
}

// With fewer threads than wished for it is slower, and nothing else; with none, installs wait for
// the next attempt to start some.
void CoordinatedInstaller::startThreads() {
    if (closing_) return;
    try {
        while (workers_.size() < kWorkers) workers_.emplace_back([this] { work(); });
        if (!watcher_.joinable()) watcher_ = std::thread([this] { watch(); });
    } catch (const std::system_error&) {
        return;
    }
}

void CoordinatedInstaller::close() {
    std::vector<std::thread> threads;
    {
        const std::lock_guard lock(mutex_);
        closing_ = true;
        installs_.clear();
        denied_.clear();
        threads = std::exchange(workers_, {});
        if (watcher_.joinable()) threads.push_back(std::move(watcher_));
        wakes_.notify_all();
        watcherWakes_.notify_all();
    }
    for (std::thread& thread : threads) thread.join();
}

void CoordinatedInstaller::work() {
    std::unique_lock lock(mutex_);
    while (true) {
        wakes_.wait(lock, [this] { return closing_ || !tasks_.empty() || mayInstall(); });
        std::function<void()> job;
        if (!tasks_.empty()) {
            job = std::move(tasks_.front());
            tasks_.pop_front();
        } else if (closing_) {
            return;
        } else {
            job = [this, coordinator = std::move(installs_.front())] { installNow(coordinator); };
            installs_.pop_front();
        }
        lock.unlock();
        job();
        job = nullptr;
        lock.lock();
    }
}

void CoordinatedInstaller::installNow(const Coordinator& coordinator) {
    if (coordinator->hasEnded()) return;
    const CoordinationHerald::Help help = book_.helpToTell();
    TerminationAssertionResult asked =
        homeScreen_.takeTerminationAssertion(coordinator->identifier, kAssertionReason);
    if (asked.outcome == TerminationAssertionResult::kDenied) {
        const std::lock_guard lock(mutex_);
        if (!closing_) denied_.push_back({coordinator, Clock::now() + retryInterval_});
        return;
    }
    const Status status = unpackAndCommit(*coordinator);
    asked.assertion.reset();  // whoever hears of the end may run the application
    if (status) {
        book_.installed(coordinator);
    } else {
        book_.failed(coordinator, status.error());
    }
}

Status CoordinatedInstaller::unpackAndCommit(LiveCoordinator& coordinator) {
    const auto asset = coordinator.promise(PromiseRole::Asset);
    const std::optional<std::string> path = asset ? asset->values().path : std::nullopt;
    const std::optional<FileURL> package =
        path ? FileURL::fromPath(*path, false) : std::optional<FileURL>();
    if (!package) {
        return coordinationError(CoordinationErrorCode::Refused,
                                 "nobody has said where the package of " + coordinator.identifier +
                                     " lies; sync it again");
    }
    return installApplicationWith(
        context_, coordinator.identifier, *package, book_.installTypeOf(coordinator),
        [&](Database& database) -> Status {
            const Result<bool> forgotten = coordinator.forget(database);
            if (!forgotten) return forgotten.error();
            if (*forgotten) return {};
            return coordinationError(CoordinationErrorCode::Cancelled,
                                     "the install of " + coordinator.identifier + " was cancelled");
        });
}

// What others do.

void CoordinatedInstaller::watch() {
    std::unique_lock lock(mutex_);
    while (!closing_) {
        watcherWakes_.wait_for(lock, kWatchInterval, [this] { return closing_; });
        if (closing_) return;
        lock.unlock();
        book_.hearOfOthers();
        retryDenied();
        lock.lock();
    }
}

void CoordinatedInstaller::retryDenied() {
    for (const Coordinator& coordinator : takeRetries()) install(coordinator);
}

// Takes out those whose time has come, whose application has ended, or who are over.
std::vector<CoordinatedInstaller::Coordinator> CoordinatedInstaller::takeRetries() {
    std::vector<Denied> waiting;
    {
        const std::lock_guard lock(mutex_);
        waiting.swap(denied_);
    }
    std::vector<Coordinator> retries;
    std::vector<Denied> stay;
    for (Denied& denied : waiting) {
        const bool now = denied.nextTry <= Clock::now() || denied.coordinator->hasEnded() ||
                         !runs(denied.coordinator->identifier);
        if (now) {
            retries.push_back(std::move(denied.coordinator));
        } else {
            stay.push_back(std::move(denied));
        }
    }
    const std::lock_guard lock(mutex_);
    std::move(stay.begin(), stay.end(), std::back_inserter(denied_));
    return retries;
}

bool CoordinatedInstaller::runs(const std::string& identifier) {
    bool found = false;
    context_.database
        .read([&](Database& database) {
            Query rows = database.query("SELECT 1 FROM running WHERE identifier = ?");
            rows.bind(identifier);
            found = rows.next();
            return rows.status();
        })
        .ignore();
    return found;
}

}  // namespace appsync
