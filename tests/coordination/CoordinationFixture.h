#pragma once

#include "coordination/InstallErrors.h"
#include "tests/client/AppsClientFixture.h"

namespace appsync {

/// A device whose installs are coordinated, and a client on it. The client is not inside the
/// daemon: reports of placeholders are counted.
class CoordinationFixture : public AppsClientFixture {
  protected:
    explicit CoordinationFixture(Scheduling scheduling = Scheduling::runToCompletion())
        : AppsClientFixture(scheduling) {
        platform_.host.setMainBundleIdentifier("com.example.other");
        makeCoordinatedClient();
    }

    using Coordinator = std::shared_ptr<InstallCoordinator>;

    SimulatedCoordination& service() { return platform_.coordination; }

    /// The coordinator of a first install, or an update, as the client gets it.
    Coordinator coordinator(bool existingApp = false, ErrorOut error = nullptr) {
        return client_->_initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier(
            kA, existingApp, true, error);
    }
    std::shared_ptr<InstallPlaceholder> placeholder() {
        return client_->_placeHolderForBundleIdentifier(kA, "Example", kInstallTypeSync);
    }
    [[nodiscard]] const SimulatedPromiseState& promise(const std::string& suffix) {
        const auto* state = service().promise(kA + suffix);
        EXPECT_NE(state, nullptr);
        static const SimulatedPromiseState kNone;
        return state != nullptr ? *state : kNone;
    }
    [[nodiscard]] std::vector<std::string> steps() const {
        return platform_.callsTo({"InstallTransactionLog.logStep"});
    }
    static SimulatedCancel cancelledWith(InstallError code) {
        return {makeInstallError(code), SyncClientID};
    }

    const ErrorRecord refusal_{"Coordination", 7, {}};
};

/// One whose host asks for one application, whose package has not come yet.
class PreparedAppFixture : public CoordinationFixture {
  protected:
    explicit PreparedAppFixture(Scheduling scheduling = Scheduling::runToCompletion())
        : CoordinationFixture(scheduling) {
        platform_.files.addDirectory(std::string(kWorkArea));
        setTodoList(PropertyList::array({todoEntry(kA, "install")}));
        platform_.addPropertyList(kInfoPath, info_);
        platform_.addPropertyList(kStorePath, store_);
        platform_.files.addFile(kIconPath, "icon");
        asset_->identifier = kA;
        asset_->dataclass = "Application";
        asset_->prettyName = "Example";
        asset_->icon = FileURL::fromPath(kIconPath, false);
        asset_->variantOptions = PropertyList::map({{"Version", "1.0"}});
        asset_->infoPath = kInfoPath;
        asset_->storeMetadataPath = kStorePath;
        platform_.clearRecording();
    }

    /// Lets the service do what there is to do.
    bool prepare(bool existingApp = false) {
        const bool status = client_->prepareAppForInstallUsingCoordination(*asset_, existingApp);
        platform_.runUntilIdle();
        return status;
    }
    /// The package has come.
    void receive() {
        asset_->path = packagePath(kA);
        platform_.files.addFile(*asset_->path, "package");
    }
    [[nodiscard]] const SimulatedCoordinatorState* state() { return service().state(kA); }

    static constexpr const char* kInfoPath = "/var/mobile/Media/a/Info.plist";
    static constexpr const char* kStorePath = "/var/mobile/Media/a/VessikMetadata.plist";
    static constexpr const char* kIconPath = "/var/mobile/Media/a/icon.png";
    const PropertyList info_ = PropertyList::map({{"BundleDisplayName", "Example"}});
    const PropertyList store_ = PropertyList::map({{"itemId", 5}});
    const SyncAssetPointer asset_ = std::make_shared<SyncAsset>();
};

}  // namespace appsync
