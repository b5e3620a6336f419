#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "platform/Error.h"

namespace appsync {

/// Why a package is refused: the codes of errors of `kInstallerErrorDomain` that packages cause.
/// Failures of the machine (a disk that is full, a file that cannot be opened) are errors of
/// `kPosixErrorDomain` instead.
enum class PackageErrorCode : std::int64_t {
    // The file and the archive.
    NotARegularFile = 1,
    NotAnArchive = 2,
    Inconsistent = 3,
    Encrypted = 4,
    CompressionNotSupported = 5,
    DamagedEntry = 6,
    // Limits.
    TooManyEntries = 10,
    TooLarge = 11,
    CompressionRatio = 12,
    // Entries.
    IllegalName = 20,
    NotAFileOrDirectory = 21,
    DuplicateEntry = 22,
    FileUsedAsDirectory = 23,
    DirectoryWithContents = 24,
    // What is in it.
    NoBundle = 30,
    SeveralBundles = 31,
    UnexpectedTopLevelEntry = 32,
    NoInfoPropertyList = 33,
    DamagedInfoPropertyList = 34,
    IllegalIdentifier = 35,
    IdentifierMismatch = 36,
    IllegalInfoValue = 37,
    NoSuchEntry = 38,
    // The caller.
    Cancelled = 50,
};

/// The error, its sentence being `reason`, which says what is wrong and what to do.
[[nodiscard]] ErrorRecord packageError(PackageErrorCode code, std::string_view reason);

/// The refusal of an entry that is in the package twice.
[[nodiscard]] ErrorRecord duplicateEntry(std::string_view name);

/// Whether the error is the refusal `code` of a package.
[[nodiscard]] bool isPackageError(const ErrorRecord& error, PackageErrorCode code) noexcept;

}  // namespace appsync
