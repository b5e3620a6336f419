#pragma once

#include <optional>
#include <span>
#include <string>
#include <vector>

#include "device/screen/HomeScreenPicture.h"
#include "device/values/DeviceRecords.h"
#include "platform/Result.h"

namespace appsync {

class DeviceDatabase;
class RootDirectory;

/// See Device::applications.
[[nodiscard]] Result<std::vector<ApplicationRecord>> listApplications(DeviceDatabase& database);

/// What the versions take that are kept for a rollback.
[[nodiscard]] Result<std::uint64_t> bytesKept(DeviceDatabase& database);

/// See Device::coordinators.
[[nodiscard]] Result<std::vector<CoordinatorRecord>> listCoordinators(DeviceDatabase& database);

/// See Device::failedInstalls.
[[nodiscard]] Result<std::vector<FailedInstall>> listFailedInstalls(DeviceDatabase& database);

/// How far an install has come, as the database knows it; nothing when none is under way.
[[nodiscard]] std::optional<InstallProgress> storedProgress(DeviceDatabase& database,
                                                            const std::string& identifier);

/// What the database knows of an identifier. Whether a session is under way is for the caller to
/// fill in, and what that means for the rest.
[[nodiscard]] Result<ApplicationStatus> applicationStatus(DeviceDatabase& database,
                                                          const std::string& identifier);

/// See Device::running.
[[nodiscard]] Result<std::vector<std::string>> runningApplications(DeviceDatabase& database);

/// What the database says of a session, beside whether one is under way.
[[nodiscard]] Result<SessionRecord> sessionRecord(DeviceDatabase& database, bool isUnderWay);

/// See Device::moment.
[[nodiscard]] Result<DeviceMoment> deviceMoment(DeviceDatabase& database, bool isUnderWay);

/// See Device::homeScreenIcon.
[[nodiscard]] Bytes homeScreenIcon(const ApplicationRecord& record, const RootDirectory& root);

/// What stands on the home screen: of `order` those that `records` hold. A placeholder stands
/// before the application that it covers. The results point into `records`.
[[nodiscard]] std::vector<const ApplicationRecord*> homeScreenRecords(
    std::span<const std::string> order, std::span<const ApplicationRecord> records);

/// The same as items, with their icons. Icons that cannot be read are left out.
[[nodiscard]] std::vector<HomeScreenItem> homeScreenItems(
    std::span<const std::string> order, std::span<const ApplicationRecord> records,
    const RootDirectory& root);

}  // namespace appsync
