#pragma once

// host/command: `appsync`, command by command. CommandLine.cpp declares the commands and their
// options; what one does, once its arguments are understood, is a function of this header, in a
// file of its own: <Name>Command.cpp. Such a file holds what is the command's own: which arguments
// go together, what it opens, in which order it asks other rooms, what it prints. What could serve
// another command stands elsewhere: host/plan (what is to be done), host/session (doing it with the
// plug-in), host/backup, host/output (texts and JSON). OpenDevice.h, IdentifierArgument.h and
// WrittenFile.h are what commands share; SyncSource.h (with MirrorSource.h) is what those share
// that plan a sync. LogLines.h is a part of LogCommand.cpp.
//
// A new command: a function here, its file, its options in CommandLine.cpp, a line in
// docs/commands.md and in tests/host/command/CommandLineTest.cpp. Includes every other room of
// host/; called by host/main.cpp only.

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "device/values/DeviceRecords.h"
#include "host/output/SyncDisplays.h"
#include "host/plan/SyncPlan.h"
#include "platform/LogFacility.h"
#include "platform/PropertyListSerialization.h"

namespace appsync {

struct Console;

// What each command does, once its arguments are understood. Each gives the exit status (see
// host/console/Problem.h); errors have then been told on the console.

// SyncCommand.cpp

struct SyncArguments {
    std::string device;
    std::string library;
    PlanOptions plan;
    /// A mirror of a library without any package is meant.
    bool mirrorsEmpty = false;
    bool isStaged = false;
    bool isDryRun = false;
    /// The longest that the session waits for applications that run; nothing: as long as they do.
    std::optional<std::chrono::seconds> longestWait;
    SyncDisplayKind display = SyncDisplayKind::Text;
};
[[nodiscard]] int runSync(const SyncArguments& arguments, const Console& console);

// StageCommand.cpp

struct StageArguments {
    /// What a sync would be told.
    SyncArguments sync;
    /// Also in the place of an area that waits already.
    bool replaces = false;
    bool asJson = false;
};
[[nodiscard]] int runStage(const StageArguments& arguments, const Console& console);

// SendCommand.cpp

struct SendArguments {
    std::string device;
    std::string identifier;
    std::string file;
    bool isRestore = false;
    /// 1, 2 or 3, see AssetParts. Nothing: of a restore, what the device knows decides.
    std::optional<unsigned> parts;
    SyncDisplayKind display = SyncDisplayKind::Text;
};
[[nodiscard]] int runSend(const SendArguments& arguments, const Console& console);

// What changes a device outside a sync: CreateCommand.cpp, SetCommand.cpp, RunCommand.cpp (and
// quit), UninstallCommand.cpp, DemoteCommand.cpp, ResetCommand.cpp

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
[[nodiscard]] int runDemote(const ApplicationArguments& arguments, bool bySystem,
                            const Console& console);
[[nodiscard]] int runReset(const std::string& device, bool asJson, const Console& console);

// What shows a device: AppsCommand.cpp, WhyCommand.cpp, InventoryCommand.cpp, StatusCommand.cpp,
// HistoryCommand.cpp, ScreenCommand.cpp

[[nodiscard]] int runApps(const std::string& device, bool asJson, const Console& console);
[[nodiscard]] int runWhy(const std::string& device, const std::string& identifier, bool asJson,
                         const Console& console);
[[nodiscard]] int runInventory(const std::string& device, bool asJson, const Console& console);
[[nodiscard]] int runStatus(const std::string& device, bool asJson, const Console& console);

struct HistoryArguments {
    std::string device;
    /// Only what happened to this application.
    std::optional<std::string> application;
    bool asJson = false;
};
[[nodiscard]] int runHistory(const HistoryArguments& arguments, const Console& console);

[[nodiscard]] int runScreen(const std::string& device, const std::string& picture, bool asJson,
                            const Console& console);

// DiffCommand.cpp

[[nodiscard]] int runDiff(const std::string& left, const std::string& right, bool asJson,
                          const Console& console);

// DataCommand.cpp: an application's data.

struct DataArguments {
    std::string device;
    std::string identifier;
    /// The folder or the archive (NAME.zip) that the data goes to, or comes from.
    std::string place;
    /// Data that is there may be replaced without asking.
    bool yes = false;
    bool asJson = false;
};
[[nodiscard]] int runDataList(const DataArguments& arguments, const Console& console);
[[nodiscard]] int runDataPull(const DataArguments& arguments, const Console& console);
[[nodiscard]] int runDataPush(const DataArguments& arguments, const Console& console);

// LogCommand.cpp

struct LogArguments {
    std::string device;
    std::optional<int> category;
    /// This level and those above it.
    std::optional<LogLevel> level;
    /// Only lines that name this application.
    std::optional<std::string> application;
    /// Only so many lines, the last ones.
    std::optional<std::size_t> last;
    bool follows = false;
    bool asJson = false;
};
[[nodiscard]] int runLog(const LogArguments& arguments, const Console& console);

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

// StoreCommand.cpp

[[nodiscard]] int runStore(const std::string& device, const std::string& folder, bool asJson,
                           const Console& console);

// BackupCommand.cpp

struct BackupArguments {
    std::string device;
    std::string backup;
    bool asJson = false;
};
[[nodiscard]] int runBackup(const BackupArguments& arguments, const Console& console);
[[nodiscard]] int runBackupCheck(const std::string& backup, bool asJson, const Console& console);

// RestoreCommand.cpp

struct RestoreArguments {
    std::string device;
    std::string backup;
    /// What the plug-in is told; 2 and 3 bring applications back.
    std::int64_t type = 2;
    bool asJson = false;
};
[[nodiscard]] int runRestore(const RestoreArguments& arguments, const Console& console);

// Files of this machine: PackageCommand.cpp, PackageCheckCommand.cpp (list and verify),
// PropertyListCommand.cpp

[[nodiscard]] int runPackageMake(const std::string& folder, const std::string& package, bool asJson,
                                 const Console& console);
[[nodiscard]] int runPackageShow(const std::string& package, bool asJson, const Console& console);
[[nodiscard]] int runPackageList(const std::string& folder, bool asJson, const Console& console);
[[nodiscard]] int runPackageVerify(const std::vector<std::string>& paths, bool asJson,
                                   const Console& console);
[[nodiscard]] int runPropertyListShow(const std::string& file, bool asJson, const Console& console);

struct ConvertArguments {
    std::string file;  // "-": standard input
    PropertyListFormat format = PropertyListFormat::Xml;
    /// "-", or nothing: standard output.
    std::optional<std::string> output;
    bool asJson = false;
};
[[nodiscard]] int runPropertyListConvert(const ConvertArguments& arguments, const Console& console);

}  // namespace appsync
