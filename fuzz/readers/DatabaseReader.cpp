#include "fuzz/readers/DatabaseReader.h"

#include <filesystem>
#include <fstream>
#include <iterator>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "device/Device.h"
#include "device/values/DeviceError.h"
#include "fuzz/readers/ScratchDirectory.h"
#include "platform/FileSystem.h"

namespace appsync {

namespace {

namespace fs = std::filesystem;

constexpr const char* kContainers = "root/var/containers/Bundle/Application";
constexpr std::size_t kMostAsked = 8;  // of the identifiers that a database may hold thousands of

void writeFile(const fs::path& path, std::string_view contents) {
    fs::create_directories(path.parent_path());
    std::ofstream(path, std::ios::binary) << contents;
}

std::string textOf(const fs::path& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

/// A device on this machine with foreign bytes for a database, in a directory of its own. It lies
/// so deep in it that what would climb out of the device stays there.
class DeviceOnDisk {
  public:
    explicit DeviceOnDisk(ByteView database) : path_(fs::path(scratch_.path()) / "1/2/3/4/device") {
        for (const fs::path& stranger : strangers()) writeFile(stranger, "stranger");
        for (const char* container :
             {"00000000-0000-0000-0000-000000000001", "00000000-0000-0000-0000-000000000002"}) {
            writeFile(path_ / kContainers / container / "App.app/main", "main");
        }
        writeFile(path_ / "device.db",
                  {reinterpret_cast<const char*>(database.data()), database.size()});
    }

    [[nodiscard]] std::string path() const { return path_.native(); }

    /// What was changed that nobody may change; empty when nothing was.
    [[nodiscard]] std::string findHarm() const {
        for (const fs::path& stranger : strangers()) {
            if (textOf(stranger) != "stranger") return stranger.native() + " was touched";
        }
        for (fs::path place = path_; place != fs::path(scratch_.path());) {
            place = place.parent_path();
            const auto items = std::distance(fs::directory_iterator(place), {});
            if (items != 2) return place.native() + " has other things in it";
        }
        return {};
    }

  private:
    /// One beside each directory on the way to the device, and some on it.
    [[nodiscard]] std::vector<fs::path> strangers() const {
        std::vector<fs::path> paths = {path_ / "root/var/mobile/Media/Photos/1.jpg",
                                       path_ / "root/var/containers/other",
                                       path_ / "root/var/mobile/Library/Preferences/other.plist"};
        for (fs::path place = path_; place != fs::path(scratch_.path());) {
            place = place.parent_path();
            paths.push_back(place / "stranger");
        }
        return paths;
    }

    const ScratchDirectory scratch_;
    const fs::path path_;
};

/// What the device answers, one question after the other: read when all could be.
class Questions {
  public:
    template <typename Answer>
    void ask(const Answer& answer) {
        if (!answer.ok()) refuse(answer.error(), kDeviceErrorDomain);
    }
    /// Of an identifier, which a device may refuse for its own sake.
    void askFor(const Status& answer) {
        if (!answer.ok()) refuse(answer.error(), answer.error().domain);
    }
    [[nodiscard]] Reading reading() && { return std::move(reading_); }

  private:
    void refuse(const ErrorRecord& error, std::string_view domain) {
        Reading refused =
            Reading::refused(error.description())
                .unless(error.domain == domain, "it is no error of a device: " + error.domain);
        if (reading_.broken.empty()) reading_ = std::move(refused);
    }

    Reading reading_ = Reading::read();
};

std::vector<std::string> lookAt(Device& device, Questions& questions) {
    std::vector<std::string> identifiers;
    const auto applications = device.applications();
    questions.ask(applications);
    questions.ask(device.applicationsOnDisk());
    questions.ask(device.homeScreen());
    questions.ask(device.settings());
    questions.ask(device.history());
    questions.ask(device.coordinators());
    questions.ask(device.sinfData());
    if (!applications) return identifiers;
    for (const ApplicationRecord& each : *applications) {
        if (identifiers.size() == kMostAsked) break;
        questions.ask(device.status(each.identifier));
        identifiers.push_back(each.identifier);
    }
    return identifiers;
}

}  // namespace

Reading readDeviceDatabase(ByteView bytes) {
    const DeviceOnDisk disk(bytes);
    Questions questions;
    for (const DeviceAccess access : {DeviceAccess::Look, DeviceAccess::Session}) {
        DeviceOpenOptions options;
        options.access = access;
        Result<std::unique_ptr<Device>> device = Device::open(disk.path(), options);
        questions.ask(device);
        if (!device) continue;
        const std::vector<std::string> identifiers = lookAt(**device, questions);
        if (access == DeviceAccess::Look) continue;
        questions.ask((*device)->startCoordination());
        questions.ask((*device)->removeLeftoverSyncPlaceholders());
        for (const std::string& each : identifiers) questions.askFor((*device)->uninstall(each));
        (*device)->closeCoordination();
    }
    const std::string harm = disk.findHarm();
    return std::move(questions).reading().unless(harm.empty(), harm);
}

}  // namespace appsync
