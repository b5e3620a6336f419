#include "device/package/DataArchive.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <memory>
#include <system_error>
#include <utility>

#include "device/archive/ArchiveWriter.h"
#include "device/archive/PackageArchive.h"
#include "device/archive/PackageEntries.h"
#include "device/archive/PackageFile.h"
#include "device/archive/PackageFolder.h"
#include "device/archive/PackageLimits.h"
#include "device/package/PackageReader.h"
#include "device/package/PackageUnpacker.h"
#include "device/values/PackageText.h"
#include "system/PosixError.h"
#include "system/RootDirectory.h"

namespace appsync {

namespace {

namespace fs = std::filesystem;

// Data may be much, lie deep, and compress as well as it likes; what counts is the room for it.
PackageLimits dataLimits() {
    PackageLimits limits;
    limits.entries = 1'000'000;
    limits.unpackedBytes = std::uint64_t{1} << 44U;
    limits.directoryBytes = std::uint64_t{256} << 20U;
    limits.ratioFreeBytes = limits.unpackedBytes;
    // What lies deeper has no path that the system takes.
    limits.nameBytes = 4000;
    return limits;
}

// The reason alone: an archive of data is no package, and what packages are advised to is no advice
// for it.
ErrorRecord bare(const ErrorRecord& error, const std::string& name) {
    if (error.domain != kInstallerErrorDomain) return error;
    std::string reason = error.description();
    const std::string subject = "package " + quotedName(name) + ": ";
    if (reason.starts_with(subject)) reason.erase(0, subject.size());
    return ErrorRecord::make(error.domain, error.code, reason.substr(0, reason.rfind("; ")));
}

/// Collects what a directory holds. Everything is named from there.
class DataListing {
  public:
    explicit DataListing(fs::path top) : top_(std::move(top)) {}

    Status addAll() {
        while (!waiting_.empty()) {
            const std::string prefix = std::move(waiting_.back());
            waiting_.pop_back();
            if (Status status = addContents(prefix); !status) return status;
        }
        return {};
    }

    std::vector<PackageItem> takeItems() {
        std::sort(items_.begin(), items_.end(), [](const PackageItem& a, const PackageItem& b) {
            return precedesInTree(a.entryName, b.entryName);
        });
        return std::move(items_);
    }
    std::vector<LeftOutItem> takeLeftOut() { return std::move(leftOut_); }

  private:
    Status addContents(const std::string& prefix) {
        std::error_code code;
        fs::directory_iterator place(top_ / prefix, code);
        for (; !code && place != fs::directory_iterator(); place.increment(code)) {
            const std::string name = prefix + place->path().filename().native();
            if (Status status = add(name); !status) return status;
        }
        if (!code) return {};
        if (prefix.empty()) return posixError(code.value(), "read", ".");
        leaveOut(prefix, posixError(code.value(), "read", prefix));
        return {};
    }

    void leaveOut(const std::string& name, const ErrorRecord& error) {
        leftOut_.push_back({name, error.description()});
    }

    Status add(std::string name) {
        const std::string path = (top_ / name).native();
        struct stat status = {};
        // A name that is too long for the system is so for an archive, too, and left out.
        if (::lstat(path.c_str(), &status) != 0 && errno != ENAMETOOLONG) {
            return posixError(errno, "examine", name);
        }
        const bool isDirectory = S_ISDIR(status.st_mode);
        if (isDirectory) name += '/';
        const auto size = isDirectory ? 0 : static_cast<std::uint64_t>(status.st_size);
        const Result<PackageEntry> entry =
            checkedEntry({.name = name, .mode = status.st_mode, .size = size}, limits_);
        if (!entry) {
            leaveOut(name, bare(entry.error(), name));
            return {};
        }
        if (!isDirectory && ::faccessat(AT_FDCWD, path.c_str(), R_OK, AT_EACCESS) != 0) {
            leaveOut(name, posixError(errno, "read", name));
            return {};
        }
        const std::uint32_t kind = isDirectory ? S_IFDIR : S_IFREG;
        items_.push_back({path, name, kind | entry->mode, size, {}});
        if (!isDirectory) items_.back().modified = status.st_mtim.tv_sec;
        if (isDirectory) waiting_.push_back(std::move(name));
        return {};
    }

    const fs::path top_;
    const PackageLimits limits_ = dataLimits();
    /// Directories whose contents are still to be added: not a recursion, however deep they lie.
    std::vector<std::string> waiting_ = {""};
    std::vector<PackageItem> items_;
    std::vector<LeftOutItem> leftOut_;
};

Result<std::unique_ptr<PackageArchive>> openArchive(Result<PackageFile> file) {
    if (!file) return file.error();
    const std::string name = file->name();
    Result<std::unique_ptr<PackageArchive>> archive =
        PackageArchive::open(*std::move(file), dataLimits());
    if (!archive) return bare(archive.error(), name);
    return archive;
}

std::uint64_t bytesOnDevice(const PackageArchive& archive) {
    return archive.unpackedBytes() + archive.entries().size() * kBlockBytes;
}

Status checkSpace(int directory, const PackageArchive& archive) {
    struct statvfs space = {};
    if (::fstatvfs(directory, &space) != 0) return {};  // the writes will tell
    const std::uint64_t free = std::uint64_t{space.f_bavail} * space.f_frsize;
    const std::uint64_t needed = bytesOnDevice(archive);
    if (needed <= free) return {};
    return posixError(ENOSPC, "unpack", archive.name(),
                      "it needs " + std::to_string(needed) + " bytes and " + std::to_string(free) +
                          " are free; remove something from the device");
}

}  // namespace

Result<DataArchiveContents> writeDataArchive(const RootDirectory& root,
                                             const std::string& directory,
                                             const std::string& file) {
    DataArchiveContents contents;
    const Result<UniqueFd> top = root.openDirectory(directory, "read");
    if (!top) {
        if (top.error().code == ENOENT) return contents;
        return top.error();
    }
    // By descriptor, so that no link leads out of the device.
    DataListing listing("/proc/self/fd/" + std::to_string(top->get()));
    if (Status status = listing.addAll(); !status) {
        return status.error().withContext(directory);
    }
    contents.leftOut = listing.takeLeftOut();
    const std::vector<PackageItem> items = listing.takeItems();
    contents.entries = items.size();
    if (items.empty()) return contents;
    if (Status status = writeArchive(items, file); !status) return status.error();
    return contents;
}

Result<std::uint64_t> checkDataArchive(const std::string& file) {
    const auto archive = openArchive(PackageFile::open(file));
    if (!archive) return archive.error();
    return bytesOnDevice(**archive);
}

Status verifyDataArchive(const std::string& file) {
    const auto archive = openArchive(PackageFile::open(file));
    if (!archive) return archive.error();
    const Status verified = (*archive)->verify();
    return verified ? verified : Status(bare(verified.error(), (*archive)->name()));
}

Status unpackDataArchive(int archive, std::string_view name, int directory) {
    const auto opened = openArchive(PackageFile::duplicate(archive, name));
    if (!opened) return opened.error();
    if (Status status = checkSpace(directory, **opened); !status) return status;
    PackageUnpackOptions options;
    options.keepsTimes = true;
    const Status unpacked = PackageUnpacker(**opened, directory, options).run();
    return unpacked ? unpacked : Status(bare(unpacked.error(), (*opened)->name()));
}

}  // namespace appsync
