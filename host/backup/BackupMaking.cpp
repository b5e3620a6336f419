#include "host/backup/BackupMaking.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <filesystem>
#include <map>
#include <set>
#include <string_view>
#include <system_error>
#include <utility>

#include "device/Device.h"
#include "device/package/DataArchive.h"
#include "device/screen/IconDrawing.h"
#include "device/values/DevicePaths.h"
#include "device/values/PackageIdentifier.h"
#include "host/backup/BackupFolder.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"
#include "host/file/HostFile.h"
#include "platform/AppRegistry.h"
#include "platform/FileSystem.h"
#include "platform/PropertyListSerialization.h"
#include "system/file/DescriptorIO.h"
#include "system/file/RootDirectory.h"
#include "system/file/UniqueFd.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

constexpr std::string_view kMetadataName = "/VessikMetadata.plist";
constexpr std::string_view kPngSignature = "\x89PNG\r\n\x1a\n";

bool isDemoted(const ApplicationRecord& record) {
    return record.isPlaceholder && (record.installType == kInstallTypeDowngrade ||
                                    record.installType == kInstallTypeIntentionalDowngrade);
}

// What a restore brings back: the person's own applications. The placeholder of a sync is none yet.
bool isForBackup(const ApplicationRecord& record) {
    const bool isOfSync = record.isPlaceholder && record.installType == kInstallTypeSync;
    return record.type == kApplicationTypeUser && !isOfSync;
}

bool isPng(ByteView bytes) {
    return bytes.size() > kPngSignature.size() &&
           std::equal(kPngSignature.begin(), kPngSignature.end(), bytes.begin(),
                      [](char a, std::uint8_t b) { return static_cast<std::uint8_t>(a) == b; });
}

// Whether it is the data that cannot be read, not the archive that cannot be written.
bool isOfSource(const ErrorRecord& error) {
    constexpr std::array<std::int64_t, 5> kCodes = {EACCES, EPERM, ENOENT, ENOTDIR, ELOOP};
    return error.domain == kPosixErrorDomain &&
           std::find(kCodes.begin(), kCodes.end(), error.code) != kCodes.end();
}

// One backup in the making.
class BackupMaking {
  public:
    BackupMaking(Device& device, BackupFolder& folder, const BackupProgress& progress)
        : device_(device), folder_(folder), progress_(progress), backup_(folder.path()) {}

    Result<BackupResult> run() {
        Status status = gather();
        if (status) status = writeRestoreInfo();
        if (status) status = writeDemotedApps();
        if (status) status = writeIconOrder();
        if (status) status = writeData();
        result_.manifest.made = formatTime(std::chrono::system_clock::now());
        if (status) status = folder_.finish(manifestText(result_.manifest));
        if (!status) return status.error();
        for (const auto& [name, sum] : result_.manifest.files) result_.bytes += sum.size;
        return std::move(result_);
    }

  private:
    Status gather() {
        Result<std::vector<ApplicationRecord>> records = device_.applications();
        if (!records) return records.error();
        std::set<std::string> seen;  // an application stands before the placeholder that covers it
        for (ApplicationRecord& record : *records) {
            if (!isForBackup(record) || !seen.insert(record.identifier).second) continue;
            records_.push_back(std::move(record));
        }
        const Result<std::vector<ApplicationRecord>> shown = device_.homeScreenApplications();
        if (!shown) return shown.error();
        for (const ApplicationRecord& record : *shown) order_.push_back(record.identifier);
        Result<std::map<std::string, Bytes>> sinfs = device_.sinfData();
        if (!sinfs) return sinfs.error();
        sinfs_ = *std::move(sinfs);
        return {};
    }

    Status writeRestoreInfo() {
        PropertyList info = PropertyList::map();
        for (const ApplicationRecord& record : records_) {
            Result<PropertyList> entry = restoreEntry(record);
            if (!entry) return entry.error();
            info.set(record.identifier, *std::move(entry));
            result_.manifest.applications.push_back(
                {record.identifier, record.version, nameOf(record), false});
        }
        return writeList(kBackupRestoreInfo, info);
    }

    std::string nameOf(const ApplicationRecord& record) const {
        return record.name.value_or(record.identifier);
    }

