#pragma once

// device/screen: what a person sees. `DeviceHomeScreen` (this header) is the platform's home
// screen: the layout, which application runs, and whether its termination is granted. IconDrawing.h
// makes the icon of an application from its file or its name, with IconCanvas.h, the one place that
// knows cairo, and CairoIconRenderer.h gives the plug-in the same as a service. HomeScreenPicture.h
// draws the whole screen (`appsync screen`).
//
// Includes device/database, device/values, system/, cairo, and of device/package only the name that
// an icon has by default. Called by install (icons of placeholders), coordination (terminations),
// `Device` and the command.

#include <chrono>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/HomeScreenService.h"
#include "platform/Result.h"

namespace appsync {

class Database;
class DeviceDatabase;
class PropertyListSerialization;

/// The home screen of a device: an icon layout in the database, a property-list array of
/// identifiers, and the applications that run. Arguments outlive it.
class DeviceHomeScreen final : public HomeScreenService {
  public:
    /// After a denial the termination is asked for again in `retryInterval`.
    DeviceHomeScreen(DeviceDatabase& database, PropertyListSerialization& propertyLists,
                     std::chrono::seconds retryInterval);

    [[nodiscard]] std::shared_ptr<HomeScreenConnection> blockableConnection() override;

    /// Denied while the application is marked as running. A granted one keeps it from being marked.
    [[nodiscard]] TerminationAssertionResult takeTerminationAssertion(
        const std::string& identifier, std::uint64_t reason) override;

    /// The identifiers in home-screen order: those of the layout, which the device need not hold,
    /// then what the device holds and the layout lacks, in the order of its arrival.
    [[nodiscard]] Result<std::vector<std::string>> order();

    /// Takes a layout over: an array of strings. Identifiers that are not legal, and repeated ones,
    /// are left out.
    Status setOrder(ByteView state);

  private:
    DeviceDatabase& database_;
    PropertyListSerialization& propertyLists_;
    const std::chrono::seconds retryInterval_;
};

/// Marks an application as running. A registry error when it is not installed, or when an assertion
/// keeps it from running; `assertionsAreStale` says that none of them is held any more. Inside a
/// transaction.
Status markRunning(Database& database, const std::string& identifier, bool assertionsAreStale);

/// Ends an application. A registry error when nothing of that name is installed. Inside a
/// transaction.
Status endRunning(Database& database, const std::string& identifier);

}  // namespace appsync
