#include "checked/CheckedCoordination.h"

#include "checked/CheckedCompletion.h"
#include "checked/CheckedPromises.h"
#include "platform/LegalIdentifier.h"

namespace appsync {

namespace {

class CheckedInstallObserver final : public AppInstallObserver {
  public:
    CheckedInstallObserver(std::shared_ptr<AppInstallObserver> observer,
                           std::shared_ptr<CheckedDelegate> delegate)
        : observer_(std::move(observer)), delegate_(std::move(delegate)) {}
    ~CheckedInstallObserver() override {
        observer_.reset();
        delegate_->end();
    }
    CheckedInstallObserver(const CheckedInstallObserver&) = delete;
    CheckedInstallObserver& operator=(const CheckedInstallObserver&) = delete;

  private:
    std::shared_ptr<AppInstallObserver> observer_;
    const std::shared_ptr<CheckedDelegate> delegate_;
};

}  // namespace

bool CheckedCoordination::isCoordinationEnabled() {
    const bool isEnabled = service_.isCoordinationEnabled();
    if (isEnabled) book_->noteOthersInstall();
    return isEnabled;
}

InstallCoordinatorService::Coordinator CheckedCoordination::coordinator(
    CoordinatorKind kind, const std::string& identifier, CoordinationClient client,
    Creation creation) {
    const CoordinationWatch::Call call(*watch_);
    Coordinator found = service_.coordinator(kind, identifier, client, creation);
    checkFound(found, identifier, client, creation);
    found.coordinator = observers_->checked(std::move(found.coordinator));
    return found;
}

void CheckedCoordination::checkFound(const Coordinator& found, const std::string& identifier,
                                     CoordinationClient client, Creation creation) const {
    if (found.error) book_->checkHasDomain(*found.error, "the coordination service");
    if (found.coordinator == nullptr) return;
    if (creation == Creation::OnlyExisting && found.wasCreated)
        book_->broken("platform/InstallCoordinatorService.h",
                      "No coordinator and no error when there is none and none was to be created.",
                      "a coordinator was created that was not asked for");
    if (found.error)
        book_->broken(
            "platform/InstallCoordinatorService.h",
            "What a look-up gives: a coordinator, or null with the reason where there is one.",
            "a coordinator and an error were given at a time");
    if (found.wasCreated && found.coordinator->creatorIdentifier() != client)
        book_->broken(
            "platform/InstallCoordinatorService.h",
            "The coordinator of an application, whichever client created it: one of the kind "
            "when there is one, else, if asked for, a new one that `client` creates.",
            "a new coordinator is that of another client");
    checkIdentifier(*found.coordinator, identifier);
}

void CheckedCoordination::checkIdentifier(const InstallCoordinator& found,
                                          const std::string& identifier) const {
    if (!isLegalIdentifier(identifier))
        book_->broken(
            "platform/InstallCoordinatorService.h",
            "An error when one of another kind stands in the way, when an update is wanted of "
            "what is not installed, or when the identifier is not legal (1 to 255 bytes of "
            "letters, digits, '.', '-', '_'; not \".\" or \"..\").",
            "an illegal identifier has a coordinator");
    const auto own = found.bundleIdentifier();
    if (own && *own != identifier)
        book_->broken(
            "platform/InstallCoordinatorService.h",
            "The coordinator of an application, whichever client created it: one of the kind "
            "when there is one, else, if asked for, a new one that `client` creates.",
            "the coordinator of another application was given");
}

std::shared_ptr<InstallCoordinator> CheckedCoordination::existingCoordinator(
    const std::string& identifier, CoordinationClient client) {
    const CoordinationWatch::Call call(*watch_);
    auto found = service_.existingCoordinator(identifier, client);
    if (found != nullptr) checkIdentifier(*found, identifier);
    return observers_->checked(std::move(found));
}

std::shared_ptr<PathTransferPromise> CheckedCoordination::makePathTransferPromise(
    const std::string& name, CoordinationClient client, const std::optional<FileURL>& path,
    std::uint64_t diskSpaceNeeded) {
    const CoordinationWatch::Call call(*watch_);
    auto made = service_.makePathTransferPromise(name, client, path, diskSpaceNeeded);
    if (made == nullptr) return nullptr;
    auto checked = std::make_shared<CheckedPathTransferPromise>(std::move(made), watch_);
    checked->checkNew(name, client);
    if (path && checked->transferPath() != path)
        book_->broken("platform/InstallCoordinatorService.h",
                      "`path` is where the file lies or will lie.",
                      "a new promise has another path");
    return checked;
}

std::shared_ptr<OutOfBandPromise> CheckedCoordination::makeOutOfBandPromise(
    const std::string& name, CoordinationClient client, std::uint64_t diskSpaceNeeded) {
    const CoordinationWatch::Call call(*watch_);
    auto made = service_.makeOutOfBandPromise(name, client, diskSpaceNeeded);
    if (made == nullptr) return nullptr;
    auto checked = std::make_shared<CheckedOutOfBandPromise>(std::move(made), watch_);
    checked->checkNew(name, client);
    return checked;
}

std::shared_ptr<InstallPlaceholder> CheckedCoordination::makeAppPlaceholder(
    const std::string& name, const std::string& identifier, std::uint64_t installType,
    CoordinationClient client) {
    const CoordinationWatch::Call call(*watch_);
    auto made = service_.makeAppPlaceholder(name, identifier, installType, client);
    if (made == nullptr) return nullptr;
    return std::make_shared<CheckedPlaceholder>(std::move(made), identifier, watch_);
}

void CheckedCoordination::uninstallApp(const std::string& identifier,
                                       UninstallCompletion completion) {
    auto once = checkedCompletion(
        book_, queues_, patience_, "uninstallApp", std::move(completion),
        [book = book_](const std::string& seen) {
            book->broken("platform/InstallCoordinatorService.h",
                         "Returns at once; the completion is called exactly once.", seen);
        });
    const CoordinationWatch::Call call(*watch_);
    service_.uninstallApp(identifier, [watch = watch_,
                                       once = std::move(once)](const ErrorRecord* error) {
        if (watch->isCaller()) {
            watch->book().broken("platform/InstallCoordinatorService.h",
                                 "Called on a thread of the service's; `error` is null on success.",
                                 "the completion was called on the thread that was in "
                                 "uninstallApp");
        }
        once(error);
    });
}

ErrorRecord CheckedCoordination::userPresentableError(
    std::int64_t code, const std::optional<ErrorRecord>& underlying) {
    ErrorRecord error = service_.userPresentableError(code, underlying);
    book_->checkHasDomain(error, "userPresentableError");
    return error;
}

std::shared_ptr<AppInstallObserver> CheckedCoordination::makeAppInstallObserver(
    const std::string& serviceName, const std::set<CoordinationClient>& clients,
    std::weak_ptr<InstallCoordinatorObserver> delegate) {
    auto checked = observers_->delegate(delegate);
    auto observer = service_.makeAppInstallObserver(serviceName, clients, checked);
    if (observer == nullptr) return nullptr;
    return std::make_shared<CheckedInstallObserver>(std::move(observer), std::move(checked));
}

}  // namespace appsync
