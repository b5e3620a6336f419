#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <ostream>
#include <system_error>
#include <utility>

#include <nlohmann/json.hpp>

#include "device/Device.h"
#include "device/package/DataArchive.h"
#include "device/package/PackageReader.h"
#include "host/backup/BackupMaking.h"
#include "host/command/argument/IdentifierArgument.h"
#include "host/command/argument/OpenDevice.h"
#include "host/command/data/DataCommands.h"
#include "host/console/Console.h"
#include "host/console/JsonWriting.h"
#include "host/console/LiveLine.h"
#include "host/console/Problem.h"
#include "host/console/Question.h"
#include "host/console/Table.h"
#include "host/console/Text.h"
#include "host/file/HostFile.h"
#include "platform/FileSystem.h"
#include "system/file/RootDirectory.h"
#include "system/file/UniqueFd.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;
using Json = nlohmann::ordered_json;

std::string amountOf(const DataContents& data) {
    return counted(data.files(), "file") + ", " + formatBytes(data.bytes);
}

bool waitsForInstall(Device& device, const std::string& identifier) {
    return device.files().itemExists(Device::restoreDataPath(identifier));
}

std::string linesOf(const DataContents& data, bool isWaiting, const Console& console) {
    if (data.entries.empty()) {
        return isWaiting ? "No data: what a restore has left waits for the install.\n"
                         : "No data.\n";
    }
    Table table({"SIZE", "MODIFIED", "NAME"});
    table.keepEndsOf(2);
    table.spare({1, 0});
    for (const DataEntry& each : data.entries) {
        table.add({each.isDirectory ? "-" : formatBytes(each.size), formatLocalTime(each.modified),
                   each.name + (each.isDirectory ? "/" : "")});
    }
    return table.textFor(console) + (console.isTerminal ? amountOf(data) + "\n" : "");
}

Json entriesJson(const DataContents& data) {
    Json entries = Json::array();
    for (const DataEntry& each : data.entries) {
        entries.push_back({{"name", each.name},
                           {"directory", each.isDirectory},
                           {"bytes", each.size},
                           {"modified", formatTime(each.modified)}});
    }
    return entries;
}

// What is the same in the answers of all three.
Json amountJson(const std::string& identifier, const DataContents& data) {
    Json leftOut = Json::array();
    for (const LeftOutItem& each : data.leftOut) {
        leftOut.push_back({{"file", each.name}, {"error", each.why}});
    }
    return {{"identifier", identifier},
            {"files", data.files()},
            {"bytes", data.bytes},
            {"leftOut", std::move(leftOut)}};
}

int finishWith(const DataContents& data, const Console& console) {
    for (const LeftOutItem& each : data.leftOut) console.complain("left out: " + each.why);
    return data.leftOut.empty() ? kExitDone : kExitSomethingFailed;
}

bool isArchiveName(const std::string& path) {
    std::string extension = fs::path(path).extension().native();
    std::transform(extension.begin(), extension.end(), extension.begin(),
                   [](unsigned char letter) { return static_cast<char>(std::tolower(letter)); });
    return extension == ".zip";
}

// The data of an application that the device knows, or that has left some.
Result<DataContents> dataOf(Device& device, const std::string& identifier) {
    Result<DataContents> data = listData(device.root(), Device::dataPath(identifier));
    if (!data) return failure(data.error().description(), "see who may read it");
    if (!data->entries.empty() || !data->leftOut.empty()) return data;
    const Result<ApplicationStatus> status = device.status(identifier);
    if (!status) return classified(status.error());
    if (status->installed || status->placeholder) return data;
    return failure(identifier + " is not on the device", "appsync apps shows what is");
}

// What is made beside its place as NAME.part, and goes unless it is finished.
class PulledItem {
  public:
    explicit PulledItem(const std::string& place)
        : place_(withoutSlash(place)), path_(place_.native() + ".part") {}
    ~PulledItem() {
        std::error_code code;
        if (isOurs_) fs::remove_all(path_, code);
    }
    PulledItem(const PulledItem&) = delete;
    PulledItem& operator=(const PulledItem&) = delete;

    [[nodiscard]] std::string path() const { return path_.native(); }

    /// Only a place that may be used is written to, and cleared.
    [[nodiscard]] Status takePlace(const Device& device) {
        Status status = checkPlace(device);
        isOurs_ = status.ok();
        return status;
    }