    Result<PropertyList> restoreEntry(const ApplicationRecord& record) {
        Result<Bytes> metadata =
            device_.propertyLists().serialize(metadataOf(record), PropertyListFormat::Binary);
        if (!metadata) return metadata.error().withContext(record.identifier);
        PropertyList entry = PropertyList::map({{"VessikMetadata", *std::move(metadata)}});
        const auto sinf = sinfs_.find(record.identifier);
        if (record.isPlaceholder && sinf != sinfs_.end()) {
            entry.set("ApplicationSINF", sinf->second);
        }
        const std::string icon = record.bundle + "/" + record.iconFile;
        const Result<ItemAttributes> attributes = device_.files().attributes(icon);
        if (!attributes || attributes->size > kMaximumIconFileBytes) return entry;
        Result<Bytes> picture = device_.files().readFile(icon);
        if (picture && isPng(*picture)) entry.set("PlaceholderIcon", *std::move(picture));
        return entry;
    }

    // What the store says, with the name and the version that stand on the home screen: those of
    // the placeholder that a restore makes.
    PropertyList metadataOf(const ApplicationRecord& record) {
        PropertyList metadata = PropertyList::map();
        const Result<Bytes> bytes =
            device_.files().readFile(record.container + std::string(kMetadataName));
        if (bytes) {
            Result<PropertyList> parsed = device_.propertyLists().parse(*bytes);
            if (parsed && parsed->isMap()) metadata = *std::move(parsed);
        }
        metadata.set("bundleVersion", record.version.value_or(""));
        metadata.set("title", nameOf(record));
        return metadata;
    }

    Status writeDemotedApps() {
        PropertyList automatic = PropertyList::array();
        PropertyList intentional = PropertyList::array();
        for (const ApplicationRecord& record : records_) {
            if (!isDemoted(record)) continue;
            const bool bySystem = record.installType == kInstallTypeDowngrade;
            (bySystem ? automatic : intentional).append(record.identifier);
            result_.demoted.push_back(record.identifier);
        }
        return writeList(kBackupDemotedApps,
                         PropertyList::map({{"AutomaticDowngrades", std::move(automatic)},
                                            {"IntentionalDowngrades", std::move(intentional)}}));
    }

    Status writeIconOrder() { return writeList(kBackupIconOrder, PropertyList::strings(order_)); }

    Status writeList(std::string_view name, const PropertyList& list) {
        const Result<Bytes> bytes =
            device_.propertyLists().serialize(list, PropertyListFormat::Binary);
        if (!bytes) return bytes.error().withContext(name);
        const Status status = writeHostFile(pathOf(name), *bytes);
        return status ? note(std::string(name)) : status;
    }

    Status writeData() {
        if (::mkdir(pathOf(kBackupData).c_str(), 0777) != 0) {
            return cannotWriteFile(errno, pathOf(kBackupData));
        }
        for (BackedUpApplication& application : result_.manifest.applications) {
            if (Status status = archive(application); !status) return status;
        }
        return nameOtherData();
    }

    // Data whose application is gone (offloaded, then forgotten): no restore would bring it back.
    Status nameOtherData() {
        const Result<std::set<std::string>> known = withData();
        if (!known) return known.error();
        const std::string directory(kDataDirectory);
        const Result<UniqueFd> open = device_.root().openDirectory(directory, "read");
        if (!open) return open.error().code == ENOENT ? Status() : Status(open.error());
        Result<std::vector<std::string>> names = namesIn(open->get(), directory);
        if (!names) return names.error();
        std::sort(names->begin(), names->end());
        for (const std::string& identifier : *names) {
            if (known->contains(identifier) || !isLegalIdentifier(identifier)) continue;
            const Result<DataContents> data =
                listData(device_.root(), Device::dataPath(identifier));
            if (data && data->entries.empty() && data->leftOut.empty()) continue;
            leaveOut(identifier,
                     "its application is gone, so that no restore would bring it back; appsync "
                     "data pull keeps it");
        }
        return {};
    }

    // Whose data is in the backup, and the system's applications, which need none.
    Result<std::set<std::string>> withData() {
        const Result<std::vector<ApplicationRecord>> records = device_.applications();
        if (!records) return records.error();
        std::set<std::string> known;
        for (const ApplicationRecord& record : *records) {
            if (record.type != kApplicationTypeUser) known.insert(record.identifier);
        }
        for (const BackedUpApplication& each : result_.manifest.applications) {
            known.insert(each.identifier);
        }
        return known;
    }

