#pragma once

#include <vector>

#include "device/archive/PackageEntries.h"
#include "device/archive/PackageLimits.h"
#include "platform/Bytes.h"
#include "platform/Result.h"

namespace appsync {

class PackageFile;

/// What an archive lists: entries whose two headers, and the descriptors after their contents,
/// agree, and which with the central directory are all that the archive consists of.
struct ArchiveDirectory {
    /// The names of the entries are views of these.
    Bytes bytes;
    std::vector<RawPackageEntry> entries;
};

/// Reads and checks the directory and the header of every entry. Refuses, with an error that names
/// the entry:
/// - names that hold a NUL, or are there twice, and counts that are not true;
/// - a local header that is not where the directory says, or contradicts it (`contradictionOf`);
/// - a descriptor that is missing or contradicts it;
/// - contents that overlap, and bytes that belong to no entry, where one could be hidden;
/// - encryption, and compression other than deflate.
/// What is compressed is not looked at. Memory is bounded by the limits. Errors do not name the
/// package.
///
/// libzip is not asked, as its consistency check refuses what common archivers write: headers that
/// give some sizes and leave the others to the descriptor, local headers with room for large sizes
/// that the central ones do without. It looks at no descriptor, and lets gaps pass. And two readers
/// of one archive could come to see two archives; what is checked here is what is unpacked.
[[nodiscard]] Result<ArchiveDirectory> readArchiveDirectory(const PackageFile& file,
                                                            const PackageLimits& limits);

}  // namespace appsync
