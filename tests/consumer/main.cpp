// A project that uses the installed libraries: one session on a device in memory.

#include <iostream>
#include <memory>
#include <string>

#include "client/AppsClient.h"
#include "client/Paths.h"
#include "client/TodoList.h"
#include "simulation/SimulatedPlatform.h"
#include "system/property_list/PropertyListCodec.h"

using namespace appsync;

int main() {
    SystemPropertyLists codec;
    SimulatedPlatform platform(codec);
    const PropertyList entry = PropertyList::map({{kTodoIdentifierKey, "com.example.a"},
                                                  {kTodoOperationKey, kTodoInstall},
                                                  {kTodoVersionKey, "1.0"},
                                                  {kTodoNameKey, "A"}});
    platform.addPropertyList(std::string(kStagingArea) + "/ApplicationsSync.plist",
                             PropertyList::array({entry}));
    const std::shared_ptr<AppsClient> client = AppsClient::create(platform.services());
    client->reconcileSync(PropertyList::map(), "1", {}, nullptr);
    for (const SyncAssetPointer& asset : client->outstandingAssetTransfers()) {
        asset->path = std::string(kPublicStaging) + "/" + asset->identifier + ".zip";
        platform.files.addFile(*asset->path, "package");
        client->assetTransferSucceeded(asset, true, nullptr);
    }
    client->assetTransferEndedWithSuccess(true);
    client->syncEndedWithSuccess(true);
    for (const std::string& call : platform.callsTo({"AppRegistry.installPackage"})) {
        std::cout << call << '\n';
    }
}