    /// Puts it on disk, and then in its place.
    [[nodiscard]] Status finish() const {
        const UniqueFd made(::open(path_.c_str(), O_RDONLY | O_CLOEXEC));
        if (!made || ::syncfs(made.get()) != 0) return cannotWriteFile(errno, place_.native());
        const char* from = path_.c_str();
        if (::renameat2(AT_FDCWD, from, AT_FDCWD, place_.c_str(), RENAME_NOREPLACE) == 0) return {};
        return errno == EEXIST ? isThere() : cannotWriteFile(errno, place_.native());
    }

  private:
    static fs::path withoutSlash(const fs::path& path) {
        return path.has_filename() ? path : path.parent_path();
    }
    [[nodiscard]] fs::path parent() const {
        return place_.has_parent_path() ? place_.parent_path() : fs::path(".");
    }
    [[nodiscard]] Status isThere() const {
        return failure(place_.native() + " exists", "name a new folder or archive");
    }

    [[nodiscard]] Status checkPlace(const Device& device) const {
        std::error_code code;
        if (fs::exists(fs::symlink_status(place_, code))) return isThere();
        if (fs::exists(fs::symlink_status(path_, code))) {
            return failure(path_.native() + " exists, of a copy that was cut off or goes on",
                           "remove it, or name another folder or archive");
        }
        if (place_.empty() || !fs::is_directory(parent(), code)) {
            return failure("cannot make '" + place_.native() + "'",
                           "name a new one in a folder that is there");
        }
        if (!liesInDevice(device, place_.native())) return {};
        return failure(place_.native() + " lies in the device", "name a place outside of it");
    }

    const fs::path place_;
    const fs::path path_;
    bool isOurs_ = false;
};

// A line on a terminal: "copied 1.5 MiB".
class CopyProgress {
  public:
    explicit CopyProgress(const Console& console) : line_(console) {}

    DataProgress heard() {
        return [this](std::uint64_t bytes) {
            done_ += bytes;
            line_.say("copied " + formatBytes(done_));
        };
    }

  private:
    LiveLine line_;
    std::uint64_t done_ = 0;
};

Status pullFolder(Device& device, const std::string& directory, const std::string& folder,
                  const DataProgress& progress) {
    if (::mkdir(folder.c_str(), 0777) != 0) return cannotWriteFile(errno, folder);
    const UniqueFd made(::open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!made) return cannotWriteFile(errno, folder);
    const Result<DataContents> copied = copyData(device.root(), directory, made.get(), progress);
    return copied ? Status() : Status(copied.error());
}

Status pullArchive(Device& device, const std::string& directory, const std::string& file,
                   const DataProgress& progress) {
    const auto written = writeDataArchive(device.root(), directory, file, progress);
    return written ? Status() : Status(written.error());
}

bool isForWantOfSpace(const ErrorRecord& error) {
    return error.domain == kPosixErrorDomain && (error.code == ENOSPC || error.code == EDQUOT);
}

Status pull(Device& device, const DataArguments& arguments, const Console& console) {
    PulledItem item(arguments.place);
    if (const Status taken = item.takePlace(device); !taken) return taken;
    const std::string directory = Device::dataPath(arguments.identifier);
    CopyProgress progress(console);
    const auto copy = isArchiveName(arguments.place) ? pullArchive : pullFolder;
    const Status copied = copy(device, directory, item.path(), progress.heard());
    if (copied) return item.finish();
    if (isArchiveName(arguments.place) && isForWantOfSpace(copied.error())) {
        return cannotWriteFile(ENOSPC, arguments.place);
    }
    return failure(copied.error().description(), "nothing was copied");
}

Status fillFromFolder(const std::string& folder, int directory, const DataProgress& progress,
                      std::vector<LeftOutItem>& leftOut) {
    const Result<RootDirectory> root = RootDirectory::open(folder);
    if (!root) return root.error();
    Result<DataContents> copied = copyData(*root, "/", directory, progress);
    if (!copied) return copied.error().withContext(folder);
    leftOut = std::move(copied->leftOut);
    return {};
}

