#include "device/archive/PackageArchiveEnd.h"

#include <algorithm>
#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

#include "device/archive/PackageArchiveFormat.h"
#include "device/archive/PackageError.h"
#include "device/archive/PackageFile.h"
#include "platform/Bytes.h"

namespace appsync {

namespace {

// The end of central directory, "PK\5\6": 22 bytes and a comment of at most 65535.
constexpr std::string_view kEndSignature = "PK\5\6";
constexpr std::size_t kEndBytes = 22;
constexpr std::size_t kLongestComment = 65535;
// Its locator for large archives, right before it, and what that leads to.
constexpr std::uint32_t kLocatorSignature = 0x07064b50;
constexpr std::size_t kLocatorBytes = 20;
constexpr std::uint32_t kLargeEndSignature = 0x06064b50;
constexpr std::size_t kLargeEndBytes = 56;
/// What the large end does not count in its own size.
constexpr std::uint64_t kLargeEndHead = 12;

/// Archivers that write to a pipe fill up their last record with zeros; a record is at most so
/// long.
constexpr std::size_t kLongestPadding = 10240;

/// A package may hold archives of its own, whose ends are seen too. With many, one that is not the
/// end is likely meant to be taken for it by somebody.
constexpr std::size_t kMostEnds = 16;

ErrorRecord endsDisagree() {
    return inconsistentArchive("the two ends for small and for large archives contradict another");
}

ErrorRecord inSeveralParts() {
    return inconsistentArchive("it is one of several parts of an archive");
}

/// Looks through the end of a file for ends of archives.
class EndSearch {
  public:
    EndSearch(const PackageFile& file, const PackageLimits& limits, ByteView tail)
        : file_(file), limits_(limits), tail_(tail) {}

    /// The one whose comment ends where the file ends, but for padding.
    Result<ArchiveDirectoryPlace> run() {
        std::optional<std::size_t> found;
        std::size_t count = 0;
        for (std::size_t at = nextEnd(0); at != kNone; at = nextEnd(at + 1)) {
            if (++count > kMostEnds) return inconsistentArchive("it has too many ends");
            if (!isPaddingFrom(at + kEndBytes + u16(tail_, at + 20))) continue;
            if (found) return inconsistentArchive("it has two ends");
            found = at;
        }
        if (!found) return noEnd();
        return isLarge(*found) ? largePlace(*found) : smallPlace(*found);
    }

  private:
    static constexpr std::size_t kNone = std::string_view::npos;

    /// The first place from there on where an end may begin.
    [[nodiscard]] std::size_t nextEnd(std::size_t from) const {
        const std::string_view tail(reinterpret_cast<const char*>(tail_.data()), tail_.size());
        const std::size_t at = tail.find(kEndSignature, from);
        return at == kNone || tail.size() - at < kEndBytes ? kNone : at;
    }

    [[nodiscard]] std::uint64_t fileOffset(std::size_t at) const {
        return file_.size() - tail_.size() + at;
    }

    [[nodiscard]] bool isPaddingFrom(std::size_t at) const {
        if (at > tail_.size() || tail_.size() - at >= kLongestPadding) return false;
        return std::all_of(tail_.begin() + static_cast<std::ptrdiff_t>(at), tail_.end(),
                           [](std::uint8_t byte) { return byte == 0; });
    }

    [[nodiscard]] bool isLarge(std::size_t at) const {
        return at >= kLocatorBytes && u32(tail_, at - kLocatorBytes) == kLocatorSignature;
    }

    [[nodiscard]] Result<ArchiveDirectoryPlace> smallPlace(std::size_t at) const {
        const ArchiveDirectoryPlace place{.offset = u32(tail_, at + 16),
                                          .size = u32(tail_, at + 12),
                                          .count = u16(tail_, at + 10),
                                          .countIsModulo65536 = true};
        const bool isInParts =
            u16(tail_, at + 4) != 0 || u16(tail_, at + 6) != 0 || u16(tail_, at + 8) != place.count;
        return checked(place, isInParts, fileOffset(at));
    }

