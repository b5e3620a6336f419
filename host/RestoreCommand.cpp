#include <algorithm>
#include <chrono>
#include <cmath>
#include <filesystem>
#include <map>
#include <ostream>
#include <set>
#include <string_view>
#include <utility>

#include <nlohmann/json.hpp>

#include "client/Paths.h"
#include "device/Device.h"
#include "host/Backup.h"
#include "host/Commands.h"
#include "host/Console.h"
#include "host/HostFile.h"
#include "host/JsonWriting.h"
#include "host/OpenDevice.h"
#include "host/PackageSender.h"
#include "host/PlugIn.h"
#include "host/Problem.h"
#include "host/Table.h"
#include "host/Text.h"
#include "platform/FileSystem.h"
#include "platform/HomeScreenService.h"
#include "platform/PropertyListSerialization.h"
#include "platform/SyncClient.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;
using Json = nlohmann::ordered_json;
using Clock = std::chrono::steady_clock;

constexpr std::uint64_t kLargestList = std::uint64_t{2} << 30U;
constexpr std::int64_t kApplicationsToo[] = {2, 3};

struct FailedRestore {
    std::string identifier;
    std::string error;
};

struct ShownApplication {
    std::string identifier;
    std::string name;
    std::optional<std::string> version;
    bool isPlaceholder = false;
};

// What came of a restore.
struct RestoreResult {
    std::vector<std::string> restored;
    std::vector<std::string> kept;
    std::vector<FailedRestore> failed;
    std::vector<ShownApplication> screen;
};

std::string directoryOf(std::string_view path) {
    return std::string(path.substr(0, path.rfind('/')));
}

bool bringsApplications(std::int64_t type) {
    return std::find(std::begin(kApplicationsToo), std::end(kApplicationsToo), type) !=
           std::end(kApplicationsToo);
}

// One restore. The restore information is the last file to be placed: without it, nothing has
// begun, and whatever was placed is placed again the next time.
class Restoring {
  public:
    Restoring(const RestoreArguments& arguments, const BackupManifest& manifest, Device& device,
              PlugIn& plugIn)
        : arguments_(arguments), manifest_(manifest), device_(device), plugIn_(plugIn) {}

    Result<RestoreResult> run() {
        Status status = findPresent();
        if (status) status = readRestoreInfo();
        if (!status) return status.error();
        checkFiles();
        status = placeData();
        if (status) status = placeDemotedApps();
        if (status) status = placeIconOrder();
        if (status) status = placeRestoreInfo();
        if (!status) return status.error();
        plugIn_.client().reconcileRestoreOfType(arguments_.type, nullptr);
        if (const auto error = device_.databaseFailure()) return unusable(*error);
        status = lookAtScreen();
        if (!status) return status.error();
        return std::move(result_);
    }

  private:
    Status findPresent() {
        const Result<std::vector<ApplicationRecord>> records = device_.applications();
        if (!records) return unusable(records.error());
        for (const ApplicationRecord& record : *records) {
            if (!record.isPlaceholder) installed_.insert(record.identifier);
        }
        const Result<DeviceSettings> settings = device_.settings();
        if (!settings) return unusable(settings.error());
        isCoordinated_ = settings->coordination;
        return {};
    }

    // What is installed stays as it is, and is taken off the list. A list that is no list goes to
    // the device as it is: the device judges it.
    Status readRestoreInfo() {
        const std::string path = pathOf(kBackupRestoreInfo);
        Result<Bytes> bytes = readHostFile(path, kLargestList);
        if (!bytes) return unusable(bytes.error());
        restoreInfo_ = *std::move(bytes);
        const Result<FileSum> sum = sumOfFile(path);
        if (!sum) return unusable(sum.error());
        if (*sum != manifest_.files.at(std::string(kBackupRestoreInfo))) {
            return unusable(path + " is altered", "use another backup, or make a new one");
        }
        const Result<PropertyList> parsed = device_.propertyLists().parse(restoreInfo_);
        if (!parsed || !parsed->isMap()) {
            for (const BackedUpApplication& each : manifest_.applications) {
                wanted_.push_back(each.identifier);
            }
            return {};
        }
        return takeOver(*parsed);
    }

    Status takeOver(const PropertyList& info) {
        PropertyList wanted = PropertyList::map();
        for (const auto& [identifier, entry] : info.entries()) {
            if (installed_.contains(identifier)) {
                result_.kept.push_back(identifier);
                continue;
            }
            wanted_.push_back(identifier);
            wanted.set(identifier, entry);
        }
        if (result_.kept.empty()) return {};
        Result<Bytes> bytes = device_.propertyLists().serialize(wanted, PropertyListFormat::Binary);
        if (!bytes) return bytes.error();
        restoreInfo_ = *std::move(bytes);
        return {};
    }

