#include "device/archive/PackageArchive.h"

#include <algorithm>
#include <utility>

#include "device/archive/PackageArchiveContents.h"
#include "device/archive/PackageArchiveDirectory.h"
#include "device/archive/PackageError.h"
#include "device/values/PackageText.h"

namespace appsync {

namespace {

constexpr std::size_t kReadBytes = std::size_t{64} << 10;

}  // namespace

PackageArchive::PackageArchive(PackageFile file) : file_(std::move(file)) {}

Result<std::unique_ptr<PackageArchive>> PackageArchive::open(PackageFile file,
                                                             const PackageLimits& limits) {
    std::unique_ptr<PackageArchive> archive(new PackageArchive(std::move(file)));
    Status status = archive->listEntries(limits);
    if (status) status = arrangeAsTree(archive->entries_);
    if (status) status = checkSizes(archive->entries_, archive->packedBytes(), limits);
    if (!status) return archive->named(status.error());
    return archive;
}

Status PackageArchive::listEntries(const PackageLimits& limits) {
    const Result<ArchiveDirectory> directory = readArchiveDirectory(file_, limits);
    if (!directory) return directory.error();
    entries_.reserve(directory->entries.size());
    for (const RawPackageEntry& raw : directory->entries) {
        Result<PackageEntry> entry = checkedEntry(raw, limits);
        if (!entry) return entry.error();
        entries_.push_back(*std::move(entry));
    }
    return {};
}

std::uint64_t PackageArchive::unpackedBytes() const noexcept {
    std::uint64_t sum = 0;
    for (const PackageEntry& entry : entries_) sum += entry.size;
    return sum;
}

const PackageEntry* PackageArchive::find(std::string_view entryName) const noexcept {
    return findEntry(entries_, entryName);
}

Status PackageArchive::stream(const PackageEntry& entry, std::span<std::uint8_t> buffer,
                              const std::function<Status(ByteView piece)>& sink) {
    PackageArchiveContents contents(file_, entry);
    while (true) {
        const Result<ByteView> piece = contents.next(buffer);
        if (!piece) return piece.error().withContext("entry " + quotedName(entry.name));
        if (piece->empty()) return {};
        if (Status status = sink(*piece); !status) return status;
    }
}

Result<Bytes> PackageArchive::read(const PackageEntry& entry, std::uint64_t maximumBytes) {
    if (entry.size > maximumBytes) {
        return packageError(PackageErrorCode::TooLarge,
                            "entry " + quotedName(entry.name) + ": it has " +
                                std::to_string(entry.size) + " bytes, at most " +
                                std::to_string(maximumBytes) + " are allowed; make it smaller");
    }
    Bytes contents;
    contents.reserve(entry.size);
    Bytes buffer(std::min<std::uint64_t>(entry.size + 1, kReadBytes));
    Status status = stream(entry, buffer, [&contents](ByteView piece) {
        contents.insert(contents.end(), piece.begin(), piece.end());
        return Status();
    });
    if (!status) return status.error();
    return contents;
}

Status PackageArchive::verify(const std::function<void(std::uint64_t bytes)>& progress) {
    Bytes piece(kReadBytes);
    for (const PackageEntry& entry : entries_) {
        if (entry.isDirectory) continue;
        Status status = stream(entry, piece, [&](ByteView read) {
            if (progress) progress(read.size());
            return Status();
        });
        if (!status) return status;
    }
    return {};
}

ErrorRecord PackageArchive::named(const ErrorRecord& error) const {
    // The system's errors say which file they are about.
    if (error.domain != kInstallerErrorDomain) return error;
    return error.withContext("package " + quotedName(name()));
}

}  // namespace appsync