    [[nodiscard]] Result<ArchiveDirectoryPlace> largePlace(std::size_t at) const {
        const std::size_t locator = at - kLocatorBytes;
        const std::uint64_t offset = u64(tail_, locator + 8);
        if (offset > file_.size() || file_.size() - offset < kLargeEndBytes) {
            return inconsistentArchive("its end points outside the file");
        }
        const Result<Bytes> end = file_.readExactly(offset, kLargeEndBytes);
        if (!end) return end.error();
        if (u32(*end, 0) != kLargeEndSignature ||
            u64(*end, 4) != fileOffset(locator) - offset - kLargeEndHead) {
            return inconsistentArchive("its end is damaged");
        }
        const ArchiveDirectoryPlace place{
            .offset = u64(*end, 48), .size = u64(*end, 40), .count = u64(*end, 32)};
        const bool isInParts = u32(*end, 16) != 0 || u32(*end, 20) != 0 ||
                               u64(*end, 24) != place.count || u32(tail_, locator + 4) != 0 ||
                               u32(tail_, locator + 16) > 1;
        Result<ArchiveDirectoryPlace> large = checked(place, isInParts, offset);
        if (large && !smallEndAgrees(at, place)) return endsDisagree();
        return large;
    }

    /// Whether the end for small archives, where it says something, says the same.
    [[nodiscard]] bool smallEndAgrees(std::size_t at, const ArchiveDirectoryPlace& place) const {
        const auto agrees = [&](std::size_t field, std::size_t bytes, std::uint64_t value,
                                std::uint64_t elsewhere) {
            const std::uint64_t said = littleEndian(tail_, at + field, bytes);
            return said == value || said == elsewhere;
        };
        return agrees(4, 2, 0, kElsewhere16) && agrees(6, 2, 0, kElsewhere16) &&
               agrees(8, 2, place.count, kElsewhere16) &&
               agrees(10, 2, place.count, kElsewhere16) &&
               agrees(12, 4, place.size, kElsewhere32) && agrees(16, 4, place.offset, kElsewhere32);
    }

    /// What an end says that begins at `end` and so ends the directory.
    [[nodiscard]] Result<ArchiveDirectoryPlace> checked(const ArchiveDirectoryPlace& place,
                                                        bool isInParts, std::uint64_t end) const {
        if (place.count > limits_.entries || place.size > limits_.directoryBytes) {
            return tooManyEntries(limits_);
        }
        if (isInParts) return inSeveralParts();
        if (place.offset > end || place.size > end - place.offset) {
            return inconsistentArchive("its list of entries lies outside the file");
        }
        if (place.size != end - place.offset) {
            return inconsistentArchive("its list of entries does not end where its end begins");
        }
        return place;
    }

    [[nodiscard]] ErrorRecord noEnd() const {
        Bytes head(4);
        const Result<std::size_t> count = file_.readAt(0, head);
        if (count && *count == 4 && head[0] == 'P' && head[1] == 'K') {
            return packageError(
                PackageErrorCode::NotAnArchive,
                "the end of the archive is missing, it was probably cut off; copy it "
                "or make it again");
        }
        return packageError(PackageErrorCode::NotAnArchive,
                            "it is not a zip archive; make one with 'appsync package make'");
    }

    const PackageFile& file_;
    const PackageLimits& limits_;
    const ByteView tail_;
};

}  // namespace

Result<ArchiveDirectoryPlace> findArchiveDirectory(const PackageFile& file,
                                                   const PackageLimits& limits) {
    constexpr std::uint64_t kTailBytes =
        kLongestComment + 1 + kEndBytes + kLocatorBytes + kLongestPadding;
    static_assert(kTailBytes <= PackageFile::kKeptBytes);
    const ByteView end = file.end();
    const std::size_t size = std::min<std::size_t>(end.size(), kTailBytes);
    return EndSearch(file, limits, end.last(size)).run();
}

ErrorRecord tooManyEntries(const PackageLimits& limits) {
    return packageError(PackageErrorCode::TooManyEntries,
                        "it lists more files than a device takes (" +
                            std::to_string(limits.entries) + "); put fewer into it");
}

}  // namespace appsync
