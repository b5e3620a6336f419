#include "host/backup/Restoring.h"

#include <algorithm>
#include <filesystem>
#include <map>
#include <set>
#include <string_view>
#include <utility>

#include "client/Paths.h"
#include "device/Device.h"
#include "device/values/PackageIdentifier.h"
#include "host/backup/Backup.h"
#include "host/backup/RestoreDefects.h"
#include "host/backup/RestoredData.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"
#include "host/file/HostFile.h"
#include "host/plan/StandingInstalls.h"
#include "host/session/PackageSender.h"
#include "host/session/PlugIn.h"
#include "platform/FileSystem.h"
#include "platform/HomeScreenService.h"
#include "platform/InstallProgressRecord.h"
#include "platform/PropertyListSerialization.h"
#include "platform/SyncClient.h"
#include "restore/DemotedApps.h"
#include "restore/RestoredApp.h"
#include "system/file/PosixError.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

constexpr std::uint64_t kLargestList = std::uint64_t{2} << 30U;
constexpr std::int64_t kApplicationsToo[] = {2, 3};
// What is named where nothing of a restore is done.
constexpr std::string_view kWholeRestore = "restore";
// Archives that share what makes them durable; several files are open for each.
constexpr std::size_t kPlacedTogether = 64;

std::string directoryOf(std::string_view path) {
    return std::string(path.substr(0, path.rfind('/')));
}

// "it is missing" becomes " is missing", what does not begin so ": ...".
std::string without(std::string_view subject, const std::string& sentence) {
    const bool begins = sentence.starts_with(subject);
    return begins ? " " + sentence.substr(subject.size()) : ": " + sentence;
}

// The failure to put something on the device, with what to do.
Status withWhatToDo(const Status& status) {
    if (status) return status;
    const ErrorRecord& error = status.error();
    if (!isInTheWay(error)) return error;
    return ErrorRecord::make(
        error.domain, error.code,
        error.description() + "; remove what stands there in its place and restore again");
}

// One restore. The restore information is the last file to be placed: without it, nothing has
// begun, and whatever was placed is placed again the next time.
class Restoring {
  public:
    Restoring(const std::string& backup, const BackupManifest& manifest, std::int64_t type,
              Device& device, PlugIn& plugIn, const RestoreProgress& progress)
        : backup_(backup),
          manifest_(manifest),
          type_(type),
          device_(device),
          plugIn_(plugIn),
          progress_(progress) {}

    // An error when the device or the backup cannot be used at all.
    Result<RestoreResult> run() {
        Status status = findPresent();
        say("checking the backup");
        if (status) status = readRestoreInfo();
        if (!status) return status.error();
        listData();
        if (const Status room = checkRoom(); !room) return refuse(room.error());
        status = clearTheWay();
        if (!status) return status.error();
        checkFiles();
        status = placeData();
        if (status) status = placeDemotedApps();
        if (!status) return status.error();
        noteUnless(placeIconOrder(), kBackupIconOrder, "the order of the home screen stays");
        isPlaced_ = noteUnless(placeRestoreInfo(), kBackupRestoreInfo, "nothing is restored");
        if (isPlaced_) {
            say("bringing back " + counted(wanted_.size(), "application"));
            plugIn_.client().reconcileRestoreOfType(type_, nullptr);
        }
        if (const auto error = device_.databaseFailure()) return unusable(*error);
        status = lookAtScreen();
        if (!status) return status.error();
        return std::move(result_);
    }

  private:
    void say(const std::string& what) const {
        if (progress_) progress_(what);
    }

    Status findPresent() {
        const Result<std::vector<ApplicationRecord>> records = device_.applications();
        if (!records) return unusable(records.error());
        for (const ApplicationRecord& record : *records) {
            (record.isPlaceholder ? standing_ : installed_).insert(record.identifier);
        }
        const Result<DeviceSettings> settings = device_.settings();
        if (!settings) return unusable(settings.error());
        isCoordinated_ = settings->coordination;
        return {};
    }

