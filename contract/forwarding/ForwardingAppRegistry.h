#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/AppRegistry.h"

namespace appsync {

/// A progress record whose calls go to another.
class ForwardingProgressRecord : public InstallProgressRecord {
  public:
    explicit ForwardingProgressRecord(std::shared_ptr<InstallProgressRecord> target)
        : target_(std::move(target)) {}

    [[nodiscard]] std::uint64_t installState() const override { return target_->installState(); }
    void setInstallState(std::uint64_t state) override { target_->setInstallState(state); }
    [[nodiscard]] std::uint64_t installPhase() const override { return target_->installPhase(); }
    void setInstallPhase(std::uint64_t phase) override { target_->setInstallPhase(phase); }
    [[nodiscard]] std::int64_t totalUnitCount() const override { return target_->totalUnitCount(); }
    void setTotalUnitCount(std::int64_t count) override { target_->setTotalUnitCount(count); }
    [[nodiscard]] std::int64_t completedUnitCount() const override {
        return target_->completedUnitCount();
    }
    void setCompletedUnitCount(std::int64_t count) override {
        target_->setCompletedUnitCount(count);
    }
    void cancel() override { target_->cancel(); }
    [[nodiscard]] std::string description() const override { return target_->description(); }

    [[nodiscard]] InstallProgressRecord& target() const { return *target_; }

  private:
    const std::shared_ptr<InstallProgressRecord> target_;
};

/// An observer whose calls go to another, as long as that is there.
class ForwardingRegistryObserver : public AppRegistryObserver {
  public:
    explicit ForwardingRegistryObserver(std::weak_ptr<AppRegistryObserver> target)
        : target_(std::move(target)) {}

    void applicationInstallsArePrioritized(const std::vector<AppProxy>& prioritized,
                                           const std::vector<AppProxy>& paused) override {
        if (const auto target = target_.lock()) {
            target->applicationInstallsArePrioritized(prioritized, paused);
        }
    }
    void applicationInstallsDidCancel(const std::vector<AppProxy>& cancelled) override {
        if (const auto target = target_.lock()) target->applicationInstallsDidCancel(cancelled);
    }

  protected:
    [[nodiscard]] const std::weak_ptr<AppRegistryObserver>& target() const { return target_; }

  private:
    const std::weak_ptr<AppRegistryObserver> target_;
};

/// A registry whose calls go to another, which is borrowed. For wrappers that change or watch some
/// of them, those of records and observers too: `recordFor` and `observerFor` say what stands
/// between.
class ForwardingAppRegistry : public AppRegistry {
  public:
    using Service = AppRegistry;

    explicit ForwardingAppRegistry(AppRegistry& target) : target_(target) {}

    [[nodiscard]] std::optional<AppProxy> proxyForIdentifier(const std::string& identifier,
                                                             Placeholders placeholders) override {
        return target_.proxyForIdentifier(identifier, placeholders);
    }
    [[nodiscard]] bool isApplicationInstalled(const std::string& identifier) override {
        return target_.isApplicationInstalled(identifier);
    }
    void enumerateBundles(BundleType type, const ProxyCallback& callback) override {
        target_.enumerateBundles(type, callback);
    }
    [[nodiscard]] std::shared_ptr<InstallProgressRecord> installProgress(
        const AppProxy& proxy, std::uint64_t phase) override {
        auto record = target_.installProgress(proxy, phase);
        return record == nullptr ? nullptr : recordFor(std::move(record));
    }
    void finishInstallPhase(InstallProgressRecord& record) override {
        const auto* forwarding = dynamic_cast<const ForwardingProgressRecord*>(&record);
        target_.finishInstallPhase(forwarding == nullptr ? record : forwarding->target());
    }
    Status installPackage(const FileURL& package, const PropertyList& options) override {
        return target_.installPackage(package, options);
    }
    Status installPlaceholderBundle(const FileURL& directory,
                                    const PropertyList& options) override {
        return target_.installPlaceholderBundle(directory, options);
    }
    Status uninstallApplication(const std::string& identifier,
                                const PropertyList& options) override {
        return target_.uninstallApplication(identifier, options);
    }
    void addObserver(std::weak_ptr<AppRegistryObserver> observer) override {
        const AppRegistryObserver* address = observer.lock().get();
        auto between = observerFor(std::move(observer));
        {
            const std::lock_guard held(mutex_);
            observers_[address] = between;
        }
        target_.addObserver(between);
    }
    void removeObserver(const AppRegistryObserver* observer) override {
        if (const auto between = takeObserver(observer)) target_.removeObserver(between.get());
    }

  protected:
    using Record = std::shared_ptr<InstallProgressRecord>;
    using Observer = std::shared_ptr<AppRegistryObserver>;

    [[nodiscard]] AppRegistry& target() { return target_; }
    /// What callers get for a record.
    [[nodiscard]] virtual Record recordFor(Record record) { return record; }
    /// Who hears in an observer's place.
    [[nodiscard]] virtual Observer observerFor(std::weak_ptr<AppRegistryObserver> observer) {
        return std::make_shared<ForwardingRegistryObserver>(std::move(observer));
    }

  private:
    [[nodiscard]] Observer takeObserver(const AppRegistryObserver* address) {
        const std::lock_guard held(mutex_);
        auto node = observers_.extract(address);
        return node.empty() ? nullptr : std::move(node.mapped());
    }

    AppRegistry& target_;
    std::mutex mutex_;
    std::map<const AppRegistryObserver*, Observer> observers_;  // protected by mutex_
};

}  // namespace appsync
