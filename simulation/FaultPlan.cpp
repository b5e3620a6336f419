#include "simulation/FaultPlan.h"

#include <algorithm>
#include <cerrno>
#include <functional>
#include <map>
#include <utility>

#include "simulation/SimulatedPlatform.h"
#include "simulation/recording/KnownCalls.h"
#include "simulation/scheduling/Chance.h"

namespace appsync {

struct FaultPlan::Way {
    using Change = std::function<void(SimulatedPlatform&, const RecordEntry&)>;

    std::string name;
    /// Has the service fail the call that is about to take effect. Without one the call is refused.
    Change arm;
    /// Makes the service as it was, once the call is over.
    std::function<void(SimulatedPlatform&)> disarm;
};

namespace {

using Way = FaultPlan::Way;
using Ways = std::vector<Way>;

constexpr int kUnknownOutcome = 99;
constexpr std::uint32_t kRegistrationFailed = 7;
/// An application that runs is quit at last: a denial for ever would be retried for ever.
constexpr std::size_t kMostDenials = 10;

/// The first argument of a call, or the one of a number.
std::string argumentOf(const RecordEntry& entry, std::size_t number = 0) {
    std::string_view rest = entry.arguments;
    for (; number > 0; --number) {
        const std::size_t comma = rest.find(", ");
        rest.remove_prefix(comma == std::string_view::npos ? rest.size() : comma + 2);
    }
    return std::string(rest.substr(0, rest.find(", ")));
}

/// The bundle identifier in the install options of a call.
std::string identifierInOptions(const RecordEntry& entry) {
    constexpr std::string_view kKey = "BundleIdentifier = ";
    const std::size_t begin = entry.arguments.find(kKey) + kKey.size();
    return entry.arguments.substr(begin, entry.arguments.find(';', begin) - begin);
}

ErrorRecord refusal() { return ErrorRecord::make("Fault", 1, "refused"); }

Way refusedWay(std::string name) { return {std::move(name), {}, {}}; }

Way failingFile(FileOperation operation, int error, std::string name) {
    return {std::move(name),
            [operation, error](SimulatedPlatform& platform, const RecordEntry&) {
                platform.files.failNext(operation, SimulatedFileSystem::kAnyPath, error);
            },
            {}};
}

/// Half of a file is there when the call fails.
Way tornFile(FileOperation operation, std::size_t argument) {
    return {"torn",
            [operation, argument](SimulatedPlatform& platform, const RecordEntry& entry) {
                platform.files.addFile(argumentOf(entry, argument), "hal");
                platform.files.failNext(operation, SimulatedFileSystem::kAnyPath, ENOSPC);
            },
            {}};
}

Ways fileWays(FileOperation operation, bool writes) {
    Ways ways{failingFile(operation, EIO, "I/O error"),
              failingFile(operation, EACCES, "no permission")};
    if (writes) ways.push_back(failingFile(operation, ENOSPC, "no space"));
    return ways;
}

Ways with(Ways ways, Way one) {
    ways.push_back(std::move(one));
    return ways;
}

Way refusedStep(CoordinationStep step) {
    return {"refused",
            [step](SimulatedPlatform& platform, const RecordEntry& entry) {
                platform.coordination.failNext(step, argumentOf(entry), refusal());
            },
            {}};
}

/// `argument` holds the key.
Way nothingMade(CoordinationObject object, std::size_t argument) {
    return {"null",
            [object, argument](SimulatedPlatform& platform, const RecordEntry& entry) {
                platform.coordination.makeNoneNext(object, argumentOf(entry, argument));
            },
            {}};
}

Way terminationOutcome(int outcome, std::string name) {
    return {std::move(name),
            [outcome](SimulatedPlatform& platform, const RecordEntry& entry) {
                platform.homeScreen.scriptTermination(argumentOf(entry), {outcome});
            },
            {}};
}

Way refusedInstall(std::string_view domain, std::string name) {
    return {std::move(name),
            [domain](SimulatedPlatform& platform, const RecordEntry& entry) {
                platform.registry.failNextInstall(identifierInOptions(entry),
                                                  ErrorRecord::make(domain, 1, "refused"));
            },
            {}};
}

Ways uninstallWays() {
    return {{"refused",
             [](SimulatedPlatform& platform, const RecordEntry& entry) {
                 platform.registry.failNextUninstall(argumentOf(entry), refusal());
             },
             {}}};
}

using WaysByCall = std::map<std::string, Ways, std::less<>>;

WaysByCall fileWaysByCall() {
    return {
        {"FileSystem.itemExists", {refusedWay("not seen")}},
        {"FileSystem.attributes", fileWays(FileOperation::Attributes, false)},
        {"FileSystem.createDirectory", fileWays(FileOperation::CreateDirectory, true)},
        {"FileSystem.removeItem", fileWays(FileOperation::RemoveItem, false)},
        {"FileSystem.moveItem", fileWays(FileOperation::MoveItem, true)},
        {"FileSystem.copyItem",
         with(fileWays(FileOperation::CopyItem, true), tornFile(FileOperation::CopyItem, 1))},
        {"FileSystem.readFile", fileWays(FileOperation::ReadFile, false)},
        {"FileSystem.writeFileAtomically", fileWays(FileOperation::WriteFileAtomically, true)},
        {"FileSystem.createFile",
         with(fileWays(FileOperation::CreateFile, true), tornFile(FileOperation::CreateFile, 0))},
        {"FileSystem.setTimesToNow", fileWays(FileOperation::SetTimesToNow, false)},
        {"PropertyListSerialization.parse", {refusedWay("no property list")}},
        {"PropertyListSerialization.serialize", {refusedWay("not written")}},
        {"PropertyListSerialization.replaceText", {refusedWay("not replaced")}},
    };
}

WaysByCall coordinationWaysByCall() {
    return {
        {"InstallCoordinatorService.coordinator",
         {{"refused",
           [](SimulatedPlatform& platform, const RecordEntry& entry) {
               platform.coordination.failNext(CoordinationStep::LookUp, argumentOf(entry, 1),
                                              refusal());
           },
           {}},
          nothingMade(CoordinationObject::Coordinator, 1)}},
        {"InstallCoordinatorService.existingCoordinator", {refusedWay("null")}},
        {"InstallCoordinatorService.makePathTransferPromise",
         {nothingMade(CoordinationObject::PathTransferPromise, 0)}},
        {"InstallCoordinatorService.makeOutOfBandPromise",
         {nothingMade(CoordinationObject::OutOfBandPromise, 0)}},
        {"InstallCoordinatorService.makeAppPlaceholder",
         {nothingMade(CoordinationObject::Placeholder, 1)}},
        {"InstallCoordinatorService.makeAppInstallObserver", {refusedWay("null")}},
        {"InstallCoordinatorService.uninstallApp", uninstallWays()},
        {"InstallCoordinator.setInstallOptions", {refusedStep(CoordinationStep::InstallOptions)}},
        {"InstallCoordinator.setInitialODRAssetPromises",
         {refusedStep(CoordinationStep::InitialODRAssetPromises)}},
        {"InstallCoordinator.setAppAssetPromise", {refusedStep(CoordinationStep::AppAssetPromise)}},
        {"InstallCoordinator.setAppAssetPromiseResponsibleClient",
         {refusedStep(CoordinationStep::AppAssetPromiseResponsibleClient)}},
        {"InstallCoordinator.setUserDataPromise", {refusedStep(CoordinationStep::UserDataPromise)}},
        {"InstallCoordinator.setPlaceholderPromise",
         {refusedStep(CoordinationStep::PlaceholderPromise)}},
        {"InstallPlaceholder.setIconPromise", {refusedStep(CoordinationStep::IconPromise)}},
        {"InstallPlaceholder.setAttributes", {refusedStep(CoordinationStep::Attributes)}},
        {"InstallPlaceholder.setMetadata", {refusedStep(CoordinationStep::Metadata)}},
        {"InstallPlaceholder.setSinf", {refusedStep(CoordinationStep::Sinf)}},
        {"InstallPlaceholder.setConfigurationComplete",
         {refusedStep(CoordinationStep::ConfigurationComplete)}},
    };
}

WaysByCall serviceWaysByCall() {
    return {
        {"AppRegistry.proxyForIdentifier", {refusedWay("nothing")}},
        {"AppRegistry.installProgress", {refusedWay("null")}},
        {"AppRegistry.installPackage",
         {refusedInstall(kInstallerErrorDomain, "package refused"),
          refusedInstall(kPosixErrorDomain, "I/O error")}},
        {"AppRegistry.installPlaceholderBundle",
         {{"refused",
           [](SimulatedPlatform& platform, const RecordEntry& entry) {
               platform.registry.failNextPlaceholderInstall(identifierInOptions(entry), refusal());
           },
           {}}}},
        {"AppRegistry.uninstallApplication", uninstallWays()},
        {"HomeScreenService.blockableConnection", {refusedWay("null")}},
        {"HomeScreenService.takeTerminationAssertion",
         {terminationOutcome(kUnknownOutcome, "unknown outcome"),
          terminationOutcome(TerminationAssertionResult::kDenied, "denied"),
          terminationOutcome(TerminationAssertionResult::kNoSuchApplication, "not found")}},
        {"HomeScreenConnection.setIconState", {refusedWay("no")}},
        {"HomeScreenConnection.flattenedIconState", {refusedWay("nothing")}},
        {"IconRenderer.openBundle", {refusedWay("null")}},
        {"IconRenderer.homeScreenIcon", {refusedWay("null")}},
        {"IconRenderer.createImageDestination", {refusedWay("null")}},
        {"ImageDestination.finalize", {refusedWay("no")}},
        {"InstallerService.lookupUninstalled", {refusedWay("nothing")}},
        {"InstallerService.clearUninstalled",
         {{"no",
           [](SimulatedPlatform& platform, const RecordEntry&) {
               platform.installer.setClearable(false);
           },
           [](SimulatedPlatform& platform) { platform.installer.setClearable(true); }}}},
        {"NamedNotifications.registerForState",
         {{"no token",
           [](SimulatedPlatform& platform, const RecordEntry&) {
               platform.notifications.setRegistrationStatus(kRegistrationFailed);
           },
           [](SimulatedPlatform& platform) { platform.notifications.setRegistrationStatus(0); }}}},
        {"TransferService.prioritizeAsset",
         {{"failed",
           [](SimulatedPlatform& platform, const RecordEntry& entry) {
               platform.transfers.failNextPrioritize(argumentOf(entry), refusal());
           },
           {}}}},
    };
}

/// Null when the call cannot fail.
const Ways* waysOf(std::string_view name) {
    static const WaysByCall all = [] {
        WaysByCall ways = fileWaysByCall();
        ways.merge(coordinationWaysByCall());
        ways.merge(serviceWaysByCall());
        for (const auto& [call, each] : ways) {
            if (!isKnownCall(call)) throw SimulationFailure("there is no call of the name " + call);
        }
        return ways;
    }();
    const auto found = all.find(name);
    return found == all.end() ? nullptr : &found->second;
}

}  // namespace

FaultPlan::FaultPlan(SimulatedPlatform& platform) : platform_(platform) {
    platform_.recorder.setInterceptor(this);
}

FaultPlan::~FaultPlan() { platform_.recorder.setInterceptor(nullptr); }

void FaultPlan::failAt(std::size_t call, std::size_t way, FaultExtent extent) {
    aim_ = Aim{call, way, extent};
}

void FaultPlan::failSometimes(std::shared_ptr<Chance> chance, std::uint64_t oneIn) {
    chance_ = std::move(chance);
    oneIn_ = oneIn;
}

void FaultPlan::failSometimes(std::uint64_t seed, std::uint64_t oneIn) {
    failSometimes(std::make_shared<Chance>(seed), oneIn);
}

void FaultPlan::stop() {
    aim_.reset();
    aimedAt_.clear();
    chance_.reset();
    platform_.files.stopFailing();
}

bool FaultPlan::hasInjected(std::string_view beginning) const {
    return std::any_of(injected_.begin(), injected_.end(), [beginning](const std::string& text) {
        return text.starts_with(beginning);
    });
}

std::optional<ErrorRecord> FaultPlan::willCall(const RecordEntry& entry) {
    const std::string name = entry.service + "." + entry.method;
    const Ways* ways = waysOf(name);
    if (ways == nullptr) return std::nullopt;
    const std::optional<std::size_t> way = wayOf(name, ways->size());
    opportunities_.push_back({name, ways->size()});
    return way ? inject(entry, ways->at(*way)) : std::nullopt;
}

/// In which way the call fails that is about to be counted, if it does.
std::optional<std::size_t> FaultPlan::wayOf(const std::string& name, std::size_t ways) {
    if (chance_ != nullptr) {
        if (!chance_->oneIn(oneIn_)) return std::nullopt;
        return static_cast<std::size_t>(chance_->detail(ways));
    }
    if (!aim_ || opportunities_.size() < aim_->call) return std::nullopt;
    if (opportunities_.size() == aim_->call) {
        aimedAt_ = name;
        return aim_->way;
    }
    if (aim_->extent == FaultExtent::Everything) return 0;
    if (aim_->extent == FaultExtent::SameCall && name == aimedAt_) return aim_->way;
    return std::nullopt;
}

std::optional<ErrorRecord> FaultPlan::inject(const RecordEntry& entry, const Way& way) {
    if (way.name == "denied" && ++denials_ > kMostDenials) return std::nullopt;
    injected_.push_back(entry.line() + ": " + way.name);
    if (!way.arm) return refusal();
    way.arm(platform_, entry);
    if (way.disarm) pending_ = &way;
    return std::nullopt;
}

void FaultPlan::didCall() {
    if (const Way* way = std::exchange(pending_, nullptr)) way->disarm(platform_);
}

}  // namespace appsync
