#include "device/install/InstallContext.h"

#include <chrono>

#include "device/database/Database.h"
#include "device/database/DeviceDatabase.h"
#include "device/values/DeviceError.h"
#include "device/values/WallClock.h"

namespace appsync {

Status asRegistryStatus(Status status) {
    if (status || status.error().domain != kDeviceErrorDomain) return status;
    return registryError(RegistryErrorCode::DatabaseFailed, status.error().description());
}

void rememberFailure(const InstallContext& context, const std::string& identifier,
                     const ErrorRecord& error) {
    context.database.changeLater([identifier, error, now = wallNow()](Database& database) {
        return database
            .query(
                "INSERT OR REPLACE INTO failures (identifier, time, domain, code, description)"
                " VALUES (?, ?, ?, ?, ?)")
            .bind(identifier, milliseconds(now), error.domain, error.code, error.description())
            .run();
    });
}

}  // namespace appsync
