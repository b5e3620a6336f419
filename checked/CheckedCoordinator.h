#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "checked/CoordinationWatch.h"
#include "contract/forwarding/ForwardingCoordination.h"

namespace appsync {

class CoordinatorObservers;

/// Looks at what a coordinator takes, and whom it calls.
class CheckedCoordinator final : public ForwardingCoordinator {
  public:
    CheckedCoordinator(std::shared_ptr<InstallCoordinator> target,
                       std::shared_ptr<CoordinatorObservers> observers);

    [[nodiscard]] std::optional<std::string> bundleIdentifier() const override;
    [[nodiscard]] CoordinationClient creatorIdentifier() const override;
    [[nodiscard]] std::optional<ErrorRecord> error() const override;
    [[nodiscard]] std::string description() const override;
    void setObserver(std::weak_ptr<InstallCoordinatorObserver> observer) override;

    [[nodiscard]] bool hasInstallOptions() const override;
    Status setInstallOptions(const InstallOptions& options) override;
    [[nodiscard]] bool hasInitialODRAssetPromises() const override;
    Status setInitialODRAssetPromises(
        const std::vector<std::shared_ptr<PathTransferPromise>>& promises) override;
    [[nodiscard]] std::shared_ptr<PathTransferPromise> appAssetPromise() const override;
    Status setAppAssetPromise(const std::shared_ptr<PathTransferPromise>& promise) override;
    [[nodiscard]] std::optional<CoordinationClient> appAssetPromiseResponsibleClient()
        const override;
    Status setAppAssetPromiseResponsibleClient(CoordinationClient client) override;
    [[nodiscard]] bool hasUserDataPromise() const override;
    Status setUserDataPromise(const std::shared_ptr<OutOfBandPromise>& promise) override;
    [[nodiscard]] bool hasPlaceholderPromise() const override;
    Status setPlaceholderPromise(const std::shared_ptr<InstallPlaceholder>& placeholder) override;
    void cancelForReason(const ErrorRecord& reason, CoordinationClient client) override;

  private:
    /// Asks or sets something, where the thread is known to be in the service meanwhile.
    template <typename Asked>
    auto inService(const Asked& asked) const;
    /// A piece that is set; `has` tells whether it is there already.
    template <typename Has, typename Set>
    Status setOnce(std::string_view piece, const Has& has, const Set& set);
    template <typename Set>
    Status setUntilCancelled(std::string_view piece, const Set& set);
    void checkPlaceholder(const InstallPlaceholder* placeholder) const;
    void brokenOnce(const std::string& seen) const;
    void brokenRefusal(const std::string& seen) const;

    const std::shared_ptr<CoordinatorObservers> observers_;
    const std::shared_ptr<CoordinationWatch> watch_;
    std::atomic<bool> isCancelled_{false};
};

}  // namespace appsync
