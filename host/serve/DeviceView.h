#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <nlohmann/json_fwd.hpp>

#include "host/serve/DeviceReading.h"
#include "host/serve/ObservedSession.h"

namespace appsync {

/// A piece of what a page shows, and the stamp of the view in which it has last changed.
struct ViewedText {
    std::string json;
    std::uint64_t changed = 0;
};

/// What there is on a device.
struct ViewedApplications {
    /// By identifier: its records, one or two objects with a comma between them.
    std::map<std::string, ViewedText> texts;
    /// Identifiers that have gone, and when.
    std::map<std::string, std::uint64_t> gone;
    /// What the icons are drawn from: a placeholder's record before that of the application.
    std::map<std::string, ApplicationRecord> icons;
    std::size_t installed = 0;
    std::size_t placeholders = 0;
    std::size_t installing = 0;
};

/// What is shown of a device: as it was at one moment, in the words of its answers. Views of a
/// device have rising stamps; none ever changes.
struct DeviceView {
    std::uint64_t stamp = 0;
    /// That of the first one: what changed before it is not known.
    std::uint64_t begun = 0;
    /// "idle", "syncing", "locked", "damaged" or "gone", and what there is to say of the last
    /// three.
    std::string state = "locked";
    std::string message;
    std::uint64_t stateChanged = 0;
    std::uint64_t logChanged = 0;
    std::uint64_t applicationsChanged = 0;

    std::shared_ptr<const ViewedApplications> applications;
    ViewedText screen;
    ViewedText coordinators;
    ViewedText session;
    /// There may be a session to draw.
    bool hasTimeline = false;
    /// As `status --json`; its space changes unnoticed.
    std::string status = "null";
};

/// What is shown where the device has not answered for longer than a reading takes: the last view,
/// if there was one, as that of a device that is locked.
[[nodiscard]] std::shared_ptr<const DeviceView> lockedView(const DeviceView* last);

/// Makes the views of one device.
class DeviceViewer {
  public:
    /// `key`: what stands for the device in an address.
    explicit DeviceViewer(std::string key);

    /// The next view, of what was read; the same one again where nothing has changed.
    [[nodiscard]] std::shared_ptr<const DeviceView> show(const Result<DeviceReading>& reading,
                                                         bool hasLog);
    /// The last one, with more in the log.
    [[nodiscard]] std::shared_ptr<const DeviceView> showLogChanged();
    /// The last one, whose state is to be told again: somebody was shown another.
    [[nodiscard]] std::shared_ptr<const DeviceView> showStateAgain();

  private:
    void showReading(DeviceView& next, const DeviceReading& reading);
    void showError(DeviceView& next, const ErrorRecord& error);
    void showApplications(DeviceView& next, const DeviceReading& reading) const;

    const std::string key_;
    ObservedSession session_;
    std::shared_ptr<const DeviceView> last_;
};

/// The body of /api/device/NAME: of what has changed since the view with that stamp, or everything.
[[nodiscard]] std::string viewText(const DeviceView& view, const std::string& name,
                                   std::optional<std::uint64_t> since);

/// What of the view has changed since the one with that stamp: "applications", "coordinators" ...;
/// everything since stamp 0.
[[nodiscard]] nlohmann::ordered_json changesSince(const DeviceView& view, std::uint64_t stamp);

}  // namespace appsync
