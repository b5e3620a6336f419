#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <chrono>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "client/AppsClient.h"
#include "client/Paths.h"
#include "client/TodoList.h"
#include "contract/DeviceContract.h"
#include "contract/suites/Applications.h"
#include "platform/HomeScreenService.h"
#include "platform/SyncAsset.h"

namespace appsync {
namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;
using testing::IsEmpty;

constexpr const char* kC = "com.example.c";

// How often is looked for what comes on threads of the device's, and how many times.
constexpr std::chrono::milliseconds kInterval{5};
constexpr int kLooks = 2000;

constexpr std::int64_t kRestoreFromBackup = 2;

/// Whole sessions of the plug-in on the port's platform, looked at through its services.
class SessionContract : public DeviceContract {
  protected:
    SessionContract() {
        checks(
            "platform/Platform.h",
            "Everything that the plug-in needs of a device: references, which the client copies.");
    }

    [[nodiscard]] std::unique_ptr<Platform> platform() {
        return std::make_unique<Platform>(device_->services());
    }
    void write(const std::string& path, const PropertyList& value) {
        FileSystem& files = platform()->files;
        EXPECT_TRUE(files.createDirectory(path.substr(0, path.rfind('/')), true, nullptr));
        const auto bytes = platform()->propertyLists.serialize(value, PropertyListFormat::Binary);
        ASSERT_TRUE(bytes);
        EXPECT_TRUE(files.writeFileAtomically(path, *bytes));
    }
    static PropertyList entry(const std::string& identifier, std::string_view operation) {
        return PropertyList::map({{kTodoIdentifierKey, identifier},
                                  {kTodoOperationKey, operation},
                                  {kTodoVersionKey, "2.0"},
                                  {kTodoNameKey, "Example"}});
    }
    /// What the host leaves in the staging area.
    void stage(const std::vector<std::string>& installs, const std::vector<std::string>& removals,
               const std::vector<std::string>& layout) {
        const std::string area(kStagingArea);
        PropertyList list = PropertyList::array();
        for (const std::string& identifier : removals) list.append(entry(identifier, kTodoRemove));
        for (const std::string& identifier : installs) {
            list.append(entry(identifier, kTodoInstall));
            write(area + "/" + identifier + "/Info.plist",
                  PropertyList::map({{BundleIdentifierKey, identifier},
                                     {BundleVersionKey, "2.0"},
                                     {BundleDisplayNameKey, "Example"}}));
        }
        write(area + "/ApplicationsSync.plist", list);
        const Status written = platform()->files.writeFileAtomically(
            area + "/DeskoraIconState.plist", device_->iconState(layout));
        EXPECT_TRUE(written);
    }

    void begin() {
        client_ = AppsClient::create(*platform());
        EXPECT_TRUE(client_->prepareForSyncWithHostAnchor(
            "anchor", [](double) {}, nullptr));
        EXPECT_TRUE(client_->reconcileSync(
            PropertyList::map(), "anchor", [](double) {}, nullptr));
        static_cast<void>(client_->installedAssets());
        assets_ = client_->outstandingAssetTransfers();
    }
    void sendAll() {
        for (const SyncAssetPointer& asset : assets_) {
            client_->assetTransferUpdatedProgress(asset, 0.5);
            asset->path = device_->addPackage({asset->identifier, "2.0", "Example"});
            client_->assetTransferSucceeded(asset, true, nullptr);
        }
        client_->assetTransferEndedWithSuccess(true);
    }
    void end() {
        client_->syncEndedWithSuccess(true);
        letGo();
    }
    /// Waits for the last of the client, which may be a call of the device's threads.
    void letGo() {
        const std::weak_ptr<AppsClient> last = client_;
        assets_.clear();
        client_.reset();
        EXPECT_TRUE(comesTrue([&] { return last.expired(); })) << "the client is not let go of";
    }
    template <typename Condition>
    bool comesTrue(Condition condition) {
        for (int i = 0; i < kLooks && !condition(); ++i) pause(platform()->queues, kInterval);
        return condition();
    }

