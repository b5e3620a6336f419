#pragma once

#include <memory>

#include "device/coordination/LivePromise.h"
#include "platform/InstallPromises.h"

namespace appsync {

/// A handle on a promise of a device's coordination service.
template <typename Kind>
class DevicePromise : public Kind {
  public:
    explicit DevicePromise(std::shared_ptr<LivePromise> promise) : promise_(std::move(promise)) {}

    [[nodiscard]] std::string name() const override { return promise_->values().name; }
    [[nodiscard]] CoordinationClient clientIdentifier() const override {
        return promise_->values().client;
    }
    [[nodiscard]] double percentComplete() const override { return promise_->values().percent; }
    void setPercentComplete(double percent) override { promise_->setPercent(percent); }
    [[nodiscard]] bool isComplete() const override { return promise_->isComplete(); }
    void setComplete() override { promise_->setComplete(); }
    void cancelForReason(const ErrorRecord& /*reason*/, CoordinationClient /*client*/) override {
        promise_->cancel();
    }

    [[nodiscard]] const std::shared_ptr<LivePromise>& live() const noexcept { return promise_; }

  private:
    const std::shared_ptr<LivePromise> promise_;
};

using DeviceOutOfBandPromise = DevicePromise<OutOfBandPromise>;

class DevicePathPromise final : public DevicePromise<PathTransferPromise> {
  public:
    using DevicePromise::DevicePromise;

    [[nodiscard]] std::optional<FileURL> transferPath() const override {
        const PromiseValues values = live()->values();
        if (!values.path) return std::nullopt;
        return FileURL::fromPath(*values.path, false);
    }
    void setTransferPath(const FileURL& path) override { live()->setPath(path.path()); }
};

/// What stands behind a handle; null where it is none of a device's service.
[[nodiscard]] inline std::shared_ptr<LivePromise> liveOf(const PathTransferPromise* promise) {
    const auto* own = dynamic_cast<const DevicePathPromise*>(promise);
    return own == nullptr ? nullptr : own->live();
}
[[nodiscard]] inline std::shared_ptr<LivePromise> liveOf(const OutOfBandPromise* promise) {
    const auto* own = dynamic_cast<const DeviceOutOfBandPromise*>(promise);
    return own == nullptr ? nullptr : own->live();
}

}  // namespace appsync
