#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <set>
#include <string>

#include "platform/FileURL.h"
#include "platform/InstallPromises.h"
#include "platform/Result.h"

namespace appsync {

class InstallCoordinator;
class InstallCoordinatorObserver;
class InstallPlaceholder;

/// What a coordinator is for.
enum class CoordinatorKind {
    Initiating,        // a first install
    Updating,          // an update of an application that is installed
    Restoring,         // an application of a restored backup
    RestoringDemoted,  // one whose payload had been offloaded
};

/// A registration for the coordinators of a set of clients. It ends with the object: no call begins
/// after that.
class AppInstallObserver {
  public:
    virtual ~AppInstallObserver() = default;
};

/// The platform's install-coordination service: one coordinator at most for each application.
///
/// Callable on any thread. Nothing throws. Null results are failures without an error of their own.
class InstallCoordinatorService {
  public:
    /// What a look-up gives: a coordinator, or null with the reason where there is one.
    struct Coordinator {
        std::shared_ptr<InstallCoordinator> coordinator;
        bool wasCreated = false;
        std::optional<ErrorRecord> error;
    };
    enum class Creation { OnlyExisting, CreateIfNotExisting };
    /// Called on a thread of the service's; `error` is null on success.
    using UninstallCompletion = std::function<void(const ErrorRecord* error)>;

    virtual ~InstallCoordinatorService() = default;

    /// Whether installs are to go through coordinators. Asked once for each client object.
    [[nodiscard]] virtual bool isCoordinationEnabled() = 0;

    /// The coordinator of an application, whichever client created it: one of the kind when there
    /// is one, else, if asked for, a new one that `client` creates. No coordinator and no error
    /// when there is none and none was to be created. An error when one of another kind stands in
    /// the way, when an update is wanted of what is not installed, or when the identifier is not
    /// legal (1 to 255 bytes of letters, digits, '.', '-', '_'; not "." or "..").
    [[nodiscard]] virtual Coordinator coordinator(CoordinatorKind kind,
                                                  const std::string& identifier,
                                                  CoordinationClient client, Creation creation) = 0;
    /// The coordinator of an application, of whatever kind; null when there is none. `client` is
    /// who asks.
    [[nodiscard]] virtual std::shared_ptr<InstallCoordinator> existingCoordinator(
        const std::string& identifier, CoordinationClient client) = 0;

    /// A new promise, attached to nothing yet. `path` is where the file lies or will lie.
    [[nodiscard]] virtual std::shared_ptr<PathTransferPromise> makePathTransferPromise(
        const std::string& name, CoordinationClient client, const std::optional<FileURL>& path,
        std::uint64_t diskSpaceNeeded) = 0;
    [[nodiscard]] virtual std::shared_ptr<OutOfBandPromise> makeOutOfBandPromise(
        const std::string& name, CoordinationClient client, std::uint64_t diskSpaceNeeded) = 0;
    /// A new placeholder, attached to nothing yet. `installType` is an `InstallType`.
    [[nodiscard]] virtual std::shared_ptr<InstallPlaceholder> makeAppPlaceholder(
        const std::string& name, const std::string& identifier, std::uint64_t installType,
        CoordinationClient client) = 0;

    /// Uninstalls the application, or its placeholder where one covers it, without asking the
    /// person who uses the device. Returns at once; the completion is called exactly once.
    virtual void uninstallApp(const std::string& identifier, UninstallCompletion completion) = 0;

    /// The error that a person may see: it says that an install did not come about, and holds the
    /// underlying error.
    [[nodiscard]] virtual ErrorRecord userPresentableError(
        std::int64_t code, const std::optional<ErrorRecord>& underlying) = 0;

    /// From now on the delegate, held weakly, hears of every coordinator that one of the clients
    /// has created and that has no observer of its own: what the service went on with before
    /// anybody looked at it is told here. `serviceName` is the name under which the delegate can be
    /// reached. Null when that cannot be; it may be asked for again.
    [[nodiscard]] virtual std::shared_ptr<AppInstallObserver> makeAppInstallObserver(
        const std::string& serviceName, const std::set<CoordinationClient>& clients,
        std::weak_ptr<InstallCoordinatorObserver> delegate) = 0;
};

}  // namespace appsync
