#pragma once

// host/watch: what stands between the plug-in and the device in a session, and sees what becomes of
// each application.
//
//     SessionWatch.h    the plug-in's calls, with WatchedCoordination.h those of the coordination
//                       service; keeps what it sees as SessionFacts.h and tells SyncEvents.h
//     SyncEvents.h      one order for the events of all threads; a SyncDisplay shows them
//     PreparationEvents.h    tells it of what comes before the first transfer
//     WaitLimit.h       how long a session waits for applications that run
//     SyncDaemon.h      the daemon that the plug-in is told of, with TransferQueue.h, which is
//                       what it has still to send
//
// Includes host/plan and the device. host/session drives, host/output implements SyncDisplay.

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <thread>
#include <vector>

#include "host/watch/WaitLimit.h"
#include "platform/AppRegistry.h"
#include "platform/DevicePolicyService.h"
#include "platform/HomeScreenService.h"
#include "platform/InstallCoordinatorService.h"

namespace appsync {

class CallGate;
class Device;
class SessionFacts;
class SyncEvents;
struct Platform;

/// Sees what the plug-in does with the registry and the home screen, and what policy tells it,
/// keeps it as facts, and reports it as events; how far installs have come it asks the device now
/// and then. Of an install through the coordination service it sees the delivery, what the device
/// tells of it and the end. Hands everything on to the device's own services.
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
    [[nodiscard]] InstallCoordinatorService& coordination() { return *coordination_; }

    /// Nothing more of the coordination service reaches the client or this object; returns when
    /// what was under way has. To be called before the client goes.
    void closeCoordination();

    /// The number of bytes that stand for the whole install of an application.
    void setSize(const std::string& identifier, std::uint64_t bytes);
    /// While removing, an uninstall is one that the host has asked for.
    void setRemoving(bool removing) { removing_ = removing; }
    /// Called for each application that the client prepares the device for, before its package is
    /// sent. To be set before the session.
    void onAsking(std::function<void()> asking) { asking_ = std::move(asking); }

    /// The longest that the session waits for applications that run, counted while there is nothing
    /// else to do; without it, as long as they run. Then what waits has failed, and is told so;
    /// `leave` is called where the client itself waits, which nothing but the end of the process
    /// ends: on the direct path, on a thread of this object's own. To be set before the session.
    void limitWait(std::chrono::milliseconds longest, std::function<void()> leave);
    /// Everything that was to be sent has been: from now on there is only to be waited.
    void nothingMoreIsSent() { waitLimit_.nothingMoreIsSent(); }
    [[nodiscard]] bool isWaitOver() const { return isWaitOver_; }

    /// Whether the client installs through coordinators.
    [[nodiscard]] bool isCoordinated() const { return isCoordinated_; }
    /// The package of an application is about to be the device's to install. `received` is where
    /// the device has it, `file` what was sent: the one that a person can look at when it fails.
    void packageSent(const std::string& identifier, const std::string& received,
                     const std::string& file);
    /// The same through the coordination service, beside it.
    void packageDelivered(const std::string& identifier);
    /// The same for one whose package an earlier session has delivered.
    void takeUpDelivered(const std::string& identifier);
    /// Waits until the uninstalls that the client has handed to the coordination service have
    /// ended, or a stop is requested. Whether they have.
    bool waitForUninstalls(const std::atomic<bool>& stopRequested);
    /// No install is under way any more: what was delivered and never heard of again has failed.
    void settleDelivered();

    // From the services.
    void placeholderAsked() const;
    void placeholderRefused(const std::string& identifier, const ErrorRecord& error);
    void terminationDenied(const std::string& identifier);
    void installBegins(const std::string& identifier);
    void installEnded(const std::string& identifier, const Status& status);
    void uninstallEnded(const std::string& identifier, const Status& status);

    // From the coordination service.
    void setCoordinated(bool isCoordinated) { isCoordinated_ = isCoordinated; }
    void coordinatorRefused(const std::string& identifier, const ErrorRecord& error);
    void coordinatorIsOf(const std::string& identifier, CoordinationClient client);
    void installCancelled(const std::string& identifier, const ErrorRecord& reason,
                          CoordinationClient client);
    void uninstallBegins();
    void coordinatedUninstallEnded(const std::string& identifier, const Status& status);

  private:
    // An install of the coordination service's.
    struct Delivered {
        std::optional<std::chrono::system_clock::time_point> toldTry;
    };
    // A package that has been sent.
    struct SentPackage {
        std::string received;
        std::string file;
    };

    void poll();
    void reportProgress();
    void reportBegin(const std::string& identifier, std::uint64_t size);
    void reportDenials();
    void reportDenial(const std::string& identifier);
    void reportWaiting(const std::string& identifier,
                       std::chrono::system_clock::time_point nextTry);
    [[nodiscard]] std::vector<std::string> deliveredIdentifiers() const;
    [[nodiscard]] std::string causeOf(const std::string& identifier,
                                      const ErrorRecord& error) const;
    void checkWait();
    void giveUpWaiting(const std::string& identifier);
    std::uint64_t sizeOf(const std::string& identifier) const;

    Device& device_;
    SyncEvents& events_;
    SessionFacts& facts_;
    std::unique_ptr<AppRegistry> registry_;
    std::unique_ptr<HomeScreenService> homeScreen_;
    std::unique_ptr<DevicePolicyService> policy_;
    const std::shared_ptr<CallGate> gate_;
    std::unique_ptr<InstallCoordinatorService> coordination_;
    std::atomic<bool> removing_ = false;
    std::atomic<bool> isCoordinated_ = false;
    std::atomic<bool> isWaitOver_ = false;
    std::function<void()> asking_;
    std::function<void()> leave_;
    WaitLimit waitLimit_{std::chrono::steady_clock::now()};

    mutable std::mutex mutex_;
    std::condition_variable ended_;
    // Guarded by mutex_.
    std::map<std::string, std::uint64_t> sizes_;
    std::map<std::string, std::uint64_t> installing_;  // to their sizes
    std::map<std::string, Delivered> delivered_;       // through coordinators
    std::map<std::string, SentPackage> sent_;          // in this session
    std::set<std::string> concluded_;                  // what was installed, or failed
    std::size_t uninstalls_ = 0;                       // of the coordination service's, under way
    bool isOver_ = false;

    std::thread poller_;
};

}  // namespace appsync
