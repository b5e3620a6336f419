// Another build of the plug-in, as a later version may be: more at the end of its table.

#include <memory>

#include "client/AppsClient.h"
#include "platform/PlugInTable.h"

namespace {

using appsync::AppsClient;
using appsync::PlugInClient;

struct LongerTable {
    appsync::PlugInTable known;
    const char* more;
};

PlugInClient makeClient(const appsync::Platform& platform) noexcept {
    const std::shared_ptr<AppsClient> client = AppsClient::create(platform);
    return {client.get(), client.get(), new std::shared_ptr<AppsClient>(client)};
}

void destroyClient(PlugInClient made) noexcept {
    delete static_cast<std::shared_ptr<AppsClient>*>(made.hold);
}

constexpr LongerTable kLonger = {{appsync::kModuleMajorVersion, appsync::kModuleMinorVersion + 5,
                                  "7.8.9", makeClient, destroyClient},
                                 "something new"};

}  // namespace

const appsync::PlugInTable* appsyncPlugInTable() noexcept { return &kLonger.known; }