    void checkFiles() {
        for (BackupFault& fault : checkBackup(arguments_.backup, manifest_)) {
            if (!manifest_.holds(fault.file)) continue;  // nobody asks for it
            const std::string name = fault.file;
            const std::string identifier =
                name.starts_with(kBackupData) ? fs::path(name).stem().native() : name;
            if (installed_.contains(identifier)) continue;
            result_.failed.push_back({identifier, name + ": " + fault.error});
            unusable_.insert(name);
        }
    }

    Status placeData() {
        PackageSender sender(device_);
        std::vector<std::string> identifiers;
        for (const BackedUpApplication& each : manifest_.applications) {
            const std::string name = dataArchiveName(each.identifier);
            if (!each.hasData || installed_.contains(each.identifier)) continue;
            if (unusable_.contains(name) || !manifest_.holds(name)) continue;
            // An offloaded application has kept its own.
            if (device_.files().itemExists(Device::dataPath(each.identifier))) continue;
            const Status placed = placeArchive(sender, each.identifier, pathOf(name));
            if (!placed) return placed;
            identifiers.push_back(each.identifier);
        }
        // Where installs are coordinated, nobody sends the data: it counts as there.
        if (isCoordinated_ || identifiers.empty()) return {};
        const Status known = device_.expectRestoreData(identifiers);
        return known ? known : Status(unusable(known.error()));
    }

    // Under another name first: an archive is there whole, or not at all.
    Status placeArchive(PackageSender& sender, const std::string& identifier,
                        const std::string& file) {
        const std::string path = Device::restoreDataPath(identifier);
        const std::string directory = directoryOf(path);
        const std::string partial = identifier + ".part";
        const Result<std::uint64_t> sent = sender.send(
            file, directory, partial, [](std::uint64_t, std::uint64_t) { return true; });
        if (!sent) return sent.error();
        device_.files().removeItem(path).ignore();
        return device_.files().moveItem(directory + "/" + partial, path);
    }

    Status placeDemotedApps() {
        device_.files().removeItem(std::string(kDemotedAppsPath)).ignore();
        return place(kBackupDemotedApps, kDemotedAppsPath);
    }

    Status place(std::string_view name, std::string_view path) {
        if (!canUse(name)) return {};
        const Result<Bytes> bytes = readHostFile(pathOf(name), kLargestList);
        if (!bytes) return bytes.error();
        return write(path, *bytes);
    }

    Status write(std::string_view path, ByteView contents) {
        const FileAttributes mobile{"mobile", "mobile"};
        const Status made = device_.files().createDirectory(directoryOf(path), true, &mobile);
        if (!made) return made;
        return device_.files().writeFileAtomically(std::string(path), contents);
    }

    // What stands on the home screen keeps its place; the others come after it.
    Status placeIconOrder() {
        if (!canUse(kBackupIconOrder)) return {};
        const Result<Bytes> bytes = readHostFile(pathOf(kBackupIconOrder), kLargestList);
        if (!bytes) return bytes.error();
        const auto screen = plugIn_.platform().homeScreen.blockableConnection();
        PropertyList order = PropertyList::array();
        std::set<std::string> seen;
        const auto append = [&](ByteView list) {
            const Result<PropertyList> parsed = device_.propertyLists().parse(list);
            if (!parsed || !parsed->isArray()) return false;
            for (const PropertyList& each : parsed->elements()) {
                const std::string* identifier = each.asString();
                if (identifier != nullptr && seen.insert(*identifier).second) order.append(each);
            }
            return true;
        };
        if (const auto now = screen->flattenedIconState(1)) append(*now);
        if (!append(*bytes)) return noteUnusable(kBackupIconOrder, "it is no list");
        const Result<Bytes> state =
            device_.propertyLists().serialize(order, PropertyListFormat::Binary);
        if (!state) return state.error();
        if (screen->setIconState(*state)) return {};
        return noteUnusable(kBackupIconOrder, "the home screen refuses it");
    }

    Status noteUnusable(std::string_view name, std::string_view why) {
        result_.failed.push_back({std::string(name), std::string(why)});
        return {};
    }

    // Beside the place where it goes once it has been processed.
    Status placeRestoreInfo() {
        const FileAttributes mobile{"mobile", "mobile"};
        const Status made =
            device_.files().createDirectory(directoryOf(kProcessedRestoreInfoPath), true, &mobile);
        return made ? write(kRestoreInfoPath, restoreInfo_) : made;
    }

