#pragma once

#include <functional>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "contract/DeviceUnderTest.h"
#include "contract/SystemUnderTest.h"

namespace appsync {

/// What a device may lack: its service then answers as the class of platform/absent/ does, or is
/// null where that is allowed.
enum class OptionalService {
    Coordination,        // InstallCoordinatorService.h
    Transfers,           // TransferService.h
    HomeScreen,          // HomeScreenService.h
    Icons,               // IconRenderer.h
    Policy,              // DevicePolicyService.h
    Backup,              // BackupService.h
    UninstalledList,     // InstallerService.h
    TransactionLog,      // InstallTransactionLog.h
    Notifications,       // Notifications.h, NamedNotifications
    NotificationCenter,  // Notifications.h
    CancelByPerson,      // AppRegistry.h: nobody on the device cancels an install
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

/// Proves the ports, and says on the standard output which sentences of platform/ each of them
/// breaks, and what was seen. Gives the exit status of the process: 0 when none is broken, 1 when
/// some are, 2 for wrong arguments, which `--help` lists.
///
/// Each test runs in a process that is forked from this one, with a time limit: a service that
/// crashes, hangs or throws fails one test. So call it from `main`, before there is any thread.
int runContractKit(int argc, char** argv, std::vector<ContractPort> ports);

/// The same tests in this process, for debuggers and sanitizers; the arguments are those of any
/// GoogleTest program. 0 when every test has passed.
int runContractSuites(int argc, char** argv, std::vector<ContractPort> ports);

}  // namespace appsync
