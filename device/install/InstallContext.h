#pragma once

#include <string>

#include "platform/Result.h"

namespace appsync {

class Containers;
class DeviceDatabase;
class DurabilityBarrier;
class ProgressBook;
class PropertyListSerialization;
class RootedFileSystem;

/// What installing and removing work with. Everything outlives whoever holds a copy of this.
struct InstallContext {
    DeviceDatabase& database;
    RootedFileSystem& files;
    Containers& containers;
    DurabilityBarrier& barrier;
    ProgressBook& progress;
    PropertyListSerialization& propertyLists;
    /// Names this boot of the machine; empty when it is not known.
    const std::string& boot;
};

/// A failure of the device's database as the registry tells it; other failures, and success, as
/// they are.
[[nodiscard]] Status asRegistryStatus(Status status);

/// Keeps the failure of an install for those who ask later.
void rememberFailure(const InstallContext& context, const std::string& identifier,
                     const ErrorRecord& error);

}  // namespace appsync
