#pragma once

// host/command/change: the commands that change a device outside a sync. ApplicationAction.h is
// what those share that do something to one application. Called by host/command only.

#include <string>
#include <vector>

#include "device/values/DeviceRecords.h"

namespace appsync {

struct Console;

/// One application of a device.
struct ApplicationArguments {
    std::string device;
    std::string identifier;
    bool asJson = false;
};
[[nodiscard]] int runCreate(const std::string& device, bool coordination, bool asJson,
                            const Console& console);
[[nodiscard]] int runSet(const std::string& device, const std::vector<std::string>& assignments,
                         bool asJson, const Console& console);
[[nodiscard]] int runRun(const ApplicationArguments& arguments, const Console& console);
[[nodiscard]] int runQuit(const ApplicationArguments& arguments, const Console& console);
[[nodiscard]] int runUninstall(const ApplicationArguments& arguments, const Console& console);
[[nodiscard]] int runRollback(const ApplicationArguments& arguments, const Console& console);
[[nodiscard]] int runDemote(const ApplicationArguments& arguments, bool bySystem,
                            const Console& console);
[[nodiscard]] int runReset(const std::string& device, bool asJson, const Console& console);

// CoordinatorCommand.cpp

struct CoordinatorArguments {
    std::string device;
    std::string action;  // "list", "create" or "cancel"
    std::string identifier;
    /// Who does it; 3 is the sync client itself.
    CoordinationClient client = 2;
    bool asJson = false;
};
[[nodiscard]] int runCoordinator(const CoordinatorArguments& arguments, const Console& console);

}  // namespace appsync
