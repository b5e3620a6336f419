#include "host/backup/Backup.h"

#include <algorithm>
#include <filesystem>
#include <set>
#include <system_error>

#include <nlohmann/json.hpp>

#include "device/package/DataArchive.h"
#include "device/values/PackageIdentifier.h"
#include "host/backup/BackupManifestKeys.h"
#include "host/backup/BackupManifestReader.h"
#include "host/console/JsonWriting.h"
#include "host/console/Problem.h"
#include "host/file/HostFile.h"
#include "system/file/PosixError.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;
using Json = nlohmann::ordered_json;

constexpr std::uint64_t kLargestManifest = std::uint64_t{256} << 20U;

ErrorRecord damaged(const std::string& path, const std::string& what) {
    return unusable("the manifest " + path + " is damaged: " + what,
                    "use another backup, or make a new one");
}

Json jsonOf(const BackupManifest& manifest) {
    Json applications = Json::array();
    for (const BackedUpApplication& each : manifest.applications) {
        applications.push_back({{kIdentifierKey, each.identifier},
                                {kVersionKey, each.version ? Json(*each.version) : Json()},
                                {kNameKey, each.name},
                                {kDataKey, each.hasData}});
    }
    Json::object_t files;  // filled as the array that it is: an object looks for each name first
    for (const auto& [name, sum] : manifest.files) {
        files.emplace_back(name, Json{{kSizeKey, sum.size}, {kSumKey, sum.sha256}});
    }
    return {{kFormatKey, kBackupFormat},
            {kMadeKey, manifest.made},
            {kApplicationsKey, std::move(applications)},
            {kFilesKey, std::move(files)}};
}

// What is wrong with the kind of a file; empty when it is a regular one.
std::string wrongKind(const std::string& backup, const std::string& name) {
    std::error_code code;
    const fs::path path = fs::path(backup) / name;
    const fs::path above = path.parent_path();
    if (name.find('/') != name.npos && fs::is_symlink(above, code)) return "it lies behind a link";
    switch (fs::symlink_status(path, code).type()) {
        case fs::file_type::regular:
            return "";
        case fs::file_type::not_found:
            return "it is missing";
        case fs::file_type::symlink:
            return "it is a link, not a file";
        case fs::file_type::none:
            return code.message();
        default:
            return "it is no regular file";
    }
}

// What is wrong with a file; empty when it is what the manifest says.
std::string defectOf(const std::string& backup, const std::string& name, const FileSum& expected) {
    const std::string kind = wrongKind(backup, name);
    if (!kind.empty()) return kind;
    const fs::path path = fs::path(backup) / name;
    std::error_code code;
    const std::uint64_t size = fs::file_size(path, code);
    if (!code && size != expected.size) {
        return "it is altered: " + std::to_string(size) + " bytes instead of " +
               std::to_string(expected.size);
    }
    const Result<FileSum> sum = sumOfFile(path.native());
    if (!sum) return sum.error().description();
    if (*sum != expected) return "its contents are altered";
    if (!identifierOfData(name)) return "";
    const Status verified = verifyDataArchive(path.native());
    return verified ? "" : "no device can unpack it: " + verified.error().description();
}

using Defects = std::map<std::string, std::string>;  // by file

void addFileDefects(const std::string& backup, const BackupManifest& manifest, Defects& defects) {
    for (const auto& [name, sum] : manifest.files) {
        const std::string defect = defectOf(backup, name, sum);
        if (!defect.empty()) defects.emplace(name, defect);
    }
}

// Where the manifest does not agree with itself.
void addDisagreements(const BackupManifest& manifest, Defects& defects) {
    for (const std::string_view list : {kBackupDemotedApps, kBackupIconOrder}) {
        if (!manifest.holds(list)) defects.emplace(list, "the manifest has no sum of it");
    }
    std::set<std::string> archives;
    for (const BackedUpApplication& each : manifest.applications) {
        if (!each.hasData) continue;
        const std::string name = dataArchiveName(each.identifier);
        archives.insert(name);
        if (!manifest.holds(name)) defects.emplace(name, "the manifest has no sum of it");
    }
    for (const auto& [name, sum] : manifest.files) {
        if (!name.starts_with(kBackupData) || archives.contains(name)) continue;
        defects.emplace(name, "no application of the manifest says that it has data");
    }
}

