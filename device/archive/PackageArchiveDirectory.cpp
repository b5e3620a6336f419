#include "device/archive/PackageArchiveDirectory.h"

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <utility>

#include "device/archive/PackageArchiveEnd.h"
#include "device/archive/PackageArchiveFormat.h"
#include "device/archive/PackageArchiveHeaders.h"
#include "device/archive/PackageError.h"
#include "device/archive/PackageFile.h"
#include "device/values/PackageText.h"

namespace appsync {

namespace {

constexpr std::uint16_t kStored = 0;
constexpr std::uint16_t kDeflated = 8;

std::string entryNamed(std::string_view name) { return "entry " + quotedName(name); }

Status checkContentsClaim(const ArchiveHeader& header) {
    if (header.isEncrypted()) {
        return packageError(PackageErrorCode::Encrypted,
                            "it is encrypted; make the package without a password");
    }
    if (header.method != kStored && header.method != kDeflated) {
        return packageError(PackageErrorCode::CompressionNotSupported,
                            "it is compressed by method " + std::to_string(header.method) +
                                "; use deflate or none");
    }
    // Nobody unpacks nothing, so nobody would notice.
    if (header.size == 0 && header.crc != 0) {
        return packageError(PackageErrorCode::DamagedEntry,
                            "it is empty, which its CRC denies; copy the package or make it again");
    }
    return {};
}

Status checkDuplicates(const std::vector<ArchiveHeader>& headers) {
    std::vector<std::string_view> names;
    names.reserve(headers.size());
    for (const ArchiveHeader& header : headers) names.push_back(header.name);
    std::sort(names.begin(), names.end());
    const auto twice = std::adjacent_find(names.begin(), names.end());
    if (twice == names.end()) return {};
    return duplicateEntry(*twice);
}

/// The headers of the central directory.
Result<std::vector<ArchiveHeader>> parseDirectory(ByteView directory,
                                                  const ArchiveDirectoryPlace& place,
                                                  const PackageLimits& limits) {
    std::vector<ArchiveHeader> headers;
    headers.reserve(std::min(limits.entries, directory.size() / kCentralHeaderBytes));
    while (!directory.empty()) {
        const Result<ArchiveHeader> header = parseCentralHeader(directory);
        if (!header) return header.error();
        if (headers.size() == limits.entries) return tooManyEntries(limits);
        headers.push_back(*header);
        directory = directory.subspan(header->bytes);
        if (header->name.find('\0') == std::string_view::npos) continue;
        return packageError(
            PackageErrorCode::IllegalName,
            entryNamed(header->name) + " has a NUL in its name; make the package again");
    }
    const std::uint64_t count = headers.size();
    if ((place.countIsModulo65536 ? count & 0xffffU : count) != place.count) {
        return inconsistentArchive("it says that it has " + std::to_string(place.count) +
                                   " entries and lists " + std::to_string(count));
    }
    if (Status status = checkDuplicates(headers); !status) return status.error();
    return headers;
}

/// Compares the entries with what stands before the directory, where their contents are.
class ContentsCheck {
  public:
    ContentsCheck(const PackageFile& file, const std::vector<ArchiveHeader>& headers,
                  std::uint64_t end)
        : file_(file), headers_(headers), end_(end) {}

    Result<std::vector<RawPackageEntry>> run() {
        places_.reserve(headers_.size());
        std::vector<RawPackageEntry> entries;
        entries.reserve(headers_.size());
        for (const ArchiveHeader& header : headers_) {
            const Result<Place> place = placeOf(header);
            if (!place) return place.error();
            if (Status claim = checkContentsClaim(header); !claim) {
                return claim.error().withContext(entryNamed(header.effectiveName()));
            }
            places_.push_back(*place);
            entries.push_back({.name = header.effectiveName(),
                               .mode = header.mode,
                               .size = header.size,
                               .packedSize = header.packedSize,
                               .contentsAt = place->contentsAt,
                               .crc = header.crc,
                               .isDeflated = header.method == kDeflated,
                               .modified = header.modified});
        }
        if (Status status = checkGaps(); !status) return status.error();
        return entries;
    }

  private:
    /// What an entry takes of the archive.
    struct Place {
        const ArchiveHeader* header = nullptr;
        std::uint64_t contentsAt = 0;
        bool hasDescriptor = false;

        [[nodiscard]] std::uint64_t begin() const { return header->localOffset; }
        [[nodiscard]] std::uint64_t contentsEnd() const { return contentsAt + header->packedSize; }
    };

