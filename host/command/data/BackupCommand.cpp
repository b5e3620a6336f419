#include <sys/stat.h>

#include <chrono>
#include <cmath>
#include <filesystem>
#include <map>
#include <ostream>
#include <utility>

#include <nlohmann/json.hpp>

#include "device/Device.h"
#include "host/backup/Backup.h"
#include "host/backup/BackupFolder.h"
#include "host/backup/BackupMaking.h"
#include "host/command/argument/OpenDevice.h"
#include "host/command/data/DataCommands.h"
#include "host/console/Console.h"
#include "host/console/JsonWriting.h"
#include "host/console/LiveLine.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"
#include "host/session/PlugIn.h"
#include "platform/SyncClient.h"

namespace appsync {
namespace {

using Json = nlohmann::ordered_json;
using Clock = std::chrono::steady_clock;

constexpr const char* kWholeBackup = "backup";  // in place of an identifier

Json jsonOf(const std::vector<BackupFault>& faults, const char* key) {
    Json list = Json::array();
    for (const BackupFault& fault : faults) {
        list.push_back({{key, fault.file}, {"error", fault.error}});
    }
    return list;
}

Json jsonOf(const std::vector<LeftOutData>& leftOut) {
    Json list = Json::array();
    for (const LeftOutData& each : leftOut) {
        list.push_back({{"identifier", each.identifier},
                        {"file", each.file.empty() ? Json() : Json(each.file)},
                        {"error", each.error}});
    }
    return list;
}

// The first of each application; the JSON names them all.
void complainOf(const std::vector<LeftOutData>& leftOut, const Console& console) {
    constexpr std::size_t kMost = 10;
    std::map<std::string, std::size_t> counts;
    for (const LeftOutData& each : leftOut) {
        if (++counts[each.identifier] <= kMost)
            console.complain(each.identifier + ": " + each.error);
    }
    for (const auto& [identifier, count] : counts) {
        if (count <= kMost) continue;
        console.complain(identifier + ": left out of its data: " + std::to_string(count - kMost) +
                         " more, which --json names");
    }
}

void printBackup(const BackupResult& result, double seconds, const Console& console) {
    std::uint64_t withData = 0;
    for (const BackedUpApplication& each : result.manifest.applications) {
        if (each.hasData) ++withData;
    }
    console.out << "backed up " << counted(result.manifest.applications.size(), "application")
                << " (" << result.demoted.size() << " offloaded, " << withData << " with data), "
                << formatBytes(result.bytes) << " in " << Json(std::round(seconds * 100) / 100)
                << " s\n";
}

std::string jsonText(const BackupResult& result, const std::vector<BackupFault>& failed,
                     double seconds) {
    Json applications = Json::array();
    Json data = Json::array();
    for (const BackedUpApplication& each : result.manifest.applications) {
        applications.push_back(each.identifier);
        if (each.hasData) data.push_back(each.identifier);
    }
    return indented({{"applications", std::move(applications)},
                     {"demoted", result.demoted},
                     {"data", std::move(data)},
                     {"leftOut", jsonOf(result.leftOut)},
                     {"failed", jsonOf(failed, "identifier")},
                     {"bytes", result.bytes},
                     {"seconds", seconds}});
}

void printBackupJson(const BackupResult& result, double seconds, const Console& console) {
    console.out << jsonText(result, {}, seconds) << '\n';
}

const char* whatToDoWith(const BackupFault& fault) {
    return fault.isSurplus ? "; remove it if nobody needs it"
                           : "; use another backup, or make a new one";
}

ErrorRecord unfinished(const std::string& backup, const ErrorRecord& cause) {
    return failure("the backup " + backup + " is not whole: " + cause.description(),
                   "mend that and back up again, or remove the folder");
}

Result<BackupResult> backUpShowingProgress(Device& device, BackupFolder& folder,
                                           const Console& console) {
    LiveLine line(console);
    std::uint64_t packed = 0;
    return makeBackup(device, folder, [&](const std::string& identifier, std::uint64_t bytes) {
        packed += bytes;
        line.say("packed " + formatBytes(packed) + "; now " + identifier);
    });
}

// The backup as a whole is what failed.
int failWhole(const BackupArguments& arguments, const ErrorRecord& error, const Console& console) {
    if (arguments.asJson) {
        const BackupFault whole{kWholeBackup, error.description()};
        console.out << jsonText(BackupResult(), {whole}, 0) << '\n';
    }
    return console.fail(error);
}

// Whether a backup that is made there leaves the disk of the device as it is.
bool liesOnOtherDisk(const std::string& backup, const std::string& device) {
    namespace fs = std::filesystem;
    std::error_code code;
    const fs::path place = fs::absolute(backup, code);
    struct stat ofBackup {};
    struct stat ofDevice {};
    const bool isKnown = ::stat(place.c_str(), &ofBackup) == 0 ||
                         ::stat(place.parent_path().c_str(), &ofBackup) == 0;
    return isKnown && ::stat(device.c_str(), &ofDevice) == 0 && ofBackup.st_dev != ofDevice.st_dev;
}

// It writes no more than a record to the device.
DeviceOpenOptions backupOptions(const BackupArguments& arguments) {
    DeviceOpenOptions options{.access = DeviceAccess::Session, .sparesKept = true};
    options.borrowsRoom = liesOnOtherDisk(arguments.backup, arguments.device);
    return options;
}

}  // namespace

int runBackup(const BackupArguments& arguments, const Console& console) {
    const Clock::time_point begin = Clock::now();
    const Result<std::unique_ptr<Device>> device =
        openDevice(arguments.device, backupOptions(arguments));
    if (!device) return console.fail(device.error());
    const Result<std::unique_ptr<PlugIn>> plugIn = PlugIn::load(**device, console);
    if (!plugIn) return console.fail(plugIn.error());
    if (const Status good = checkBackupPlace(**device, arguments.backup); !good) {
        return console.fail(good.error());
    }
    Result<BackupFolder> folder = BackupFolder::make(arguments.backup);
    if (!folder) return console.fail(unusable(folder.error()));
    (*plugIn)->client().prepareForBackup();
    const Result<BackupResult> result = backUpShowingProgress(**device, *folder, console);
    if (!result) {
        return failWhole(arguments, unfinished(arguments.backup, result.error()), console);
    }
    const double seconds = std::chrono::duration<double>(Clock::now() - begin).count();
    complainOf(result->leftOut, console);
    (arguments.asJson ? printBackupJson : printBackup)(*result, seconds, console);
    return result->leftOut.empty() ? kExitDone : kExitSomethingFailed;
}

int runBackupCheck(const std::string& backup, bool asJson, const Console& console) {
    const Result<BackupManifest> manifest = readBackupManifest(backup);
    if (!manifest && !isBackup(backup)) return console.fail(manifest.error());
    const std::vector<BackupFault> faults =
        manifest ? checkBackup(backup, *manifest)
                 : std::vector<BackupFault>{
                       {std::string(kBackupManifest), manifest.error().description()}};
    for (const BackupFault& fault : faults) {
        console.complain(fault.file + ": " + fault.error + (manifest ? whatToDoWith(fault) : ""));
    }
    if (asJson) {
        console.out << indented({{"whole", faults.empty()}, {"faults", jsonOf(faults, "file")}})
                    << '\n';
    } else if (faults.empty()) {
        console.out << printable(backup)
                    << " is whole: " << counted(manifest->applications.size(), "application")
                    << ", of " << localTimeOf(manifest->made) << '\n';
    }
    return faults.empty() ? kExitDone : kExitSomethingFailed;
}

}  // namespace appsync
