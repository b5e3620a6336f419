#pragma once

#include <condition_variable>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "platform/AppRegistry.h"

namespace appsync {

/// The installs under way, as observers hear of them.
struct InstallsUnderWay {
    std::vector<AppProxy> prioritized;
    std::vector<AppProxy> paused;

    /// Adds an install whose record has this state to the list that it belongs to, if to any.
    void add(const AppProxy& proxy, std::uint64_t state) {
        if (state == kInstallStatePaused) paused.push_back(proxy);
        if (state < kInstallStatePaused) prioritized.push_back(proxy);
    }
};

/// Tells the observers of a registry of the installs under way, as `AppRegistryObserver` wants it,
/// on a thread of its own: each new observer once, soon after it was added, and all of them when
/// the lists have changed, a few times a second at most. No lock is held while one is called.
/// Callable on any thread.
class RegistryObservers {
  public:
    /// `list` makes the lists, on that thread; it may take the registry's locks.
    explicit RegistryObservers(std::function<InstallsUnderWay()> list);
    /// No call begins any more. An observer must not destroy this.
    ~RegistryObservers();
    RegistryObservers(const RegistryObservers&) = delete;
    RegistryObservers& operator=(const RegistryObservers&) = delete;

    void add(std::weak_ptr<AppRegistryObserver> observer);
    /// Waits for a call of that observer to end, except on the thread of that call.
    void remove(const AppRegistryObserver* observer);

    /// The lists may have changed.
    void touch();

  private:
    struct Registration {
        std::weak_ptr<AppRegistryObserver> observer;
        const AppRegistryObserver* address = nullptr;
        std::uint64_t heard = 0;  // the number of the lists that it heard last
    };

    [[nodiscard]] bool startThread();
    void work();
    void refresh(std::unique_lock<std::mutex>& lock);
    [[nodiscard]] bool anyoneWaits() const;
    bool tellNext(std::unique_lock<std::mutex>& lock);

    const std::function<InstallsUnderWay()> list_;

    std::mutex mutex_;
    // Protected by mutex_.
    std::condition_variable wakes_;
    std::condition_variable callEnded_;
    std::vector<Registration> registrations_;
    const AppRegistryObserver* called_ = nullptr;
    bool touched_ = false;
    bool closing_ = false;
    std::thread thread_;  // started with the first observer

    // Changed with mutex_ held, by thread_ alone, which reads the lists without.
    InstallsUnderWay lists_;
    std::uint64_t number_ = 0;  // of the lists; 0 before the first
};

}  // namespace appsync
