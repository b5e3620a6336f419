#include "device/package/DataArchive.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <filesystem>
#include <memory>
#include <optional>
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
#include "system/file/DescriptorIO.h"
#include "system/file/PosixError.h"
#include "system/file/RootDirectory.h"

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
                                             const std::string& directory, const std::string& file,
                                             const DataProgress& progress) {
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
    if (Status status = writeArchive(items, file, file, progress); !status) return status.error();
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

Status unpackDataArchive(int archive, std::string_view name, int directory,
                         const DataProgress& progress) {
    const auto opened = openArchive(PackageFile::duplicate(archive, name));
    if (!opened) return opened.error();
    if (Status status = checkSpace(directory, **opened); !status) return status;
    PackageUnpackOptions options;
    options.keepsTimes = true;
    std::uint64_t before = 0;
    options.progress = [&](std::uint64_t done, std::uint64_t /*total*/) {
        if (progress) progress(done - std::exchange(before, done));
        return true;
    };
    const Status unpacked = PackageUnpacker(**opened, directory, options).run();
    return unpacked ? unpacked : Status(bare(unpacked.error(), (*opened)->name()));
}

namespace {

std::chrono::system_clock::time_point timeOf(const struct timespec& time) {
    using std::chrono::duration_cast;
    using Clock = std::chrono::system_clock;
    return Clock::time_point(duration_cast<Clock::duration>(
        std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec)));
}

/// A directory of data, open: what is in it is named from there, and nothing leads out of it.
struct OpenData {
    RootDirectory top;
    std::vector<PackageItem> items;
    std::vector<LeftOutItem> leftOut;
};

// Nothing where there is no such directory.
Result<std::optional<OpenData>> openData(const RootDirectory& root, const std::string& directory) {
    const Result<UniqueFd> opened = root.openDirectory(directory, "read");
    if (!opened) {
        if (opened.error().code == ENOENT) return std::optional<OpenData>();
        return opened.error();
    }
    const std::string path = "/proc/self/fd/" + std::to_string(opened->get());
    Result<RootDirectory> top = RootDirectory::open(path);
    if (!top) return top.error();
    DataListing listing("/proc/self/fd/" + std::to_string(top->descriptor()));
    if (Status status = listing.addAll(); !status) return status.error().withContext(directory);
    return std::optional<OpenData>({*std::move(top), listing.takeItems(), listing.takeLeftOut()});
}

std::string plainName(const PackageItem& item) {
    std::string name = item.entryName;
    if (S_ISDIR(item.mode)) name.pop_back();
    return name;
}

DataContents contentsOf(const OpenData& data) {
    DataContents contents;
    contents.leftOut = data.leftOut;
    for (const PackageItem& item : data.items) {
        DataEntry entry{plainName(item), S_ISDIR(item.mode), item.size, {}};
        struct stat status = {};
        if (::fstatat(data.top.descriptor(), entry.name.c_str(), &status, AT_SYMLINK_NOFOLLOW) ==
            0) {
            entry.modified = timeOf(status.st_mtim);
        }
        contents.bytes += entry.size;
        contents.entries.push_back(std::move(entry));
    }
    return contents;
}

Status streamFile(int file, const std::string& name, Bytes& buffer,
                  const std::function<Status(ByteView piece)>& sink) {
    while (true) {
        const ssize_t count = ::read(file, buffer.data(), buffer.size());
        if (count < 0 && errno == EINTR) continue;
        if (count < 0) return posixError(errno, "read", name);
        if (count == 0) return {};
        const auto piece = ByteView(buffer).first(static_cast<std::size_t>(count));
        if (Status status = sink(piece); !status) return status;
    }
}

/// One copying of data into a directory.
class DataCopying {
  public:
    DataCopying(const OpenData& data, int target, const DataProgress& progress)
        : data_(data), target_(target), progress_(progress) {}

    Status run() {
        for (const PackageItem& item : data_.items) {
            Status status = S_ISDIR(item.mode) ? makeDirectory(item) : copyFile(item);
            if (!status) return status;
        }
        return {};
    }

  private:
    [[nodiscard]] Status makeDirectory(const PackageItem& item) const {
        const std::string name = plainName(item);
        if (::mkdirat(target_, name.c_str(), 0700) == 0 &&
            ::fchmodat(target_, name.c_str(), item.mode & kPermissions, 0) == 0) {
            return {};
        }
        return posixError(errno, "create directory", name);
    }

    Status copyFile(const PackageItem& item) {
        const std::string& name = item.entryName;
        const Result<RegularFile> source = data_.top.openRegularFile("/" + name);
        if (!source) return source.error();
        const UniqueFd copy(::openat(target_, name.c_str(),
                                     O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600));
        if (!copy) return posixError(errno, "create", name);
        const auto write = [&](ByteView piece) -> Status {
            const int error = writeWhole(copy.get(), piece).error;
            if (error != 0) return posixError(error, "write", name);
            if (progress_) progress_(piece.size());
            return {};
        };
        Status status = streamFile(source->descriptor.get(), name, buffer_, write);
        return status ? finish(source->descriptor.get(), copy.get(), item) : status;
    }

    [[nodiscard]] static Status finish(int source, int copy, const PackageItem& item) {
        struct stat status = {};
        if (::fstat(source, &status) == 0 && ::fchmod(copy, item.mode & kPermissions) == 0) {
            const std::array<struct timespec, 2> times = {status.st_mtim, status.st_mtim};
            if (::futimens(copy, times.data()) == 0) return {};
        }
        return posixError(errno, "finish", item.entryName);
    }

    static constexpr std::uint32_t kPermissions = 07777;

    const OpenData& data_;
    const int target_;
    const DataProgress& progress_;
    Bytes buffer_ = Bytes(std::size_t{256} << 10U);
};

Status checkRoom(int directory, const std::string& name, const DataContents& contents) {
    struct statvfs space = {};
    if (::fstatvfs(directory, &space) != 0) return {};  // the writes will tell
    const std::uint64_t free = std::uint64_t{space.f_bavail} * space.f_frsize;
    const std::uint64_t needed = contents.bytes + contents.entries.size() * kBlockBytes;
    if (needed <= free) return {};
    return posixError(ENOSPC, "copy", name,
                      "it needs " + std::to_string(needed) + " bytes and " + std::to_string(free) +
                          " are free where it is to go; make room there");
}

}  // namespace

