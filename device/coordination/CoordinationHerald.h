#pragma once

#include <condition_variable>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <set>
#include <thread>
#include <vector>

#include "platform/InstallCoordinatorService.h"

namespace appsync {

class LiveCoordinator;

/// Tells observers of coordinators what happens to them, on a thread of its own or of one that
/// helps, one call after the other, in the order in which it happened. A coordinator without an
/// observer of its own is told to whoever observes the client that created it.
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
    void tell(std::shared_ptr<LiveCoordinator> coordinator, Call call,
              std::function<void()> told = {});

    /// From now on nothing is told of the coordinator; other news is.
    void hold(const LiveCoordinator& coordinator);
    /// Tells what was held back. Does nothing where nothing is held.
    void release(const LiveCoordinator& coordinator);

    /// As long as it lives, what its thread tells wakes nobody; as it goes, its thread, which is
    /// one of the service's, tells it itself, unless another is at it.
    class Help {
      public:
        explicit Help(CoordinationHerald& herald);
        ~Help();
        Help(const Help&) = delete;
        Help& operator=(const Help&) = delete;

      private:
        CoordinationHerald& herald_;
    };

    /// No call begins any more; waits for one that has begun. Not to be called by an observer.
    void close();

  private:
    class Registration;
    class Registrations;
    struct News {
        std::shared_ptr<LiveCoordinator> coordinator;
        Call call;
        std::function<void()> told;
    };

    void wake();
    void work();
    void deliverAll(std::unique_lock<std::mutex>& lock);
    void deliver(const News& news);

    const std::shared_ptr<Registrations> registrations_;

    std::mutex mutex_;
    // Protected by mutex_.
    std::condition_variable wakes_;
    bool isTelling_ = false;  // some thread delivers news, until there is none
    bool isIdle_ = false;     // the own thread waits to be woken
    std::deque<News> news_;
    std::map<std::int64_t, std::vector<News>> held_;  // by the ids of their coordinators
    bool closing_ = false;
    std::thread thread_;  // started with the first news
};

}  // namespace appsync
