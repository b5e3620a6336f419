#include "system/RegistryObservers.h"

#include <algorithm>
#include <chrono>
#include <system_error>
#include <utility>

namespace appsync {

namespace {

constexpr std::chrono::milliseconds kBetweenReports{250};

// Of many installs the lists are long: so that they cost a sync next to nothing, however many there
// are, nineteen parts of twenty of the time are rest.
std::chrono::steady_clock::duration restAfter(std::chrono::steady_clock::duration work) {
    return std::max<std::chrono::steady_clock::duration>(kBetweenReports, 19 * work);
}

bool sameIdentifiers(const std::vector<AppProxy>& left, const std::vector<AppProxy>& right) {
    return std::equal(left.begin(), left.end(), right.begin(), right.end(),
                      [](const AppProxy& one, const AppProxy& other) {
                          return one.applicationIdentifier == other.applicationIdentifier;
                      });
}

bool sameLists(const InstallsUnderWay& left, const InstallsUnderWay& right) {
    return sameIdentifiers(left.prioritized, right.prioritized) &&
           sameIdentifiers(left.paused, right.paused);
}

}  // namespace

RegistryObservers::RegistryObservers(std::function<InstallsUnderWay()> list)
    : list_(std::move(list)) {}

RegistryObservers::~RegistryObservers() {
    {
        const std::lock_guard lock(mutex_);
        closing_ = true;
        wakes_.notify_all();
    }
    if (thread_.joinable()) thread_.join();
}

void RegistryObservers::add(std::weak_ptr<AppRegistryObserver> observer) {
    const AppRegistryObserver* address = observer.lock().get();
    if (address == nullptr) return;
    std::unique_lock lock(mutex_);
    registrations_.push_back({std::move(observer), address});
    if (startThread()) {
        wakes_.notify_all();
        return;
    }
    // Without a thread the first report, which observers wait for, comes from here.
    refresh(lock);
    while (tellNext(lock)) continue;
}

bool RegistryObservers::startThread() {
    if (thread_.joinable()) return true;
    try {
        thread_ = std::thread([this] { work(); });
        return true;
    } catch (const std::system_error&) {
        return false;
    }
}

void RegistryObservers::remove(const AppRegistryObserver* observer) {
    std::unique_lock lock(mutex_);
    std::erase_if(registrations_, [observer](const Registration& registration) {
        return registration.address == observer;
    });
    if (std::this_thread::get_id() == thread_.get_id()) return;
    callEnded_.wait(lock, [this, observer] { return called_ != observer; });
}

void RegistryObservers::touch() {
    const std::lock_guard lock(mutex_);
    // Whoever touched it first has woken the thread, or `add` will.
    if (!std::exchange(touched_, true)) wakes_.notify_all();
}

void RegistryObservers::work() {
    std::unique_lock lock(mutex_);
    auto nextReport = std::chrono::steady_clock::now();
    while (!closing_) {
        const auto newcomer = [this] { return closing_ || anyoneWaits(); };
        wakes_.wait(lock, [&] { return newcomer() || (touched_ && !registrations_.empty()); });
        // Changes come in bursts; a newcomer does not wait for their end.
        wakes_.wait_until(lock, nextReport, newcomer);
        if (closing_) return;
        const auto begun = std::chrono::steady_clock::now();
        refresh(lock);
        while (!closing_ && tellNext(lock)) continue;
        const auto ended = std::chrono::steady_clock::now();
        nextReport = ended + restAfter(ended - begun);
    }
}

bool RegistryObservers::anyoneWaits() const {
    return std::any_of(registrations_.begin(), registrations_.end(),
                       [](const Registration& registration) { return registration.heard == 0; });
}

void RegistryObservers::refresh(std::unique_lock<std::mutex>& lock) {
    touched_ = false;
    lock.unlock();
    InstallsUnderWay lists = list_();
    lock.lock();
    const bool changed = number_ == 0 || !sameLists(lists, lists_);
    lists_ = std::move(lists);
    if (changed) ++number_;
}

// Calls one observer that has not heard of the lists. False when there is none.
bool RegistryObservers::tellNext(std::unique_lock<std::mutex>& lock) {
    const auto next = std::find_if(
        registrations_.begin(), registrations_.end(),
        [this](const Registration& registration) { return registration.heard != number_; });
    if (next == registrations_.end()) return false;
    next->heard = number_;
    std::shared_ptr<AppRegistryObserver> observer = next->observer.lock();
    if (observer == nullptr) return true;
    called_ = observer.get();
    lock.unlock();
    observer->applicationInstallsArePrioritized(lists_.prioritized, lists_.paused);
    // Perhaps the last: its destructor may call `remove`. Whoever removes an observer may take away
    // what that stands on, so the call ends only now.
    observer.reset();
    lock.lock();
    called_ = nullptr;
    callEnded_.notify_all();
    return true;
}

}  // namespace appsync
