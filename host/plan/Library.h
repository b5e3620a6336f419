#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "platform/Bytes.h"

namespace appsync {

/// One package of a library.
struct LibraryPackage {
    std::string identifier;
    std::string version;
    std::string name;
    /// The package's file, a path of this machine.
    std::string file;
    /// Bytes of the package itself, which travel.
    std::uint64_t bytes = 0;
    /// Bytes that its files take on the device.
    std::uint64_t unpackedBytes = 0;
};

/// Something in a library that cannot be used, and why.
struct LibraryFault {
    std::string fileName;
    std::string error;
};

/// What a folder of packages holds: one package for each identifier, sorted by it.
struct Library {
    std::string folder;
    std::vector<LibraryPackage> packages;
    std::vector<LibraryFault> faults;
    /// For people: packages that a higher version of the same application has hidden.
    std::vector<std::string> notes;
    /// The contents of IconOrder.plist, when there is a good one.
    std::optional<Bytes> iconOrder;

    /// The package of an identifier; null when there is none.
    [[nodiscard]] const LibraryPackage* find(const std::string& identifier) const;
};

/// Of several packages of one application keeps the one with the highest version (compareVersions),
/// of equal ones the one whose file name sorts first; a note names each that is left out.
/// The result is sorted by identifier.
[[nodiscard]] std::vector<LibraryPackage> keepHighestVersions(std::vector<LibraryPackage> packages,
                                                              std::vector<std::string>& notes);

}  // namespace appsync
