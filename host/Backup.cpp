#include "host/Backup.h"

#include <algorithm>
#include <filesystem>
#include <set>
#include <system_error>

#include <nlohmann/json.hpp>

#include "device/PackageIdentifier.h"
#include "host/HostFile.h"
#include "host/JsonWriting.h"
#include "host/Problem.h"
#include "host/Text.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;
using Json = nlohmann::ordered_json;

constexpr int kFormat = 1;
constexpr std::uint64_t kLargestManifest = std::uint64_t{256} << 20U;

constexpr const char* kFormatKey = "format";
constexpr const char* kMadeKey = "made";
constexpr const char* kApplicationsKey = "applications";
constexpr const char* kFilesKey = "files";
constexpr const char* kIdentifierKey = "identifier";
constexpr const char* kVersionKey = "version";
constexpr const char* kNameKey = "name";
constexpr const char* kDataKey = "data";
constexpr const char* kSizeKey = "size";
constexpr const char* kSumKey = "sha256";

ErrorRecord damaged(const std::string& path, const std::string& what) {
    return unusable("the manifest " + path + " is damaged: " + what,
                    "use another backup, or make a new one");
}

// Where a file of the manifest may stand: one of the three lists, or an archive of data.
bool isBackupFile(const std::string& name) {
    if (name == kBackupRestoreInfo || name == kBackupDemotedApps || name == kBackupIconOrder) {
        return true;
    }
    const std::string prefix = std::string(kBackupData) + "/";
    constexpr std::string_view kSuffix = ".zip";
    return name.starts_with(prefix) && name.ends_with(kSuffix) &&
           name.size() > prefix.size() + kSuffix.size() &&
           isLegalIdentifier(
               name.substr(prefix.size(), name.size() - prefix.size() - kSuffix.size()));
}

bool isSum(const std::string& text) {
    return text.size() == 64 && text.find_first_not_of("0123456789abcdef") == text.npos;
}

Json jsonOf(const BackupManifest& manifest) {
    Json applications = Json::array();
    for (const BackedUpApplication& each : manifest.applications) {
        applications.push_back({{kIdentifierKey, each.identifier},
                                {kVersionKey, each.version ? Json(*each.version) : Json()},
                                {kNameKey, each.name},
                                {kDataKey, each.hasData}});
    }
    Json files = Json::object();
    for (const auto& [name, sum] : manifest.files) {
        files[name] = {{kSizeKey, sum.size}, {kSumKey, sum.sha256}};
    }
    return {{kFormatKey, kFormat},
            {kMadeKey, manifest.made},
            {kApplicationsKey, std::move(applications)},
            {kFilesKey, std::move(files)}};
}

const Json* memberOf(const Json& object, const char* key) {
    if (!object.is_object()) return nullptr;
    const auto found = object.find(key);
    return found == object.end() ? nullptr : &*found;
}

std::optional<std::string> textAt(const Json& object, const char* key) {
    const Json* member = memberOf(object, key);
    if (member == nullptr || !member->is_string()) return std::nullopt;
    return member->get<std::string>();
}

bool readApplication(const Json& value, BackupManifest& manifest) {
    BackedUpApplication application;
    const auto identifier = textAt(value, kIdentifierKey);
    const Json* data = memberOf(value, kDataKey);
    if (!identifier || !isLegalIdentifier(*identifier)) return false;
    if (data == nullptr || !data->is_boolean()) return false;
    application.identifier = *identifier;
    application.version = textAt(value, kVersionKey);
    application.name = textAt(value, kNameKey).value_or(*identifier);
    application.hasData = data->get<bool>();
    manifest.applications.push_back(std::move(application));
    return true;
}

bool readFile(const std::string& name, const Json& value, BackupManifest& manifest) {
    const Json* size = memberOf(value, kSizeKey);
    const auto sum = textAt(value, kSumKey);
    if (!isBackupFile(name) || size == nullptr || !size->is_number_unsigned()) return false;
    if (!sum || !isSum(*sum)) return false;
    manifest.files[name] = {size->get<std::uint64_t>(), *sum};
    return true;
}

