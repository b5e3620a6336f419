#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

#include "platform/InstallPlaceholder.h"

namespace appsync {

class LivePromise;

/// All that a placeholder is made from.
struct PlaceholderConfiguration {
    std::string name;
    std::string identifier;
    std::uint64_t installType = 0;
    std::shared_ptr<LivePromise> icon;
    PlaceholderAttributes attributes;
    std::optional<StoreMetadata> metadata;
    std::optional<Bytes> sinf;
};

/// A placeholder that its client fills. It is in memory only, until the service puts it on the home
/// screen.
class DevicePlaceholder final : public InstallPlaceholder {
  public:
    /// What the coordinator does that it was handed to.
    struct Owner {
        std::function<void()> configurationComplete;
        std::function<void()> cancelled;
    };

    DevicePlaceholder(std::string name, std::string identifier, std::uint64_t installType);

    [[nodiscard]] std::string description() const override;
    Status setIconPromise(const std::shared_ptr<PathTransferPromise>& promise) override;
    Status setAttributes(const PlaceholderAttributes& attributes) override;
    Status setMetadata(const std::optional<StoreMetadata>& metadata) override;
    Status setSinf(const Bytes& sinf) override;
    Status setConfigurationComplete() override;
    void cancelForReason(const ErrorRecord& reason, CoordinationClient client) override;

    [[nodiscard]] const std::string& identifier() const noexcept { return identifier_; }
    [[nodiscard]] PlaceholderConfiguration configuration() const;

    /// Hands it to a coordinator. An error when it was given up or handed to one before.
    Status hand(Owner owner);
    [[nodiscard]] bool isConfigurationComplete() const;

  private:
    [[nodiscard]] Status mayChange() const;
    Status change(const std::function<void(PlaceholderConfiguration&)>& edit);

    const std::string identifier_;
    mutable std::mutex mutex_;
    // Protected by mutex_.
    PlaceholderConfiguration configuration_;
    std::optional<Owner> owner_;
    bool complete_ = false;
    bool cancelled_ = false;
};

}  // namespace appsync