    // What is installed stays as it is, and is taken off the list. A list that is no list goes to
    // the device as it is: the device judges it.
    Status readRestoreInfo() {
        const std::string name(kBackupRestoreInfo);
        for (BackupFault& fault : checkBackup(backup_, manifest_)) {
            if (!fault.isSurplus) faults_.emplace(fault.file, std::move(fault.error));
        }
        if (const auto fault = faults_.find(name); fault != faults_.end()) {
            return unusable(pathOf(name) + without("it ", fault->second),
                            "use another backup, or make a new one");
        }
        Result<Bytes> bytes = readHostFile(pathOf(name), kLargestList);
        if (!bytes) return unusable(bytes.error());
        restoreInfo_ = *std::move(bytes);
        const Result<PropertyList> parsed = device_.propertyLists().parse(restoreInfo_);
        if (parsed && parsed->isMap()) return takeOver(*parsed);
        for (const BackedUpApplication& each : manifest_.applications) {
            wantUnlessInstalled(each.identifier, "the restore information of the backup is no map");
        }
        return {};
    }

    Status takeOver(const PropertyList& info) {
        PropertyList taken = PropertyList::map();
        for (const auto& [identifier, entry] : info.entries()) {
            if (!isLegalIdentifier(identifier)) {
                fail(identifier, "this is not an identifier (" + std::string(kIdentifierRule) +
                                     "), so it is left out; use another backup");
            } else if (installed_.contains(identifier)) {
                result_.kept.push_back(identifier);
            } else {
                want(identifier,
                     defectOfRestoreEntry(entry, device_.propertyLists(), isCoordinated_));
                taken.set(identifier, entry);
            }
        }
        for (const BackedUpApplication& each : manifest_.applications) {
            if (info.find(each.identifier) != nullptr) continue;
            wantUnlessInstalled(each.identifier,
                                "the restore information of the backup does not name it");
        }
        if (taken.entries().size() == info.entries().size()) return {};
        Result<Bytes> bytes = device_.propertyLists().serialize(taken, PropertyListFormat::Binary);
        if (!bytes) return bytes.error();
        restoreInfo_ = *std::move(bytes);
        return {};
    }

    void wantUnlessInstalled(const std::string& identifier, const std::string& defect) {
        if (installed_.contains(identifier)) {
            result_.kept.push_back(identifier);
        } else {
            want(identifier, defect);
        }
    }

    void want(const std::string& identifier, const std::string& defect) {
        wanted_.push_back(identifier);
        if (!defect.empty()) {
            defects_[identifier] = defect + "; use another backup, or install it with appsync sync";
        }
    }

    void listData() {
        for (const BackedUpApplication& each : manifest_.applications) {
            if (!each.hasData || installed_.contains(each.identifier)) continue;
            const std::string name = dataArchiveName(each.identifier);
            // An offloaded application has kept its own.
            if (!canUse(name) || device_.files().itemExists(Device::dataPath(each.identifier))) {
                continue;
            }
            data_.push_back({each.identifier, pathOf(name)});
        }
    }

    // An install fails for good while data waits that the device has no room for.
    Status checkRoom() {
        const Result<std::uint64_t> free = device_.freeSpace();
        if (!free || data_.empty()) return {};  // what fails then is named alone
        const std::uint64_t needed = bytesNeededFor(data_, device_);
        device_.makeRoom(needed <= *free ? needed : 0);
        if (needed <= *free) return {};
        return lackOfSpace("the data of all applications together", needed, *free,
                           "nothing is restored; free space on the device and restore again");
    }

    // Nothing has been changed.
    Result<RestoreResult> refuse(const ErrorRecord& reason) {
        const Result<std::vector<ApplicationRecord>> shown = device_.homeScreenApplications();
        if (!shown) return unusable(shown.error());
        for (const ApplicationRecord& record : *shown) show(record);
        fail(std::string(kWholeRestore), reason.description());
        return std::move(result_);
    }

    void show(const ApplicationRecord& record) {
        result_.screen.push_back({record.identifier, record.name.value_or(record.identifier),
                                  record.version, record.isPlaceholder});
    }

    // What an interrupted sync was about to bring would go with the next sync, not stay restored.
    Status clearTheWay() {
        if (!bringsApplications(type_)) return {};
        const auto removed = device_.removeLeftoverSyncPlaceholders();
        if (!removed) return unusable(removed.error());
        const Result<std::vector<CoordinatorRecord>> coordinators = device_.coordinators();
        if (!coordinators) return unusable(coordinators.error());
        const std::set<std::string> wanted(wanted_.begin(), wanted_.end());
        for (const CoordinatorRecord& each : *coordinators) {
            const bool isOfSync = each.client == SyncClientID && each.kind == "initiating";
            if (!isOfSync || each.isComplete || !wanted.contains(each.identifier)) continue;
            const Status cancelled = device_.cancelCoordinator(each.identifier, SyncClientID);
            if (!cancelled) return unusable(cancelled.error());
        }
        return {};
    }

