#include <chrono>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "contract/forwarding/ForwardingAppRegistry.h"
#include "platform/WorkQueues.h"
#include "tests/violators/Violator.h"

namespace appsync {
namespace {

using Proxies = std::vector<AppProxy>;
using WeakObserver = std::weak_ptr<AppRegistryObserver>;

/// A registry that puts a `Between` in each observer's place. It is made with the observer and the
/// platform.
template <typename Between>
class WithObserver : public ForwardingAppRegistry {
  public:
    WithObserver(AppRegistry& target, const Platform& platform)
        : ForwardingAppRegistry(target), platform_(platform) {}

  protected:
    Observer observerFor(WeakObserver observer) override {
        return std::make_shared<Between>(std::move(observer), platform_);
    }

  private:
    const Platform platform_;
};

struct Between : ForwardingRegistryObserver {
    Between(WeakObserver target, const Platform& all)
        : ForwardingRegistryObserver(std::move(target)), platform(all) {}
    const Platform platform;
};

struct NoFirstReport : Between {
    using Between::Between;
    void applicationInstallsArePrioritized(const Proxies& prioritized,
                                           const Proxies& paused) override {
        if (!first)
            ForwardingRegistryObserver::applicationInstallsArePrioritized(prioritized, paused);
        first = false;
    }
    bool first = true;
};
struct NoEmptyReport : Between {
    using Between::Between;
    void applicationInstallsArePrioritized(const Proxies& prioritized,
                                           const Proxies& paused) override {
        if (prioritized.empty() && paused.empty()) return;
        ForwardingRegistryObserver::applicationInstallsArePrioritized(prioritized, paused);
    }
};
struct TwoFirstReports : Between {
    using Between::Between;
    void applicationInstallsArePrioritized(const Proxies& prioritized,
                                           const Proxies& paused) override {
        ForwardingRegistryObserver::applicationInstallsArePrioritized(prioritized, paused);
        if (first) {
            ForwardingRegistryObserver::applicationInstallsArePrioritized(prioritized, paused);
        }
        first = false;
    }
    bool first = true;
};
struct OnlyAFirstReport : Between {
    using Between::Between;
    void applicationInstallsArePrioritized(const Proxies& prioritized,
                                           const Proxies& paused) override {
        if (first)
            ForwardingRegistryObserver::applicationInstallsArePrioritized(prioritized, paused);
        first = false;
    }
    bool first = true;
};
struct PausedAmongTheOthers : Between {
    using Between::Between;
    void applicationInstallsArePrioritized(const Proxies& prioritized,
                                           const Proxies& paused) override {
        Proxies all = prioritized;
        all.insert(all.end(), paused.begin(), paused.end());
        ForwardingRegistryObserver::applicationInstallsArePrioritized(all, {});
    }
};
struct PausedAreLeftOut : Between {
    using Between::Between;
    void applicationInstallsArePrioritized(const Proxies& prioritized, const Proxies&) override {
        ForwardingRegistryObserver::applicationInstallsArePrioritized(prioritized, {});
    }
};
struct ListsAreSwapped : Between {
    using Between::Between;
    void applicationInstallsArePrioritized(const Proxies& prioritized,
                                           const Proxies& paused) override {
        ForwardingRegistryObserver::applicationInstallsArePrioritized(paused, prioritized);
    }
};
struct ListsWithoutIdentifiers : Between {
    using Between::Between;
    void applicationInstallsArePrioritized(const Proxies& prioritized,
                                           const Proxies& paused) override {
        Proxies nameless = prioritized;
        for (AppProxy& proxy : nameless) proxy.applicationIdentifier.clear();
        ForwardingRegistryObserver::applicationInstallsArePrioritized(nameless, paused);
    }
};
/// Lists applications and placeholders that await nothing, too.
struct EverythingIsUnderWay : Between {
    using Between::Between;
    void applicationInstallsArePrioritized(const Proxies& prioritized,
                                           const Proxies& paused) override {
        Proxies all;
        platform.registry.enumerateBundles(
            AppRegistry::kEveryBundle, [&](const AppProxy& proxy, bool&) {
                for (const AppProxy& each : paused) {
                    if (each.applicationIdentifier == proxy.applicationIdentifier) return;
                }
                all.push_back(proxy);
            });
        (void)prioritized;
        ForwardingRegistryObserver::applicationInstallsArePrioritized(all, paused);
    }
};
struct DemotedAreUnderWay : Between {
    using Between::Between;
    void applicationInstallsArePrioritized(const Proxies& prioritized,
                                           const Proxies& paused) override {
        Proxies all = prioritized;
        platform.registry.enumerateBundles(
            AppRegistry::kEveryBundle, [&](const AppProxy& proxy, bool&) {
                if (proxy.state.placeholder &&
                    (proxy.installType == kInstallTypeDowngrade ||
                     proxy.installType == kInstallTypeIntentionalDowngrade)) {
                    all.push_back(proxy);
                }
            });
        ForwardingRegistryObserver::applicationInstallsArePrioritized(all, paused);
    }
};
/// Leaves on the list what has been on it once.
struct NothingLeavesTheList : Between {
    using Between::Between;
    void applicationInstallsArePrioritized(const Proxies& prioritized,
                                           const Proxies& paused) override {
        for (const AppProxy& proxy : prioritized) seen[proxy.applicationIdentifier] = proxy;
        Proxies all;
        for (const auto& [identifier, proxy] : seen) all.push_back(proxy);
        ForwardingRegistryObserver::applicationInstallsArePrioritized(all, paused);
    }
    std::map<std::string, AppProxy> seen;
};
/// Each report comes by two tasks at once.
struct SeveralReportsAtOnce : Between {
    using Between::Between;
    void applicationInstallsArePrioritized(const Proxies& prioritized,
                                           const Proxies& paused) override {
        for (int task = 0; task < 2; ++task) {
            platform.queues.runAfter(std::chrono::nanoseconds(0), [=, weak = target()] {
                const auto observer = weak.lock();
                if (observer) observer->applicationInstallsArePrioritized(prioritized, paused);
            });
        }
    }
};
struct CancelsAreNotTold : Between {
    using Between::Between;
    void applicationInstallsDidCancel(const Proxies&) override {}
};
struct CancelsNameNobody : Between {
    using Between::Between;
    void applicationInstallsDidCancel(const Proxies&) override {
        ForwardingRegistryObserver::applicationInstallsDidCancel({});
    }
};
struct ObserversAreOwned : Between {
    ObserversAreOwned(WeakObserver target, const Platform& all)
        : Between(target, all), owned(target.lock()) {}
    const std::shared_ptr<AppRegistryObserver> owned;
};

/// Reports come under a lock.
class ReportsUnderALock : public ForwardingAppRegistry {
  public:
    ReportsUnderALock(AppRegistry& target, const Platform& platform)
        : ForwardingAppRegistry(target), lock_(platform.queues.makeLock()) {}

