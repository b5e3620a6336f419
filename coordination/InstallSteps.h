#pragma once

#include <cstdint>
#include <string_view>

#include "platform/InstallTransactionLog.h"

namespace appsync {

/// Kinds of steps in the transaction log.
enum class InstallStep : std::uint64_t {
    Install = 1,  // the install or the update of an application
    Restore = 2,
    CreateCoordinator = 3,
    CreatePlaceholder = 4,
    CopyIcon = 5,
    Uninstall = 7,
};

// Who the plug-in is in the transaction log, and how the two records of a step are told apart.
inline constexpr std::uint64_t kStepParty = 1;
inline constexpr std::uint64_t kStepStarts = 1;
inline constexpr std::uint64_t kStepEnds = 2;

inline void logStepStart(InstallTransactionLog& log, InstallStep step, std::string_view identifier,
                         std::string_view description) {
    log.logStep(static_cast<std::uint64_t>(step), kStepParty, kStepStarts, true, identifier,
                description);
}
inline void logStepEnd(InstallTransactionLog& log, InstallStep step, bool success,
                       std::string_view identifier, std::string_view description) {
    log.logStep(static_cast<std::uint64_t>(step), kStepParty, kStepEnds, success, identifier,
                description);
}

}  // namespace appsync
