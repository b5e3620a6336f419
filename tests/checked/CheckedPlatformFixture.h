#pragma once

#include <chrono>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "checked/CheckedPlatform.h"
#include "tests/client/AppsClientFixture.h"

namespace appsync {

/// Services that stand in the place of those of a platform.
struct Replaced {
    SyncHost* host = nullptr;
    AppRegistry* registry = nullptr;
    FileSystem* files = nullptr;
    PropertyListSerialization* propertyLists = nullptr;
    WorkQueues* queues = nullptr;
    InstallCoordinatorService* coordination = nullptr;
    HomeScreenService* homeScreen = nullptr;
    LogFacility* log = nullptr;
    BackupService* backup = nullptr;
    DevicePolicyService* policy = nullptr;
    InstallerService* installer = nullptr;
};

template <typename Service>
Service& either(Service* replaced, Service& own) {
    return replaced != nullptr ? *replaced : own;
}

inline Platform with(const Platform& full, const Replaced& replaced) {
    return {.host = either(replaced.host, full.host),
            .log = either(replaced.log, full.log),
            .registry = either(replaced.registry, full.registry),
            .installer = either(replaced.installer, full.installer),
            .coordination = either(replaced.coordination, full.coordination),
            .policy = either(replaced.policy, full.policy),
            .backup = either(replaced.backup, full.backup),
            .homeScreen = either(replaced.homeScreen, full.homeScreen),
            .icons = full.icons,
            .transactions = full.transactions,
            .queues = either(replaced.queues, full.queues),
            .files = either(replaced.files, full.files),
            .propertyLists = either(replaced.propertyLists, full.propertyLists),
            .notifications = full.notifications,
            .notificationCenter = full.notificationCenter};
}

/// A device in memory, a platform that checks it or a part of it that is broken, and a client.
class CheckedPlatformFixture : public testing::Test {
  protected:
    explicit CheckedPlatformFixture(Scheduling scheduling = Scheduling::runToCompletion())
        : platform_(codec_, scheduling) {}
    ~CheckedPlatformFixture() override {
        client_.reset();
        platform_.runUntilIdle();
    }
    CheckedPlatformFixture(const CheckedPlatformFixture&) = delete;
    CheckedPlatformFixture& operator=(const CheckedPlatformFixture&) = delete;

    void check(const Platform& platform) {
        checked_.emplace(
            platform,
            CheckedPlatformOptions{
                .sink = [this](const ContractBreach& breach) { breaches_.push_back(breach); },
                .patience = std::chrono::seconds(30),
                .lockPatience = std::chrono::seconds(20),
                .currentThread =
                    [this] {
                        return reinterpret_cast<std::uintptr_t>(platform_.scheduler.current());
                    }});
    }
    void checkWith(const Replaced& replaced) { check(with(platform_.services(), replaced)); }
    void makeClient() { client_ = AppsClient::create(checked_->services()); }

    void stage(const PropertyList& todoList) {
        platform_.addPropertyList(std::string(kStagingArea) + "/ApplicationsSync.plist", todoList);
    }
    /// A session in which one application goes, one is updated, one comes and one does not.
    void sync() {
        platform_.registry.addApplication(kA);
        platform_.registry.addApplication(kB);
        stage(PropertyList::array({todoEntry(kA, kTodoRemove), todoEntry(kB, kTodoInstall),
                                   todoEntry(kC, kTodoInstall),
                                   todoEntry("com.example.d", kTodoInstall)}));
        client_->reconcileSync(PropertyList::map(), "1", {}, nullptr);
        static_cast<void>(client_->installedAssets());
        static_cast<void>(client_->installedAssetMetrics());
        for (const SyncAssetPointer& asset : client_->outstandingAssetTransfers()) transfer(asset);
        client_->assetTransferEndedWithSuccess(true);
        platform_.advance(std::chrono::seconds(60));
        client_->syncEndedWithSuccess(true);
        static_cast<void>(client_->installedAssets());
    }
    void transfer(const SyncAssetPointer& asset) {
        asset->path = std::string(kPublicStaging) + "/" + asset->identifier + ".zip";
        client_->assetTransferUpdatedProgress(asset, 0.5);
        if (asset->identifier == "com.example.d") {
            const ErrorRecord error = ErrorRecord::make(kSyncErrorDomain, 1, "it did not come");
            client_->assetTransferSucceeded(asset, false, &error);
            return;
        }
        platform_.files.addFile(*asset->path, "package");
        client_->assetTransferSucceeded(asset, true, nullptr);
    }
    void restore() {
        const auto metadata =
            codec_.serialize(PropertyList::map({{"title", "Shown"}}), PropertyListFormat::Binary);
        const PropertyList info = PropertyList::map({{"VessikMetadata", *metadata}});
        platform_.files.addDirectory("/var/mobile/Library/Logs/MediaServices");
        platform_.addPropertyList(std::string(kRestoreInfoPath),
                                  PropertyList::map({{"com.example.e", info}}));
        client_->reconcileRestoreOfType(2, nullptr);
        platform_.advance(std::chrono::seconds(60));
    }

    /// What was told, "header: sentence (seen)".
    [[nodiscard]] std::vector<std::string> told() const {
        std::vector<std::string> texts;
        for (const ContractBreach& breach : breaches_)
            texts.push_back(breach.header + ": " + breach.sentence + " (" + breach.seen + ")");
        return texts;
    }

    SystemPropertyLists codec_;
    SimulatedPlatform platform_;
    std::vector<ContractBreach> breaches_;
    std::optional<CheckedPlatform> checked_;
    std::shared_ptr<AppsClient> client_;
};

}  // namespace appsync
