#include "host/serve/ObservedSession.h"

#include <cstddef>

#include <nlohmann/json.hpp>

#include "host/console/Text.h"
#include "host/output/DeviceOverview.h"
#include "platform/InstallProgressRecord.h"

namespace appsync {
namespace {

using Json = nlohmann::ordered_json;

bool isArriving(const ApplicationStatus& status) {
    return (status.placeholder && isOpenInstall(*status.placeholder)) ||
           (status.coordinator && isOpenInstall(*status.coordinator));
}

// How far the installs that are under way are, the farthest of them.
struct Farthest {
    bool isInstalling = false;
    bool isTransferring = false;
    bool onlyWaits = true;

    void see(const ApplicationStatus& status) {
        if (!status.denial) onlyWaits = false;
        if (!status.placeholder || !status.placeholder->progress) return;
        const InstallProgress& progress = *status.placeholder->progress;
        if (progress.phase != kInstallPhaseLoading && !status.denial) isInstalling = true;
        if (progress.phase == kInstallPhaseLoading && progress.completedUnits > 0)
            isTransferring = true;
    }
};

}  // namespace

void ObservedSession::see(const DeviceMoment& moment) {
    const bool isAnother = moment.session.process != record_.process ||
                           moment.session.since != record_.since || !record_.isUnderWay;
    if (isAnother) begun_.clear();
    record_ = moment.session;
    phase_.reset();
    if (record_.isUnderWay) seeInstalls(moment);
}

void ObservedSession::seeInstalls(const DeviceMoment& moment) {
    Farthest farthest;
    underWay_ = 0;
    for (const auto& [identifier, status] : moment.applications) {
        if (!isArriving(status)) continue;
        ++underWay_;
        begun_.insert(identifier);
        farthest.see(status);
    }
    if (farthest.isInstalling) {
        phase_ = "install";
    } else if (farthest.isTransferring) {
        phase_ = "transfer";
    } else if (underWay_ > 0 && farthest.onlyWaits) {
        phase_ = "wait";
    } else {
        phase_ = begun_.size() == underWay_ ? "prepare" : "transfer";
    }
}

nlohmann::ordered_json ObservedSession::json() const {
    if (!record_.isUnderWay && !record_.wasInterrupted) return {};
    const bool isCounted = record_.isUnderWay && !begun_.empty();
    return {{"running", record_.isUnderWay},
            {"interrupted", record_.wasInterrupted},
            {"phase", phase_ ? Json(*phase_) : Json()},
            {"done", isCounted ? Json(begun_.size() - underWay_) : Json()},
            {"total", isCounted ? Json(begun_.size()) : Json()},
            {"began", record_.since ? Json(formatTime(*record_.since)) : Json()},
            {"ended", Json()},
            {"process", record_.process ? Json(*record_.process) : Json()}};
}

}  // namespace appsync
