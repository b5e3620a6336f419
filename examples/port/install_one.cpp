// install_one DEVICE: a session that installs one package, and what is on the device then.

#include <iostream>

#include "Device.h"
#include "client/AppsClient.h"
#include "client/Paths.h"
#include "client/TodoList.h"

using namespace appsync;

namespace {

/// Placeholders of a session that was cut off would keep their applications from coming.
void removeLeftovers(AppRegistry& registry) {
    registry.enumerateBundles(AppRegistry::kUserBundles, [&](const AppProxy& proxy, bool&) {
        if (!proxy.state.placeholder || proxy.installType != kInstallTypeSync) return;
        registry.uninstallApplication(proxy.applicationIdentifier, {}).ignore();
    });
}

bool write(const Platform& platform, const std::string& path, const PropertyList& value) {
    const auto bytes = platform.propertyLists.serialize(value, PropertyListFormat::Binary);
    return bytes && platform.files.writeFileAtomically(path, *bytes);
}

/// Leaves what is wanted of the device, in one step.
bool stage(const Platform& platform) {
    const std::string area(kStagingArea);
    const PropertyList entry = PropertyList::map({{kTodoIdentifierKey, "com.example.hello"},
                                                  {kTodoOperationKey, kTodoInstall},
                                                  {kTodoNameKey, "Hello"}});
    platform.files.removeItem(area).ignore();
    return platform.files.createDirectory(area + ".new", true, nullptr) &&
           write(platform, area + ".new/ApplicationsSync.plist", PropertyList::array({entry})) &&
           platform.files.moveItem(area + ".new", area);
}

/// Sends the package, which the device has asked for.
void send(const Platform& platform, AppsClient& client, const SyncAssetPointer& asset) {
    asset->path = std::string(kPublicStaging) + "/" + asset->identifier + ".zip";
    const PropertyList info = PropertyList::map({{BundleIdentifierKey, asset->identifier},
                                                 {BundleVersionKey, "1.0"},
                                                 {BundleDisplayNameKey, "Hello"}});
    client.assetTransferSucceeded(asset, write(platform, *asset->path, info), nullptr);
}

}  // namespace

int main(int argc, char** argv) {
    if (argc != 2) return 2;
    port::Device device(argv[1]);
    const Platform platform = device.platform();
    removeLeftovers(platform.registry);
    if (!stage(platform)) return 1;

    const std::shared_ptr<AppsClient> client = AppsClient::create(platform);
    client->prepareForSyncWithHostAnchor("", {}, nullptr);
    client->reconcileSync(PropertyList::map(), "1", {}, nullptr);
    for (const SyncAssetPointer& asset : client->outstandingAssetTransfers())
        send(platform, *client, asset);
    client->assetTransferEndedWithSuccess(true);
    client->syncEndedWithSuccess(true);
    platform.registry.removeObserver(client.get());

    platform.registry.enumerateBundles(AppRegistry::kEveryBundle, [](const AppProxy& app, bool&) {
        std::cout << app.applicationIdentifier << ' ' << app.bundleVersion.value_or("?") << '\n';
    });
}
