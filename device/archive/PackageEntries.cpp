#include "device/archive/PackageEntries.h"

#include <sys/stat.h>

#include <algorithm>
#include <cstddef>

#include "device/archive/PackageArchiveFormat.h"
#include "device/archive/PackageError.h"
#include "device/values/PackageText.h"

namespace appsync {

namespace {

constexpr std::string_view kBundleSuffix = ".app";

unsigned int rank(char character) noexcept {
    return character == '/' ? 0U : static_cast<unsigned char>(character) + 1U;
}

ErrorRecord refusal(PackageErrorCode code, std::string_view name, std::string_view reason) {
    return packageError(code, "entry " + quotedName(name) + " " + std::string(reason));
}

const char* defectOfComponent(std::string_view component, const PackageLimits& limits) noexcept {
    if (component.empty()) return "has an empty component in its name";
    if (component == "." || component == "..") return "has '.' or '..' as a component of its name";
    if (component.size() > limits.componentBytes) return "has a component that is too long";
    return nullptr;
}

const char* defectOfCharacters(std::string_view name) noexcept {
    if (name.find('\\') != std::string_view::npos) return "has a backslash in its name";
    if (holdsControlCharacter(name)) return "has a control character in its name";
    if (!isValidUtf8(name)) return "has a name that is not valid UTF-8";
    return nullptr;
}

const char* defectOfComponents(std::string_view name, const PackageLimits& limits) noexcept {
    for (std::size_t begin = 0; begin <= name.size();) {
        const std::size_t end = std::min(name.find('/', begin), name.size());
        if (const char* defect = defectOfComponent(name.substr(begin, end - begin), limits)) {
            return defect;
        }
        begin = end + 1;
    }
    return nullptr;
}

/// What is wrong with a name (without a slash at its end); null when nothing is.
const char* defectOfName(std::string_view name, const PackageLimits& limits) noexcept {
    if (name.empty()) return "has no name";
    if (name.front() == '/') return "has an absolute name";
    if (name.size() > limits.nameBytes) return "has a name that is too long";
    if (const char* defect = defectOfCharacters(name)) return defect;
    return defectOfComponents(name, limits);
}

const char* kindOf(std::uint32_t mode) noexcept {
    switch (mode & S_IFMT) {
        case S_IFLNK:
            return "is a symbolic link";
        case S_IFCHR:
        case S_IFBLK:
            return "is a device";
        case S_IFIFO:
            return "is a pipe";
        case S_IFSOCK:
            return "is a socket";
        default:
            return "is of an unknown kind";
    }
}

Status checkKind(const RawPackageEntry& raw, bool namedAsDirectory) {
    const std::uint32_t type = raw.mode & S_IFMT;
    constexpr std::string_view kAdvice = "; a package holds only files and directories";
    if (type != 0 && type != S_IFREG && type != S_IFDIR) {
        return refusal(PackageErrorCode::NotAFileOrDirectory, raw.name,
                       kindOf(raw.mode) + std::string(kAdvice));
    }
    if (type != 0 && (type == S_IFDIR) != namedAsDirectory) {
        return refusal(
            PackageErrorCode::NotAFileOrDirectory, raw.name,
            "is a directory by its mode or by its name, but not by both" + std::string(kAdvice));
    }
    if (namedAsDirectory && (raw.size != 0 || raw.packedSize > 2)) {
        return refusal(PackageErrorCode::DirectoryWithContents, raw.name,
                       "is a directory and has contents of its own");
    }
    return {};
}

/// Drops setuid, setgid, sticky and the writing of group and others; leaves the owner what is
/// needed to read, and to empty, what was unpacked.
std::uint32_t deviceMode(std::uint32_t mode, bool isDirectory) noexcept {
    const std::uint32_t needed = isDirectory ? 0700U : 0400U;
    const std::uint32_t usual = isDirectory ? 0755U : 0644U;
    return mode == 0 ? usual : (mode & 0755U) | needed;
}

std::string_view topOf(std::string_view name) noexcept { return name.substr(0, name.find('/')); }

bool isBundleName(std::string_view name) noexcept {
    return name.size() > kBundleSuffix.size() && name.ends_with(kBundleSuffix);
}

Status checkTopLevel(const PackageEntry& entry) {
    const std::string_view top = topOf(entry.name);
    const bool isDirectory = entry.isDirectory || top.size() < entry.name.size();
    if (top == kStoreMetadataName && !isDirectory) return {};
    if (isBundleName(top) && isDirectory) return {};
    return refusal(PackageErrorCode::UnexpectedTopLevelEntry, entry.name,
                   "does not belong in a package; at its top are one directory <Name>.app and "
                   "optionally the file VessikMetadata.plist");
}

ErrorRecord tooLarge(const PackageLimits& limits) {
    return packageError(PackageErrorCode::TooLarge, "it unpacks to more than " +
                                                        std::to_string(limits.unpackedBytes) +
                                                        " bytes; make it smaller");
}

ErrorRecord compressedTooFar(std::uint64_t unpacked, std::uint64_t packed) {
    return packageError(PackageErrorCode::CompressionRatio,
                        std::to_string(packed) + " bytes claim to unpack to " +
                            std::to_string(unpacked) +
                            "; no application compresses that far, do not trust its source");
}

bool passesRatio(std::uint64_t unpacked, std::uint64_t packed,
                 const PackageLimits& limits) noexcept {
    return unpacked > limits.ratioFreeBytes && unpacked / limits.ratio > packed;
}

}  // namespace

bool precedesInTree(std::string_view left, std::string_view right) noexcept {
    return std::lexicographical_compare(left.begin(), left.end(), right.begin(), right.end(),
                                        [](char a, char b) { return rank(a) < rank(b); });
}

Result<PackageEntry> checkedEntry(const RawPackageEntry& raw, const PackageLimits& limits) {
    const bool isDirectory = raw.name.size() > 1 && raw.name.back() == '/';
    const std::string_view name = raw.name.substr(0, raw.name.size() - (isDirectory ? 1 : 0));
    if (const char* defect = defectOfName(name, limits)) {
        return refusal(PackageErrorCode::IllegalName, raw.name,
                       std::string(defect) + "; make the package again with other names");
    }
    if (Status status = checkKind(raw, isDirectory); !status) return status.error();
    return PackageEntry{.name = std::string(name),
                        .isDirectory = isDirectory,
                        .mode = deviceMode(raw.mode, isDirectory),
                        .size = raw.size,
                        .packedSize = raw.packedSize,
                        .contentsAt = raw.contentsAt,
                        .crc = raw.crc,
                        .isDeflated = raw.isDeflated,
                        .modified = raw.modified};
}

Status arrangeAsTree(std::vector<PackageEntry>& entries) {
    std::sort(entries.begin(), entries.end(), [](const PackageEntry& a, const PackageEntry& b) {
        return precedesInTree(a.name, b.name);
    });
    for (std::size_t position = 1; position < entries.size(); ++position) {
        const PackageEntry& before = entries[position - 1];
        const PackageEntry& entry = entries[position];
        if (entry.name == before.name) return duplicateEntry(entry.name);
        if (!before.isDirectory && entry.name.starts_with(before.name + "/")) {
            return refusal(PackageErrorCode::FileUsedAsDirectory, entry.name,
                           "lies in " + quotedName(before.name) + ", which is a file");
        }
    }
    return {};
}

Status checkSizes(const std::vector<PackageEntry>& entries, std::uint64_t packedBytes,
                  const PackageLimits& limits) {
    std::uint64_t unpacked = 0;
    std::uint64_t taken = 0;
    for (const PackageEntry& entry : entries) {
        if (entry.size > limits.unpackedBytes - unpacked) return tooLarge(limits);
        unpacked += entry.size;
        const std::uint64_t headers = kLocalHeaderBytes + entry.name.size();
        if (entry.packedSize > packedBytes || headers + entry.packedSize > packedBytes - taken) {
            return packageError(PackageErrorCode::Inconsistent,
                                "its entries claim more bytes than it has, so that some of them "
                                "overlap; make it again");
        }
        taken += headers + entry.packedSize;
        if (passesRatio(entry.size, entry.packedSize, limits)) {
            return compressedTooFar(entry.size, entry.packedSize)
                .withContext("entry " + quotedName(entry.name));
        }
    }
    if (passesRatio(unpacked, packedBytes, limits)) return compressedTooFar(unpacked, packedBytes);
    return {};
}

Result<std::string> bundleDirectoryOf(const std::vector<PackageEntry>& entries) {
    std::string_view bundle;
    for (const PackageEntry& entry : entries) {
        if (Status status = checkTopLevel(entry); !status) return status.error();
        const std::string_view top = topOf(entry.name);
        if (top == kStoreMetadataName || top == bundle) continue;
        if (!bundle.empty()) {
            return packageError(PackageErrorCode::SeveralBundles,
                                "it holds " + quotedName(bundle) + " and " + quotedName(top) +
                                    "; a package holds one application");
        }
        bundle = top;
    }
    if (bundle.empty()) {
        return packageError(PackageErrorCode::NoBundle,
                            "it holds no directory <Name>.app, so there is no application in it");
    }
    return std::string(bundle);
}

const PackageEntry* findEntry(const std::vector<PackageEntry>& entries,
                              std::string_view name) noexcept {
    const auto found = std::lower_bound(entries.begin(), entries.end(), name,
                                        [](const PackageEntry& entry, std::string_view wanted) {
                                            return precedesInTree(entry.name, wanted);
                                        });
    return found != entries.end() && found->name == name ? &*found : nullptr;
}

}  // namespace appsync
