#include "host/session/AppStore.h"

#include <chrono>
#include <memory>
#include <set>
#include <string_view>
#include <utility>

#include "device/Device.h"
#include "host/console/Problem.h"
#include "host/plan/LibraryReader.h"
#include "host/plan/SyncPlan.h"
#include "host/session/PackageSender.h"
#include "host/session/StoreDelivery.h"
#include "platform/InstallCoordinator.h"
#include "platform/InstallCoordinatorService.h"

namespace appsync {
namespace {

constexpr std::chrono::milliseconds kWaitInterval{100};

class Store {
  public:
    Store(Device& device, const Library& library, InstallCoordinatorService& service)
        : device_(device), library_(library), service_(service), sender_(device) {}

    Result<StoreResult> run() {
        // What was delivered to an earlier session goes on.
        if (Status started = device_.startCoordination(); !started) return started.error();
        if (Status awaited = awaitSystemApplications(); !awaited) return awaited.error();
        const Result<std::vector<CoordinatorRecord>> coordinators = device_.coordinators();
        if (!coordinators) return unusable(coordinators.error());
        for (const CoordinatorRecord& each : *coordinators) serve(each.identifier);
        if (lacksPackage_) nameFaults();
        while (!device_.waitForCoordinatedInstalls(kWaitInterval)) {
            if (allWaitForApplications()) break;
        }
        if (Status judged = judge(); !judged) return judged.error();
        return std::move(result_);
    }

  private:
    // Nobody asks for offloaded applications of the system.
    Status awaitSystemApplications() {
        const Result<DeviceSettings> settings = device_.settings();
        if (!settings) return unusable(settings.error());
        if (!settings->coordination) return {};
        const Result<std::vector<ApplicationRecord>> records = device_.applications();
        if (!records) return unusable(records.error());
        for (const ApplicationRecord& record : *records) {
            const bool isServed =
                isOffloadedSystemApplication(record) && library_.find(record.identifier) != nullptr;
            if (!isServed) continue;
            const bool isForbidden = settings->installation == PolicyAnswer::No;
            const Status awaited =
                isForbidden ? Status(installationForbidden()) : awaitPackage(service_, record);
            if (awaited) continue;
            result_.failed.push_back({record.identifier, awaited.error().description()});
        }
        return {};
    }

    void serve(const std::string& identifier) {
        const auto coordinator = service_.existingCoordinator(identifier, AppStoreClientID);
        if (coordinator == nullptr) return;
        if (coordinator->appAssetPromiseResponsibleClient() != AppStoreClientID) return;
        const auto promised = coordinator->appAssetPromise();
        delivered_.insert(identifier);
        if (promised != nullptr && promised->isComplete()) return;
        const Status kept = deliver(identifier, *coordinator);
        if (kept) return;
        delivered_.erase(identifier);
        result_.failed.push_back({identifier, kept.error().description()});
    }

    Status deliver(const std::string& identifier, InstallCoordinator& coordinator) {
        const LibraryPackage* package = library_.find(identifier);
        if (package == nullptr) {
            lacksPackage_ = true;
            return failure("the store has no package of it", "add one to its folder");
        }
        // An install that fails would take the placeholder away.
        const Status good = verifyPackage(package->file, identifier, device_.propertyLists());
        if (!good) return good;
        const Result<std::uint64_t> sent =
            deliverFromStore(service_, coordinator, *package, sender_,
                             [](std::uint64_t, std::uint64_t) { return true; });
        return sent ? Status() : Status(sent.error());
    }

    // A package that cannot be read may be the one that is missed.
    void nameFaults() {
        for (const LibraryFault& fault : library_.faults) {
            if (fault.fileName == kIconOrderFile) continue;
            result_.failed.push_back({fault.fileName, fault.error});
        }
    }

    // A placeholder does not run, but an application that it covers may.
    bool allWaitForApplications() {
        for (const std::string& identifier : device_.coordinatedInstallsUnderWay()) {
            const Result<ApplicationStatus> status = device_.status(identifier);
            if (!status || !status->denial) return false;
        }
        return true;
    }

    Status judge() {
        const Result<std::vector<ApplicationRecord>> records = device_.applications();
        if (!records) return unusable(records.error());
        std::set<std::string> installed;
        for (const ApplicationRecord& record : *records) {
            if (!record.isPlaceholder) installed.insert(record.identifier);
        }
        for (const std::string& identifier : delivered_) {
            const Result<ApplicationStatus> status = device_.status(identifier);
            if (!status) return unusable(status.error());
            const bool isOpen = status->coordinator.has_value();
            if (installed.contains(identifier) && !isOpen && !status->lastFailure) {
                result_.kept.push_back(identifier);
            } else {
                result_.failed.push_back({identifier, whyNot(identifier, *status)});
            }
        }
        return {};
    }

    static std::string whyNot(const std::string& identifier, const ApplicationStatus& status) {
        if (status.lastFailure) return status.lastFailure->error.description();
        if (status.denial) {
            return "it is running: quit it (appsync quit DEVICE " + identifier +
                   "), and run the store again";
        }
        return "the device has not installed it: see appsync why";
    }

    Device& device_;
    const Library& library_;
    InstallCoordinatorService& service_;
    PackageSender sender_;
    std::set<std::string> delivered_;
    bool lacksPackage_ = false;
    StoreResult result_;
};

}  // namespace

Result<StoreResult> keepPromises(Device& device, const Library& library,
                                 InstallCoordinatorService& service) {
    return Store(device, library, service).run();
}

}  // namespace appsync
