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

}  // namespace

SeededRecording::SeededRecording(std::uint64_t seed, Choices choices)
    : choices_(choices), random_(seed), world_(schedulingOf(seed)) {}

std::string SeededRecording::identifier(std::size_t index) const {
    return "com.example.app" + std::to_string(index);
}

std::string SeededRecording::record() {
    arrange();
    startClient();
    if (choices_.hasFaults && oneIn(2)) world_.faults.failSometimes(random_(), 10 + random_() % 90);
    if (oneIn(3)) restore();
    sync();
    if (oneIn(8)) client_->prepareForBackup();
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
        world_.platform.registry.addApplication(identifier(i), "0.9");
        if (oneIn(3)) world_.platform.homeScreen.setRunning(identifier(i), true);
        if (oneIn(4)) world_.platform.installer.addUninstalled(identifier(i));
    }
    if (oneIn(3)) world_.platform.registry.setInstallDuration(std::chrono::seconds(random_() % 60));
    if (oneIn(3)) world_.platform.host.setRecoverableTest([](const ErrorRecord&) { return true; });
    if (oneIn(10)) {
        world_.platform.policy.set(PolicyFeature::AppInstallationAllowed, PolicyAnswer::No);
    }
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
        if (oneIn(2)) identifiers.push_back(identifier(i));
    }
    world_.stageRestore(identifiers);
    std::optional<ErrorRecord> error;
    static_cast<void>(client_->reconcileRestoreOfType(2, &error));
}

void SeededRecording::sync() {
    if (!oneIn(12)) world_.stage(anyTodoList());
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
    for (const SyncAssetPointer& asset : client_->outstandingAssetTransfers()) transfer(asset);
    const bool success = !oneIn(4);
    client_->assetTransferEndedWithSuccess(success);
    client_->syncEndedWithSuccess(success);
}

PropertyList SeededRecording::anyTodoList() {
    PropertyList list = PropertyList::array();
    for (std::size_t i = 0; i < choices_.identifiers; ++i) {
        if (oneIn(4)) continue;
        list.append(World::entry(identifier(i), oneIn(4) ? "remove" : "install"));
    }
    return list;
}

/// What others do while the session runs.
void SeededRecording::disturb() {
    SimulatedPlatform& simulated = world_.platform;
    for (std::size_t i = 0; i < choices_.identifiers; ++i) {
        simulated.scheduler.spawnAfter(
            std::chrono::seconds(random_() % 90), "person",
            [&simulated, each = identifier(i)] { simulated.homeScreen.setRunning(each, false); });
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
        client_->assetTransferSucceeded(asset, true, nullptr);
    }
}

}  // namespace appsync
