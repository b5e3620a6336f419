#pragma once

#include <memory>

#include "platform/Platform.h"

namespace appsync {

class Recording;

/// Any platform, whose calls and callbacks are written to a recording. What the plug-in is given by
/// it hands everything on.
///
/// The platform and the recording must outlive it, and it must outlive what it has handed out, as
/// any platform.
class RecordingPlatform {
  public:
    RecordingPlatform(const Platform& platform, Recording& recording);
    ~RecordingPlatform();
    RecordingPlatform(const RecordingPlatform&) = delete;
    RecordingPlatform& operator=(const RecordingPlatform&) = delete;

    /// What a client is created with.
    [[nodiscard]] const Platform& services() const;

  private:
    struct Services;
    const std::unique_ptr<Services> services_;
};

}  // namespace appsync
