#include "device/coordination/CoordinationService.h"

#include "device/coordination/DevicePlaceholder.h"
#include "device/coordination/DevicePromise.h"
#include "device/install/BundleRemoval.h"
#include "device/services/DeviceServices.h"
#include "device/values/DeviceError.h"
#include "device/values/PackageIdentifier.h"

namespace appsync {

namespace {

PromiseValues newPromise(const std::string& name, CoordinationClient client,
                         std::uint64_t diskSpaceNeeded) {
    PromiseValues values;
    values.name = name;
    values.client = client;
    values.diskSpaceNeeded = diskSpaceNeeded;
    return values;
}

std::string nameOf(CoordinationClient client) { return "client " + std::to_string(client); }

}  // namespace

CoordinationService::CoordinationService(const InstallContext& context, DevicePolicy& policy,
                                         DeviceHomeScreen& homeScreen,
                                         std::chrono::seconds retryInterval,
                                         CoordinationBook::Access access)
    : context_(context),
      policy_(policy),
      access_(access),
      book_(std::make_shared<CoordinationBook>(context, herald_, access)),
      installer_(context, *book_, homeScreen, retryInterval) {
    book_->setInstaller([this](const CoordinationBook::Coordinator& coordinator) {
        installer_.install(coordinator);
    });
}

CoordinationService::~CoordinationService() { close(); }

void CoordinationService::close() {
    installer_.close();
    herald_.close();
    book_->close();
}

bool CoordinationService::isCoordinationEnabled() {
    const Result<DeviceSettings> settings = policy_.settings();
    return settings && settings->coordination;
}

CoordinationService::Coordinator CoordinationService::coordinator(CoordinatorKind kind,
                                                                  const std::string& identifier,
                                                                  CoordinationClient client,
                                                                  Creation creation) {
    Coordinator found = book_->lookUp(kind, identifier, client, creation);
    if (found.coordinator != nullptr && access_ == CoordinationBook::Access::Session) {
        installer_.start();
    }
    return found;
}

std::shared_ptr<InstallCoordinator> CoordinationService::existingCoordinator(
    const std::string& identifier, CoordinationClient /*client*/) {
    return book_->existing(identifier);
}

std::shared_ptr<PathTransferPromise> CoordinationService::makePathTransferPromise(
    const std::string& name, CoordinationClient client, const std::optional<FileURL>& path,
    std::uint64_t diskSpaceNeeded) {
    PromiseValues values = newPromise(name, client, diskSpaceNeeded);
    if (path) values.path = path->path();
    return std::make_shared<DevicePathPromise>(std::make_shared<LivePromise>(std::move(values)));
}

std::shared_ptr<OutOfBandPromise> CoordinationService::makeOutOfBandPromise(
    const std::string& name, CoordinationClient client, std::uint64_t diskSpaceNeeded) {
    return std::make_shared<DeviceOutOfBandPromise>(
        std::make_shared<LivePromise>(newPromise(name, client, diskSpaceNeeded)));
}

std::shared_ptr<InstallPlaceholder> CoordinationService::makeAppPlaceholder(
    const std::string& name, const std::string& identifier, std::uint64_t installType,
    CoordinationClient /*client*/) {
    if (!isLegalIdentifier(identifier)) return nullptr;
    return std::make_shared<DevicePlaceholder>(name, identifier, installType);
}

void CoordinationService::uninstallApp(const std::string& identifier,
                                       UninstallCompletion completion) {
    installer_.post([this, identifier, completion = std::move(completion)] {
        const Status status = uninstall(identifier);
        if (completion) completion(status ? nullptr : &status.error());
    });
}

// What is removed takes its coordinator along; where nothing stands yet, there is only that.
Status CoordinationService::uninstall(const std::string& identifier) {
    if (Status legal = requireLegalIdentifier(identifier); !legal) return legal;
    const Status removed = removeBundles(context_, identifier, Removal::PlaceholderFirst);
    book_->hearOfOthers();
    if (removed || !isRegistryError(removed.error(), RegistryErrorCode::NothingInstalled)) {
        return removed;
    }
    return cancel(identifier, 0) ? Status() : removed;
}

ErrorRecord CoordinationService::userPresentableError(
    std::int64_t code, const std::optional<ErrorRecord>& underlying) {
    std::string sentence = "the application was not installed";
    if (underlying) sentence += ": " + underlying->description();
    ErrorRecord error = ErrorRecord::make(kCoordinationErrorDomain, code, sentence);
    if (!underlying) return error;
    error.userInfo.set("UnderlyingError", PropertyList::map({
                                              {"Domain", underlying->domain},
                                              {"Code", underlying->code},
                                              {"Description", underlying->description()},
                                          }));
    return error;
}

std::shared_ptr<AppInstallObserver> CoordinationService::makeAppInstallObserver(
    const std::string& /*serviceName*/, const std::set<CoordinationClient>& clients,
    std::weak_ptr<InstallCoordinatorObserver> delegate) {
    auto observer = herald_.observe(clients, std::move(delegate));
    start();
    return observer;
}

void CoordinationService::start() {
    if (access_ == CoordinationBook::Access::Look || !isCoordinationEnabled()) return;
    installer_.start();
    book_->resume();
}

Status CoordinationService::create(const std::string& identifier, CoordinationClient client) {
    if (!isCoordinationEnabled()) {
        return coordinationError(CoordinationErrorCode::NotEnabled,
                                 "installs are not coordinated on this device; turn that on "
                                 "(appsync set DEVICE coordination=on)");
    }
    return book_->create(identifier, client);
}

Status CoordinationService::cancel(const std::string& identifier, CoordinationClient client) {
    if (Status legal = requireLegalIdentifier(identifier); !legal) return legal;
    const auto coordinator = book_->find(identifier);
    if (coordinator == nullptr) {
        return coordinationError(CoordinationErrorCode::NoCoordinator,
                                 "there is no coordinator for " + identifier + " to cancel");
    }
    book_->cancel(coordinator,
                  coordinationError(CoordinationErrorCode::Cancelled,
                                    nameOf(client) + " cancelled the install of " + identifier),
                  client);
    return {};
}

std::vector<std::string> CoordinationService::installsUnderWay() {
    return book_->installsUnderWay();
}

bool CoordinationService::waitForInstalls(std::chrono::milliseconds longest) {
    const auto patience = installer_.isHeld() ? std::chrono::milliseconds(0) : longest;
    return book_->waitForInstalls(patience);
}

}  // namespace appsync
