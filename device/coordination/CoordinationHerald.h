#pragma once

#include <chrono>
#include <condition_variable>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <set>
#include <thread>
#include <vector>

#include "platform/InstallCoordinatorService.h"

namespace appsync {

class LiveCoordinator;

/// Tells observers of coordinators what happens to them, on a thread of its own, one call after
/// the other, in the order in which it happened. A coordinator without an observer of its own is
/// told to whoever observes the client that created it.
///
/// Callable on any thread. Its registrations may outlive it.
class CoordinationHerald {
  public:
    using Call = std::function<void(InstallCoordinatorObserver&)>;

    CoordinationHerald();
    ~CoordinationHerald();
    CoordinationHerald(const CoordinationHerald&) = delete;
    CoordinationHerald& operator=(const CoordinationHerald&) = delete;

    /// Observes what those clients have created, until the result is destroyed.
    [[nodiscard]] std::shared_ptr<AppInstallObserver> observe(
        const std::set<CoordinationClient>& clients,
        std::weak_ptr<InstallCoordinatorObserver> delegate);

    /// Has the observers of the coordinator called; then, also when there are none, calls `told`.
    /// News that has a delay is not told before, and holds up what comes after it.
    void tell(std::shared_ptr<LiveCoordinator> coordinator, Call call,
              std::function<void()> told = {},
              std::chrono::milliseconds delay = std::chrono::milliseconds(0));

    /// No call begins any more; waits for one that has begun. Not to be called by an observer.
    void close();

  private:
    using Clock = std::chrono::steady_clock;
    class Registration;
    class Registrations;
    struct News {
        std::shared_ptr<LiveCoordinator> coordinator;
        Call call;
        std::function<void()> told;
        Clock::time_point notBefore;
    };

    void work();
    void deliver(const News& news);

    const std::shared_ptr<Registrations> registrations_;

    std::mutex mutex_;
    // Protected by mutex_.
    std::condition_variable wakes_;
    std::deque<News> news_;
    bool closing_ = false;
    std::thread thread_;  // started with the first news
};

}  // namespace appsync
