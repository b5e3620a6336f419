#include "tests/recordings/SeededRecording.h"

#include <chrono>

#include "client/Paths.h"
#include "platform/InstallProgressRecord.h"
#include "platform/SyncAsset.h"

namespace appsync {
namespace {

Scheduling schedulingOf(std::uint64_t seed) {
    constexpr std::size_t kChangePoints = 4;
    return seed % 2 == 0 ? Scheduling::seeded(seed) : Scheduling::prioritized(seed, kChangePoints);
}

std::vector<std::string> identifiersOf(const SeededRecording::Choices& choices) {
    std::vector<std::string> identifiers;
    for (std::size_t i = 0; i < choices.identifiers; ++i) {
        identifiers.push_back("com.example.app" + std::to_string(i));
    }
    // What a path may hold and a URL holds in another form.
    if (choices.isTroubled) identifiers.back() += " @AZ[`az{09:\u00e4\u20ac";
    return identifiers;
}

}  // namespace

SeededRecording::SeededRecording(std::uint64_t seed, Choices choices)
    : choices_(choices),
      random_(seed),
      world_(schedulingOf(seed)),
      identifiers_(identifiersOf(choices)),
      troubles_(world_, random_, identifiers_) {}

std::string SeededRecording::record() {
    arrange();
    startClient();
    if (choices_.hasFaults && oneIn(2)) world_.faults.failSometimes(random_(), 10 + random_() % 90);
    if (oneIn(3)) restore();
    sync();
    if (oneIn(8)) client_->prepareForBackup();
    if (choices_.isEventful) {
        if (oneIn(2)) sync();
        askRareThings();
    }
    world_.settle();
    world_.faults.stop();
    endClient();
    return sink_.text;
}

void SeededRecording::arrange() {
    world_.coordinated = choices_.isCoordinated.value_or(oneIn(2));
    world_.isInDaemon = !oneIn(4);
    for (std::size_t i = 0; i < choices_.identifiers; ++i) {
        if (!oneIn(4)) continue;
        world_.platform.registry.addApplication(identifiers_[i], "0.9");
        if (oneIn(3)) world_.platform.homeScreen.setRunning(identifiers_[i], true);
        if (oneIn(4)) world_.platform.installer.addUninstalled(identifiers_[i]);
    }
    if (oneIn(3)) world_.platform.registry.setInstallDuration(std::chrono::seconds(random_() % 60));
    if (oneIn(3)) world_.platform.host.setRecoverableTest([](const ErrorRecord&) { return true; });
    if (oneIn(10)) {
        world_.platform.policy.set(PolicyFeature::AppInstallationAllowed, PolicyAnswer::No);
    }
    if (choices_.isEventful) arrangeEvents();
    if (choices_.isTroubled) troubles_.arrange();
}

void SeededRecording::arrangeEvents() {
    for (std::size_t i = 0; i < choices_.identifiers; ++i) arrangeApplication(identifiers_[i]);
    if (oneIn(2)) {
        std::vector<std::string> last = someIdentifiers();
        last.emplace_back("com.example.gone");
        world_.platform.addPropertyList(std::string(kLastSyncAppStatePath),
                                        PropertyList::strings(last));
    }
    if (oneIn(2)) world_.stageDemoted(someIdentifiers(), someIdentifiers());
    arrangeServices();
}

void SeededRecording::arrangeApplication(const std::string& identifier) {
    constexpr std::uint64_t kInstallTypes = 9;
    constexpr std::uint64_t kStates = 6;
    constexpr std::uint64_t kPhases = 4;
    SimulatedAppRegistry& registry = world_.platform.registry;
    if (oneIn(2)) {
        registry.addApplication(identifier, oneIn(2) ? "0.9" : "1.0");
        if (!oneIn(4)) {
            const std::string path = registry.installed(identifier)->bundleContainerPath;
            world_.platform.addPropertyList(path + "/VessikMetadata.plist", anyStoreMetadata());
        }
        if (oneIn(2)) world_.platform.homeScreen.setRunning(identifier, true);
        if (oneIn(3)) world_.platform.installer.addUninstalled(identifier);
    }
    if (oneIn(3)) registry.addPlaceholder(identifier, random_() % kInstallTypes);
    if (oneIn(3) && registry.placeholder(identifier)) {
        registry.setProgress(identifier, {random_() % kStates, random_() % kPhases, 100, 10});
    }
    if (oneIn(3)) world_.platform.backup.addRestoreData(identifier);
    if (oneIn(4)) {
        AppProxy system;
        system.applicationIdentifier = "com.korvu.system" + identifier;
        system.bundleVersion = "1.0";
        system.bundleContainerPath = "/private/" + identifier;
        system.bundlePath = system.bundleContainerPath + "/System.app";
        system.applicationType = "System";
        system.installType = random_() % kInstallTypes;
        system.state.placeholder = true;
        registry.add(system);
    }
}

void SeededRecording::arrangeServices() {
    SimulatedPlatform& simulated = world_.platform;
    const ErrorRecord refused = ErrorRecord::make("Installer", 1, "refused");
    if (oneIn(3)) simulated.registry.failNextInstall(anyIdentifier(), refused);
    if (oneIn(3)) simulated.registry.failNextPlaceholderInstall(anyIdentifier(), refused);
    if (oneIn(3)) simulated.registry.failNextUninstall(anyIdentifier(), refused);
    if (oneIn(4)) simulated.transfers.setCanCancelTransfers(false);
    if (oneIn(4)) simulated.host.setTransferService(nullptr);
    if (oneIn(4)) simulated.icons.failAt(static_cast<IconStep>(random_() % 4));
    if (oneIn(4)) simulated.homeScreen.setReachable(false);
    if (oneIn(4)) simulated.policy.set(PolicyFeature::AppRemovalAllowed, PolicyAnswer::No);
    if (oneIn(4)) simulated.host.setRecoverableTest([](const ErrorRecord&) { return false; });
    if (oneIn(3)) simulated.coordination.setPlaceholderDuration(std::chrono::seconds(12));
}

/// What a store may have written, and what it may not have.
PropertyList SeededRecording::anyStoreMetadata() {
    const auto oneOf = [this](std::vector<PropertyList> values) {
        return values[random_() % values.size()];
    };
    PropertyList account = PropertyList::map();
    if (!oneIn(4)) account.set("KorvuID", oneOf({"account 0", "account 1", 7}));
    if (!oneIn(4)) account.set("QPPersonID", oneOf({7, 8, std::uint64_t{1} << 63U, "person"}));
    if (!oneIn(4)) account.set("AltQPID", oneOf({"other", 7}));
    PropertyList download = PropertyList::map();
    if (!oneIn(4)) download.set("accountInfo", oneOf({account, account, account, "none"}));
    PropertyList metadata = PropertyList::map({{"itemName", "Sold"}});
    if (!oneIn(4)) metadata.set("korvuId", oneOf({"account 0", "account 0", 7}));
    if (!oneIn(4)) {
        metadata.set("com.korvu.VessikStore.downloadInfo",
                     oneOf({download, download, download, "none"}));
    }
    if (oneIn(3)) metadata.set("launchProhibited", oneIn(2));
    if (!choices_.isTroubled) return metadata;
    const auto anyFlag = [&oneOf] {
        return oneOf({true, false, 1, -1, 0, std::uint64_t{1} << 63U, 0.0, 0.5, "YES", "no", "True",
                      "maybe", PropertyList::array()});
    };
    for (const char* key : {"is-auto-download", "VKPresselApp", "RGApplicationLaunchProhibited",
                            "title", "itemName", "bundleVersion"}) {
        if (oneIn(3)) metadata.set(key, anyFlag());
    }
    if (oneIn(2)) metadata.set("launchProhibited", anyFlag());
    return metadata;
}

std::vector<std::string> SeededRecording::someIdentifiers() {
    std::vector<std::string> some;
    for (std::size_t i = 0; i < choices_.identifiers; ++i) {
        if (oneIn(2)) some.push_back(identifiers_[i]);
    }
    return some;
}

/// Restore information that lacks something, or has it in another form.
void SeededRecording::stageEventfulRestore() {
    const PropertyList metadata = anyStoreMetadata();
    PropertyList info = PropertyList::map();
    for (const std::string& each : someIdentifiers()) {
        PropertyList entry = PropertyList::map();
        const Bytes encoded =
            oneIn(4) ? Bytes{1, 2} : *world_.codec.serialize(metadata, PropertyListFormat::Binary);
        if (!oneIn(5)) entry.set("VessikMetadata", encoded);
        if (!oneIn(5)) entry.set("ApplicationSINF", Bytes{9, 8, 7});
        if (oneIn(2)) entry.set("PlaceholderIcon", Bytes{1, 2, 3, 4});
        if (oneIn(8)) {
            info.set(each, "none");
        } else {
            info.set(each, entry);
        }
    }
    if (oneIn(6)) info.set("../com.example.unsafe", PropertyList::map());
    world_.platform.addPropertyList(std::string(kRestoreInfoPath), info,
                                    PropertyListFormat::Binary);
}

void SeededRecording::askRareThings() {
    static_cast<void>(client_->currentSyncAnchor());
    static_cast<void>(client_->korvuIDsForAssets());
    static_cast<void>(client_->accountsForAssets());
    static_cast<void>(client_->installedAssetMetrics());
    client_->prepareForBackup();
    if (oneIn(3)) client_->clearSyncData();
}

/// The package of an application that restores, and its data, or one of them.
void SeededRecording::transferRestore() {
    constexpr unsigned kBothParts = 3;
    for (unsigned parts = 1; parts <= kBothParts; ++parts) {
        if (oneIn(2)) continue;
        auto asset = std::make_shared<SyncAsset>();
        asset->identifier = anyIdentifier();
        asset->dataclass = "Application";
        asset->isRestore = true;
        asset->completedParts = parts;
        asset->variantOptions = PropertyList::map({{"Version", "1.0"}, {"AssetParts", parts}});
        transfer(asset);
    }
}

/// An entry of a todo list as few hosts write it.
PropertyList SeededRecording::anyEntry(const std::string& identifier) {
    static const std::vector<const char*> operations = {"install", "install",   "remove", "SENT",
                                                        "FAILED",  "INSTALLED", "strange"};
    PropertyList entry = World::entry(identifier, operations[random_() % operations.size()]);
    if (oneIn(4)) entry.set("version", oneIn(2) ? PropertyList("2.0") : PropertyList(2));
    if (oneIn(6)) entry.set("identifier", "../" + identifier);
    return entry;
}

void SeededRecording::startClient() {
    SimulatedPlatform& simulated = world_.platform;
    simulated.coordination.setEnabled(world_.coordinated);
    if (!world_.isInDaemon) simulated.host.setMainBundleIdentifier("com.example.other");
    RecordingOptions options;
    options.isAnonymous = choices_.isAnonymous;
    options.clock = [&simulated] { return simulated.now(); };
    options.thread = [&simulated] { return simulated.scheduler.current(); };
    recording_ = std::make_shared<Recording>(sink_, simulated.host, "test", std::move(options));
    platform_ = std::make_unique<RecordingPlatform>(simulated.services(), *recording_);
    {
        const SpanRecord span(*recording_, "host", "makeClient", 0);
        made_ = appsyncPlugInTable()->makeClient(platform_->services());
    }
    client_ = std::make_unique<RecordedClient>(*made_.client, *recording_);
    if (!world_.isInDaemon) simulated.coordination.start();
    simulated.notificationCenter.post(kStartUp);
    simulated.runUntilIdle();
}

void SeededRecording::endClient() {
    {
        const SpanRecord span(*recording_, "host", "destroyClient", 0);
        platform_->services().registry.removeObserver(made_.observer);
        appsyncPlugInTable()->destroyClient(made_);
    }
    recording_->finish();
}

void SeededRecording::restore() {
    std::vector<std::string> identifiers;
    for (std::size_t i = 0; i < choices_.identifiers; ++i) {
        if (oneIn(2)) identifiers.push_back(identifiers_[i]);
    }
    world_.stageRestore(identifiers);
    if (choices_.isEventful && !oneIn(3)) stageEventfulRestore();
    std::optional<ErrorRecord> error;
    const bool isRare = choices_.isEventful && oneIn(3);
    static_cast<void>(client_->reconcileRestoreOfType(
        isRare ? static_cast<std::int64_t>(random_() % 4) : 2, &error));
}

void SeededRecording::sync() {
    if (!oneIn(12)) world_.stage(anyTodoList());
    if (choices_.isTroubled) troubles_.spoilStaging();
    disturb();
    static_cast<void>(client_->supportedDataclasses());
    static_cast<void>(client_->disabledAssetTypes());
    client_->prepareForSyncWithHostAnchor(
        "anchor 0", [](double) {}, nullptr);
    std::optional<ErrorRecord> error;
    if (!client_->reconcileSync({}, "anchor 1", {}, &error)) return;
    static_cast<void>(client_->installedAssets());
    static_cast<void>(client_->installedAssetMetrics());
    static_cast<void>(client_->accountsForAssets());
    transferAll();
    if (choices_.isEventful && oneIn(2)) transferRestore();
    if (choices_.isTroubled && oneIn(5)) return;  // the host has gone
    const bool success = !oneIn(4);
    client_->assetTransferEndedWithSuccess(success);
    client_->syncEndedWithSuccess(success);
}

void SeededRecording::transferAll() {
    for (const SyncAssetPointer& asset : client_->outstandingAssetTransfers()) {
        if (choices_.isTroubled && oneIn(2)) {
            transferTroubled(asset);
        } else {
            transfer(asset);
        }
    }
}

/// One that is begun and not ended, or ends without a file or a reason.
void SeededRecording::transferTroubled(const SyncAssetPointer& asset) {
    asset->downloadProgress = troubles_.anyFraction();
    client_->assetTransferUpdatedProgress(asset, troubles_.anyFraction());
    if (oneIn(2)) return;
    if (oneIn(3)) world_.platform.coordination.postDidBeginFulfillment(random_() % 4);
    if (oneIn(3) && world_.platform.registry.progress(asset->identifier)) {
        world_.platform.registry.cancelInstalls({asset->identifier});
    }
    if (oneIn(4)) asset->path = std::string(1, '\0');
    client_->assetTransferSucceeded(asset, !oneIn(3), nullptr);
}

PropertyList SeededRecording::anyTodoList() {
    PropertyList list = PropertyList::array();
    for (std::size_t i = 0; i < choices_.identifiers; ++i) {
        if (oneIn(4)) continue;
        if (choices_.isEventful && oneIn(3)) {
            list.append(anyEntry(identifiers_[i]));
            continue;
        }
        list.append(World::entry(identifiers_[i], oneIn(4) ? "remove" : "install"));
    }
    return list;
}

/// What others do while the session runs.
void SeededRecording::disturb() {
    SimulatedPlatform& simulated = world_.platform;
    for (std::size_t i = 0; i < choices_.identifiers; ++i) {
        simulated.scheduler.spawnAfter(
            std::chrono::seconds(random_() % 90), "person",
            [&simulated, each = identifiers_[i]] { simulated.homeScreen.setRunning(each, false); });
    }
    if (!oneIn(2)) return;
    simulated.scheduler.spawnAfter(std::chrono::seconds(random_() % 90), "another client",
                                   [&simulated, each = anyIdentifier()] {
                                       if (simulated.coordination.state(each) != nullptr) {
                                           simulated.coordination.cancel(
                                               each, ErrorRecord::make("Person", 1, "cancelled"),
                                               AppStoreClientID);
                                       } else if (simulated.registry.progress(each)) {
                                           simulated.registry.cancelInstalls({each});
                                       }
                                   });
    if (world_.coordinated) simulated.coordination.prioritize(anyIdentifier());
}

void SeededRecording::transfer(const SyncAssetPointer& asset) {
    asset->downloadProgress = 0.5;
    client_->assetTransferUpdatedProgress(asset, 0.5);
    if (oneIn(4)) world_.platform.advance(std::chrono::seconds(random_() % 90));
    if (oneIn(6)) {
        const ErrorRecord lost = ErrorRecord::make(kPosixErrorDomain, 5, "lost");
        client_->assetTransferSucceeded(asset, false, oneIn(2) ? &lost : nullptr);
    } else {
        world_.receive(asset);
        if (choices_.isEventful && oneIn(8)) asset->path = "../" + asset->identifier + ".zip";
        if (choices_.isEventful && oneIn(8)) asset->isDownload = false;
        client_->assetTransferSucceeded(asset, true, nullptr);
    }
}

}  // namespace appsync
