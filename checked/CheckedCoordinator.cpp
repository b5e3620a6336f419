#include "checked/CheckedCoordinator.h"

#include <utility>

#include "checked/CheckedPromises.h"
#include "checked/CoordinatorObservers.h"

namespace appsync {

CheckedCoordinator::CheckedCoordinator(std::shared_ptr<InstallCoordinator> target,
                                       std::shared_ptr<CoordinatorObservers> observers)
    : ForwardingCoordinator(std::move(target)),
      observers_(std::move(observers)),
      watch_(observers_->watch()) {}

template <typename Asked>
auto CheckedCoordinator::inService(const Asked& asked) const {
    const CoordinationWatch::Call call(*watch_);
    return asked();
}

void CheckedCoordinator::brokenOnce(const std::string& seen) const {
    watch_->book().broken("platform/InstallCoordinator.h",
                          "Each piece is to be asked for before it is set: a second set is refused "
                          "with an error, and the first stands.",
                          seen);
}

void CheckedCoordinator::brokenRefusal(const std::string& seen) const {
    watch_->book().broken("platform/InstallCoordinator.h",
                          "Refuses null, and the placeholder of another application.", seen);
}

std::optional<std::string> CheckedCoordinator::bundleIdentifier() const {
    return inService([&] { return ForwardingCoordinator::bundleIdentifier(); });
}

CoordinationClient CheckedCoordinator::creatorIdentifier() const {
    return inService([&] { return ForwardingCoordinator::creatorIdentifier(); });
}

std::optional<ErrorRecord> CheckedCoordinator::error() const {
    return inService([&] { return ForwardingCoordinator::error(); });
}

std::string CheckedCoordinator::description() const {
    return inService([&] { return ForwardingCoordinator::description(); });
}

void CheckedCoordinator::setObserver(std::weak_ptr<InstallCoordinatorObserver> observer) {
    inService([&] { ForwardingCoordinator::setObserver(observers_->ofOneCoordinator(observer)); });
}

template <typename Set>
Status CheckedCoordinator::setUntilCancelled(std::string_view piece, const Set& set) {
    const bool wasCancelled = isCancelled_;
    Status status = set();
    if (!status) {
        watch_->book().checkHasDomain(status.error(), "a coordinator");
    } else if (wasCancelled) {
        watch_->book().broken(
            "platform/InstallCoordinator.h",
            "On a coordinator that is done or cancelled every set is refused and every question "
            "is answered as when it ended.",
            "a coordinator that was cancelled took " + std::string(piece));
    }
    return status;
}

template <typename Has, typename Set>
Status CheckedCoordinator::setOnce(std::string_view piece, const Has& has, const Set& set) {
    const CoordinationWatch::Call call(*watch_);
    const bool wasThere = has();
    Status status = setUntilCancelled(piece, set);
    if (!status) return status;
    if (wasThere) brokenOnce("a coordinator that had " + std::string(piece) + " took another");
    if (!has() && !ForwardingCoordinator::error())
        brokenOnce("a coordinator took " + std::string(piece) + " and has it not");
    return status;
}

bool CheckedCoordinator::hasInstallOptions() const {
    return inService([&] { return ForwardingCoordinator::hasInstallOptions(); });
}

Status CheckedCoordinator::setInstallOptions(const InstallOptions& options) {
    return setOnce(
        "install options", [&] { return ForwardingCoordinator::hasInstallOptions(); },
        [&] { return ForwardingCoordinator::setInstallOptions(options); });
}

bool CheckedCoordinator::hasInitialODRAssetPromises() const {
    return inService([&] { return ForwardingCoordinator::hasInitialODRAssetPromises(); });
}

Status CheckedCoordinator::setInitialODRAssetPromises(
    const std::vector<std::shared_ptr<PathTransferPromise>>& promises) {
    return setOnce(
        "initial assets", [&] { return ForwardingCoordinator::hasInitialODRAssetPromises(); },
        [&] { return ForwardingCoordinator::setInitialODRAssetPromises(promises); });
}

std::shared_ptr<PathTransferPromise> CheckedCoordinator::appAssetPromise() const {
    auto promise = inService([&] { return ForwardingCoordinator::appAssetPromise(); });
    if (promise == nullptr) return nullptr;
    return std::make_shared<CheckedPathTransferPromise>(std::move(promise), watch_);
}

// One that waits for another package has none of it, so what it has is not asked for here.
Status CheckedCoordinator::setAppAssetPromise(const std::shared_ptr<PathTransferPromise>& promise) {
    return inService([&] {
        return setUntilCancelled(
            "a package", [&] { return ForwardingCoordinator::setAppAssetPromise(promise); });
    });
}

std::optional<CoordinationClient> CheckedCoordinator::appAssetPromiseResponsibleClient() const {
    return inService([&] { return ForwardingCoordinator::appAssetPromiseResponsibleClient(); });
}

Status CheckedCoordinator::setAppAssetPromiseResponsibleClient(CoordinationClient client) {
    return setOnce(
        "a client that brings the package",
        [&] { return ForwardingCoordinator::appAssetPromiseResponsibleClient().has_value(); },
        [&] { return ForwardingCoordinator::setAppAssetPromiseResponsibleClient(client); });
}

bool CheckedCoordinator::hasUserDataPromise() const {
    return inService([&] { return ForwardingCoordinator::hasUserDataPromise(); });
}

Status CheckedCoordinator::setUserDataPromise(const std::shared_ptr<OutOfBandPromise>& promise) {
    return setOnce(
        "a promise of data", [&] { return ForwardingCoordinator::hasUserDataPromise(); },
        [&] { return ForwardingCoordinator::setUserDataPromise(promise); });
}

bool CheckedCoordinator::hasPlaceholderPromise() const {
    return inService([&] { return ForwardingCoordinator::hasPlaceholderPromise(); });
}

Status CheckedCoordinator::setPlaceholderPromise(
    const std::shared_ptr<InstallPlaceholder>& placeholder) {
    Status status = setOnce(
        "a placeholder", [&] { return ForwardingCoordinator::hasPlaceholderPromise(); },
        [&] { return ForwardingCoordinator::setPlaceholderPromise(placeholder); });
    if (status) checkPlaceholder(placeholder.get());
    return status;
}

void CheckedCoordinator::checkPlaceholder(const InstallPlaceholder* placeholder) const {
    if (placeholder == nullptr) {
        brokenRefusal("null was taken for a placeholder");
        return;
    }
    const auto* checked = dynamic_cast<const CheckedPlaceholder*>(placeholder);
    const auto own = bundleIdentifier();
    if (checked != nullptr && own && *own != checked->identifier())
        brokenRefusal("the placeholder of another application was taken");
}

void CheckedCoordinator::cancelForReason(const ErrorRecord& reason, CoordinationClient client) {
    inService([&] { ForwardingCoordinator::cancelForReason(reason, client); });
    isCancelled_ = true;
}

}  // namespace appsync
