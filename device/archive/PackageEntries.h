#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "device/archive/PackageLimits.h"
#include "platform/Result.h"

namespace appsync {

/// The name of the store metadata, beside the bundle.
inline constexpr std::string_view kStoreMetadataName = "VessikMetadata.plist";
/// The name of the property list that describes a bundle, inside it.
inline constexpr std::string_view kInfoPropertyListName = "Info.plist";

/// A file or a directory that a package lists.
struct PackageEntry {
    /// Without the slash that ends the name of a directory in the archive.
    std::string name;
    bool isDirectory = false;
    /// The mode it is to have on the device.
    std::uint32_t mode = 0;
    std::uint64_t size = 0;
    std::uint64_t packedSize = 0;
    /// Where its contents begin in the archive.
    std::uint64_t contentsAt = 0;
    std::uint32_t crc = 0;
    /// Or else stored as it is.
    bool isDeflated = false;
    /// When its contents were changed last, in seconds since 1970; nothing where nobody has said.
    std::optional<std::int64_t> modified = std::nullopt;
};

/// An entry as the archive has it.
struct RawPackageEntry {
    std::string_view name;
    /// The mode of a file system, its type included; 0 when the archive gives none.
    std::uint32_t mode = 0;
    std::uint64_t size = 0;
    std::uint64_t packedSize = 0;
    std::uint64_t contentsAt = 0;
    std::uint32_t crc = 0;
    bool isDeflated = false;
    std::optional<std::int64_t> modified = std::nullopt;
};

/// The order in which a directory comes right before everything in it. Entries of a package are
/// kept and unpacked in it.
[[nodiscard]] bool precedesInTree(std::string_view left, std::string_view right) noexcept;

/// The entry, its name and its kind checked.
[[nodiscard]] Result<PackageEntry> checkedEntry(const RawPackageEntry& raw,
                                                const PackageLimits& limits);

/// Sorts the entries by `precedesInTree` and refuses duplicates and files with something in them.
[[nodiscard]] Status arrangeAsTree(std::vector<PackageEntry>& entries);

/// Refuses entries whose sizes together pass the limits. `packedBytes` is the size of the archive.
[[nodiscard]] Status checkSizes(const std::vector<PackageEntry>& entries, std::uint64_t packedBytes,
                                const PackageLimits& limits);

/// The name of the one bundle directory at the top of the tree, given that nothing but store
/// metadata stands beside it. The entries are arranged as a tree.
[[nodiscard]] Result<std::string> bundleDirectoryOf(const std::vector<PackageEntry>& entries);

/// The entry of that name; null when there is none. The entries are arranged as a tree.
[[nodiscard]] const PackageEntry* findEntry(const std::vector<PackageEntry>& entries,
                                            std::string_view name) noexcept;

}  // namespace appsync
