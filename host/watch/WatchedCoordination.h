#pragma once

#include <condition_variable>
#include <memory>
#include <mutex>

#include "platform/InstallCoordinatorService.h"

namespace appsync {

class SessionWatch;

/// Lets calls of the device's threads through until it is closed.
class CallGate {
  public:
    /// False when it is closed. Each true needs a `leave`.
    [[nodiscard]] bool enter();
    void leave();
    /// Returns when nobody is inside; nobody comes in from now on.
    void close();

  private:
    std::mutex mutex_;
    std::condition_variable left_;
    // Guarded by mutex_.
    std::size_t inside_ = 0;
    bool isClosed_ = false;
};

/// Hands every call of the plug-in on to the device's coordination service and every call of its
/// observers on to the plug-in, and tells the watch of those that it has to know of, first. The
/// plug-in's observers hear nothing more once the gate is closed, so that plug-in and watch can go
/// while the service is at work.
[[nodiscard]] std::unique_ptr<InstallCoordinatorService> watchCoordination(
    InstallCoordinatorService& service, SessionWatch& watch, std::shared_ptr<CallGate> gate);

}  // namespace appsync
