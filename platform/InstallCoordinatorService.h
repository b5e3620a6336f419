#pragma once

namespace appsync {

/// The platform's install-coordination service.
class InstallCoordinatorService {
  public:
    virtual ~InstallCoordinatorService() = default;

    /// Whether installs are to go through coordinators. Asked once for each client object.
    [[nodiscard]] virtual bool isCoordinationEnabled() = 0;
};

}  // namespace appsync
