#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "platform/PropertyList.h"
#include "simulation/coordination/SimulatedCoordination.h"
#include "simulation/files/FileJournal.h"
#include "simulation/recording/DurableChanges.h"
#include "simulation/services/SimulatedAppRegistry.h"

namespace appsync {

class SimulatedPlatform;

/// What the services of a device have written down.
struct ServiceRecords {
    SimulatedAppRegistry::Records registry;
    SimulatedCoordination::Records coordination;
    bool isCoordinated = false;
    std::optional<PropertyList> uninstalled;
    std::set<std::string> restoreData;
    std::vector<std::string> layout;
};

/// What a crash has left of a device. A platform takes it over with `SimulatedPlatform::reopen`.
struct DeviceImage {
    std::shared_ptr<const FileNode> files;
    ServiceRecords records;
    bool powerWasLost = false;
};

/// Follows what becomes durable on a device, from now on, and says at any moment what a crash would
/// leave. Everything that is there at first is on disk.
///
/// The run goes on as if nothing had happened: whoever takes the image over sees the device as the
/// process has left it, and nothing of what the process does afterwards.
///
///     CrashRecorder crashes(platform);
///     crashes.onChange([&](std::string_view what) { images.push_back(crashes.imageOf(7)); });
class CrashRecorder : public DurableChangeListener {
  public:
    using Hook = std::function<void(std::string_view what)>;

    /// The platform is only borrowed, and outlives the recorder.
    explicit CrashRecorder(SimulatedPlatform& platform);
    ~CrashRecorder() override;

    CrashRecorder(const CrashRecorder&) = delete;
    CrashRecorder& operator=(const CrashRecorder&) = delete;

    /// Runs after each change: an instant at which a crash may come.
    void onChange(Hook hook) { hook_ = std::move(hook); }
    /// What a crash now would leave. The seed says which crash it is:
    ///
    /// - 0: the process ends.
    /// - 1: it ends within the last operation, and what no service has committed is lost.
    /// - 2: power is lost, and everything that was not synced or committed to disk.
    /// - Others: every fourth is as 1, with as much lost of what was not committed as it says;
    ///   otherwise power is lost, and it says what of the rest, in which order, and how torn.
    [[nodiscard]] DeviceImage imageOf(std::uint64_t seed) const;

    void filesChanged(std::string_view what) override;
    void recordsChanged(std::string_view what, Persistence persistence) override;

  private:
    [[nodiscard]] ServiceRecords records() const;

    SimulatedPlatform& platform_;
    Hook hook_;
    std::vector<ServiceRecords> history_;  // from what is on disk to what there is now
    std::size_t committed_ = 0;            // which of them is the last that is committed
};

}  // namespace appsync