    Status lookAtScreen() {
        const Result<std::vector<ApplicationRecord>> records = device_.applications();
        if (!records) return unusable(records.error());
        std::map<std::string, const ApplicationRecord*> present;
        for (const ApplicationRecord& record : *records) present[record.identifier] = &record;
        const Result<std::vector<HomeScreenItem>> items = device_.homeScreen();
        if (!items) return unusable(items.error());
        for (const HomeScreenItem& item : *items) {
            const auto found = present.find(item.identifier);
            if (found == present.end()) continue;
            const ApplicationRecord& record = *found->second;
            result_.screen.push_back({record.identifier, record.name.value_or(record.identifier),
                                      record.version, record.isPlaceholder});
        }
        if (!bringsApplications(arguments_.type)) return {};
        for (const std::string& identifier : wanted_) {
            if (present.contains(identifier)) {
                result_.restored.push_back(identifier);
            } else {
                result_.failed.push_back({identifier, whyMissing(identifier)});
            }
        }
        return {};
    }

    std::string whyMissing(const std::string& identifier) {
        const Result<ApplicationStatus> status = device_.status(identifier);
        if (status && status->lastFailure) return status->lastFailure->error.description();
        return "the device has made no placeholder of it: see appsync log";
    }

    [[nodiscard]] bool canUse(std::string_view name) const {
        return manifest_.holds(name) && !unusable_.contains(std::string(name));
    }

    [[nodiscard]] std::string pathOf(std::string_view name) const {
        return (fs::path(arguments_.backup) / name).native();
    }

    const RestoreArguments& arguments_;
    const BackupManifest& manifest_;
    Device& device_;
    PlugIn& plugIn_;
    bool isCoordinated_ = false;
    std::set<std::string> installed_;
    std::vector<std::string> wanted_;
    std::set<std::string> unusable_;  // files of the backup
    Bytes restoreInfo_;
    RestoreResult result_;
};

void printJson(const RestoreArguments& arguments, const RestoreResult& result, double seconds,
               const Console& console) {
    Json failed = Json::array();
    for (const FailedRestore& each : result.failed) {
        failed.push_back({{"identifier", each.identifier}, {"error", each.error}});
    }
    Json screen = Json::array();
    for (const ShownApplication& each : result.screen) {
        screen.push_back({{"identifier", each.identifier},
                          {"name", each.name},
                          {"version", each.version ? Json(*each.version) : Json()},
                          {"state", each.isPlaceholder ? "placeholder" : "installed"}});
    }
    console.out << indented({{"type", arguments.type},
                             {"restored", result.restored},
                             {"kept", result.kept},
                             {"failed", std::move(failed)},
                             {"screen", std::move(screen)},
                             {"seconds", seconds}})
                << '\n';
}

void print(const RestoreArguments& arguments, const RestoreResult& result, double seconds,
           const Console& console) {
    if (!result.screen.empty()) {
        Table table({"IDENTIFIER", "VERSION", "NAME", "STATE"});
        for (const ShownApplication& each : result.screen) {
            table.add({each.identifier, each.version.value_or("-"), each.name,
                       each.isPlaceholder ? "placeholder" : "installed"});
        }
        console.out << table.text();
    }
    if (!bringsApplications(arguments.type)) {
        console.out << "a restore of type " << arguments.type << " brings no applications back\n";
        return;
    }
    console.out << counted(result.restored.size(), "application") << " restored, "
                << result.kept.size() << " kept, " << result.failed.size() << " failed in "
                << Json(std::round(seconds * 100) / 100) << " s\n";
}

}  // namespace

int runRestore(const RestoreArguments& arguments, const Console& console) {
    const Clock::time_point begin = Clock::now();
    const Result<BackupManifest> manifest = readBackupManifest(arguments.backup);
    if (!manifest) return console.fail(manifest.error());
    const Result<std::unique_ptr<Device>> device =
        openDevice(arguments.device, DeviceAccess::Session);
    if (!device) return console.fail(device.error());
    const Result<std::unique_ptr<PlugIn>> plugIn = PlugIn::loadForRestore(**device);
    if (!plugIn) return console.fail(plugIn.error());
    const Result<RestoreResult> result = Restoring(arguments, *manifest, **device, **plugIn).run();
    if (!result) return console.fail(classified(result.error()));
    const double seconds = std::chrono::duration<double>(Clock::now() - begin).count();
    for (const FailedRestore& each : result->failed) {
        console.complain(each.identifier + ": " + each.error);
    }
    (arguments.asJson ? printJson : print)(arguments, *result, seconds, console);
    return result->failed.empty() ? kExitDone : kExitSomethingFailed;
}

}  // namespace appsync
