#include "transfer/InstallNames.h"

#include <gtest/gtest.h>

#include <array>
#include <limits>

namespace appsync {
namespace {

TEST(InstallNames, NamesEveryType) {
    constexpr std::array names{"RGInstallTypeNone",       "RGInstallTypeStoreDownload",
                               "RGInstallTypeRestore",    "RGInstallTypeAutomaticDownload",
                               "RGInstallTypeSync",       "RGInstallTypeAutomaticUpdate",
                               "RGInstallTypeMigration",  "RGInstallTypeDowngrade",
                               "Unknown Install Type: 8", "Unknown Install Type: 9"};
    for (std::size_t type = 0; type < names.size(); ++type) {
        EXPECT_EQ(installTypeName(type), names[type]);
    }
}

TEST(InstallNames, NamesEveryState) {
    constexpr std::array names{"RGInstallStateWaiting",   "RGInstallStateActive",
                               "RGInstallStatePaused",    "RGInstallStateCanceled",
                               "RGInstallStateFailed",    "RGInstallStateFinished",
                               "Unknown Install State: 6"};
    for (std::size_t state = 0; state < names.size(); ++state) {
        EXPECT_EQ(installStateName(state), names[state]);
    }
}

TEST(InstallNames, NamesEveryPhase) {
    constexpr std::array names{"RGInstallPhaseLoading", "RGInstallPhaseInstalling",
                               "RGInstallPhaseRestoringData", "RGInstallPhaseInstallingPlaceholder",
                               "Unknown Install Phase: 4"};
    for (std::size_t phase = 0; phase < names.size(); ++phase) {
        EXPECT_EQ(installPhaseName(phase), names[phase]);
    }
}

TEST(InstallNames, NamesTheLargestNumber) {
    EXPECT_EQ(installStateName(std::numeric_limits<std::uint64_t>::max()),
              "Unknown Install State: 18446744073709551615");
}

}  // namespace
}  // namespace appsync
