#include "device/package/PackageWriter.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstddef>
#include <cstdio>
#include <memory>
#include <utility>
#include <vector>

#include "device/archive/ArchiveWriter.h"
#include "device/archive/PackageError.h"
#include "device/archive/PackageFolder.h"
#include "device/values/PackageText.h"
#include "system/file/PosixError.h"
#include "system/file/UniqueFd.h"

namespace appsync {

namespace {

/// The package under a temporary name, which goes unless the package was finished.
class UnfinishedPackage {
  public:
    explicit UnfinishedPackage(std::string package)
        : package_(std::move(package)), path_(temporaryPath(package_)) {}
    ~UnfinishedPackage() { ::unlink(path_.c_str()); }
    UnfinishedPackage(const UnfinishedPackage&) = delete;
    UnfinishedPackage& operator=(const UnfinishedPackage&) = delete;

    [[nodiscard]] const std::string& path() const noexcept { return path_; }

    [[nodiscard]] Result<UniqueFd> open() const {
        UniqueFd descriptor(::open(path_.c_str(), O_RDONLY | O_CLOEXEC));
        if (!descriptor) return posixError(errno, "write", package_);
        return descriptor;
    }

    [[nodiscard]] Status finish() const {
        if (::rename(path_.c_str(), package_.c_str()) == 0) return {};
        return posixError(errno, "write", package_);
    }

  private:
    static std::string temporaryPath(const std::string& package) {
        const std::size_t nameBegin = package.rfind('/') + 1;
        return package.substr(0, nameBegin) + "." + package.substr(nameBegin) + ".tmp" +
               std::to_string(::getpid());
    }

    std::string package_;
    std::string path_;
};

/// Without a directory to write to, libzip would name the temporary file.
Status checkDirectory(const std::string& package) {
    const std::size_t slash = package.rfind('/');
    const std::string directory =
        slash == package.npos ? "." : package.substr(0, std::max<std::size_t>(slash, 1));
    if (package.empty() || slash + 1 == package.size()) {
        return packageError(PackageErrorCode::NotARegularFile,
                            "cannot write " + quotedName(package) +
                                ": it is no name of a file; name the package to write");
    }
    if (::access(directory.c_str(), W_OK | X_OK) == 0) return {};
    return posixError(errno, "write to the directory", directory,
                      "it is missing or cannot be written; create it, or choose another");
}

/// Renaming would replace a device, or the link instead of what it leads to.
Status checkReplaceable(const std::string& package) {
    struct stat status = {};
    if (::lstat(package.c_str(), &status) != 0 || S_ISREG(status.st_mode)) return {};
    return packageError(PackageErrorCode::NotARegularFile,
                        "cannot write " + quotedName(package) +
                            ": something other than a file stands there; choose another name");
}

/// Reads the package back, as a device would.
Result<PackageInfo> checkPackage(int descriptor, const std::string& name,
                                 PropertyListSerialization& propertyLists) {
    const Result<PackageReader> reader = PackageReader::open(descriptor, name, propertyLists);
    if (!reader) return reader.error();
    return reader->info();
}

}  // namespace

Result<PackageInfo> writePackage(const std::string& folder, const std::string& package,
                                 PropertyListSerialization& propertyLists) {
    if (Status status = checkDirectory(package); !status) return status.error();
    if (Status status = checkReplaceable(package); !status) return status.error();
    const Result<std::vector<PackageItem>> items = listPackageFolder(folder, PackageLimits());
    if (!items) return items.error();
    const UnfinishedPackage unfinished(package);
    if (Status status = writeArchive(*items, unfinished.path(), package); !status)
        return status.error();
    const Result<UniqueFd> file = unfinished.open();
    if (!file) return file.error();
    Result<PackageInfo> info = checkPackage(file->get(), package, propertyLists);
    if (!info) return info;
    if (::fsync(file->get()) != 0) return posixError(errno, "write", package);
    if (Status status = unfinished.finish(); !status) return status.error();
    return info;
}

}  // namespace appsync
