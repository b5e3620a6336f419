#pragma once

// device/coordination: the platform's install-coordination service, the one part of a device with a
// life of its own.
//
//     service   CoordinationService.h: what clients call; wires everything below
//     handles   DeviceCoordinator.h, DevicePlaceholder.h, DevicePromise.h: what clients hold
//     book      CoordinationBook.h: which coordinators there are, their pieces
//               (CoordinationPieces.cpp), their ends (CoordinationEndings.cpp), each in memory
//               (LiveCoordinator.h, LivePromise.h)
//     threads   CoordinatedInstaller.h installs, CoordinationHerald.h calls observers
//
// A call goes from a handle to the book, from there to the database (CoordinationTables) and, when
// a coordinator is complete, to the installer, which works with device/install; the herald tells.
// No lock is held across a transaction or a call of an observer. Includes install, screen,
// services, database, values and system/; made by `Device` alone.

#include <chrono>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "device/coordination/CoordinatedInstaller.h"
#include "device/coordination/CoordinationBook.h"
#include "device/coordination/CoordinationHerald.h"
#include "device/install/InstallContext.h"
#include "platform/InstallCoordinatorService.h"

namespace appsync {

class DeviceHomeScreen;
class DevicePolicy;

/// A device's install-coordination service: its coordinators stand in the database and outlive the
/// process, its installs run on threads of its own.
///
/// What earlier sessions left is gone on with when somebody starts it or observes a client.
/// Observers are called one after the other, on one thread.
class CoordinationService final : public InstallCoordinatorService {
  public:
    /// Everything outlives it. Beside a session (`Look`) it does no more than create and cancel.
    CoordinationService(const InstallContext& context, DevicePolicy& policy,
                        DeviceHomeScreen& homeScreen, std::chrono::seconds retryInterval,
                        CoordinationBook::Access access);
    ~CoordinationService() override;

    [[nodiscard]] bool isCoordinationEnabled() override;
    [[nodiscard]] Coordinator coordinator(CoordinatorKind kind, const std::string& identifier,
                                          CoordinationClient client, Creation creation) override;
    [[nodiscard]] std::shared_ptr<InstallCoordinator> existingCoordinator(
        const std::string& identifier, CoordinationClient client) override;
    [[nodiscard]] std::shared_ptr<PathTransferPromise> makePathTransferPromise(
        const std::string& name, CoordinationClient client, const std::optional<FileURL>& path,
        std::uint64_t diskSpaceNeeded) override;
    [[nodiscard]] std::shared_ptr<OutOfBandPromise> makeOutOfBandPromise(
        const std::string& name, CoordinationClient client, std::uint64_t diskSpaceNeeded) override;
    /// Null when the identifier is not a legal one.
    [[nodiscard]] std::shared_ptr<InstallPlaceholder> makeAppPlaceholder(
        const std::string& name, const std::string& identifier, std::uint64_t installType,
        CoordinationClient client) override;
    void uninstallApp(const std::string& identifier, UninstallCompletion completion) override;
    /// The underlying error stands under "UnderlyingError": "Domain", "Code", "Description".
    [[nodiscard]] ErrorRecord userPresentableError(
        std::int64_t code, const std::optional<ErrorRecord>& underlying) override;
    [[nodiscard]] std::shared_ptr<AppInstallObserver> makeAppInstallObserver(
        const std::string& serviceName, const std::set<CoordinationClient>& clients,
        std::weak_ptr<InstallCoordinatorObserver> delegate) override;

    // See Device.

    void start();
    Status create(const std::string& identifier, CoordinationClient client);
    Status cancel(const std::string& identifier, CoordinationClient client);
    [[nodiscard]] std::vector<std::string> installsUnderWay();
    [[nodiscard]] bool waitForInstalls(std::chrono::milliseconds longest);
    void holdInstalls() { installer_.hold(); }
    void letInstallsGo() { installer_.letGo(); }

    /// No call of an observer begins any more, and no thread is left.
    void close();

  private:
    [[nodiscard]] Status uninstall(const std::string& identifier);

    const InstallContext context_;
    DevicePolicy& policy_;
    const CoordinationBook::Access access_;
    CoordinationHerald herald_;
    const std::shared_ptr<CoordinationBook> book_;
    CoordinatedInstaller installer_;
};

}  // namespace appsync
