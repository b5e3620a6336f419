#pragma once

// device/package: what an application's package and the archive of its data are. `PackageReader`
// (this header) opens, checks and unpacks a package; `writePackage` makes one (PackageWriter.h);
// DataArchive.h has the archives of an application's data, which backups hold. Behind the reader:
// PackageInfo.h (Info.plist) and PackageUnpacker.h (writing the tree).
//
// Includes device/archive, device/values and system/: no database and no device. Called by
// install, screen (the usual name of an icon) and host/. What reads foreign bytes here is fuzzed
// (fuzz/readers/).

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <string_view>

#include "device/archive/PackageLimits.h"
#include "platform/Bytes.h"
#include "platform/PropertyList.h"
#include "platform/Result.h"

namespace appsync {

class PackageArchive;
class PackageFile;
class PropertyListSerialization;
struct RegularFile;

/// A file fills its last block of the device's disk, and a directory takes one.
inline constexpr std::uint64_t kBlockBytes = 4096;

/// What a package says of itself. Every text is valid UTF-8 without control characters.
struct PackageInfo {
    /// "BundleIdentifier": a legal identifier.
    std::string identifier;
    /// "BundleVersion"; "" when there is none.
    std::string version;
    /// "BundleDisplayName", else the name of the bundle directory without ".app".
    std::string displayName;
    /// "BundleExecutable"; "" when there is none.
    std::string executable;
    /// "BundleIconFile", else "Icon.png": a plain file name, which the bundle need not hold.
    std::string iconFile;
    /// "<Name>.app".
    std::string bundleDirectoryName;
    /// The sum of the sizes of all files, unpacked.
    std::uint64_t unpackedBytes = 0;
    /// The size of the package itself.
    std::uint64_t packedBytes = 0;
    /// Files and directories that the package lists.
    std::uint64_t entryCount = 0;
    /// Whether VessikMetadata.plist stands beside the bundle.
    bool hasStoreMetadata = false;
    /// The whole of Info.plist: a map.
    PropertyList info;
};

/// How a package is unpacked.
struct PackageUnpackOptions {
    /// Called with the bytes unpacked so far, and all of them, after every piece (at most 256 KiB)
    /// and once at the end; false stops the unpacking with the error `Cancelled`. May be empty.
    std::function<bool(std::uint64_t done, std::uint64_t total)> progress;

    /// Called for every file after its last byte was written and its CRC was found right, before
    /// its descriptor is closed; whoever wants to sync or start write-back does so here. May be
    /// empty. An error stops the unpacking.
    std::function<Status(int fileDescriptor)> fileWritten;

    /// Files get the modification times that the archive gives.
    bool keepsTimes = false;
};

/// An application package, opened and checked.
///
/// Opening validates everything that can be known without unpacking: the archive's consistency
/// (both headers of each entry, counts, sizes, no encryption), names, kinds, duplicates, the tree
/// they make, `PackageLimits`, the one bundle and its Info.plist. Hostile packages cost bounded
/// memory and time. The refusals are those of PackageErrorCode and name the package, the entry and
/// what to do.
///
/// One thread at a time may use a reader; distinct readers are independent. Memory does not grow
/// with the size of the package or of an entry, only with the number of entries.
class PackageReader {
  public:
    /// Opens the file at a path of this machine. Only a regular file (or a link to one) is opened;
    /// a pipe or a device is refused without waiting on it.
    [[nodiscard]] static Result<PackageReader> open(const std::string& path,
                                                    PropertyListSerialization& propertyLists,
                                                    const PackageLimits& limits = {});

    /// Opens the package that a descriptor refers to. The descriptor stays the caller's and may be
    /// closed or moved at once: the reader keeps a duplicate and reads at offsets of its own.
    /// `name` is what errors call the package.
    [[nodiscard]] static Result<PackageReader> open(int fileDescriptor, std::string_view name,
                                                    PropertyListSerialization& propertyLists,
                                                    const PackageLimits& limits = {});

    /// The same, of an open file that the reader takes over. `name` is what errors call it.
    [[nodiscard]] static Result<PackageReader> open(RegularFile file, std::string_view name,
                                                    PropertyListSerialization& propertyLists,
                                                    const PackageLimits& limits = {});

    PackageReader(PackageReader&& other) noexcept;
    PackageReader& operator=(PackageReader&& other) noexcept;
    ~PackageReader();

    [[nodiscard]] const PackageInfo& info() const noexcept { return info_; }

    /// What tells later whether the unpacked bundle is as it was (BundleSum.h).
    [[nodiscard]] std::uint64_t bundleSum() const;

    /// Refuses the package unless it is of this application.
    [[nodiscard]] Status expectIdentifier(std::string_view identifier) const;

    /// Reads all the contents, in pieces, without unpacking them: refuses what `unpackInto` would.
    /// Calls `progress`, which may be empty, with the size of each piece.
    [[nodiscard]] Status verify(const std::function<void(std::uint64_t bytes)>& progress = {});

    /// The contents of VessikMetadata.plist as they stand in the package (not parsed).
    /// `NoSuchEntry` when there is none.
    [[nodiscard]] Result<Bytes> readStoreMetadata();

    /// The contents of Info.plist as they stand in the package.
    [[nodiscard]] Result<Bytes> readInfoPropertyList();

    /// The contents of a file directly inside the bundle, such as the icon. `NoSuchEntry` when
    /// there is none, `TooLarge` when it holds more than `maximumBytes`.
    [[nodiscard]] Result<Bytes> readBundleFile(std::string_view fileName,
                                               std::uint64_t maximumBytes);

    /// Unpacks everything into a directory, which should be empty: nothing that stands there is
    /// opened or replaced, no link is followed. Files get the modes of the package without setuid,
    /// setgid, sticky and what lets group and others write; the owner can read files, and use
    /// directories. The CRC of every file is checked. Nothing is made durable (see
    /// PackageUnpackOptions::fileWritten). After a failure what was unpacked stays, for the caller
    /// to remove. The descriptor stays the caller's.
    [[nodiscard]] Status unpackInto(int directoryDescriptor,
                                    const PackageUnpackOptions& options = {});

  private:
    PackageReader(std::unique_ptr<PackageArchive> archive, PackageInfo info,
                  const PackageLimits& limits);
    [[nodiscard]] static Result<PackageReader> open(PackageFile file,
                                                    PropertyListSerialization& propertyLists,
                                                    const PackageLimits& limits);
    [[nodiscard]] Result<Bytes> readFile(std::string_view entryName, std::uint64_t maximumBytes);

    std::unique_ptr<PackageArchive> archive_;
    PackageInfo info_;
    PackageLimits limits_;
};

}  // namespace appsync
