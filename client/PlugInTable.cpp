#include "platform/PlugInTable.h"

#include <memory>

#include "client/AppsClient.h"

namespace appsync {
namespace {

using ClientHold = std::shared_ptr<AppsClient>;

// Whoever is on the other side of the table may be built without exceptions.
PlugInClient makeClient(const Platform& platform) noexcept {
    try {
        auto hold = std::make_unique<ClientHold>(AppsClient::create(platform));
        AppsClient* const client = hold->get();
        return {client, client, hold.release()};
    } catch (...) {
        return {};
    }
}

void destroyClient(PlugInClient made) noexcept { delete static_cast<ClientHold*>(made.hold); }

constexpr PlugInTable kTable = {kModuleMajorVersion, kModuleMinorVersion, APPSYNC_VERSION,
                                makeClient, destroyClient};

}  // namespace
}  // namespace appsync

const appsync::PlugInTable* appsyncPlugInTable() noexcept { return &appsync::kTable; }
