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

    /// The whole name of an entry, in bytes; one component of it; and how many components it has.
    std::size_t nameBytes = 1024;
    std::size_t componentBytes = 255;
    std::size_t components = 32;

    /// Info.plist, and the store metadata.
    std::uint64_t propertyListBytes = std::uint64_t{1} << 20;
    /// "BundleVersion", "BundleDisplayName" and the other texts of Info.plist.
    std::size_t textBytes = 1024;
};

}  // namespace appsync