    Result<Place> placeOf(const ArchiveHeader& header) {
        const Result<ByteView> bytes = localHeaderBytes(header);
        if (!bytes) return bytes.error();
        const Result<ArchiveHeader> local = parseLocalHeader(*bytes);
        if (!local) return local.error();
        if (const char* contradiction = contradictionOf(*local, header)) {
            return inconsistentArchive(entryNamed(header.name) + " has " + contradiction +
                                       " in its own header");
        }
        const std::uint64_t contentsAt = header.localOffset + local->bytes;
        if (contentsAt > end_ || header.packedSize > end_ - contentsAt) return overlaps(header);
        return Place{&header, contentsAt, local->hasDescriptor()};
    }

    /// In the buffer, until the next call.
    Result<ByteView> localHeaderBytes(const ArchiveHeader& header) {
        // What most have, so that most are read at once.
        constexpr std::size_t kUsualExtraBytes = 96;
        if (header.localOffset > end_) return notThere(header);
        buffer_.resize(kLocalHeaderBytes + header.name.size() + kUsualExtraBytes);
        const Result<std::size_t> count = file_.readAt(header.localOffset, buffer_);
        if (!count) return count.error();
        if (*count < kLocalHeaderBytes || u32(buffer_, 0) != kLocalHeaderSignature) {
            return notThere(header);
        }
        const std::size_t length = localHeaderLength(buffer_);
        if (length > end_ - header.localOffset) return notThere(header);
        if (length > *count) {
            Result<Bytes> whole = file_.readExactly(header.localOffset, length);
            if (!whole) return whole.error();
            buffer_ = *std::move(whole);
        }
        return ByteView(buffer_).first(length);
    }

    /// Refuses bytes before the directory that belong to no entry, or to two.
    Status checkGaps() {
        std::sort(places_.begin(), places_.end(),
                  [](const Place& a, const Place& b) { return a.begin() < b.begin(); });
        const std::uint64_t first = places_.empty() ? end_ : places_.front().begin();
        if (first != 0) return belongToNoEntry(first, "at its beginning");
        for (std::size_t i = 0; i < places_.size(); ++i) {
            const std::uint64_t next = i + 1 < places_.size() ? places_[i + 1].begin() : end_;
            if (Status status = checkEnd(places_[i], next); !status) return status;
        }
        return {};
    }

    /// What stands between the contents of an entry and what comes `next`.
    [[nodiscard]] Status checkEnd(const Place& place, std::uint64_t next) const {
        if (place.contentsEnd() > next) return overlaps(*place.header);
        const std::uint64_t between = next - place.contentsEnd();
        const std::string after = "after entry " + quotedName(place.header->name);
        if (!place.hasDescriptor) {
            return between == 0 ? Status() : Status(belongToNoEntry(between, after));
        }
        if (between > kLongestDescriptor) {
            return belongToNoEntry(between, after);
        }
        std::array<std::uint8_t, kLongestDescriptor> bytes = {};
        const auto descriptor = std::span(bytes).first(static_cast<std::size_t>(between));
        const Result<std::size_t> count = file_.readAt(place.contentsEnd(), descriptor);
        if (!count) return count.error();
        if (*count == between && isDescriptorOf(descriptor, *place.header)) return {};
        return inconsistentArchive(entryNamed(place.header->name) +
                                   " has other sizes or another CRC after its contents");
    }

    static ErrorRecord notThere(const ArchiveHeader& header) {
        return inconsistentArchive(entryNamed(header.name) + " is not where the list says");
    }

    static ErrorRecord overlaps(const ArchiveHeader& header) {
        return inconsistentArchive(entryNamed(header.name) + " overlaps what comes after it");
    }

    static ErrorRecord belongToNoEntry(std::uint64_t bytes, const std::string& where) {
        return inconsistentArchive(std::to_string(bytes) + " bytes " + where +
                                   " belong to no entry");
    }

    const PackageFile& file_;
    const std::vector<ArchiveHeader>& headers_;
    const std::uint64_t end_;
    std::vector<Place> places_;
    Bytes buffer_;
};

}  // namespace

Result<ArchiveDirectory> readArchiveDirectory(const PackageFile& file,
                                              const PackageLimits& limits) {
    const Result<ArchiveDirectoryPlace> place = findArchiveDirectory(file, limits);
    if (!place) return place.error();
    Result<Bytes> bytes = file.readExactly(place->offset, place->size);
    if (!bytes) return bytes.error();
    const Result<std::vector<ArchiveHeader>> headers = parseDirectory(*bytes, *place, limits);
    if (!headers) return headers.error();
    Result<std::vector<RawPackageEntry>> entries =
        ContentsCheck(file, *headers, place->offset).run();
    if (!entries) return entries.error();
    return ArchiveDirectory{*std::move(bytes), *std::move(entries)};
}

}  // namespace appsync
