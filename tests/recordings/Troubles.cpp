#include "tests/recordings/Troubles.h"

#include <array>
#include <limits>
#include <utility>

#include "client/Paths.h"
#include "client/TodoList.h"

namespace appsync {
namespace {

PropertyList anArray() {
    PropertyList array = PropertyList::array();
    array.append("a");
    return array;
}

}  // namespace

void Troubles::arrange() {
    for (const std::string& each : identifiers_) {
        if (oneIn(2)) refusePieces(each);
        if (oneIn(3)) withholdObjects(each);
        if (world_.coordinated && oneIn(2)) addCoordinatorOfAnother(each);
        if (oneIn(2)) hideBundle(each);
        if (oneIn(4)) coverWithSystemPlaceholder(each);
    }
    SimulatedPlatform& simulated = world_.platform;
    if (oneIn(4)) {
        simulated.coordination.makeNoneNext(CoordinationObject::AppInstallObserver,
                                            "com.korvu.trd.rlink.tsappobserverdelegate");
    }
    const auto reported = simulated.registry.installed(identifiers_.front());
    if (reported && oneIn(3)) simulated.registry.setReport({*reported}, {});
    if (oneIn(3)) fillRestoreState();
    if (oneIn(3)) spoilFiles();
}

void Troubles::refusePieces(const std::string& identifier) {
    constexpr std::array kSteps = {CoordinationStep::LookUp,
                                   CoordinationStep::InstallOptions,
                                   CoordinationStep::InitialODRAssetPromises,
                                   CoordinationStep::AppAssetPromise,
                                   CoordinationStep::AppAssetPromiseResponsibleClient,
                                   CoordinationStep::UserDataPromise,
                                   CoordinationStep::PlaceholderPromise,
                                   CoordinationStep::IconPromise,
                                   CoordinationStep::Attributes,
                                   CoordinationStep::Metadata,
                                   CoordinationStep::Sinf,
                                   CoordinationStep::ConfigurationComplete};
    world_.platform.coordination.failNext(kSteps[random_() % kSteps.size()], identifier,
                                          ErrorRecord::make("Coordination", 3, "refused"));
}

void Troubles::withholdObjects(const std::string& identifier) {
    SimulatedCoordination& coordination = world_.platform.coordination;
    switch (random_() % 6) {
        case 0:
            return coordination.makeNoneNext(CoordinationObject::Coordinator, identifier);
        case 1:
            return coordination.makeNoneNext(CoordinationObject::ExistingCoordinator, identifier);
        case 2:
            return coordination.makeNoneNext(CoordinationObject::PathTransferPromise,
                                             identifier + "-Asset");
        case 3:
            return coordination.makeNoneNext(CoordinationObject::PathTransferPromise,
                                             identifier + "-Icon");
        case 4:
            return coordination.makeNoneNext(CoordinationObject::OutOfBandPromise,
                                             identifier + "-UserData");
        default:
            return coordination.makeNoneNext(CoordinationObject::Placeholder, identifier);
    }
}

void Troubles::addCoordinatorOfAnother(const std::string& identifier) {
    constexpr std::array kPieces = {
        CoordinationStep::InstallOptions, CoordinationStep::InitialODRAssetPromises,
        CoordinationStep::AppAssetPromise, CoordinationStep::UserDataPromise,
        CoordinationStep::PlaceholderPromise};
    SimulatedCoordination& coordination = world_.platform.coordination;
    const auto kind = static_cast<CoordinatorKind>(random_() % 4);
    const CoordinationClient client = oneIn(3) ? AppStoreClientID : SyncClientID;
    const auto made = coordination.addCoordinator(kind, identifier, client);
    if (made == nullptr) return;
    if (oneIn(3)) made->setAppAssetPromiseResponsibleClient(AppStoreClientID).ignore();
    for (const CoordinationStep piece : kPieces) {
        if (oneIn(4)) coordination.setHas(piece, identifier, true);
    }
    if (oneIn(6)) coordination.setError(identifier, ErrorRecord::make("Coordination", 4, "ill"));
}

/// An application of which the registry does not say where it is.
void Troubles::hideBundle(const std::string& identifier) {
    auto proxy = world_.platform.registry.installed(identifier);
    if (!proxy) return;
    proxy->bundlePath.clear();
    world_.platform.registry.add(*proxy);
}

void Troubles::coverWithSystemPlaceholder(const std::string& identifier) {
    SimulatedAppRegistry& registry = world_.platform.registry;
    registry.addPlaceholder(identifier, 0);
    AppProxy proxy = *registry.placeholder(identifier);
    proxy.applicationType = "System";
    registry.add(proxy);
}

/// What earlier sessions have left, of more applications than are looked for one by one.
void Troubles::fillRestoreState() {
    constexpr int kMany = 40;
    const auto pathAt = [](PropertyList path) {
        return PropertyList::map({{"1.0", PropertyList::map({{"path", std::move(path)}})}});
    };
    PropertyList root = PropertyList::map();
    for (int i = 0; i < kMany; ++i)
        root.set("com.example.left" + std::to_string(i), pathAt("/left"));
    for (const std::string& each : identifiers_) {
        const std::string path = World::packagePath(each);
        root.set(each, oneIn(4) ? pathAt(7) : pathAt(path));
        if (oneIn(2)) world_.platform.files.addFile(path, "package");
    }
    world_.platform.addPropertyList(std::string(kRestoreStatePath), root);
}

void Troubles::spoilFiles() {
    constexpr std::array kSpoilt = {kLastSyncAppStatePath, kDemotedAppsPath, kRestoreStatePath};
    spoil(kSpoilt[random_() % kSpoilt.size()]);
}

void Troubles::spoilStaging() {
    for (const std::string& each : identifiers_) {
        if (!oneIn(3)) continue;
        world_.platform.addPropertyList(
            std::string(kStagingArea) + "/" + each + "/Info.plist",
            PropertyList::map(
                {{"VKPresselApp", oneIn(2)}, {"RGApplicationLaunchProhibited", oneIn(2)}}));
    }
    if (oneIn(8)) return spoil(kTodoListPath);
    if (oneIn(6)) spoil("/var/mobile/Media/PublicStaging/ApplicationSync/DeskoraIconState.plist");
    if (!oneIn(3)) return;
    PropertyList list = PropertyList::array();
    for (const std::string& each : identifiers_) list.append(World::entry(each, "install"));
    list.append(World::entry("com.example/../unsafe", "install"));
    list.append(PropertyList::map({{kTodoOperationKey, "remove"}, {kTodoIdentifierKey, 7}}));
    list.append(PropertyList::map({{kTodoOperationKey, "install"}, {kTodoIdentifierKey, ""}}));
    list.append("no entry");
    world_.platform.addPropertyList(std::string(kTodoListPath), list);
}

void Troubles::spoil(std::string_view path) {
    switch (random_() % 4) {
        case 0:
            world_.platform.files.addFile(std::string(path), "rubbish");
            return;
        case 1:
            world_.platform.files.addFile(std::string(path), "");
            return;
        case 2:
            world_.platform.addPropertyList(std::string(path), PropertyList::map({{"a", 1}}));
            return;
        default:
            world_.platform.addPropertyList(std::string(path), anArray());
    }
}

double Troubles::anyFraction() {
    constexpr std::array kFractions = {
        0.0, 0.123456, 1.0, 7.5, -1.0, 1e30, std::numeric_limits<double>::quiet_NaN()};
    return kFractions[random_() % kFractions.size()];
}

}  // namespace appsync
