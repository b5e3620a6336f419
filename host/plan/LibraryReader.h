#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "host/plan/Library.h"
#include "host/plan/LibraryIndex.h"
#include "host/plan/StepProgress.h"
#include "platform/Result.h"

namespace appsync {

class PropertyListSerialization;
struct PackageInfo;

/// The name of a library's icon layout.
inline constexpr std::string_view kIconOrderFile = "IconOrder.plist";

/// Reads a folder of packages: every "*.zip" directly in it, and IconOrder.plist. Packages and a
/// layout that cannot be used become faults. An error only when the folder itself cannot be read.
/// The steps of the progress are packages. One that the index of the folder knows is not opened.
[[nodiscard]] Result<Library> readLibrary(
    const std::string& folder, PropertyListSerialization& propertyLists,
    const StepProgress& progress = {},
    const LibraryIndexPlace& indexPlace = LibraryIndexPlace::ofUser());

/// The names of the packages in a folder, sorted: every "*.zip" directly in it. An error only when
/// the folder itself cannot be read.
[[nodiscard]] Result<std::vector<std::string>> packageNamesIn(const std::string& folder);

/// One package as a library has it, or why no library can use it. What it says of its contents is
/// taken for true.
[[nodiscard]] Result<LibraryPackage> readPackage(const std::string& file,
                                                 PropertyListSerialization& propertyLists);

/// The same, and reads the contents, in pieces: refuses whatever an install would. Calls `progress`
/// with the size of each piece.
[[nodiscard]] Result<LibraryPackage> readWholePackage(
    const std::string& file, PropertyListSerialization& propertyLists,
    const std::function<void(std::uint64_t bytes)>& progress);

/// The icon layout of a folder of packages; nothing where there is none. An error says why it
/// cannot be used.
[[nodiscard]] Result<std::optional<Bytes>> readIconOrder(const std::string& folder,
                                                         PropertyListSerialization& propertyLists);

/// The file that a session sends for an identifier: the library's package of it, else the file
/// ID.zip (or ID.ZIP), which the device then judges.
[[nodiscard]] Result<std::string> packageFileFor(const Library& library,
                                                 const std::string& identifier);

/// The package in that file, or why the device cannot take it.
[[nodiscard]] Result<LibraryPackage> packageFor(const Library& library,
                                                const std::string& identifier,
                                                PropertyListSerialization& propertyLists);

/// Refuses a file that no device would install as that application. Reads all of it, in pieces.
[[nodiscard]] Status verifyPackage(const std::string& file, const std::string& identifier,
                                   PropertyListSerialization& propertyLists);

/// Bytes that the application of a package takes on a device, unpacked.
[[nodiscard]] std::uint64_t bytesOnDevice(const PackageInfo& info);

}  // namespace appsync