// Why it cannot be used; empty when it can.
std::string readInto(const Json& root, BackupManifest& manifest) {
    const Json* format = memberOf(root, kFormatKey);
    if (format == nullptr || !format->is_number_integer()) return "it tells no format";
    if (format->get<std::int64_t>() != kFormat) {
        return "this version does not know its format " + format->dump();
    }
    manifest.made = textAt(root, kMadeKey).value_or("");
    const Json* applications = memberOf(root, kApplicationsKey);
    const Json* files = memberOf(root, kFilesKey);
    if (applications == nullptr || !applications->is_array()) return "it lists no applications";
    if (files == nullptr || !files->is_object()) return "it lists no files";
    for (const Json& each : *applications) {
        if (!readApplication(each, manifest)) return "an application in it is not as it should be";
    }
    for (const auto& [name, each] : files->items()) {
        if (!readFile(name, each, manifest)) return "its file " + printable(name) + " has no sum";
    }
    return manifest.holds(kBackupRestoreInfo) ? "" : "it does not name the restore information";
}

std::optional<BackupFault> checkFile(const std::string& backup, const std::string& name,
                                     const FileSum& expected) {
    const fs::path path = fs::path(backup) / name;
    std::error_code code;
    if (!fs::exists(path, code)) return BackupFault{name, "it is missing"};
    const Result<FileSum> sum = sumOfFile(path.native());
    if (!sum) return BackupFault{name, sum.error().description()};
    if (*sum == expected) return std::nullopt;
    if (sum->size == expected.size) return BackupFault{name, "its contents are altered"};
    return BackupFault{name, "it is altered: " + std::to_string(sum->size) + " bytes instead of " +
                                 std::to_string(expected.size)};
}

std::vector<std::string> filesIn(const std::string& backup) {
    std::vector<std::string> names;
    std::error_code code;
    fs::recursive_directory_iterator place(backup, code);
    for (; !code && place != fs::recursive_directory_iterator(); place.increment(code)) {
        std::error_code ignored;
        if (place->is_directory(ignored) && !place->is_symlink(ignored)) continue;
        names.push_back(place->path().lexically_relative(backup).native());
    }
    std::sort(names.begin(), names.end());
    return names;
}

}  // namespace

std::string dataArchiveName(const std::string& identifier) {
    return std::string(kBackupData) + "/" + identifier + ".zip";
}

Result<BackupManifest> readBackupManifest(const std::string& backup) {
    std::error_code code;
    if (!fs::is_directory(backup, code)) {
        return unusable("there is no backup " + backup, "name the folder that appsync backup made");
    }
    const std::string path = (fs::path(backup) / kBackupManifest).native();
    if (!fs::exists(path, code)) {
        return unusable("the backup " + backup + " has no " + std::string(kBackupManifest) +
                            ": it was cut off, or it is no backup",
                        "make a new one with appsync backup");
    }
    const Result<Bytes> bytes = readHostFile(path, kLargestManifest);
    if (!bytes) return unusable(bytes.error().description(), "make it readable");
    const Json root = Json::parse(bytes->begin(), bytes->end(), nullptr, false);
    if (root.is_discarded()) return damaged(path, "it is not JSON");
    BackupManifest manifest;
    const std::string defect = readInto(root, manifest);
    if (!defect.empty()) return damaged(path, defect);
    return manifest;
}

Status writeBackupManifest(const std::string& backup, const BackupManifest& manifest) {
    const std::string text = indented(jsonOf(manifest)) + "\n";
    const Bytes bytes(text.begin(), text.end());
    return writeHostFile((fs::path(backup) / kBackupManifest).native(), bytes);
}

std::vector<BackupFault> checkBackup(const std::string& backup, const BackupManifest& manifest) {
    std::vector<BackupFault> faults;
    for (const auto& [name, sum] : manifest.files) {
        if (auto fault = checkFile(backup, name, sum)) faults.push_back(*std::move(fault));
    }
    for (const std::string& name : filesIn(backup)) {
        if (name == kBackupManifest || manifest.holds(name)) continue;
        faults.push_back({name, "the manifest does not name it"});
    }
    return faults;
}

}  // namespace appsync
