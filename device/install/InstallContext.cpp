#include "device/InstallContext.h"

#include <chrono>

#include "device/Database.h"
#include "device/DeviceDatabase.h"
#include "device/DeviceError.h"
#include "device/WallClock.h"

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
