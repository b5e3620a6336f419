#include "device/archive/PackageFolder.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <system_error>
#include <utility>

#include "device/archive/PackageEntries.h"
#include "device/values/PackageText.h"
#include "system/file/PosixError.h"

namespace appsync {

namespace {

namespace fs = std::filesystem;

std::uint32_t packedMode(mode_t mode) noexcept {
    if (S_ISDIR(mode)) return S_IFDIR | 0755U;
    return S_IFREG | ((mode & S_IXUSR) != 0 ? 0755U : 0644U);
}

/// Collects what a folder holds, as the package is to hold it.
class FolderListing {
  public:
    explicit FolderListing(const PackageLimits& limits) : limits_(limits) {}

    Status addContentsOf(const fs::path& folder) {
        waiting_.push_back({folder, ""});
        return addWaiting();
    }

    /// A bundle, and the store metadata beside it.
    Status addBundle(const fs::path& bundle) {
        if (Status status = add(bundle, bundle.filename().native()); !status) return status;
        const fs::path metadata = bundle.parent_path() / kStoreMetadataName;
        struct stat found = {};
        if (::lstat(metadata.c_str(), &found) == 0) {
            Status status = add(metadata, std::string(kStoreMetadataName));
            if (!status) return status;
        }
        return addWaiting();
    }

    Result<std::vector<PackageItem>> finish(const fs::path& folder) {
        Status status = arrangeAsTree(entries_);
        if (!status) return refusal(status.error(), folder);
        const Result<std::string> bundle = bundleDirectoryOf(entries_);
        if (!bundle) return refusal(bundle.error(), folder);
        std::sort(items_.begin(), items_.end(), [](const PackageItem& a, const PackageItem& b) {
            return precedesInTree(a.entryName, b.entryName);
        });
        return std::move(items_);
    }

  private:
    /// A folder whose contents are still to be added.
    struct Waiting {
        fs::path folder;
        std::string prefix;
    };

    // Not a recursion, as folders may lie deep.
    Status addWaiting() {
        while (!waiting_.empty()) {
            const Waiting next = std::move(waiting_.back());
            waiting_.pop_back();
            if (Status status = addContents(next.folder, next.prefix); !status) return status;
        }
        return {};
    }

    Status addContents(const fs::path& folder, const std::string& prefix) {
        std::error_code error;
        fs::directory_iterator place(folder, error);
        for (; !error && place != fs::directory_iterator(); place.increment(error)) {
            const std::string name = place->path().filename().native();
            if (Status status = add(place->path(), prefix + name); !status) return status;
        }
        if (error) return posixError(error.value(), "read", folder.native());
        return {};
    }

    Status add(const fs::path& path, std::string entryName) {
        struct stat status = {};
        if (::lstat(path.c_str(), &status) != 0) return posixError(errno, "examine", path.native());
        const bool isDirectory = S_ISDIR(status.st_mode);
        if (isDirectory) entryName += '/';
        const auto size = isDirectory ? 0 : static_cast<std::uint64_t>(status.st_size);
        Result<PackageEntry> entry =
            checkedEntry({.name = entryName, .mode = status.st_mode, .size = size}, limits_);
        if (!entry) return refusal(entry.error(), path);
        if (entries_.size() >= limits_.entries) return tooMany(path);
        entries_.push_back(*std::move(entry));
        items_.push_back({path.native(), entryName, packedMode(status.st_mode), size});
        if (isDirectory) waiting_.push_back({path, entryName});
        return {};
    }

    static ErrorRecord refusal(const ErrorRecord& error, const fs::path& path) {
        return cannotPack(static_cast<PackageErrorCode>(error.code), path.native(),
                          error.description());
    }

    [[nodiscard]] ErrorRecord tooMany(const fs::path& path) const {
        return cannotPack(PackageErrorCode::TooManyEntries, path.native(),
                          "a package holds at most " + std::to_string(limits_.entries) +
                              " files and directories");
    }

    const PackageLimits& limits_;
    std::vector<PackageEntry> entries_;
    std::vector<PackageItem> items_;
    std::vector<Waiting> waiting_;
};

}  // namespace

Result<std::vector<PackageItem>> listPackageFolder(const std::string& folder,
                                                   const PackageLimits& limits) {
    std::error_code error;
    const fs::path path = fs::canonical(folder, error);
    if (!error && !fs::is_directory(path, error))
        error = std::make_error_code(std::errc::not_a_directory);
    if (folder.empty() || error.value() == ENOENT || error.value() == ENOTDIR) {
        return posixError(folder.empty() ? ENOENT : error.value(), "pack", quotedName(folder),
                          "there is no such folder; name the one that holds <Name>.app");
    }
    if (error) return posixError(error.value(), "open", folder);
    FolderListing listing(limits);
    Status status =
        path.extension() == ".app" ? listing.addBundle(path) : listing.addContentsOf(path);
    if (!status) return status.error();
    return listing.finish(path);
}

ErrorRecord cannotPack(PackageErrorCode code, std::string_view path, std::string_view reason) {
    return packageError(code, "cannot pack " + quotedName(path) + ": " + std::string(reason));
}

}  // namespace appsync
