#include "transfer/InstallNames.h"

#include <array>
#include <cstddef>
#include <span>
#include <string_view>

#include "platform/LogFacility.h"
#include "platform/LogRendering.h"

namespace appsync {

namespace {

constexpr std::array<std::string_view, 8> kTypeNames{
    "RGInstallTypeNone",      "RGInstallTypeStoreDownload",
    "RGInstallTypeRestore",   "RGInstallTypeAutomaticDownload",
    "RGInstallTypeSync",      "RGInstallTypeAutomaticUpdate",
    "RGInstallTypeMigration", "RGInstallTypeDowngrade",
};
constexpr std::array<std::string_view, 6> kStateNames{
    "RGInstallStateWaiting",  "RGInstallStateActive", "RGInstallStatePaused",
    "RGInstallStateCanceled", "RGInstallStateFailed", "RGInstallStateFinished",
};
constexpr std::array<std::string_view, 4> kPhaseNames{
    "RGInstallPhaseLoading",
    "RGInstallPhaseInstalling",
    "RGInstallPhaseRestoringData",
    "RGInstallPhaseInstallingPlaceholder",
};

constexpr std::string_view kUnknownType = "Unknown Install Type: %lu";
constexpr std::string_view kUnknownState = "Unknown Install State: %lu";
constexpr std::string_view kUnknownPhase = "Unknown Install Phase: %lu";

std::string nameOf(std::uint64_t number, std::span<const std::string_view> names,
                   std::string_view unknownFormat) {
    if (number < names.size()) return std::string(names[static_cast<std::size_t>(number)]);
    const std::array<LogArgument, 1> arguments{number};
    return renderLogMessage(
        {LogCategory::Coordination, LogLevel::Default, unknownFormat, arguments});
}

}  // namespace

std::string installTypeName(std::uint64_t type) { return nameOf(type, kTypeNames, kUnknownType); }

std::string installStateName(std::uint64_t state) {
    return nameOf(state, kStateNames, kUnknownState);
}

std::string installPhaseName(std::uint64_t phase) {
    return nameOf(phase, kPhaseNames, kUnknownPhase);
}

}  // namespace appsync