    // The data is named by its application, a list by its name.
    void checkFiles() {
        for (const auto& [name, error] : faults_) {
            const std::optional<std::string> identifier = identifierOfData(name);
            if (!identifier) {
                fail(name, error + "; use another backup");
                continue;
            }
            if (installed_.contains(*identifier)) continue;
            std::string what = name;
            failData(*identifier, what.append(": ").append(error));
        }
    }

    void failData(const std::string& identifier, const std::string& error) {
        fail(identifier, error + "; it comes back without its data: use another backup for that");
    }

    void fail(const std::string& identifier, std::string error) {
        result_.failed.push_back({identifier, std::move(error)});
    }

    // Whether it went well; else the list is named.
    bool noteUnless(const Status& status, std::string_view name, const char* consequence) {
        if (!status) fail(std::string(name), status.error().description() + "; " + consequence);
        return status.ok();
    }

    Status placeData() {
        PackageSender sender(device_);
        std::size_t done = 0;
        for (const DataToPlace& each : data_) {
            say("placing data, " + std::to_string(++done) + " of " + std::to_string(data_.size()));
            const Status sent = sendArchive(sender, each);
            if (sent) {
                placing_.push_back(each.identifier);
            } else {
                failPlacing(each.identifier, sent);
            }
            if (placing_.size() == kPlacedTogether) placeArchives(sender);
        }
        placeArchives(sender);
        // Where installs are coordinated, nobody sends the data: it counts as there.
        if (isCoordinated_ || placed_.empty()) return {};
        const Status known = device_.expectRestoreData(placed_);
        return known ? known : Status(unusable(known.error()));
    }

    static Status sendArchive(PackageSender& sender, const DataToPlace& data) {
        const fs::path place = Device::restoreDataPath(data.identifier);
        const Result<std::uint64_t> sent =
            sender.sendAside(data.file, place.parent_path().native(), place.filename().native(),
                             [](std::uint64_t, std::uint64_t) { return true; });
        return sent ? Status() : Status(sent.error());
    }

    void placeArchives(PackageSender& sender) {
        const std::map<std::string, ErrorRecord> failures = sender.placeAll();
        for (const std::string& identifier : std::exchange(placing_, {})) {
            const auto failure = failures.find(Device::restoreDataPath(identifier));
            if (failure == failures.end()) {
                placed_.push_back(identifier);
            } else {
                failPlacing(identifier, failure->second);
            }
        }
    }

    void failPlacing(const std::string& identifier, const Status& status) {
        fail(identifier, withWhatToDo(status).error().description() +
                             "; until then it comes back without its data");
    }

    // A list that is none goes to the device all the same: the device judges it. One that the
    // device cannot hold is an error: without it what was offloaded would come back as the others,
    // for good.
    Status placeDemotedApps() {
        constexpr const char* kConsequence = "nobody counts as offloaded";
        device_.files().removeItem(std::string(kDemotedAppsPath)).ignore();
        if (!canUse(kBackupDemotedApps)) return {};
        const Result<Bytes> bytes = readHostFile(pathOf(kBackupDemotedApps), kLargestList);
        if (!noteUnless(bytes ? Status() : Status(bytes.error()), kBackupDemotedApps,
                        kConsequence)) {
            return {};
        }
        const Result<PropertyList> list = device_.propertyLists().parse(*bytes);
        if (list) offloaded_ = DemotedApps(*list);
        if (const std::string defect = defectOfDemotedApps(list); !defect.empty()) {
            noteUnless(failure(defect, "use another backup"), kBackupDemotedApps, kConsequence);
        }
        return write(kDemotedAppsPath, *bytes);
    }

    Status write(std::string_view path, ByteView contents) {
        const Status made = makeDirectoryFor(path);
        if (!made) return made;
        return withWhatToDo(device_.files().writeFileAtomically(std::string(path), contents));
    }