// All that is there, except for the folder of archives itself.
std::vector<std::string> itemsIn(const std::string& backup) {
    std::vector<std::string> names;
    std::error_code code;
    // What may not be read cannot be surplus, and its files are found missing.
    constexpr auto kOptions = fs::directory_options::skip_permission_denied;
    fs::recursive_directory_iterator place(backup, kOptions, code);
    for (; !code && place != fs::recursive_directory_iterator(); place.increment(code)) {
        std::error_code ignored;
        const std::string name = place->path().lexically_relative(backup).native();
        const bool isFolder = place->is_directory(ignored) && !place->is_symlink(ignored);
        if (!isFolder || name != kBackupData) names.push_back(name);
    }
    return names;
}

}  // namespace

std::string dataArchiveName(const std::string& identifier) {
    return std::string(kBackupData) + "/" + archiveNameOf(identifier);
}

std::optional<std::string> identifierOfData(std::string_view file) {
    if (!file.starts_with(kBackupData)) return std::nullopt;
    file.remove_prefix(kBackupData.size());
    if (!file.starts_with('/')) return std::nullopt;
    return identifierOfArchive(file.substr(1));
}

bool isBackup(const std::string& folder) {
    const std::string unfinished = std::string(kBackupManifest) + ".part";
    const auto holds = [&](std::string_view name) {
        std::error_code code;
        return fs::exists(fs::symlink_status(fs::path(folder) / name, code));
    };
    return holds(kBackupManifest) || holds(unfinished) || holds(kBackupRestoreInfo);
}

Result<BackupManifest> readBackupManifest(const std::string& backup) {
    std::error_code code;
    if (!fs::is_directory(backup, code)) {
        return unusable("there is no backup " + displayPath(backup),
                        "name the folder that appsync backup made");
    }
    const std::string path = (fs::path(backup) / kBackupManifest).native();
    const fs::file_status found = fs::symlink_status(path, code);
    if (found.type() == fs::file_type::none) {
        return unusable("cannot read the backup " + backup + ": " + code.message(),
                        "make it readable");
    }
    if (!fs::exists(found)) {
        return unusable("the backup " + backup + " has no " + std::string(kBackupManifest) +
                            ": it was cut off, or it is no backup",
                        "make a new one with appsync backup");
    }
    const std::string kind = wrongKind(backup, std::string(kBackupManifest));
    if (!kind.empty()) return damaged(path, kind);
    const Result<Bytes> bytes = readHostFile(path, kLargestManifest);
    if (!bytes) return unusable(bytes.error());
    return parseBackupManifest(*bytes, path);
}

Result<BackupManifest> parseBackupManifest(ByteView text, const std::string& path) {
    BackupManifest manifest;
    const std::string_view characters(reinterpret_cast<const char*>(text.data()), text.size());
    const std::string defect = readManifestText(characters, manifest);
    if (!defect.empty()) return damaged(path, defect);
    return manifest;
}

Bytes manifestText(const BackupManifest& manifest) {
    const std::string text = indented(jsonOf(manifest)) + "\n";
    return {text.begin(), text.end()};
}

std::vector<BackupFault> checkBackup(const std::string& backup, const BackupManifest& manifest) {
    Defects defects;
    addFileDefects(backup, manifest, defects);
    addDisagreements(manifest, defects);
    std::set<std::string> surplus;
    for (const std::string& name : itemsIn(backup)) {
        if (name == kBackupManifest || manifest.holds(name)) continue;
        if (defects.emplace(name, "the manifest does not name it").second) surplus.insert(name);
    }
    std::vector<BackupFault> faults;
    for (const auto& [name, defect] : defects) {
        faults.push_back({name, defect, surplus.contains(name)});
    }
    return faults;
}

}  // namespace appsync