    [[nodiscard]] std::vector<std::string> asked() const {
        std::vector<std::string> identifiers;
        identifiers.reserve(assets_.size());
        for (const SyncAssetPointer& asset : assets_) identifiers.push_back(asset->identifier);
        return identifiers;
    }
    /// "com.example.a 2.0", or "com.example.a (placeholder)", sorted.
    std::vector<std::string> present() {
        std::vector<std::string> texts;
        platform()->registry.enumerateBundles(AppRegistry::kUserBundles, [&](const AppProxy& proxy,
                                                                             bool&) {
            texts.push_back(proxy.applicationIdentifier +
                            (proxy.state.placeholder ? " (placeholder)"
                                                     : " " + proxy.bundleVersion.value_or("?")));
        });
        std::sort(texts.begin(), texts.end());
        return texts;
    }
    /// "com.example.a INSTALLED", in the list's order.
    std::vector<std::string> outcomes() {
        const Result<Bytes> bytes = platform()->files.readFile(std::string(kTodoListPath));
        const auto list = platform()->propertyLists.parse(bytes ? *bytes : Bytes{});
        if (!list || !list->isArray()) return {"no list"};
        std::vector<std::string> texts;
        for (const PropertyList& each : list->elements()) {
            const std::string* identifier = each.findString(kTodoIdentifierKey);
            const std::string* operation = each.findString(kTodoOperationKey);
            texts.push_back((identifier != nullptr ? *identifier : "?") + " " +
                            (operation != nullptr ? *operation : "?"));
        }
        return texts;
    }
    /// The icon layout, as the home screen gives it.
    std::vector<std::string> layout() {
        const auto connection = platform()->homeScreen.blockableConnection();
        const auto bytes = connection != nullptr ? connection->flattenedIconState(1) : std::nullopt;
        const auto list = platform()->propertyLists.parse(bytes ? *bytes : Bytes{});
        if (!list || !list->isArray()) return {"no layout"};
        std::vector<std::string> identifiers;
        for (const PropertyList& each : list->elements()) {
            identifiers.push_back(each.asString() != nullptr ? *each.asString() : "?");
        }
        return identifiers;
    }
    /// What a host does before a session: removes the placeholders that no install belongs to.
    void removeLeftovers() {
        AppRegistry& registry = platform()->registry;
        std::vector<std::string> leftovers;
        registry.enumerateBundles(AppRegistry::kUserBundles, [&](const AppProxy& proxy, bool&) {
            const bool isOfSync = proxy.installType == kInstallTypeSync;
            if (proxy.state.placeholder && isOfSync)
                leftovers.push_back(proxy.applicationIdentifier);
        });
        const PropertyList only = PropertyList::map({{UninstallPlaceholderOnlyKey, true}});
        for (const std::string& identifier : leftovers) {
            EXPECT_TRUE(registry.uninstallApplication(identifier, only));
        }
    }
    [[nodiscard]] bool has(OptionalService service) const {
        return !GetParam().absent.contains(service);
    }

