#pragma once

#include <functional>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "contract/DeviceUnderTest.h"
#include "contract/SystemUnderTest.h"

namespace appsync {

/// What a device may lack: its service then answers as platform/ says of one that is not there.
enum class OptionalService {
    Coordination,     // InstallCoordinatorService.h
    Transfers,        // TransferService.h
    HomeScreen,       // HomeScreenService.h
    Icons,            // IconRenderer.h
    Policy,           // DevicePolicyService.h
    Backup,           // BackupService.h
    UninstalledList,  // InstallerService.h
    TransactionLog,   // InstallTransactionLog.h
};

/// An implementation of platform/, as the kit takes it: how its services are made, anew for each
/// test. The kit looks at what can be made.
struct ContractPort {
    /// Letters and digits.
    std::string name;
    /// Files, queues, property lists and notifications.
    std::function<std::unique_ptr<SystemUnderTest>()> makeSystem;
    /// Everything that makes it a device.
    std::function<std::unique_ptr<DeviceUnderTest>()> makeDevice;
    std::set<OptionalService> absent;
};

/// Runs the contract's suites over each of the ports; gives the exit status of the process: 0 when
/// every contract is kept. The arguments are those of a GoogleTest program.
int runContractSuites(int argc, char** argv, std::vector<ContractPort> ports);

}  // namespace appsync
