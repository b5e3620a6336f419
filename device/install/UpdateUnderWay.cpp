#include "device/install/UpdateUnderWay.h"

#include "device/database/CoordinationTables.h"
#include "device/values/DeviceError.h"
#include "platform/AppRegistry.h"

namespace appsync {
namespace {

// No sync ends what another client has begun.
std::string remedy(const std::string& identifier,
                   const std::optional<StoredCoordinator>& coordinator) {
    if (!coordinator || coordinator->client == SyncClientID) return "; let a sync finish it";
    const std::string client = std::to_string(coordinator->client);
    return " by client " + client + "; wait, or cancel it (appsync coordinator DEVICE cancel " +
           identifier + " --client " + client + ")";
}

}  // namespace

ErrorRecord updateIsUnderWay(const std::string& identifier,
                             const std::optional<StoredCoordinator>& coordinator,
                             std::string_view then) {
    return registryError(RegistryErrorCode::UpdateUnderWay,
                         "an update of " + identifier + " is under way" +
                             remedy(identifier, coordinator) + ", and " + std::string(then) +
                             " then");
}

}  // namespace appsync