    std::shared_ptr<AppsClient> client_;
    std::vector<SyncAssetPointer> assets_;
};

APPSYNC_CONTRACT_SUITE(SessionContract, devicePorts());

TEST_P(SessionContract, ASessionInstallsUpdatesAndRemoves) {
    ASSERT_TRUE(installPackage({kB, "1.0"}));
    ASSERT_TRUE(installPackage({kC, "1.0"}));
    stage({kA, kB}, {kC}, {kB, kA});
    begin();
    EXPECT_THAT(asked(), testing::UnorderedElementsAre(kA, kB));
    EXPECT_THAT(present(), ElementsAre("com.example.a (placeholder)", "com.example.b (placeholder)",
                                       "com.example.b 1.0"));
    sendAll();
    EXPECT_THAT(present(), ElementsAre("com.example.a 2.0", "com.example.b 2.0"));
    EXPECT_THAT(outcomes(), ElementsAre("com.example.c remove", "com.example.a INSTALLED",
                                        "com.example.b INSTALLED"));
    if (has(OptionalService::HomeScreen)) {
        EXPECT_THAT(layout(), ElementsAre(kB, kA));
    }
    end();
}

TEST_P(SessionContract, AnUpdateThatIsRefusedLeavesTheOldVersion) {
    ASSERT_TRUE(installPackage({kA, "1.0"}));
    stage({kA, kB}, {}, {kA, kB});
    begin();
    for (const SyncAssetPointer& asset : assets_) {
        const std::string package = asset->identifier == kA ? kC : kB;
        asset->path = device_->addPackage({package, "2.0"});
        client_->assetTransferSucceeded(asset, true, nullptr);
    }
    client_->assetTransferEndedWithSuccess(true);
    EXPECT_THAT(present(), ElementsAre("com.example.a 1.0", "com.example.b 2.0"));
    EXPECT_THAT(outcomes(), ElementsAre("com.example.a FAILED", "com.example.b INSTALLED"));
    end();
}

TEST_P(SessionContract, ASecondSessionGoesOnWhereTheFirstWasInterrupted) {
    stage({kA, kB}, {}, {kA, kB});
    begin();
    ASSERT_FALSE(assets_.empty());
    client_->assetTransferUpdatedProgress(assets_.front(), 0.5);
    letGo();
    static_cast<void>(device_->reopen());  // where it is offered: as another process
    removeLeftovers();
    stage({kA, kB}, {}, {kA, kB});
    begin();
    EXPECT_THAT(asked(), testing::UnorderedElementsAre(kA, kB));
    sendAll();
    EXPECT_THAT(present(), ElementsAre("com.example.a 2.0", "com.example.b 2.0"));
    EXPECT_THAT(outcomes(), ElementsAre("com.example.a INSTALLED", "com.example.b INSTALLED"));
    end();
}

TEST_P(SessionContract, ARestoreBringsPlaceholders) {
    const auto metadata = services_.propertyLists.serialize(
        PropertyList::map({{"title", "Atlas"}, {"bundleVersion", "3.0"}}),
        PropertyListFormat::Binary);
    ASSERT_TRUE(metadata);
    ASSERT_TRUE(
        services_.files.createDirectory("/var/mobile/Library/Logs/MediaServices", true, nullptr));
    write(std::string(kRestoreInfoPath),
          PropertyList::map({{kA, PropertyList::map({{"VessikMetadata", *metadata}})}}));
    client_ = AppsClient::create(*platform());
    EXPECT_TRUE(client_->reconcileRestoreOfType(kRestoreFromBackup, nullptr));
    EXPECT_THAT(present(), ElementsAre("com.example.a (placeholder)"));
    const std::optional<AppProxy> proxy = preferred(kA);
    ASSERT_TRUE(proxy);
    EXPECT_EQ(proxy->installType, std::uint64_t{kInstallTypeRestore});
    EXPECT_EQ(proxy->displayName, "Atlas");
    EXPECT_EQ(proxy->bundleVersion, "3.0");
    EXPECT_NE(progress(kA), nullptr);
    EXPECT_FALSE(services_.files.itemExists(std::string(kRestoreInfoPath)));
    EXPECT_TRUE(services_.files.itemExists(std::string(kProcessedRestoreInfoPath)));
    letGo();
}

class CoordinatedSessionContract : public SessionContract {
  protected:
    CoordinatedSessionContract() { device_->turnCoordinationOn(); }
};

APPSYNC_CONTRACT_SUITE(CoordinatedSessionContract, devicePorts({OptionalService::Coordination}));

TEST_P(CoordinatedSessionContract, ASessionInstallsAndUpdates) {
    ASSERT_TRUE(installPackage({kB, "1.0"}));
    ASSERT_TRUE(services_.coordination.isCoordinationEnabled());
    stage({kA, kB}, {}, {kB, kA});
    begin();
    EXPECT_THAT(asked(), testing::UnorderedElementsAre(kA, kB));
    sendAll();
    const std::vector<std::string> wanted{"com.example.a 2.0", "com.example.b 2.0"};
    EXPECT_TRUE(comesTrue([&] { return present() == wanted; }));
    EXPECT_EQ(present(), wanted);
    EXPECT_TRUE(comesTrue([&] {
        return services_.coordination.existingCoordinator(kA, SyncClientID) == nullptr &&
               services_.coordination.existingCoordinator(kB, SyncClientID) == nullptr;
    })) << "a coordinator stays when its install is over";
    end();
}

TEST_P(CoordinatedSessionContract, ARemovalIsMade) {
    ASSERT_TRUE(installPackage({kC, "1.0"}));
    stage({}, {kC}, {});
    begin();
    EXPECT_TRUE(comesTrue([&] { return present().empty(); }));
    EXPECT_THAT(present(), IsEmpty());
    end();
}

}  // namespace

void linkSessionContract() {}

}  // namespace appsync
