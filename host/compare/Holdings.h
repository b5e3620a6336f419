#pragma once

// host/compare: what `diff` compares. Holdings.h (this header) reads a device, a backup or a
// library as the same thing: applications, and their order; DataSum.h sums up what an application's
// data holds, wherever it lies; Comparison.h finds what differs. Nothing is changed, and a session
// of somebody else may be under way. Includes backup, plan, file, console, device and system/;
// called by the commands.

#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "host/backup/Backup.h"
#include "platform/Result.h"

namespace appsync {

class Device;
class PropertyListSerialization;

/// What a folder was taken for.
enum class HoldingsKind { Device, Backup, Library };

/// "device", "backup", "library".
[[nodiscard]] std::string_view kindName(HoldingsKind kind);

/// How an application is there.
enum class HeldState {
    // On a device.
    Installed,
    Offloaded,
    Restored,  // the placeholder of a restore
    Arriving,  // the placeholder of an install that has not ended
    // In a backup, which does not tell installed from restored ones.
    BackedUp,
    BackedUpOffloaded,
    // In a library.
    Package,
};

/// "installed", "offloaded" and so on.
[[nodiscard]] std::string_view stateName(HeldState state);

/// One application of a device, a backup or a library.
struct HeldApplication {
    std::string version;
    HeldState state = HeldState::Installed;
    bool isOfSystem = false;
};

/// What cannot be read, and why.
struct UnreadableHolding {
    std::string what;  // an identifier, or a file
    std::string error;
};

/// What a folder holds.
struct Holdings {
    Holdings();
    Holdings(Holdings&&) noexcept;
    Holdings& operator=(Holdings&&) noexcept;
    ~Holdings();

    std::string path;
    HoldingsKind kind = HoldingsKind::Library;
    std::map<std::string, HeldApplication> applications;  // by identifier
    /// The home screen, or what is to become it; nothing where nothing is said of it.
    std::optional<std::vector<std::string>> order;
    std::vector<UnreadableHolding> unreadable;

    std::unique_ptr<Device> device;          // of a device
    std::optional<BackupManifest> manifest;  // of a backup
};

/// Reads what a folder holds. It is a device or a backup where it has the parts of one, a library
/// where it holds packages. An error when it is none of these, or cannot be used.
[[nodiscard]] Result<Holdings> readHoldings(const std::string& path,
                                            PropertyListSerialization& propertyLists);

}  // namespace appsync
