#pragma once

// host/command/data: the commands that take what applications keep out of a device and bring it
// back. Called by host/command only.

#include <cstdint>
#include <string>

#include "host/replay/RecordingFile.h"

namespace appsync {

struct Console;

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
    /// The module with the plug-in; empty: the one that is built in.
    std::string plugIn{};
    RecordingArguments recording{};
    bool asJson = false;
};
[[nodiscard]] int runRestore(const RestoreArguments& arguments, const Console& console);

}  // namespace appsync
