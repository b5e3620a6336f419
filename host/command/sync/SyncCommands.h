#pragma once

// host/command/sync: the commands that bring packages to a device. SyncSource.h (with
// MirrorSource.h) is what those share that plan a sync. Called by host/command only.

#include <chrono>
#include <optional>
#include <string>

#include "host/output/SyncDisplays.h"
#include "host/plan/SyncPlan.h"
#include "host/replay/RecordingFile.h"

namespace appsync {

struct Console;

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
    /// The module with the plug-in; empty: the one that is built in.
    std::string plugIn{};
    RecordingArguments recording{};
    SyncDisplayKind display = SyncDisplayKind::Text;
    /// A terminal, too, gets long lists whole.
    bool isVerbose = false;
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
    /// Data that is there is replaced unasked.
    bool yes = false;
    /// The module with the plug-in; empty: the one that is built in.
    std::string plugIn{};
    RecordingArguments recording{};
    SyncDisplayKind display = SyncDisplayKind::Text;
    bool isVerbose = false;
};
[[nodiscard]] int runSend(const SendArguments& arguments, const Console& console);

// StoreCommand.cpp

[[nodiscard]] int runStore(const std::string& device, const std::string& folder, bool asJson,
                           const Console& console);

}  // namespace appsync
