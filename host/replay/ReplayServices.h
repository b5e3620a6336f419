#pragma once

#include <memory>

#include "platform/Platform.h"

namespace appsync {

class ReplayRun;

/// Every service of platform/, answering as the recording of a run says.
class ReplayServices {
  public:
    /// The run must outlive it.
    explicit ReplayServices(ReplayRun& run);
    ~ReplayServices();
    ReplayServices(const ReplayServices&) = delete;
    ReplayServices& operator=(const ReplayServices&) = delete;

    [[nodiscard]] const Platform& platform() const;

  private:
    struct All;
    const std::unique_ptr<All> all_;
};

}  // namespace appsync