  protected:
    struct Locking : ForwardingRegistryObserver {
        Locking(WeakObserver target, Lock& lock)
            : ForwardingRegistryObserver(std::move(target)), lock_(lock) {}
        void applicationInstallsArePrioritized(const Proxies& prioritized,
                                               const Proxies& paused) override {
            const std::lock_guard<Lock> held(lock_);
            ForwardingRegistryObserver::applicationInstallsArePrioritized(prioritized, paused);
        }
        Lock& lock_;
    };
    Observer observerFor(WeakObserver observer) override {
        return std::make_shared<Locking>(std::move(observer), *lock_);
    }
    [[nodiscard]] Lock& lock() { return *lock_; }

  private:
    const std::unique_ptr<Lock> lock_;
};

/// Every look-up takes the lock, too.
class ReportsUnderTheLockOfLookUps : public ReportsUnderALock {
  public:
    using ReportsUnderALock::ReportsUnderALock;
    std::optional<AppProxy> proxyForIdentifier(const std::string& identifier,
                                               Placeholders placeholders) override {
        const std::lock_guard<Lock> held(lock());
        return target().proxyForIdentifier(identifier, placeholders);
    }
};

/// `removeObserver` waits for the report that is under way, also from within it.
class RemovingWaitsForTheReport : public ReportsUnderALock {
  public:
    using ReportsUnderALock::ReportsUnderALock;
    void removeObserver(const AppRegistryObserver* observer) override {
        const std::lock_guard<Lock> held(lock());
        ForwardingAppRegistry::removeObserver(observer);
    }
};

struct RemovedRegistryObserversHear : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    void removeObserver(const AppRegistryObserver*) override {}
};
struct OneObserverOnly : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    void addObserver(WeakObserver observer) override {
        if (!has) ForwardingAppRegistry::addObserver(std::move(observer));
        has = true;
    }
    bool has = false;
};
/// The first report comes before `addObserver` has returned.
struct FirstReportOnTheCallersThread : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    struct Later : ForwardingRegistryObserver {
        using ForwardingRegistryObserver::ForwardingRegistryObserver;
        void applicationInstallsArePrioritized(const Proxies& prioritized,
                                               const Proxies& paused) override {
            if (!first) {
                ForwardingRegistryObserver::applicationInstallsArePrioritized(prioritized, paused);
            }
            first = false;
        }
        bool first = true;
    };
    Observer observerFor(WeakObserver observer) override {
        Proxies prioritized;
        Proxies paused;
        target().enumerateBundles(kEveryBundle, [&](const AppProxy& proxy, bool&) {
            const auto record =
                proxy.state.placeholder ? target().installProgress(proxy, kWholeInstall) : nullptr;
            if (record == nullptr) return;
            (record->installState() == kInstallStatePaused ? paused : prioritized).push_back(proxy);
        });
        if (const auto now = observer.lock()) {
            now->applicationInstallsArePrioritized(prioritized, paused);
        }
        return std::make_shared<Later>(std::move(observer));
    }
};
/// An install that was paused is reported when the next one begins.
struct PausingIsNotAChange : Between {
    using Between::Between;
    void applicationInstallsArePrioritized(const Proxies& prioritized,
                                           const Proxies& paused) override {
        const std::size_t count = prioritized.size() + paused.size();
        if (heard && count == last) return;
        heard = true;
        last = count;
        ForwardingRegistryObserver::applicationInstallsArePrioritized(prioritized, paused);
    }
    bool heard = false;
    std::size_t last = 0;
};

}  // namespace

