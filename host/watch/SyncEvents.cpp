#include "host/watch/SyncEvents.h"

#include <algorithm>
#include <system_error>
#include <thread>

namespace appsync {

std::string_view nameOf(SyncEventKind kind) {
    switch (kind) {
        case SyncEventKind::Started:
            return "started";
        case SyncEventKind::Progress:
            return "progress";
        case SyncEventKind::Waiting:
            return "waiting";
        case SyncEventKind::Ended:
            return "ended";
    }
    return "";
}

std::string_view nameOf(SyncPhase phase) {
    switch (phase) {
        case SyncPhase::Prepare:
            return "prepare";
        case SyncPhase::Remove:
            return "remove";
        case SyncPhase::Transfer:
            return "transfer";
        case SyncPhase::Install:
            return "install";
    }
    return "";
}

std::string_view nameOf(SyncState state) {
    switch (state) {
        case SyncState::Active:
            return "active";
        case SyncState::Waiting:
            return "waiting";
        case SyncState::Finished:
            return "finished";
        case SyncState::Failed:
            return "failed";
    }
    return "";
}

unsigned percentOf(std::uint64_t done, std::uint64_t total) {
    if (done >= total) return 100;
    const double fraction = static_cast<double>(done) / static_cast<double>(total);
    return std::min(99U, static_cast<unsigned>(fraction * 100));
}

namespace {

bool isNews(const SyncEvent& progress, const SyncEvent& last) {
    if (last.kind == SyncEventKind::Ended) return false;  // it comes too late
    // What waits is looked at all the same, and goes on only when it has come further.
    const bool isOtherState = progress.state != last.state && last.state != SyncState::Waiting;
    return isOtherState ||
           percentOf(progress.done, progress.total) > percentOf(last.done, last.total);
}

}  // namespace

void SyncEvents::tellOfTime() {
    if (!display_.isLive() || ticker_.joinable()) return;
    try {
        ticker_ = std::thread([this] { tickOn(); });
    } catch (const std::system_error&) {
        // It is drawn at events only.
    }
}

SyncEvents::~SyncEvents() {
    {
        const std::lock_guard guard(mutex_);
        isFinished_ = true;
    }
    over_.notify_all();
    if (ticker_.joinable()) ticker_.join();
}

void SyncEvents::tickOn() {
    constexpr std::chrono::milliseconds kInterval{250};
    std::unique_lock lock(mutex_);
    while (!over_.wait_for(lock, kInterval, [this] { return isFinished_; })) display_.tick();
}

void SyncEvents::expect(const SyncTotals& totals) {
    const std::lock_guard guard(mutex_);
    if (!isFinished_) display_.expect(totals);
}

void SyncEvents::doing(std::string_view what) {
    const std::lock_guard guard(mutex_);
    if (!isFinished_) display_.doing(what);
}

void SyncEvents::note(std::string_view text) {
    const std::lock_guard guard(mutex_);
    if (!isFinished_) display_.note(text);
}

void SyncEvents::report(SyncEvent event) {
    const std::lock_guard guard(mutex_);
    if (isFinished_) return;
    const auto [position, isFirst] = shown_.try_emplace({event.phase, event.identifier}, event);
    SyncEvent& last = position->second;
    if (!isFirst) {
        if (last.total > 0) event.total = last.total;
        event.done = std::max(event.done, last.done);
    }
    event.done = std::min(event.done, event.total);
    if (!isFirst && event.kind == SyncEventKind::Progress && !isNews(event, last)) return;
    last = event;
    display_.show(event);
}

void SyncEvents::finish(const SyncSummary& summary) {
    const std::lock_guard guard(mutex_);
    finishLocked(summary);
}

void SyncEvents::complainSoon(std::string_view text) {
    const std::unique_lock lock = lockSoon();
    if (lock && !isFinished_) display_.complain(text);
}

bool SyncEvents::finishSoon(const SyncSummary& summary) {
    const std::unique_lock lock = lockSoon();
    if (lock) finishLocked(summary);
    return lock.owns_lock();
}

void SyncEvents::closeSoon() {
    const std::unique_lock lock = lockSoon();
    if (!lock || isFinished_) return;
    isFinished_ = true;
    display_.close();
}

std::unique_lock<std::mutex> SyncEvents::lockSoon() {
    constexpr int kAttempts = 50;
    constexpr std::chrono::milliseconds kBetweenAttempts{10};
    std::unique_lock lock(mutex_, std::try_to_lock);
    for (int attempt = 1; !lock && attempt < kAttempts; ++attempt) {
        std::this_thread::sleep_for(kBetweenAttempts);
        static_cast<void>(lock.try_lock());
    }
    return lock;
}

void SyncEvents::finishLocked(const SyncSummary& summary) {
    if (isFinished_) return;
    isFinished_ = true;
    display_.finish(summary);
}

}  // namespace appsync
