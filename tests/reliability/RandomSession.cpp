#include "tests/reliability/RandomSession.h"

#include <chrono>
#include <exception>

#include "client/Paths.h"
#include "platform/InstallProgressRecord.h"

namespace appsync {
namespace {

constexpr std::uint64_t kIdentifiers = 6;
constexpr std::size_t kChangePoints = 4;
constexpr std::uint64_t kLongestDelay = 90;  // seconds: some retries
constexpr std::uint64_t kLongestShortDelay = 15;
constexpr std::uint64_t kLongestPlaceholder = 12;
constexpr CoordinationClient kAnotherClient = 9;

std::set<std::size_t> keysOf(const std::map<std::size_t, std::uint64_t>& numbers) {
    std::set<std::size_t> keys;
    for (const auto& [key, number] : numbers) keys.insert(key);
    return keys;
}

ErrorRecord somebodysReason() { return ErrorRecord::make("Person", 1, "cancelled"); }

}  // namespace

Scheduling RandomSession::schedulingOf(std::uint64_t seed, std::shared_ptr<Chance> turns) {
    Scheduling scheduling =
        seed % 2 == 0 ? Scheduling::seeded(seed) : Scheduling::prioritized(seed, kChangePoints);
    scheduling.chance = std::move(turns);
    return scheduling;
}

RandomSession::RandomSession(std::uint64_t seed, const SessionChanges& changes)
    : changes_(changes),
      choices_(seed, changes.choices),
      turns_(std::make_shared<Chance>(changes.turnSeed.value_or(seed), changes.turns)),
      world_(schedulingOf(seed, turns_)),
      invariants_(world_),
      demands_(world_, invariants_) {}

std::vector<std::string> RandomSession::run() {
    try {
        runThrowing();
    } catch (const std::exception& failure) {
        invariants_.violate(failure.what());
    }
    return invariants_.violations();
}

void RandomSession::runThrowing() {
    arrange();
    world_.startClient();
    arrangeFaults();
    if (oneIn(3)) {
        restore();
        if (oneIn(3)) restore();
    }
    leaves_ = oneIn(10);
    sync();
    if (!leaves_ && oneIn(3)) sync();
    if (oneIn(8)) world_.client->prepareForBackup();
    if (leaves_) {
        invariants_.clientGoes();
        invariants_.sessionHasEnded();
        return;
    }
    world_.settle();
    invariants_.sessionHasEnded();
    demands_.sessionHasEnded();
    invariants_.clientGoes();
}

std::array<std::size_t, 3> RandomSession::draws() const {
    return {choices_.draws(), faultChance_ != nullptr ? faultChance_->draws() : 0, turns_->draws()};
}

SessionChanges RandomSession::unrest() const {
    const auto of = [](const std::vector<std::size_t>& draws) {
        return std::set<std::size_t>(draws.begin(), draws.end());
    };
    SessionChanges changes = changes_;
    changes.choices.kept = of(choices_.unrest());
    changes.faults.kept =
        of(faultChance_ != nullptr ? faultChance_->unrest() : std::vector<std::size_t>());
    changes.turns.kept = of(turns_->unrest());
    return changes;
}

std::string RandomSession::anyIdentifier() {
    return "com.example.app" + std::to_string(any(kIdentifiers));
}

std::chrono::seconds RandomSession::anyDelay() { return std::chrono::seconds(any(kLongestDelay)); }

/// Within the time that it is waited for a few placeholders.
std::chrono::seconds RandomSession::shortDelay() {
    return std::chrono::seconds(any(kLongestShortDelay));
}

void RandomSession::arrange() {
    world_.coordinated = oneIn(2);
    world_.isInDaemon = !oneIn(4);
    for (std::uint64_t i = any(kIdentifiers); i > 0; --i) {
        const std::string identifier = anyIdentifier();
        world_.platform.registry.addApplication(identifier, "0.9");
        invariants_.mustKeep(identifier);
        if (oneIn(3)) world_.platform.homeScreen.setRunning(identifier, true);
        if (oneIn(6)) world_.platform.installer.addUninstalled(identifier);
    }
    if (oneIn(3)) world_.platform.registry.setInstallDuration(anyDelay());
    if (oneIn(3)) world_.platform.host.setRecoverableTest([](const ErrorRecord&) { return true; });
    if (oneIn(6)) world_.platform.transfers.setCanCancelTransfers(false);
    if (oneIn(6)) world_.platform.host.setTransferService(nullptr);
    arrangePolicy();
    arrangeOffloaded();
}

void RandomSession::arrangeFaults() {
    const bool someFail = oneIn(2);
    if (!someFail && changes_.faults.replaced.empty()) return;
    constexpr std::uint64_t kOften = 10;
    const std::uint64_t count = kOften + any(90);
    const std::uint64_t seed = choices_.seed();
    ChanceChanges changes = changes_.faults;
    if (!someFail && !changes.kept) changes.kept = keysOf(changes.replaced);
    faultChance_ = std::make_shared<Chance>(changes_.faultSeed.value_or(seed), std::move(changes));
    world_.faults.failSometimes(faultChance_, count);
}

void RandomSession::arrangePolicy() {
    if (oneIn(10)) {
        world_.platform.policy.set(PolicyFeature::AppInstallationAllowed, PolicyAnswer::No);
        demands_.forbidInstalls();
    }
    if (oneIn(10)) {
        world_.platform.policy.set(PolicyFeature::AppRemovalAllowed, PolicyAnswer::No);
        demands_.forbidRemovals();
    }
}

/// Applications that are offloaded, on the device and in the backup.
void RandomSession::arrangeOffloaded() {
    std::vector<std::string> automatically;
    std::vector<std::string> intentionally;
    for (std::uint64_t i = 0; i < kIdentifiers; ++i) {
        if (!oneIn(3)) continue;
        const std::string identifier = "com.example.app" + std::to_string(i);
        const bool isIntentional = oneIn(2);
        (isIntentional ? intentionally : automatically).push_back(identifier);
        if (oneIn(2) || world_.platform.registry.installed(identifier)) continue;
        world_.platform.registry.addPlaceholder(
            identifier, isIntentional ? kInstallTypeIntentionalDowngrade : kInstallTypeDowngrade);
    }
    world_.stageDemoted(automatically, intentionally);
    if (oneIn(2)) {
        world_.platform.coordination.setPlaceholderDuration(
            std::chrono::seconds(any(kLongestPlaceholder)));
    }
}

void RandomSession::restore() {
    std::vector<std::string> identifiers;
    for (std::uint64_t i = 0; i < kIdentifiers; ++i) {
        if (oneIn(2)) identifiers.push_back("com.example.app" + std::to_string(i));
    }
    world_.stageRestore(identifiers);
    invariants_.restoreBegins();
    if (world_.coordinated && oneIn(2)) disturbRestore();
    std::optional<ErrorRecord> error;
    if (!world_.client->reconcileRestoreOfType(2, &error) || error) {
        invariants_.violate("a restore was refused");
    }
    world_.platform.onCall("WaitGroup.waitFor", {});
    demands_.restored(identifiers);
}

/// While it is waited for placeholders others cancel, promise one more, and give one up.
void RandomSession::disturbRestore() {
    world_.platform.onCall("WaitGroup.waitFor", [this](const RecordEntry&) {
        if (oneIn(2)) cancelByAnother(anyIdentifier(), shortDelay());
        if (oneIn(2)) restoreAnother(anyIdentifier(), true);
        if (oneIn(2)) restoreAnother(anyIdentifier(), false);
    });
}

void RandomSession::restoreAnother(const std::string& identifier, bool isSound) {
    demands_.leaveOut(identifier);
    demands_.mayBePlaced(identifier);
    const Bytes metadata = isSound ? world_.restoreMetadata() : Bytes{};
    const std::uint64_t demotionStatus = any(3);
    world_.platform.scheduler.spawnAfter(
        shortDelay(), "another restore", [this, identifier, metadata, demotionStatus] {
            const std::shared_ptr<AppsClient> client = world_.client;
            if (client == nullptr) return;
            client->prepareAppForRestoreUsingCoordination(identifier, metadata, nullptr, nullptr,
                                                          demotionStatus);
        });
}

void RandomSession::sync() {
    const PropertyList list = anyTodoList();
    if (!oneIn(12)) {
        world_.stage(list);
        invariants_.sessionBegins(list);
        demands_.willReconcile(list);
    } else {
        invariants_.sessionBeginsWithoutList();
    }
    disturb();
    world_.client->prepareForSyncWithHostAnchor("anchor 0", {}, nullptr);
    std::optional<ErrorRecord> error;
    if (!world_.client->reconcileSync({}, "anchor 1", {}, &error)) return;
    static_cast<void>(world_.client->installedAssets());
    for (const SyncAssetPointer& asset : assetsToSend()) transfer(asset);
    if (!world_.coordinated && oneIn(3)) transferRestore();
    if (leaves_) return;
    const bool success = !oneIn(4);
    world_.client->assetTransferEndedWithSuccess(success);
    world_.client->syncEndedWithSuccess(success);
}

std::vector<SyncAssetPointer> RandomSession::assetsToSend() {
    demands_.willAsk();
    std::vector<SyncAssetPointer> assets = world_.client->outstandingAssetTransfers();
    demands_.wereAskedFor(assets);
    return assets;
}

/// No identifier twice: of two entries only the first is marked.
PropertyList RandomSession::anyTodoList() {
    PropertyList list = PropertyList::array();
    for (std::uint64_t i = 0; i < kIdentifiers; ++i) {
        const std::string identifier = "com.example.app" + std::to_string(i);
        if (oneIn(3, true)) continue;
        list.append(World::entry(identifier, oneIn(4) ? "remove" : "install"));
    }
    return list;
}

/// What others do while the session runs.
void RandomSession::disturb() {
    for (std::uint64_t i = 0; i < kIdentifiers; ++i) {
        // Whoever runs is quit before the host loses patience.
        const std::string identifier = "com.example.app" + std::to_string(i);
        world_.platform.scheduler.spawnAfter(anyDelay(), "person", [this, identifier] {
            world_.platform.homeScreen.setRunning(identifier, false);
        });
    }
    if (oneIn(3)) cancelByAnother(anyIdentifier(), anyDelay());
    if (world_.coordinated && oneIn(6)) {
        const std::string identifier = anyIdentifier();
        if (world_.platform.coordination.state(identifier) == nullptr) {
            demands_.leaveOut(identifier);
            world_.platform.coordination.addCoordinator(CoordinatorKind::Initiating, identifier,
                                                        kAnotherClient);
        }
    }
    if (world_.coordinated && oneIn(4)) world_.platform.coordination.prioritize(anyIdentifier());
    if (oneIn(4)) {
        const std::string identifier = anyIdentifier();
        demands_.leaveOut(identifier);
        world_.platform.registry.failNextInstall(
            identifier, ErrorRecord::make(kInstallerErrorDomain, 1, "refused"));
    }
}

void RandomSession::cancelByAnother(const std::string& identifier, std::chrono::seconds delay) {
    demands_.leaveOut(identifier);
    world_.platform.scheduler.spawnAfter(delay, "another client", [this, identifier] {
        if (world_.platform.coordination.state(identifier) != nullptr) {
            world_.platform.coordination.cancel(identifier, somebodysReason(), AppStoreClientID);
        } else if (world_.platform.registry.progress(identifier)) {
            world_.platform.registry.cancelInstalls({identifier});
        }
    });
}

void RandomSession::transfer(const SyncAssetPointer& asset) {
    asset->downloadProgress = 0.5;
    world_.client->assetTransferUpdatedProgress(asset, 0.5);
    if (oneIn(4)) world_.platform.advance(anyDelay());
    if (oneIn(6)) {
        demands_.notDelivered(asset->identifier);
        loseTransfer(asset);
    } else if (oneIn(20)) {
        asset->path = "../" + asset->identifier + ".zip";
        world_.client->assetTransferSucceeded(asset, true, nullptr);
    } else if (oneIn(20)) {
        asset->isDownload = false;
        asset->path = "upload";
        world_.client->assetTransferSucceeded(asset, true, nullptr);
    } else if (!oneIn(8)) {
        world_.receive(asset);
        if (!asset->isRestore) demands_.delivered(asset->identifier);
        world_.client->assetTransferSucceeded(asset, true, nullptr);
    } else {
        demands_.notDelivered(asset->identifier);
    }
}

/// The package of an application that restores, then its data, or one of them.
void RandomSession::transferRestore() {
    // In no list: what arrives a second time is marked as arrived a second time.
    const std::string identifier = "com.example.restoring";
    if (oneIn(2) && !world_.platform.registry.placeholder(identifier)) {
        world_.platform.registry.addPlaceholder(identifier, 2);
    }
    if (oneIn(2)) world_.platform.backup.addRestoreData(identifier);
    for (const unsigned parts :
         {unsigned{kAssetPartApplication}, unsigned{kAssetPartApplicationData}}) {
        if (oneIn(4, true)) continue;
        auto asset = std::make_shared<SyncAsset>();
        asset->identifier = identifier;
        asset->dataclass = "Application";
        asset->isRestore = true;
        asset->completedParts = parts;
        asset->variantOptions = PropertyList::map({{"Version", "1.0"}});
        transfer(asset);
    }
}

void RandomSession::loseTransfer(const SyncAssetPointer& asset) {
    const ErrorRecord lost = ErrorRecord::make(kPosixErrorDomain, 5, "lost");
    world_.client->assetTransferSucceeded(asset, false, oneIn(2) ? &lost : nullptr);
}

}  // namespace appsync
