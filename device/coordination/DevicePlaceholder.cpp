#include "device/coordination/DevicePlaceholder.h"

#include "device/coordination/DevicePromise.h"
#include "device/values/DeviceError.h"

namespace appsync {

namespace {

Status refusedPlaceholder(const std::string& identifier, std::string_view reason) {
    return coordinationError(
        CoordinationErrorCode::Refused,
        "the placeholder of " + identifier + " is refused: " + std::string(reason));
}

}  // namespace

DevicePlaceholder::DevicePlaceholder(std::string name, std::string identifier,
                                     std::uint64_t installType)
    : identifier_(std::move(identifier)) {
    configuration_.name = std::move(name);
    configuration_.identifier = identifier_;
    configuration_.installType = installType;
}

std::string DevicePlaceholder::description() const {
    const PlaceholderConfiguration now = configuration();
    return identifier_ + " (" + now.name + ", install type " + std::to_string(now.installType) +
           ")";
}

Status DevicePlaceholder::setIconPromise(const std::shared_ptr<PathTransferPromise>& promise) {
    const std::shared_ptr<LivePromise> icon = liveOf(promise.get());
    if (icon == nullptr) {
        return coordinationError(CoordinationErrorCode::Refused,
                                 "the icon of " + identifier_ + " is no promise of this service");
    }
    if (Status status = mayChange(); !status) return status;
    if (!icon->attach({})) {
        return coordinationError(CoordinationErrorCode::Refused,
                                 "the promise " + icon->values().name +
                                     " belongs to another coordinator or placeholder");
    }
    return change([&](PlaceholderConfiguration& configuration) { configuration.icon = icon; });
}

Status DevicePlaceholder::setAttributes(const PlaceholderAttributes& attributes) {
    return change([&](PlaceholderConfiguration& now) { now.attributes = attributes; });
}

Status DevicePlaceholder::setMetadata(const std::optional<StoreMetadata>& metadata) {
    return change([&](PlaceholderConfiguration& now) { now.metadata = metadata; });
}

Status DevicePlaceholder::setSinf(const Bytes& sinf) {
    return change([&](PlaceholderConfiguration& now) { now.sinf = sinf; });
}

Status DevicePlaceholder::setConfigurationComplete() {
    std::function<void()> complete;
    if (Status status = mayChange(); !status) return status;
    {
        const std::lock_guard lock(mutex_);
        complete_ = true;
        if (owner_) complete = owner_->configurationComplete;
    }
    if (complete) complete();
    return {};
}

void DevicePlaceholder::cancelForReason(const ErrorRecord& /*reason*/,
                                        CoordinationClient /*client*/) {
    std::function<void()> cancelled;
    {
        const std::lock_guard lock(mutex_);
        if (cancelled_) return;
        cancelled_ = true;
        if (owner_) cancelled = owner_->cancelled;
    }
    if (cancelled) cancelled();
}

PlaceholderConfiguration DevicePlaceholder::configuration() const {
    const std::lock_guard lock(mutex_);
    return configuration_;
}

Status DevicePlaceholder::hand(Owner owner) {
    const std::lock_guard lock(mutex_);
    if (cancelled_) return refusedPlaceholder(identifier_, "it was given up");
    if (owner_) return refusedPlaceholder(identifier_, "a coordinator has it already");
    owner_ = std::move(owner);
    return {};
}

bool DevicePlaceholder::isConfigurationComplete() const {
    const std::lock_guard lock(mutex_);
    return complete_ && !cancelled_;
}

Status DevicePlaceholder::mayChange() const {
    const std::lock_guard lock(mutex_);
    if (cancelled_) return refusedPlaceholder(identifier_, "it was given up");
    if (complete_) return refusedPlaceholder(identifier_, "its configuration is complete");
    return {};
}

Status DevicePlaceholder::change(const std::function<void(PlaceholderConfiguration&)>& edit) {
    if (Status status = mayChange(); !status) return status;
    const std::lock_guard lock(mutex_);
    edit(configuration_);
    return {};
}

}  // namespace appsync