std::uint64_t DataContents::files() const noexcept {
    return static_cast<std::uint64_t>(std::count_if(
        entries.begin(), entries.end(), [](const DataEntry& each) { return !each.isDirectory; }));
}

Result<DataContents> listData(const RootDirectory& root, const std::string& directory) {
    const Result<std::optional<OpenData>> data = openData(root, directory);
    if (!data) return data.error();
    return *data ? contentsOf(**data) : DataContents();
}

Result<DataContents> copyData(const RootDirectory& root, const std::string& directory, int target,
                              const DataProgress& progress) {
    const Result<std::optional<OpenData>> data = openData(root, directory);
    if (!data) return data.error();
    if (!*data) return DataContents();
    DataContents contents = contentsOf(**data);
    if (Status status = checkRoom(target, directory, contents); !status) return status.error();
    if (Status status = DataCopying(**data, target, progress).run(); !status) {
        return status.error().withContext(directory);
    }
    return contents;
}

Status readData(const RootDirectory& root, const std::string& directory, const DataReader& reader) {
    const Result<std::optional<OpenData>> data = openData(root, directory);
    if (!data) return data.error();
    if (!*data) return {};
    Bytes buffer(std::size_t{256} << 10U);
    for (const PackageItem& item : (*data)->items) {
        if (S_ISDIR(item.mode)) continue;
        const Result<RegularFile> file = (*data)->top.openRegularFile("/" + item.entryName);
        if (!file) return file.error().withContext(directory);
        reader.fileBegins(item.entryName, file->size);
        Status status =
            streamFile(file->descriptor.get(), item.entryName, buffer, [&](ByteView piece) {
                reader.piece(piece);
                return Status();
            });
        if (!status) return status.error().withContext(directory);
    }
    return {};
}

Status readDataArchive(const std::string& file, const DataReader& reader) {
    const auto archive = openArchive(PackageFile::open(file));
    if (!archive) return archive.error();
    Bytes buffer(std::size_t{256} << 10U);
    for (const PackageEntry& entry : (*archive)->entries()) {
        if (entry.isDirectory) continue;
        reader.fileBegins(entry.name, entry.size);
        const Status status = (*archive)->stream(entry, buffer, [&](ByteView piece) {
            reader.piece(piece);
            return Status();
        });
        if (!status) return bare(status.error(), (*archive)->name());
    }
    return {};
}

}  // namespace appsync
