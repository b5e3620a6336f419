#pragma once

#include <atomic>
#include <chrono>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "checked/BreachBook.h"
#include "platform/AppRegistry.h"
#include "platform/WorkQueues.h"

namespace appsync {

/// Looks at a registry: its records, its walks, its errors, and how it calls observers.
class CheckedRegistry final : public AppRegistry {
  public:
    struct Patience {
        std::chrono::nanoseconds forCalls;
        std::chrono::nanoseconds forLocks;
    };

    /// The queues are those of the same platform. The book is shared with what comes due later.
    CheckedRegistry(AppRegistry& registry, WorkQueues& queues, std::shared_ptr<BreachBook> book,
                    Patience patience);
    ~CheckedRegistry() override;
    CheckedRegistry(const CheckedRegistry&) = delete;
    CheckedRegistry& operator=(const CheckedRegistry&) = delete;

    [[nodiscard]] std::optional<AppProxy> proxyForIdentifier(const std::string& identifier,
                                                             Placeholders placeholders) override;
    [[nodiscard]] bool isApplicationInstalled(const std::string& identifier) override;
    void enumerateBundles(BundleType type, const ProxyCallback& callback) override;
    [[nodiscard]] std::shared_ptr<InstallProgressRecord> installProgress(
        const AppProxy& proxy, std::uint64_t phase) override;
    void finishInstallPhase(InstallProgressRecord& record) override;
    Status installPackage(const FileURL& package, const PropertyList& options) override;
    Status installPlaceholderBundle(const FileURL& directory, const PropertyList& options) override;
    Status uninstallApplication(const std::string& identifier,
                                const PropertyList& options) override;
    void addObserver(std::weak_ptr<AppRegistryObserver> observer) override;
    void removeObserver(const AppRegistryObserver* observer) override;

  private:
    class Observer;
    class Record;

    void checkProxy(const AppProxy& proxy) const;
    void checkIdentifier(const PropertyList& options, const Status& status) const;
    void checkRefusal(std::string_view identifier, const Status& status) const;
    /// Whether nothing here keeps the registry busy, and yet another thread's question to it is not
    /// answered in time.
    [[nodiscard]] bool holdsLock();

    AppRegistry& registry_;
    WorkQueues& queues_;
    const std::shared_ptr<BreachBook> book_;
    const Patience patience_;
    // Changes that are under way, or were begun or ended: while the number is even and stays the
    // same, nothing is changed through this object.
    std::atomic<std::size_t> changesUnderWay_{0};
    std::atomic<std::uint64_t> changes_{0};

    std::mutex mutex_;
    std::vector<std::shared_ptr<Observer>> observers_;  // protected by mutex_; removed ones too

    const std::unique_ptr<OperationQueue> questions_;  // ends first
};

}  // namespace appsync
