#include "device/coordination/CoordinationHerald.h"

#include <algorithm>
#include <chrono>
#include <iterator>
#include <system_error>
#include <utility>

#include "device/coordination/LiveCoordinator.h"

namespace appsync {

namespace {

constexpr std::chrono::milliseconds kMoment{2};

// Whom this thread helps.
thread_local const CoordinationHerald* helped = nullptr;

}  // namespace

/// Who observes which clients.
class CoordinationHerald::Registrations {
  public:
    void add(const Registration* registration) {
        const std::lock_guard lock(mutex_);
        all_.push_back(registration);
    }
    /// Waits for a call of it to end, except on the thread of that call.
    void remove(const Registration* registration) {
        std::unique_lock lock(mutex_);
        std::erase(all_, registration);
        callEnded_.wait(
            lock, [&] { return called_ != registration || caller_ == std::this_thread::get_id(); });
    }
    /// Makes the call for each registration of a client.
    void call(CoordinationClient client, const Call& call);

  private:
    std::mutex mutex_;
    // Protected by mutex_. Registrations stand here while they live.
    std::vector<const Registration*> all_;
    const Registration* called_ = nullptr;
    std::thread::id caller_;
    std::condition_variable callEnded_;
};

class CoordinationHerald::Registration final : public AppInstallObserver {
  public:
    Registration(std::shared_ptr<Registrations> registrations,
                 std::set<CoordinationClient> observed,
                 std::weak_ptr<InstallCoordinatorObserver> hearer)
        : clients(std::move(observed)),
          delegate(std::move(hearer)),
          registrations_(std::move(registrations)) {
        registrations_->add(this);
    }
    Registration(const Registration&) = delete;
    Registration& operator=(const Registration&) = delete;
    ~Registration() override { registrations_->remove(this); }

    const std::set<CoordinationClient> clients;
    const std::weak_ptr<InstallCoordinatorObserver> delegate;

  private:
    const std::shared_ptr<Registrations> registrations_;
};

void CoordinationHerald::Registrations::call(CoordinationClient client, const Call& call) {
    std::unique_lock lock(mutex_);
    const std::vector<const Registration*> now = all_;
    for (const Registration* registration : now) {
        // An earlier call may have ended this one.
        if (std::find(all_.begin(), all_.end(), registration) == all_.end()) continue;
        if (!registration->clients.contains(client)) continue;
        std::shared_ptr<InstallCoordinatorObserver> delegate = registration->delegate.lock();
        if (delegate == nullptr) continue;
        called_ = registration;
        caller_ = std::this_thread::get_id();
        lock.unlock();
        call(*delegate);
        delegate.reset();  // perhaps the last: not with the lock held
        lock.lock();
        called_ = nullptr;
        callEnded_.notify_all();
    }
}

CoordinationHerald::CoordinationHerald() : registrations_(std::make_shared<Registrations>()) {}

CoordinationHerald::~CoordinationHerald() { close(); }

std::shared_ptr<AppInstallObserver> CoordinationHerald::observe(
    const std::set<CoordinationClient>& clients,
    std::weak_ptr<InstallCoordinatorObserver> delegate) {
    return std::make_shared<Registration>(registrations_, clients, std::move(delegate));
}

void CoordinationHerald::tell(std::shared_ptr<LiveCoordinator> coordinator, Call call,
                              std::function<void()> told) {
    const std::lock_guard lock(mutex_);
    if (closing_) return;
    const auto held = held_.find(coordinator->id);
    const bool isHelping = helped == this;
    News news{std::move(coordinator), std::move(call), std::move(told)};
    if (held != held_.end()) return held->second.push_back(std::move(news));
    news_.push_back(std::move(news));
    if (!isHelping) wake();
}

CoordinationHerald::Help::Help(CoordinationHerald& herald) : herald_(herald) { helped = &herald; }

CoordinationHerald::Help::~Help() {
    helped = nullptr;
    std::unique_lock lock(herald_.mutex_);
    herald_.deliverAll(lock);
}

void CoordinationHerald::hold(const LiveCoordinator& coordinator) {
    const std::lock_guard lock(mutex_);
    held_.try_emplace(coordinator.id);
}

void CoordinationHerald::release(const LiveCoordinator& coordinator) {
    const std::lock_guard lock(mutex_);
    const auto held = held_.find(coordinator.id);
    if (held == held_.end()) return;
    std::move(held->second.begin(), held->second.end(), std::back_inserter(news_));
    held_.erase(held);
    if (!closing_ && !news_.empty()) wake();
}

// With the lock held.
void CoordinationHerald::wake() {
    if (isIdle_) wakes_.notify_all();
    if (thread_.joinable()) return;
    try {
        thread_ = std::thread([this] { work(); });
    } catch (const std::system_error&) {
        // They are told with the next news, when there may be a thread.
        return;
    }
}

void CoordinationHerald::close() {
    std::deque<News> dropped;
    std::map<std::int64_t, std::vector<News>> droppedToo;
    {
        const std::lock_guard lock(mutex_);
        closing_ = true;
        dropped.swap(news_);
        droppedToo.swap(held_);
        wakes_.notify_all();
    }
    if (thread_.joinable()) thread_.join();
    std::unique_lock lock(mutex_);
    wakes_.wait(lock, [this] { return !isTelling_; });
}

void CoordinationHerald::work() {
    std::unique_lock lock(mutex_);
    while (true) {
        isIdle_ = true;
        wakes_.wait(lock, [this] { return closing_ || (!news_.empty() && !isTelling_); });
        isIdle_ = false;
        if (closing_) return;
        deliverAll(lock);
        // What comes within a moment need not wake anybody.
        wakes_.wait_for(lock, kMoment, [this] { return closing_; });
    }
}

void CoordinationHerald::deliverAll(std::unique_lock<std::mutex>& lock) {
    if (isTelling_) return;
    isTelling_ = true;
    while (!closing_ && !news_.empty()) {
        {
            const News news = std::move(news_.front());
            news_.pop_front();
            lock.unlock();
            deliver(news);
        }
        lock.lock();
    }
    isTelling_ = false;
    if (closing_) wakes_.notify_all();
}

void CoordinationHerald::deliver(const News& news) {
    if (const auto observer = news.coordinator->observer()) {
        news.call(*observer);
    } else {
        registrations_->call(news.coordinator->client, news.call);
    }
    if (news.told) news.told();
}

}  // namespace appsync
