#include "simulation/DeviceImage.h"

#include <random>
#include <utility>

#include "simulation/SimulatedPlatform.h"

namespace appsync {

CrashRecorder::CrashRecorder(SimulatedPlatform& platform) : platform_(platform) {
    platform_.files.keepJournal();
    history_.push_back(records());
    platform_.recorder.setChangeListener(this);
}

CrashRecorder::~CrashRecorder() { platform_.recorder.setChangeListener(nullptr); }

DeviceImage CrashRecorder::imageOf(std::uint64_t seed) const {
    std::mt19937_64 random(seed);
    const std::size_t last = history_.size() - 1;
    DeviceImage image;
    FileLoss loss{FileLoss::Kind::Nothing, random()};
    std::size_t written = last;
    if (seed == 1) {
        loss.kind = FileLoss::Kind::LastOperation;
        written = committed_;
    } else if (seed == 2) {
        loss.kind = FileLoss::Kind::Everything;
        written = 0;
    } else if (seed != 0 && seed % 4 == 0) {
        loss.kind = FileLoss::Kind::LastOperation;
        written = committed_ + random() % (last - committed_ + 1);
    } else if (seed != 0) {
        loss.kind = FileLoss::Kind::Some;
        written = random() % history_.size();
    }
    image.powerWasLost =
        loss.kind == FileLoss::Kind::Everything || loss.kind == FileLoss::Kind::Some;
    image.files = platform_.files.afterCrash(loss);
    image.records = history_.at(written);
    return image;
}

void CrashRecorder::filesChanged(std::string_view what) {
    if (hook_) hook_(what);
}

void CrashRecorder::recordsChanged(std::string_view what, Persistence persistence) {
    if (persistence == Persistence::OnDisk) history_.clear();
    history_.push_back(records());
    if (persistence != Persistence::Soon) committed_ = history_.size() - 1;
    if (hook_) hook_(what);
}

ServiceRecords CrashRecorder::records() const {
    return {platform_.registry.records(),       platform_.coordination.records(),
            platform_.coordination.isEnabled(), platform_.installer.uninstalled(),
            platform_.backup.restoreData(),     platform_.homeScreen.layout()};
}

}  // namespace appsync
