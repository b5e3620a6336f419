#pragma once

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <thread>

#include "platform/AppRegistry.h"
#include "platform/DevicePolicyService.h"
#include "platform/HomeScreenService.h"

namespace appsync {

class Device;
class SessionFacts;
class SyncEvents;
struct Platform;

/// Sees what the plug-in does with the registry and the home screen, and what policy tells it,
/// keeps it as facts, and reports it as events; how far installs have come it asks the device now
/// and then. Hands everything on to the device's own services.
///
/// Callable on any thread. Must outlive the client; device, events and facts must outlive it.
class SessionWatch {
  public:
    SessionWatch(Device& device, const Platform& platform, SyncEvents& events, SessionFacts& facts);
    SessionWatch(const SessionWatch&) = delete;
    SessionWatch& operator=(const SessionWatch&) = delete;
    ~SessionWatch();

    /// What the client gets in place of the device's own.
    [[nodiscard]] AppRegistry& registry() { return *registry_; }
    [[nodiscard]] HomeScreenService& homeScreen() { return *homeScreen_; }
    [[nodiscard]] DevicePolicyService& policy() { return *policy_; }

    /// The number of bytes that stand for the whole install of an application.
    void setSize(const std::string& identifier, std::uint64_t bytes);
    /// While removing, an uninstall is one that the host has asked for.
    void setRemoving(bool removing) { removing_ = removing; }

    // From the services.
    void placeholderRefused(const std::string& identifier, const ErrorRecord& error);
    void terminationDenied(const std::string& identifier);
    void installBegins(const std::string& identifier);
    void installEnded(const std::string& identifier, const Status& status);
    void uninstallEnded(const std::string& identifier, const Status& status);

  private:
    void poll();
    void reportProgress();
    std::uint64_t sizeOf(const std::string& identifier) const;

    Device& device_;
    SyncEvents& events_;
    SessionFacts& facts_;
    std::unique_ptr<AppRegistry> registry_;
    std::unique_ptr<HomeScreenService> homeScreen_;
    std::unique_ptr<DevicePolicyService> policy_;
    std::atomic<bool> removing_ = false;

    mutable std::mutex mutex_;
    std::condition_variable ended_;
    // Guarded by mutex_.
    std::map<std::string, std::uint64_t> sizes_;
    std::map<std::string, std::uint64_t> installing_;  // to their sizes
    bool isOver_ = false;

    std::thread poller_;
};

}  // namespace appsync
