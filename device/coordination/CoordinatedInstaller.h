#pragma once

#include <chrono>
#include <condition_variable>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "device/install/InstallContext.h"
#include "platform/Result.h"

namespace appsync {

class CoordinationBook;
class DeviceHomeScreen;
class LiveCoordinator;

/// Installs what coordinators have together, on a few threads of its own, and does for the service
/// whatever else takes time. One thread more looks, a few times a second, for what others did to
/// the database: coordinators that they cancelled, applications that an install waits for and that
/// have ended.
///
/// An application that runs is not replaced: its install waits until the application has ended, or
/// until the retry interval is over, and then asks again.
///
/// Callable on any thread. The threads start with the first work.
class CoordinatedInstaller {
  public:
    using Coordinator = std::shared_ptr<LiveCoordinator>;

    /// Everything outlives it.
    CoordinatedInstaller(const InstallContext& context, CoordinationBook& book,
                         DeviceHomeScreen& homeScreen, std::chrono::seconds retryInterval);
    ~CoordinatedInstaller();
    CoordinatedInstaller(const CoordinatedInstaller&) = delete;
    CoordinatedInstaller& operator=(const CoordinatedInstaller&) = delete;

    /// Begins to look for what others do.
    void start();
    /// Installs the application of a coordinator that has all its pieces.
    void install(const Coordinator& coordinator);
    /// From now on no install begins.
    void hold();
    void letGo();
    [[nodiscard]] bool isHeld() const;
    /// Has something done. It is done in any case, at the latest by `close`.
    void post(std::function<void()> task);

    /// Ends the threads. An install that has begun is finished; one that waits is left to the next
    /// session. Not to be called on one of the threads.
    void close();

  private:
    using Clock = std::chrono::steady_clock;
    /// An install whose application runs.
    struct Denied {
        Coordinator coordinator;
        Clock::time_point nextTry;
    };

    void startThreads();
    void work();
    void watch();
    void retryDenied();
    [[nodiscard]] std::vector<Coordinator> takeRetries();
    [[nodiscard]] bool mayInstall() const;
    [[nodiscard]] bool runs(const std::string& identifier);

    void installNow(const Coordinator& coordinator);
    Status unpackAndCommit(LiveCoordinator& coordinator);

    const InstallContext context_;
    CoordinationBook& book_;
    DeviceHomeScreen& homeScreen_;
    const std::chrono::seconds retryInterval_;

    mutable std::mutex mutex_;
    // Protected by mutex_.
    std::condition_variable wakes_;
    std::condition_variable watcherWakes_;
    std::deque<std::function<void()>> tasks_;
    std::deque<Coordinator> installs_;
    std::vector<Denied> denied_;
    std::vector<std::thread> workers_;
    std::thread watcher_;
    bool held_ = false;
    bool closing_ = false;
};

}  // namespace appsync
