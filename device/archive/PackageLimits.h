#pragma once

#include <cstddef>
#include <cstdint>

namespace appsync {

/// What a package may claim at most. Everything here is checked before the first byte is unpacked.
struct PackageLimits {
    std::uint64_t entries = 100'000;
    std::uint64_t unpackedBytes = std::uint64_t{16} << 30;
    /// The central directory of the archive.
    std::uint64_t directoryBytes = std::uint64_t{24} << 20;

    /// Packages that unpack to more than `ratioFreeBytes` may not exceed `ratio` bytes unpacked for
    /// each byte packed. Small packages may compress as well as they like.
    std::uint64_t ratioFreeBytes = std::uint64_t{16} << 20;
    std::uint64_t ratio = 200;

    /// The whole name of an entry, in bytes, and one component of it. How deep it lies is bounded
    /// by that alone: 512 components of one letter each. What stands on the device under such a
    /// name has a path well below the 4096 bytes that the system takes.
    std::size_t nameBytes = 1024;
    std::size_t componentBytes = 255;

    /// Info.plist, and the store metadata.
    std::uint64_t propertyListBytes = std::uint64_t{1} << 20;
    /// "BundleVersion", "BundleDisplayName" and the other texts of Info.plist.
    std::size_t textBytes = 1024;
};

}  // namespace appsync
