#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "device/values/DeviceRecords.h"
#include "platform/InstallProgressRecord.h"
#include "platform/Result.h"

namespace appsync {

class Database;
class DeviceDatabase;
class Query;

/// What is told in thousandths by default.
inline constexpr std::int64_t kProgressUnits = 1000;

/// The progress of every install that is under way. In this process it is what memory says; the
/// database follows within a moment, for other processes and for the next session.
///
/// Callable on any thread. Its handles may outlive it.
class ProgressBook {
  public:
    /// `changed` is called, on any thread, when an install came, went, or changed its state.
    ProgressBook(DeviceDatabase& database, std::function<void()> changed);
    ~ProgressBook();
    ProgressBook(const ProgressBook&) = delete;
    ProgressBook& operator=(const ProgressBook&) = delete;

    /// The handle on an install that is under way; null when none is.
    [[nodiscard]] std::shared_ptr<InstallProgressRecord> record(const std::string& identifier);
    [[nodiscard]] std::optional<InstallProgress> progress(const std::string& identifier);

    /// Ends the phase that the install is in: what was loaded or restored is to be installed, what
    /// was installed is finished.
    void finishPhase(InstallProgressRecord& record);

    /// Forgets what is known of the identifier: its row was made anew, or is gone. A handle on it
    /// keeps its values, or takes `finalState`, and changes nothing any more.
    void forget(const std::string& identifier, std::optional<std::uint64_t> finalState = {});

    /// The package is being unpacked: `fraction`, from 0 to 1, is done. False when somebody has
    /// cancelled the install. The record may be null: an install without a placeholder.
    static bool installing(InstallProgressRecord* record, double fraction);

  private:
    class Shared;
    class Handle;

    const std::shared_ptr<Shared> shared_;
};

/// The progress in a row: state, phase, total, completed and unpacked, from that column on.
[[nodiscard]] InstallProgress readProgress(const Query& row, int column);

/// The progress of an install as the database knows it; nothing when none is under way.
[[nodiscard]] Result<std::optional<InstallProgress>> loadProgress(Database& database,
                                                                  const std::string& identifier);

}  // namespace appsync
