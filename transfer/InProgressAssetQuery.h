#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "client/Log.h"
#include "platform/AppRegistry.h"

namespace appsync {

struct Platform;
class Semaphore;

/// Asks the AppRegistry once which installs the device is carrying out by itself.
///
/// A query lives for one call of the class operation. The registry's first report fills both lists
/// and then signals the semaphore; the lists are read only after the wait for it, which orders the
/// two, so there is no lock. Reports for one observer come one at a time, and later ones change
/// nothing.
class InProgressAssetQuery final : public AppRegistryObserver {
  public:
    using Identifiers = std::optional<std::vector<std::string>>;

    /// `currentInProgressAssetIDs:restoringAssetIDs:`: class operation. The bundle identifiers of
    /// installs in progress, and of applications being restored, in the registry's order; nothing
    /// when the wait for the registry's first report fails. Blocks until that report has come.
    static void currentInProgressAssetIDs(const Platform& platform, Identifiers& inProgressAssetIDs,
                                          Identifiers& restoringAssetIDs);

    /// `init`: a query that has heard nothing yet.
    explicit InProgressAssetQuery(const Platform& platform);
    ~InProgressAssetQuery() override;

    InProgressAssetQuery(const InProgressAssetQuery&) = delete;
    InProgressAssetQuery& operator=(const InProgressAssetQuery&) = delete;

    /// `_fetchResults`: waits for the first report. False when the wait timed out.
    [[nodiscard]] bool _fetchResults();

    /// `applicationInstallsArePrioritized:arePaused:`: sorts the first report; the paused installs
    /// are only logged.
    void applicationInstallsArePrioritized(const std::vector<AppProxy>& prioritized,
                                           const std::vector<AppProxy>& paused) override;
    /// Cancelled installs are of no concern here.
    void applicationInstallsDidCancel(const std::vector<AppProxy>& cancelled) override;

  private:
    void sortReport(const std::vector<AppProxy>& prioritized);
    void sortInstall(const AppProxy& proxy);

    const std::unique_ptr<Semaphore> _waitForInitialObservationData;
    Identifiers _inProgressAssetIDs;  // nothing until the first report
    Identifiers _restoringAssetIDs;   // nothing until the first report
    AppRegistry& registry_;
    const Log log_;
};

}  // namespace appsync
