#pragma once

#include <atomic>
#include <memory>
#include <optional>
#include <string>
#include <utility>

#include "checked/CoordinationWatch.h"
#include "contract/forwarding/ForwardingCoordination.h"

// The promises and placeholders of an install-coordination service, looked at.
// `ForwardingCoordinator` and `ForwardingPlaceholder` unwrap them when they are handed in.

namespace appsync {

/// Looks at the progress of a promise.
template <typename Forwarding>
class CheckedPromise final : public Forwarding {
  public:
    template <typename Target>
    CheckedPromise(std::shared_ptr<Target> target, std::shared_ptr<CoordinationWatch> watch)
        : Forwarding(std::move(target)), watch_(std::move(watch)) {}

    [[nodiscard]] double percentComplete() const override {
        const CoordinationWatch::Call call(*watch_);
        const double percent = Forwarding::percentComplete();
        if (!(percent >= 0.0 && percent <= 1.0))
            watch_->book().broken("platform/InstallPromises.h", "From 0.0 to 1.0.",
                                  "a progress of " + std::to_string(percent));
        return percent;
    }
    void setPercentComplete(double percent) override {
        const CoordinationWatch::Call call(*watch_);
        const std::uint64_t before = ++watch_->progressChanges();
        const double former = Forwarding::percentComplete();
        Forwarding::setPercentComplete(percent);
        const double latter = percentComplete();
        if (watch_->progressChanges() != before || percent < former || latter >= former) return;
        watch_->book().broken(
            "platform/InstallPromises.h",
            "An object is a handle on the service's record: two handles on one promise show the "
            "same.",
            "the progress was set to " + std::to_string(percent) +
                " and is less than it was before");
    }
    void setComplete() override {
        const CoordinationWatch::Call call(*watch_);
        Forwarding::setComplete();
    }
    void cancelForReason(const ErrorRecord& reason, CoordinationClient client) override {
        const CoordinationWatch::Call call(*watch_);
        Forwarding::cancelForReason(reason, client);
    }

    /// Looks at a promise that was just made.
    void checkNew(const std::string& name, CoordinationClient client) const {
        const std::string made = Forwarding::name();
        if (made != name)
            brokenNew("a new promise is named '" + made + "', and not '" + name + "'");
        if (Forwarding::clientIdentifier() != client)
            brokenNew("a new promise is that of another client");
        if (Forwarding::isComplete()) brokenNew("a new promise is kept already");
        static_cast<void>(percentComplete());
    }

  private:
    void brokenNew(const std::string& seen) const {
        watch_->book().broken("platform/InstallCoordinatorService.h",
                              "A new promise, attached to nothing yet.", seen);
    }

    const std::shared_ptr<CoordinationWatch> watch_;
};

using CheckedPathTransferPromise = CheckedPromise<ForwardingPathTransferPromise>;
using CheckedOutOfBandPromise = CheckedPromise<ForwardingOutOfBandPromise>;

/// Looks at what a placeholder takes.
class CheckedPlaceholder final : public ForwardingPlaceholder {
  public:
    CheckedPlaceholder(std::shared_ptr<InstallPlaceholder> target, std::string identifier,
                       std::shared_ptr<CoordinationWatch> watch)
        : ForwardingPlaceholder(std::move(target)),
          identifier_(std::move(identifier)),
          watch_(std::move(watch)) {}

    [[nodiscard]] const std::string& identifier() const { return identifier_; }

    Status setIconPromise(const std::shared_ptr<PathTransferPromise>& promise) override {
        return taken("an icon", [&] { return ForwardingPlaceholder::setIconPromise(promise); });
    }
    Status setAttributes(const PlaceholderAttributes& attributes) override {
        return taken("attributes",
                     [&] { return ForwardingPlaceholder::setAttributes(attributes); });
    }
    Status setMetadata(const std::optional<StoreMetadata>& metadata) override {
        return taken("metadata", [&] { return ForwardingPlaceholder::setMetadata(metadata); });
    }
    Status setSinf(const Bytes& sinf) override {
        return taken("a SINF", [&] { return ForwardingPlaceholder::setSinf(sinf); });
    }
    Status setConfigurationComplete() override {
        const CoordinationWatch::Call call(*watch_);
        Status status = ForwardingPlaceholder::setConfigurationComplete();
        checkDomain(status);
        if (status) isComplete_ = true;
        return status;
    }
    void cancelForReason(const ErrorRecord& reason, CoordinationClient client) override {
        const CoordinationWatch::Call call(*watch_);
        ForwardingPlaceholder::cancelForReason(reason, client);
    }

  private:
    template <typename Set>
    Status taken(const std::string& piece, const Set& set) {
        const CoordinationWatch::Call call(*watch_);
        const bool wasComplete = isComplete_;
        Status status = set();
        checkDomain(status);
        if (status && wasComplete) {
            watch_->book().broken("platform/InstallPlaceholder.h",
                                  "A second set of the same piece replaces the first, until the "
                                  "configuration is complete; from then on every set is refused.",
                                  "a placeholder that was complete took " + piece);
        }
        return status;
    }
    void checkDomain(const Status& status) const {
        if (!status) watch_->book().checkHasDomain(status.error(), "a placeholder");
    }

    const std::string identifier_;
    const std::shared_ptr<CoordinationWatch> watch_;
    std::atomic<bool> isComplete_{false};
};

}  // namespace appsync