std::vector<Violator> registryObserverViolators() {
    Violators v("platform/AppRegistry.h", "*RegistryObserver*:*AppRegistry*");
    const std::string first =
        "Comes once soon after the observer was added, also when both lists are empty, never on "
        "the thread that added it before `addObserver` has returned; then again whenever the lists "
        "change, which several changes may share.";
    v.device<WithObserver<NoFirstReport>>("NoFirstReport", first);
    v.device<WithObserver<NoEmptyReport>>("NoEmptyReport", first);
    v.device<WithObserver<TwoFirstReports>>("TwoFirstReports", first);
    v.device<WithObserver<OnlyAFirstReport>>("OnlyAFirstReport", first);
    v.device<WithObserver<PausingIsNotAChange>>("PausingIsNotAChange", first);
    v.device<FirstReportOnTheCallersThread>("FirstReportOnTheCallersThread", first);
    v.device<OneObserverOnly>("OneObserverOnly", first);
    const std::string lists =
        "`applicationInstallsArePrioritized:arePaused:`: the installs under way, in two lists: the "
        "paused ones (their record's state is 2), and all others, in no particular order.";
    v.device<WithObserver<PausedAmongTheOthers>>("PausedAmongTheOthers", lists);
    v.device<WithObserver<PausedAreLeftOut>>("PausedAreLeftOut", lists);
    v.device<WithObserver<ListsAreSwapped>>("ListsAreSwapped", lists);
    v.device<WithObserver<ListsWithoutIdentifiers>>("ListsWithoutIdentifiers", lists);
    const std::string underWay =
        "An install is under way from the moment when its placeholder stands until its package is "
        "installed, has failed or was cancelled, or the placeholder is gone.";
    v.device<WithObserver<EverythingIsUnderWay>>("EverythingIsUnderWay", underWay);
    v.device<WithObserver<NothingLeavesTheList>>("NothingLeavesTheList", underWay);
    v.device<WithObserver<DemotedAreUnderWay>>(
        "DemotedAreUnderWay",
        "The placeholder of a demoted application (`InstallType` 7, 8) awaits no install.");
    v.device<WithObserver<SeveralReportsAtOnce>>(
        "SeveralReportsAtOnce",
        "Hears from the registry, on a thread of the registry's, one call at a time for one "
        "observer.");
    const std::string cancelled =
        "`applicationInstallsDidCancel:`: somebody on the device cancelled these installs.";
    v.device<WithObserver<CancelsAreNotTold>>("CancelsAreNotTold", cancelled);
    v.device<WithObserver<CancelsNameNobody>>("CancelsNameNobody", cancelled);
    const std::string lock =
        "It may call the registry and remove itself meanwhile, so a registry holds no lock when it "
        "calls.";
    v.device<ReportsUnderTheLockOfLookUps>("ReportsUnderALock", lock);
    v.device<RemovingWaitsForTheReport>("RemovingWaitsForTheReport", lock);
    v.device<WithObserver<ObserversAreOwned>>(
        "ObserversAreOwned",
        "It is held weakly; while it is being called it is kept alive, so that the last of it may "
        "go on the registry's thread.");
    v.device<RemovedRegistryObserversHear>("RemovedRegistryObserversHear",
                                           "No call begins after this one has returned.");
    return v.take();
}

}  // namespace appsync
