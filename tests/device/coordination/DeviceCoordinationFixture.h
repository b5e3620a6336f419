#pragma once

#include <condition_variable>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/InstallCoordinator.h"
#include "platform/InstallCoordinatorService.h"
#include "tests/device/DevicePlatformFixture.h"

namespace appsync {

/// Keeps what it hears of coordinators: "placeholder com.example.atlas", "complete
/// com.example.atlas", "failed com.example.atlas", "cancelled com.example.atlas, client 3".
class CoordinationListener final : public InstallCoordinatorObserver {
  public:
    void promiseDidBeginFulfillmentWithIdentifier(std::uint64_t promise) override;
    void coordinatorDidInstallPlaceholder(
        const std::shared_ptr<InstallCoordinator>& coordinator) override;
    void coordinatorDidCompleteSuccessfully(
        const std::shared_ptr<InstallCoordinator>& coordinator) override;
    void coordinatorCanceledWithReason(const std::shared_ptr<InstallCoordinator>& coordinator,
                                       const ErrorRecord& reason,
                                       CoordinationClient client) override;
    void coordinatorShouldPrioritize(
        const std::shared_ptr<InstallCoordinator>& coordinator) override;

    /// Waits until that many things have been heard. Gives all of them.
    [[nodiscard]] std::vector<std::string> waitFor(std::size_t count);
    [[nodiscard]] std::vector<std::string> heard();
    /// Called with each thing that is heard, on the thread that tells of it.
    void setReaction(std::function<void(const std::string&)> reaction);

  private:
    void hear(std::string what);

    std::mutex mutex_;
    // Protected by mutex_.
    std::condition_variable heardMore_;
    std::vector<std::string> heard_;
    std::function<void(const std::string&)> reaction_;
};

/// A device whose installs are coordinated, and a client of its service: the sync daemon's.
class DeviceCoordinationFixture : public DevicePlatformFixture {
  protected:
    DeviceCoordinationFixture();

    [[nodiscard]] InstallCoordinatorService& service() { return platform().coordination; }
    /// Ends the session with everything in it, however far it has come.
    void endAndForget();

    /// Looks up or creates a coordinator, and observes it.
    std::shared_ptr<InstallCoordinator> coordinator(const std::string& identifier,
                                                    CoordinatorKind kind);
    /// Hands in everything but the package, as the plug-in does: options, the list of initial
    /// assets, the promise of the package, and a placeholder with an icon.
    std::shared_ptr<InstallCoordinator> prepare(const std::string& identifier,
                                                CoordinatorKind kind = CoordinatorKind::Initiating);
    /// Says that the package lies at a device path.
    static void deliver(InstallCoordinator& coordinator, const std::string& package);
    /// Prepares, stages a package, delivers it and waits until the install has ended.
    void installCoordinated(const std::string& identifier, const std::string& version = "1.0",
                            CoordinatorKind kind = CoordinatorKind::Initiating);
    [[nodiscard]] std::shared_ptr<PathTransferPromise> pathPromise(const std::string& name);
    [[nodiscard]] std::shared_ptr<InstallPlaceholder> placeholder(const std::string& identifier);

    /// Puts an icon where the plug-in makes the files of a placeholder. Gives its device path.
    std::string stageIcon(const std::string& identifier);
    [[nodiscard]] bool hasPlaceholder(const std::string& identifier);
    /// The record of the one coordinator of the identifier; nothing when there is none.
    [[nodiscard]] std::optional<CoordinatorRecord> recordOf(const std::string& identifier);
    /// Waits, for as long as a test may take, until it is so.
    [[nodiscard]] static bool eventually(const std::function<bool()>& isSo);

    const std::shared_ptr<CoordinationListener> listener_ =
        std::make_shared<CoordinationListener>();
};

}  // namespace appsync
