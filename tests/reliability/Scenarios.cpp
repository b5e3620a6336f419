#include "tests/reliability/Scenarios.h"

#include <chrono>
#include <map>
#include <optional>

#include "client/Paths.h"
#include "client/TodoList.h"
#include "platform/InstallProgressRecord.h"
#include "tests/reliability/HostPlan.h"

namespace appsync {
namespace {

constexpr const char* kA = "com.example.a";
constexpr const char* kB = "com.example.b";
constexpr const char* kC = "com.example.c";
constexpr const char* kD = "com.example.d";
/// How long placeholders take, where it is to be waited for them.
constexpr std::chrono::seconds kPlaceholderDuration{3};

using Shortcomings = std::vector<std::string>;

PropertyList oneOfEach() {
    return PropertyList::array({World::entry(kA, "install"), World::entry(kB, "remove")});
}

PropertyList updates() {
    return PropertyList::array({World::entry(kA, "install"), World::entry(kC, "install")});
}

PropertyList removals() {
    return PropertyList::array({World::entry(kA, "remove"), World::entry(kB, "remove")});
}

/// The client's answer to the host is the one that it promises.
void expect(Invariants& invariants, bool holds, const char* what) {
    if (!holds) invariants.violate(what);
}

void reconcile(World& world, Invariants& invariants) {
    std::optional<ErrorRecord> error;
    const bool done = world.client->reconcileSync({}, "anchor 1", {}, &error);
    const bool takeover =
        world.faults.hasInjected("FileSystem.createDirectory(" + std::string(kWorkArea) + ", ") ||
        world.faults.hasInjected("FileSystem.moveItem(");
    // A directory of the last session that cannot be removed is in the way of the next one's.
    const bool inTheWay = world.faults.hasInjected("FileSystem.removeItem(");
    expect(invariants, done || takeover || inTheWay, "a session was refused without a reason");
    expect(invariants, done || error.has_value(), "a session was refused without an error");
}

void transfer(World& world, const SyncAssetPointer& asset) {
    asset->downloadProgress = 0.5;
    world.client->assetTransferUpdatedProgress(asset, 0.5);
    world.receive(asset);
    world.client->assetTransferSucceeded(asset, true, nullptr);
}

/// Up to the moment at which the session begins.
HostPlan begin(World& world, Invariants& invariants, const PropertyList& wanted) {
    HostPlan plan{wanted, {}};
    if (world.hostPlans) plan = planSession(world, wanted);
    world.stage(plan.todoList, wanted);
    invariants.sessionBegins(plan.todoList);
    if (world.client == nullptr) world.startClient();
    return plan;
}

std::function<void(World&, Invariants&)> syncing(PropertyList list) {
    return [list = std::move(list)](World& world, Invariants& invariants) {
        sync(world, invariants, list);
    };
}

void restore(World& world, Invariants& invariants, const std::vector<std::string>& identifiers) {
    world.stageRestore(identifiers);
    invariants.restoreBegins();
    std::optional<ErrorRecord> error;
    expect(invariants, world.client->reconcileRestoreOfType(2, &error), "a restore was refused");
    expect(invariants, !error, "a restore gave an error");
    world.settle();
}

/// By the same client, of a backup that holds more.
void restoreTwice(World& world, Invariants& invariants) {
    restore(world, invariants, {kA});
    restore(world, invariants, {kA, kC});
}

void prepareRestore(World& world, const char* identifier, const Bytes& metadata) {
    const std::shared_ptr<AppsClient> client = world.client;
    client->prepareAppForRestoreUsingCoordination(identifier, metadata, nullptr, nullptr, 0);
}

/// While it is waited for the placeholders of two applications, the store cancels one of them, the
/// other is given up, and at the last moment a third one is promised.
void restoreDisturbed(World& world, Invariants& invariants) {
    world.platform.onCall("WaitGroup.waitFor", [&world](const RecordEntry&) {
        Scheduler& scheduler = world.platform.scheduler;
        scheduler.spawnAfter(std::chrono::seconds(1), "store", [&world] {
            if (world.platform.coordination.state(kA) == nullptr) return;
            world.platform.coordination.cancel(kA, ErrorRecord::make("Person", 1, "cancelled"),
                                               AppStoreClientID);
        });
        scheduler.spawnAfter(std::chrono::seconds(2), "another restore",
                             [&world] { prepareRestore(world, kC, {}); });
        scheduler.spawnAfter(std::chrono::seconds(9), "another restore",
                             [&world] { prepareRestore(world, kD, world.restoreMetadata()); });
    });
    restore(world, invariants, {kA, kC});
    world.platform.onCall("WaitGroup.waitFor", {});
}

/// The package of a restoring application, then its data.
void transferRestore(World& world, Invariants&) {
    // Who sends it by hand sees whether it is there.
    if (world.hostPlans && world.platform.registry.installed(kA)) return;
    for (const unsigned parts :
         {unsigned{kAssetPartApplication}, unsigned{kAssetPartApplicationData}}) {
        auto asset = std::make_shared<SyncAsset>();
        asset->identifier = kA;
        asset->dataclass = "Application";
        asset->isRestore = true;
        asset->completedParts = parts;
        asset->variantOptions = PropertyList::map({{"Version", "1.0"}});
        world.client->assetTransferUpdatedProgress(asset, 1.0);
        world.receive(asset);
        if (parts == kAssetPartApplicationData) asset->path = std::nullopt;
        world.client->assetTransferSucceeded(asset, true, nullptr);
    }
    world.client->assetTransferEndedWithSuccess(true);
    world.settle();
}

void clean(World& world, Invariants&) {
    world.client->clearSyncData();
    world.settle();
}

void backUp(World& world, Invariants&) {
    world.client->prepareForBackup();
    static_cast<void>(world.client->installedAssetMetrics());
    static_cast<void>(world.client->korvuIDsForAssets());
    static_cast<void>(world.client->accountsForAssets());
    world.settle();
}

/// Of a session that has installed nothing: what is uninstalled is told of, and forgotten.
void endSession(World& world, Invariants&) {
    static_cast<void>(world.client->installedAssets());
    world.client->assetTransferEndedWithSuccess(true);
    world.client->syncEndedWithSuccess(true);
    world.settle();
}

/// The transfers of two applications, one of which fails, and the phase that fails then.
void loseTransfers(World& world, Invariants& invariants) {
    const PropertyList list = updates();
    begin(world, invariants, list);
    reconcile(world, invariants);
    const auto assets = world.client->outstandingAssetTransfers();
    world.platform.runUntilIdle();
    const ErrorRecord lost = ErrorRecord::make(kPosixErrorDomain, 5, "lost");
    for (const SyncAssetPointer& asset : assets) {
        world.client->assetTransferUpdatedProgress(asset, 0.5);
        if (asset->identifier == kA) world.client->assetTransferSucceeded(asset, false, &lost);
    }
    world.client->assetTransferEndedWithSuccess(false);
    world.client->syncEndedWithSuccess(false);
    world.settle();
}

Shortcomings differences(World& world, const std::vector<std::string>& installed,
                         const std::vector<std::string>& placeholders = {}) {
    Shortcomings result;
    if (world.platform.registry.installedIdentifiers() != installed) {
        result.emplace_back("other applications are installed");
    }
    if (world.platform.registry.placeholderIdentifiers() != placeholders) {
        result.emplace_back("there are other placeholders");
    }
    if (!world.platform.coordination.identifiers().empty() && placeholders.empty()) {
        result.emplace_back("a coordinator is left");
    }
    return result;
}

auto leaving(std::vector<std::string> installed, std::vector<std::string> placeholders = {}) {
    return [=](World& world) { return differences(world, installed, placeholders); };
}

/// Whether the list of offloaded applications could not be read once. They are restored like all
/// others then, and stay so.
bool wasDemotedListLost(const World& world) {
    return world.faults.hasInjected("FileSystem.readFile(" + std::string(kDemotedAppsPath)) ||
           world.faults.hasInjected("PropertyListSerialization.parse(");
}

/// The same, and these placeholders are those of offloaded applications.
auto leavingOffloaded(std::vector<std::string> installed, std::vector<std::string> placeholders,
                      const std::map<std::string, std::uint64_t>& installTypes) {
    return [=](World& world) {
        Shortcomings result = differences(world, installed, placeholders);
        // On the direct path they are restored like all others.
        if (!world.coordinated || wasDemotedListLost(world)) return result;
        for (const auto& [identifier, installType] : installTypes) {
            const auto placeholder = world.platform.registry.placeholder(identifier);
            if (placeholder && placeholder->installType == installType) continue;
            result.push_back(identifier + " is not offloaded as it was");
        }
        return result;
    };
}

/// The same, and every application of the list is marked as installed.
auto marking(std::vector<std::string> installed) {
    return [=](World& world) {
        Shortcomings result = differences(world, installed);
        const PropertyList list = world.platform.propertyListAt(std::string(kTodoListPath))
                                      .value_or(PropertyList::array());
        for (const PropertyList& entry : list.elements()) {
            if (hasOperation(entry, kTodoInstalled) || hasOperation(entry, kTodoRemove)) continue;
            result.push_back(*entry.findString(kTodoIdentifierKey) + " is not marked");
        }
        return result;
    };
}

std::string metadataPath(const char* identifier) {
    return std::string("/var/containers/Bundle/Application/") + identifier +
           "/VessikMetadata.plist";
}

Shortcomings unclearedMarks(World& world) {
    Shortcomings result;
    for (const char* identifier : {kA, kB}) {
        const auto metadata = world.platform.propertyListAt(metadataPath(identifier));
        if (!metadata || metadata->find("title") == nullptr ||
            metadata->find("is-auto-download") != nullptr) {
            result.push_back(std::string("the metadata of ") + identifier);
        }
    }
    return result;
}

void install(World& world, std::initializer_list<const char*> identifiers) {
    for (const char* identifier : identifiers) {
        world.platform.registry.addApplication(identifier, "0.9");
    }
}

void addMarks(World& world) {
    install(world, {kA, kB});
    for (const char* identifier : {kA, kB}) {
        world.platform.addPropertyList(
            metadataPath(identifier),
            PropertyList::map({{"title", "A"}, {"is-auto-download", true}, {"korvuId", "me"}}));
    }
}

void addUninstalled(World& world) {
    world.platform.files.addDirectory(std::string(kWorkArea));
    world.platform.installer.addUninstalled(kA);
    world.platform.addPropertyList(std::string(kLastSyncAppStatePath), PropertyList::array({kB}));
}

Shortcomings uncleared(World& world) {
    Shortcomings result;
    if (world.platform.installer.uninstalled()->size() != 0) {
        result.emplace_back("the uninstalled list");
    }
    return result;
}

void addRestoring(World& world) {
    world.platform.files.addDirectory(std::string(kWorkArea));
    world.platform.registry.addPlaceholder(kA, 2);
    world.platform.backup.addRestoreData(kA);
    world.platform.addPropertyList(
        std::string(kRestoreStatePath),
        PropertyList::map(
            {{kC, PropertyList::map({{"1.0", PropertyList::map({{"path", "/c"}})}})}}));
}

/// Offloaded applications that the host wants back, wants removed, and says nothing of.
void addOffloaded(World& world) {
    world.platform.registry.addPlaceholder(kA, kInstallTypeDowngrade);
    world.platform.registry.addPlaceholder(kB, kInstallTypeIntentionalDowngrade);
    world.platform.registry.addPlaceholder(kC, kInstallTypeIntentionalDowngrade);
}

void addBackup(World& world) {
    install(world, {kB});
    world.stageDemoted({kC}, {kD});
}

void addSlowBackup(World& world) {
    addBackup(world);
    world.platform.coordination.setPlaceholderDuration(kPlaceholderDuration);
}

/// All of them are coordinated; there is nothing to wait for else.
void addSlowRestores(std::vector<Scenario>& all) {
    Scenario slow;
    slow.name = "CoordinatedRestoreOutsideTheDaemon";
    slow.coordinated = true;
    slow.isInDaemon = false;
    slow.isVariant = true;
    slow.arrange = addSlowBackup;
    slow.run = [](World& world, Invariants& invariants) {
        restore(world, invariants, {kA, kC, kD});
    };
    slow.shortcomings = leavingOffloaded(
        {kB}, {kA, kC, kD}, {{kC, kInstallTypeDowngrade}, {kD, kInstallTypeIntentionalDowngrade}});
    all.push_back(slow);
    slow.name = "CoordinatedSecondRestore";
    slow.run = restoreTwice;
    slow.shortcomings = leavingOffloaded({kB}, {kA, kC}, {{kC, kInstallTypeDowngrade}});
    all.push_back(slow);
    slow.name = "CoordinatedDisturbedRestore";
    slow.run = restoreDisturbed;
    slow.shortcomings = leaving({kB}, {kC, kD});
    all.push_back(slow);
}

std::vector<Scenario> inBothModes(const Scenario& scenario) {
    Scenario direct = scenario;
    Scenario coordinated = scenario;
    direct.name = "Direct" + scenario.name;
    coordinated.name = "Coordinated" + scenario.name;
    coordinated.coordinated = true;
    return {direct, coordinated};
}

std::vector<Scenario> make() {
    const auto withB = [](World& world) { install(world, {kB}); };
    const auto withAll = [](World& world) { install(world, {kA, kB, kC}); };
    const auto fine = [](World&) { return Shortcomings{}; };
    const auto restoring = [](World& world, Invariants& invariants) {
        restore(world, invariants, {kA, kC});
    };
    std::vector<Scenario> all;
    const auto add = [&all](const Scenario& scenario) {
        for (Scenario& each : inBothModes(scenario)) all.push_back(std::move(each));
    };
    add({"Sync", false, withB, syncing(oneOfEach()), marking({kA}), true, oneOfEach()});
    add({"Update", false, withAll, syncing(updates()), marking({kA, kB, kC}), true, updates()});
    add({"Removal", false, withAll, syncing(removals()), leaving({kC}), true, removals()});
    add({"LostTransfers", false, withAll, loseTransfers, fine, false, updates(),
         syncing(updates())});
    // A placeholder that a coordinator has promised stays until the store keeps its promise; what
    // is given up once has lost its restore information.
    add({"Restore", false, addBackup, restoring,
         leavingOffloaded({kB}, {kA, kC}, {{kC, kInstallTypeDowngrade}}), true});
    addSlowRestores(all);
    all.push_back({"DirectSecondRestore", false, addBackup, restoreTwice, leaving({kB}, {kA, kC})});
    all.push_back({"CoordinatedOffloaded", true, addOffloaded, syncing(oneOfEach()),
                   leaving({kA}, {kC}), true, oneOfEach()});
    all.back().mayLosePackage = true;
    add({"Backup", false, addMarks, backUp, unclearedMarks});
    add({"SessionEnd", false, addUninstalled, endSession, uncleared});
    add({"Clearing", false,
         [](World& world) {
             addUninstalled(world);
             world.platform.registry.addPlaceholder(kC, 4);
         },
         clean, uncleared});
    all.push_back(
        {"DirectRestoreTransfer", false, addRestoring, transferRestore, leaving({kA}), false});
    return all;
}

}  // namespace

void Scenario::setUp(World& world) const {
    world.coordinated = coordinated;
    world.isInDaemon = isInDaemon;
}

void sync(World& world, Invariants& invariants, const PropertyList& wanted) {
    const HostPlan plan = begin(world, invariants, wanted);
    expect(invariants, world.client->prepareForSyncWithHostAnchor("anchor 0", {}, nullptr),
           "preparing for a sync was refused");
    reconcile(world, invariants);
    world.platform.runUntilIdle();
    static_cast<void>(world.client->installedAssets());
    const auto assets = world.client->outstandingAssetTransfers();
    world.platform.runUntilIdle();
    for (const SyncAssetPointer& asset : assets) {
        if (!plan.arrived.contains(asset->identifier)) transfer(world, asset);
    }
    world.client->assetTransferEndedWithSuccess(true);
    world.platform.runUntilIdle();
    cancelWhatWasTakenUp(world, plan);
    world.client->syncEndedWithSuccess(true);
    world.settle();
}

const std::vector<Scenario>& scenarios() {
    static const std::vector<Scenario> all = make();
    return all;
}

}  // namespace appsync