Status fillFromArchive(const std::string& file, int directory, const DataProgress& progress) {
    const UniqueFd archive(::open(file.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
    if (!archive) return systemError(errno, "cannot open " + file);
    const Status unpacked = unpackDataArchive(archive.get(), file, directory, progress);
    if (unpacked || unpacked.error().domain != kInstallerErrorDomain) return unpacked;
    return failure(file + " cannot be unpacked: " + unpacked.error().description(),
                   "use another archive; nothing was changed");
}

Status checkSource(const std::string& place) {
    std::error_code code;
    const fs::file_status found = fs::status(place, code);
    if (fs::is_directory(found) || fs::is_regular_file(found)) return {};
    return failure(fs::exists(found) ? place + " is neither a folder nor a file"
                                     : "there is no '" + place + "'",
                   "name the folder or the archive with the data");
}

Status askBeforeReplacing(const DataArguments& arguments, const DataContents& data,
                          const Console& console) {
    if (arguments.yes || (data.entries.empty() && data.leftOut.empty())) return {};
    const std::string what =
        arguments.identifier + " has data on the device (" + amountOf(data) + ")";
    const std::string question =
        "Replace the data of " + arguments.identifier + " (" + amountOf(data) + ")?";
    return askBeforeLosing({what, question, "give --yes to replace it; appsync data pull keeps it"},
                           console);
}

Result<DataContents> push(Device& device, const DataArguments& arguments, const Console& console) {
    if (const Status good = device.checkDataReplaceable(arguments.identifier); !good) {
        return good.error();
    }
    if (const Status good = checkSource(arguments.place); !good) return good.error();
    const std::string directory = Device::dataPath(arguments.identifier);
    const Result<DataContents> before = listData(device.root(), directory);
    if (!before) return before.error();
    if (const Status agreed = askBeforeReplacing(arguments, *before, console); !agreed) {
        return agreed.error();
    }
    std::vector<LeftOutItem> leftOut;
    CopyProgress progress(console);
    std::error_code code;
    const bool isFolder = fs::is_directory(arguments.place, code);
    const Status replaced = device.replaceData(arguments.identifier, [&](int made) {
        return isFolder ? fillFromFolder(arguments.place, made, progress.heard(), leftOut)
                        : fillFromArchive(arguments.place, made, progress.heard());
    });
    if (!replaced) return replaced.error();
    Result<DataContents> now = listData(device.root(), directory);
    if (now) now->leftOut = std::move(leftOut);
    return now;
}

}  // namespace

int runDataList(const DataArguments& arguments, const Console& console) {
    const Status checked = checkIdentifier(arguments.identifier, kGiveAsShown);
    if (!checked) return console.fail(checked.error());
    return lookAt(arguments.device, console, [&](Device& device) -> Status {
        const Result<DataContents> data = dataOf(device, arguments.identifier);
        if (!data) return data.error();
        Json object = amountJson(arguments.identifier, *data);
        const bool isWaiting = waitsForInstall(device, arguments.identifier);
        object["waiting"] = isWaiting;
        object["entries"] = entriesJson(*data);
        console.out << (arguments.asJson ? indented(object) + "\n"
                                         : linesOf(*data, isWaiting, console));
        for (const LeftOutItem& each : data->leftOut) console.complain(each.why);
        return {};
    });
}

int runDataPull(const DataArguments& arguments, const Console& console) {
    const Status checked = checkIdentifier(arguments.identifier, kGiveAsShown);
    if (!checked) return console.fail(checked.error());
    const Result<std::unique_ptr<Device>> device = openDevice(arguments.device, DeviceAccess::Look);
    if (!device) return console.fail(device.error());
    const Result<DataContents> data = dataOf(**device, arguments.identifier);
    if (!data) return console.fail(data.error());
    if (data->entries.empty()) {
        finishWith(*data, console);
        const bool isWaiting = waitsForInstall(**device, arguments.identifier);
        return console.fail(failure(
            arguments.identifier + " has no data that can be copied",
            isWaiting ? "what a restore has left comes with the install" : "see appsync data ls"));
    }
    const Status pulled = pull(**device, arguments, console);
    if (!pulled) return console.fail(pulled.error());
    Json object = amountJson(arguments.identifier, *data);
    object["place"] = arguments.place;
    console.out << (arguments.asJson ? indented(object)
                                     : arguments.identifier + ": copied " + amountOf(*data) +
                                           " to " + printable(arguments.place))
                << '\n';
    return finishWith(*data, console);
}

int runDataPush(const DataArguments& arguments, const Console& console) {
    const Status checked = checkIdentifier(arguments.identifier, kGiveAsShown);
    if (!checked) return console.fail(checked.error());
    const Result<std::unique_ptr<Device>> device =
        openDevice(arguments.device, DeviceAccess::Session);
    if (!device) return console.fail(device.error());
    const Result<DataContents> data = push(**device, arguments, console);
    if (!data) return console.fail(classified(data.error()));
    console.out << (arguments.asJson ? indented(amountJson(arguments.identifier, *data))
                                     : arguments.identifier + " has new data: " + amountOf(*data))
                << '\n';
    return finishWith(*data, console);
}

}  // namespace appsync
