#include "device/coordination/DeviceCoordinator.h"

#include "device/coordination/CoordinationBook.h"
#include "device/coordination/DevicePlaceholder.h"
#include "device/coordination/DevicePromise.h"
#include "device/coordination/LiveCoordinator.h"

namespace appsync {

DeviceCoordinator::~DeviceCoordinator() { tellNews(); }

std::optional<std::string> DeviceCoordinator::bundleIdentifier() const {
    return coordinator_->identifier;
}

CoordinationClient DeviceCoordinator::creatorIdentifier() const { return coordinator_->client; }

std::optional<ErrorRecord> DeviceCoordinator::error() const { return coordinator_->error(); }

std::string DeviceCoordinator::description() const {
    return coordinator_->identifier + " (" + nameOf(coordinator_->kind) + ", client " +
           std::to_string(coordinator_->client) + ")";
}

void DeviceCoordinator::setObserver(std::weak_ptr<InstallCoordinatorObserver> observer) {
    coordinator_->setObserver(std::move(observer));
}

bool DeviceCoordinator::hasInstallOptions() const {
    return coordinator_->snapshot().options.has_value();
}

Status DeviceCoordinator::setInstallOptions(const InstallOptions& options) {
    return book_->setOptions(coordinator_, options);
}

bool DeviceCoordinator::hasInitialODRAssetPromises() const {
    return coordinator_->snapshot().hasInitialAssets;
}

Status DeviceCoordinator::setInitialODRAssetPromises(
    const std::vector<std::shared_ptr<PathTransferPromise>>& promises) {
    std::vector<std::shared_ptr<LivePromise>> live;
    live.reserve(promises.size());
    for (const auto& promise : promises) live.push_back(liveOf(promise.get()));
    return book_->setInitialAssets(coordinator_, live);
}

std::shared_ptr<PathTransferPromise> DeviceCoordinator::appAssetPromise() const {
    auto promise = coordinator_->promise(PromiseRole::Asset);
    if (promise == nullptr) return nullptr;
    return std::make_shared<DevicePathPromise>(std::move(promise));
}

Status DeviceCoordinator::setAppAssetPromise(const std::shared_ptr<PathTransferPromise>& promise) {
    return book_->setPromise(coordinator_, PromiseRole::Asset, liveOf(promise.get()));
}

std::optional<CoordinationClient> DeviceCoordinator::appAssetPromiseResponsibleClient() const {
    return coordinator_->snapshot().responsible;
}

Status DeviceCoordinator::setAppAssetPromiseResponsibleClient(CoordinationClient client) {
    tellNews();
    return book_->setResponsible(coordinator_, client);
}

bool DeviceCoordinator::hasUserDataPromise() const {
    return coordinator_->promise(PromiseRole::UserData) != nullptr;
}

Status DeviceCoordinator::setUserDataPromise(const std::shared_ptr<OutOfBandPromise>& promise) {
    return book_->setPromise(coordinator_, PromiseRole::UserData, liveOf(promise.get()));
}

bool DeviceCoordinator::hasPlaceholderPromise() const {
    return coordinator_->snapshot().placeholder != PlaceholderState::None;
}

Status DeviceCoordinator::setPlaceholderPromise(
    const std::shared_ptr<InstallPlaceholder>& placeholder) {
    holdsNews_ = true;
    book_->holdNews(*coordinator_);
    return book_->setPlaceholder(coordinator_,
                                 std::dynamic_pointer_cast<DevicePlaceholder>(placeholder));
}

void DeviceCoordinator::tellNews() {
    if (holdsNews_.exchange(false)) book_->tellNews(*coordinator_);
}

void DeviceCoordinator::cancelForReason(const ErrorRecord& reason, CoordinationClient client) {
    book_->cancel(coordinator_, reason, client);
}

}  // namespace appsync