    Status makeDirectoryFor(std::string_view path) {
        const FileAttributes mobile{"mobile", "mobile"};
        return withWhatToDo(device_.files().createDirectory(directoryOf(path), true, &mobile));
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
        if (!append(*bytes)) return failure("it is no list", "use another backup");
        const Result<Bytes> state =
            device_.propertyLists().serialize(order, PropertyListFormat::Binary);
        if (!state) return state.error();
        if (screen->setIconState(*state)) return {};
        return failure("the home screen refuses it", "see appsync log");
    }

    // Beside the place where it goes once it has been processed. A directory in its own place
    // would go there, too.
    Status placeRestoreInfo() {
        const std::string path(kRestoreInfoPath);
        const Status made = makeDirectoryFor(kProcessedRestoreInfoPath);
        if (!made) return made;
        const Result<ItemAttributes> there = device_.files().attributes(path);
        if (there && there->isDirectory) device_.files().removeItem(path).ignore();
        return write(path, restoreInfo_);
    }

    Status lookAtScreen() {
        const Result<std::vector<ApplicationRecord>> shown = device_.homeScreenApplications();
        if (!shown) return unusable(shown.error());
        std::set<std::string> present;
        for (const ApplicationRecord& record : *shown) {
            if (cameBackAsAnother(record)) {
                if (Status status = takeAway(record.identifier); !status) return status;
                continue;
            }
            present.insert(record.identifier);
            show(record);
        }
        if (!bringsApplications(type_)) return {};
        for (const std::string& identifier : wanted_) {
            if (present.contains(identifier)) {
                result_.restored.push_back(identifier);
            } else {
                fail(identifier, whyMissing(identifier));
            }
        }
        return {};
    }

    // The device could not look at its list. As it stands it would count as any other, for good.
    [[nodiscard]] bool cameBackAsAnother(const ApplicationRecord& record) const {
        return isCoordinated_ && record.isPlaceholder &&
               record.installType == kInstallTypeRestore &&
               !standing_.contains(record.identifier) &&
               offloaded_.statusOf(record.identifier) != kNotDemoted;
    }

    Status takeAway(const std::string& identifier) {
        const Status cancelled = device_.cancelCoordinator(identifier, SyncClientID);
        if (!cancelled) return unusable(cancelled.error());
        defects_[identifier] =
            "the device did not see that it was offloaded, and has taken it away again; restore "
            "again";
        return {};
    }

    std::string whyMissing(const std::string& identifier) {
        if (!isPlaced_) return "the restore information did not reach the device";
        const auto defect = defects_.find(identifier);
        if (defect != defects_.end()) return defect->second;
        const Result<ApplicationStatus> status = device_.status(identifier);
        if (status && status->coordinator && status->coordinator->client != SyncClientID) {
            return heldSentence(identifier, status->coordinator->client);
        }
        if (status && status->lastFailure) return status->lastFailure->error.description();
        return "the device has made no placeholder of it: see appsync log";
    }

    [[nodiscard]] bool canUse(std::string_view name) const {
        return manifest_.holds(name) && !faults_.contains(std::string(name));
    }

    [[nodiscard]] std::string pathOf(std::string_view name) const {
        return (fs::path(backup_) / name).native();
    }

    const std::string& backup_;
    const BackupManifest& manifest_;
    const std::int64_t type_;
    Device& device_;
    PlugIn& plugIn_;
    bool isCoordinated_ = false;
    bool isPlaced_ = false;  // the restore information has reached the device
    std::set<std::string> installed_;
    std::set<std::string> standing_;  // placeholders from before
    DemotedApps offloaded_{PropertyList()};
    std::vector<std::string> wanted_;
    std::map<std::string, std::string> defects_;  // by identifier
    std::map<std::string, std::string> faults_;   // by file of the backup
    Bytes restoreInfo_;
    std::vector<DataToPlace> data_;
    std::vector<std::string> placing_;  // whose data is aside
    std::vector<std::string> placed_;   // whose data waits on the device
    const RestoreProgress& progress_;
    RestoreResult result_;
};

}  // namespace

bool bringsApplications(std::int64_t type) {
    return std::find(std::begin(kApplicationsToo), std::end(kApplicationsToo), type) !=
           std::end(kApplicationsToo);
}

Result<RestoreResult> restoreBackup(const std::string& backup, const BackupManifest& manifest,
                                    std::int64_t type, Device& device, PlugIn& plugIn,
                                    const RestoreProgress& progress) {
    return Restoring(backup, manifest, type, device, plugIn, progress).run();
}

}  // namespace appsync
