#include "host/serve/ServedDevices.h"

#include <cstddef>
#include <filesystem>
#include <system_error>
#include <utility>

#include "host/console/Problem.h"
#include "host/serve/ChangeBell.h"
#include "host/serve/ServedDevice.h"
#include "host/serve/http/PercentDecoding.h"
#include "system/file/PosixError.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

constexpr std::size_t kMostDevices = 500;
constexpr std::chrono::seconds kFolderInterval{1};

// One that begins with a dot is a device that is still being made.
bool isShownName(const std::string& name) { return !name.empty() && name.front() != '.'; }

bool holdsDevice(const fs::path& folder, ServedDevices::IsDevice isDevice) {
    std::error_code code;
    fs::directory_iterator each(folder, code);
    for (; !code && each != fs::directory_iterator(); each.increment(code)) {
        if (isShownName(each->path().filename()) && isDevice(each->path())) return true;
    }
    return false;
}

Result<std::string> servedPlace(const std::string& path) {
    std::error_code code;
    const fs::path place = fs::canonical(path, code);
    if (code) {
        return unusable("cannot serve " + displayPath(path) + ": " + code.message(),
                        "give the directory of a device, or a folder of devices");
    }
    return place.string();
}

}  // namespace

ServedDevices::ServedDevices(std::string path, bool isFolder, IsDevice isDevice, ChangeBell& bell)
    : path_(std::move(path)), isFolder_(isFolder), isDevice_(isDevice), bell_(bell) {}

Result<std::unique_ptr<ServedDevices>> ServedDevices::open(const std::string& path,
                                                           IsDevice isDevice, ChangeBell& bell) {
    const Result<std::string> place = servedPlace(path);
    if (!place) return place.error();
    const bool isFolder = !isDevice(*place);
    if (isFolder && !holdsDevice(*place, isDevice)) {
        return unusable(displayPath(path) + " is neither a device nor a folder that holds one",
                        "give the directory of a device, or a folder of devices");
    }
    std::unique_ptr<ServedDevices> devices(new ServedDevices(*place, isFolder, isDevice, bell));
    if (!isFolder) devices->add(*place, fs::path(*place).filename());
    return devices;
}

std::vector<std::shared_ptr<ServedDevice>> ServedDevices::all() {
    const std::lock_guard lock(mutex_);
    look();
    std::vector<std::shared_ptr<ServedDevice>> devices;
    devices.reserve(devices_.size());
    for (const auto& [name, device] : devices_) devices.push_back(device);
    return devices;
}

std::size_t ServedDevices::leftOut() {
    const std::lock_guard lock(mutex_);
    return leftOut_;
}

std::shared_ptr<ServedDevice> ServedDevices::find(const std::string& name) {
    const std::lock_guard lock(mutex_);
    look();
    const auto found = devices_.find(name);
    return found == devices_.end() ? nullptr : found->second;
}

void ServedDevices::look() {
    const auto now = std::chrono::steady_clock::now();
    if (!isFolder_ || (!devices_.empty() && now - lastLook_ < kFolderInterval)) return;
    lastLook_ = now;
    const std::set<std::string> newcomers = newNames();
    std::size_t added = 0;
    for (const std::string& name : newcomers) {
        if (devices_.size() == kMostDevices) break;
        add((fs::path(path_) / name).string(), name);
        ++added;
    }
    const std::size_t before = std::exchange(leftOut_, newcomers.size() - added);
    if (added > 0 || leftOut_ != before) bell_.ring();
}

std::set<std::string> ServedDevices::newNames() const {
    std::set<std::string> names;
    std::error_code code;
    fs::directory_iterator each(path_, code);
    for (; !code && each != fs::directory_iterator(); each.increment(code)) {
        const std::string name = each->path().filename();
        const bool isNew = isShownName(name) && !devices_.contains(name);
        if (isNew && isDevice_(each->path())) names.insert(name);
    }
    return names;
}

void ServedDevices::add(const std::string& path, const std::string& name) {
    if (devices_.contains(name)) return;
    devices_[name] = std::make_shared<ServedDevice>(path, name, percentEncoded(name), bell_);
}

}  // namespace appsync
