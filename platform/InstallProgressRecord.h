#pragma once

#include <cstdint>
#include <string>

namespace appsync {

/// Numbers of install states.
enum InstallState : std::uint64_t {
    kInstallStateWaiting = 0,
    kInstallStateActive = 1,
    kInstallStatePaused = 2,
    kInstallStateCanceled = 3,
    kInstallStateFailed = 4,
    kInstallStateFinished = 5,
};

/// Numbers of install phases.
enum InstallPhase : std::uint64_t {
    kInstallPhaseLoading = 0,
    kInstallPhaseInstalling = 1,
    kInstallPhaseRestoringData = 2,
    kInstallPhaseInstallingPlaceholder = 3,
};

/// Numbers of install types.
enum InstallType : std::uint64_t {
    kInstallTypeNone = 0,
    kInstallTypeStoreDownload = 1,
    kInstallTypeRestore = 2,
    kInstallTypeAutomaticDownload = 3,
    kInstallTypeSync = 4,
    kInstallTypeAutomaticUpdate = 5,
    kInstallTypeMigration = 6,
    kInstallTypeDowngrade = 7,             // demoted by the system
    kInstallTypeIntentionalDowngrade = 8,  // demoted by a person
};

/// A live handle on the progress of one application's install. Every call takes effect at once for
/// everybody who looks. Callable on any thread; never fails. When the install ends, the state
/// becomes finished (5), failed (4) or canceled (3); from then on the record keeps its values and
/// changes nothing any more.
class InstallProgressRecord {
  public:
    virtual ~InstallProgressRecord() = default;

    [[nodiscard]] virtual std::uint64_t installState() const = 0;
    virtual void setInstallState(std::uint64_t state) = 0;
    [[nodiscard]] virtual std::uint64_t installPhase() const = 0;
    virtual void setInstallPhase(std::uint64_t phase) = 0;
    [[nodiscard]] virtual std::int64_t totalUnitCount() const = 0;
    virtual void setTotalUnitCount(std::int64_t count) = 0;
    [[nodiscard]] virtual std::int64_t completedUnitCount() const = 0;
    virtual void setCompletedUnitCount(std::int64_t count) = 0;

    /// Cancels the install: its state becomes canceled (3).
    virtual void cancel() = 0;

    /// One line for a log.
    [[nodiscard]] virtual std::string description() const = 0;
};

}  // namespace appsync
