#include "host/output/PlanText.h"

#include <algorithm>

#include "host/console/Text.h"

namespace appsync {
namespace {

std::string sizeText(const PlannedInstall& each) {
    const std::string size = each.hasArrived ? "on the device already" : formatBytes(each.bytes);
    return "(" + size + (each.isDowngrade() ? "; a downgrade)\n" : ")\n");
}

std::string versionText(const std::string& version) {
    return version.empty() ? "-" : printable(version);
}

std::string installLine(const PlannedInstall& each) {
    return "install  " + printable(each.identifier) + " " + versionText(each.newVersion) + " " +
           sizeText(each);
}

std::string updateLine(const PlannedInstall& each) {
    return "update   " + printable(each.identifier) + " " + versionText(each.oldVersion) + " -> " +
           versionText(each.newVersion) + " " + sizeText(each);
}

std::size_t packagesToSend(const SyncPlan& plan) {
    const auto travels = [](const PlannedInstall& each) { return !each.hasArrived; };
    return static_cast<std::size_t>(
        std::count_if(plan.install.begin(), plan.install.end(), travels) +
        std::count_if(plan.update.begin(), plan.update.end(), travels));
}

// What somebody may not have meant.
std::string lossLine(const SyncPlan& plan) {
    const auto downgrades = static_cast<std::size_t>(
        std::count_if(plan.update.begin(), plan.update.end(),
                      [](const PlannedInstall& each) { return each.isDowngrade(); }));
    std::string losses;
    if (!plan.remove.empty()) losses = counted(plan.remove.size(), "removal");
    if (downgrades > 0) losses += (losses.empty() ? "" : ", ") + counted(downgrades, "downgrade");
    return losses.empty() ? "" : losses + "\n";
}

bool isInStep(const SyncPlan& plan) {
    return plan.bringsInStep && plan.failed.empty() &&
           std::none_of(plan.skipped.begin(), plan.skipped.end(),
                        [](const PlannedSkip& skip) { return skip.isUnmet; });
}

}  // namespace

std::string planText(const SyncPlan& plan, const SpaceCheck& space) {
    std::string text;
    for (const std::string& each : plan.remove) text += "remove   " + printable(each) + "\n";
    for (const PlannedInstall& each : plan.install) text += installLine(each);
    for (const PlannedInstall& each : plan.update) text += updateLine(each);
    for (const PlannedSkip& each : plan.skipped) {
        text += "skip     " + printable(each.identifier) + ": " + printable(each.why) + "\n";
    }
    for (const SyncFailure& each : plan.failed) {
        text += "failed   " + printable(each.identifier) + ": " + printable(each.error) + "\n";
    }
    for (const std::string& each : plan.notes) text += "note     " + printable(each) + "\n";
    if (plan.empty()) {
        return text + (isInStep(plan) ? "Nothing to do: all is in step.\n" : "Nothing to do.\n");
    }
    return text + lossLine(plan) + counted(packagesToSend(plan), "package") + " to send, " +
           formatBytes(plan.bytes()) + "; needed " + formatBytes(space.needed) + ", free " +
           formatBytes(space.free) + (space.fits() ? ": it fits\n" : ": it does not fit\n");
}

}  // namespace appsync