    // Of an application that is still to be restored, the data that waits for it.
    Status archive(BackedUpApplication& application) {
        const std::string& identifier = application.identifier;
        const std::string name = dataArchiveName(identifier);
        const std::string directory = Device::dataPath(identifier);
        const Result<UniqueFd> readable = device_.root().openDirectory(directory, "read");
        if (!readable && readable.error().code != ENOENT) {
            leaveOut(identifier, readable.error().description());
            return {};
        }
        Result<DataArchiveContents> contents =
            writeDataArchive(device_.root(), directory, pathOf(name), [&](std::uint64_t bytes) {
                if (progress_) progress_(identifier, bytes);
            });
        if (!contents && isOfSource(contents.error())) {
            ::unlink(pathOf(name).c_str());
            leaveOut(identifier, contents.error().description());
            return {};
        }
        if (!contents) return contents.error().withContext("the data of " + identifier);
        for (const LeftOutItem& item : contents->leftOut) leaveOut(identifier, item.why, item.name);
        application.hasData = contents->entries > 0;
        if (!application.hasData) {
            const Result<bool> copied = copyWaitingData(identifier, name);
            if (!copied) return copied.error();
            application.hasData = *copied;
        }
        if (!application.hasData) return {};
        if (const Status usable = checkArchive(name, contents->entries > 0); !usable) {
            leaveOut(identifier, "its archive: " + usable.error().description());
            application.hasData = false;
            ::unlink(pathOf(name).c_str());
            return {};
        }
        return note(name);
    }

    // What was written here is what was read; what a restore has left came from elsewhere.
    [[nodiscard]] Status checkArchive(const std::string& name, bool isOwn) const {
        if (!isOwn) return verifyDataArchive(pathOf(name));
        const Result<std::uint64_t> checked = checkDataArchive(pathOf(name));
        return checked ? Status() : Status(checked.error());
    }

    // Without a file, it is all of the data.
    void leaveOut(const std::string& identifier, const std::string& reason,
                  const std::string& file = {}) {
        result_.leftOut.push_back({identifier, file, "left out of its data: " + reason});
    }

    Result<bool> copyWaitingData(const std::string& identifier, const std::string& name) {
        const Result<RegularFile> waiting =
            device_.root().openRegularFile(Device::restoreDataPath(identifier));
        if (!waiting) {
            if (waiting.error().code == ENOENT) return false;
            return waiting.error();
        }
        const std::string path = pathOf(name);
        const UniqueFd copy(::open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0666));
        if (!copy) return cannotWriteFile(errno, path);
        const int error = copyWhole(waiting->descriptor.get(), copy.get());
        if (error != 0) return cannotWriteFile(error, path);
        return true;
    }

    Status note(const std::string& name) {
        Result<FileSum> sum = sumOfFile(pathOf(name));
        if (!sum) return sum.error();
        result_.manifest.files[name] = *std::move(sum);
        return {};
    }

    [[nodiscard]] std::string pathOf(std::string_view name) const {
        return (fs::path(backup_) / name).native();
    }

    Device& device_;
    BackupFolder& folder_;
    const BackupProgress& progress_;
    const std::string backup_;
    std::vector<ApplicationRecord> records_;
    std::vector<std::string> order_;
    std::map<std::string, Bytes> sinfs_;
    BackupResult result_;
};

}  // namespace

bool liesInDevice(const Device& device, const std::string& path) {
    std::error_code code;
    // Of a name that is new in the working directory nothing else makes a whole path.
    const fs::path canonical = fs::weakly_canonical(fs::absolute(path, code), code);
    const fs::path inside = canonical.lexically_relative(fs::weakly_canonical(device.path(), code));
    return !code && !inside.empty() && *inside.begin() != "..";
}

Status checkBackupPlace(const Device& device, const std::string& backup) {
    if (!liesInDevice(device, backup)) return {};
    return unusable(backup + " lies in the device that is to be backed up",
                    "name a folder outside of it");
}

Result<BackupResult> makeBackup(Device& device, BackupFolder& folder,
                                const BackupProgress& progress) {
    return BackupMaking(device, folder, progress).run();
}

}  // namespace appsync
