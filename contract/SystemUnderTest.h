#pragma once

#include <chrono>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "platform/FileSystem.h"
#include "platform/Notifications.h"
#include "platform/PropertyListSerialization.h"
#include "platform/WorkQueues.h"

namespace appsync {

/// One implementation of the services that every process has, and what the contract tests need to
/// do beside them. Made anew for each test, with an empty device root.
///
/// Whoever ports the plug-in writes one of these and hands it to the kit (contract/ContractKit.h).
class SystemUnderTest {
  public:
    virtual ~SystemUnderTest() = default;

    virtual FileSystem& files() = 0;
    virtual WorkQueues& queues() = 0;
    virtual PropertyListSerialization& propertyLists() = 0;
    virtual NamedNotifications& notifications() = 0;
    virtual NotificationCenter& notificationCenter() = 0;

    // What a host or another process leaves on the device.
    virtual void addLink(const std::string& path, const std::string& target) = 0;
    virtual void addPipe(const std::string& path) = 0;
    /// Accounts that items can be given to and that are not the same: "mobile", and another one
    /// where this process may give items away.
    virtual std::vector<std::string> accounts() = 0;
    /// Whether an item belongs to these accounts; to one that is not named it always does.
    virtual bool belongsTo(const std::string& path, const FileAttributes& accounts) = 0;
    /// The names in a directory of the device, sorted.
    virtual std::vector<std::string> names(const std::string& directory) = 0;

    /// Another process posts; everyone who is told of it has been told when this returns.
    virtual void post(std::string_view name) = 0;
    /// The state of a named notification, as another process sees it.
    virtual std::uint64_t notificationState(std::string_view name) = 0;

    /// Time by the clock that delays and timeouts go by.
    virtual std::chrono::nanoseconds now() = 0;
};

}  // namespace appsync
