#include "device/package/PackageArchiveEnd.h"

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "device/package/PackageError.h"
#include "device/package/PackageFile.h"
#include "device/values/PackageText.h"
#include "platform/Bytes.h"

namespace appsync {

namespace {

// The end of central directory, "PK\5\6": 22 bytes and a comment of at most 65535.
constexpr std::uint32_t kEndSignature = 0x06054b50;
constexpr std::size_t kEndBytes = 22;
constexpr std::size_t kLongestComment = 65535;
// Its locator for large archives, right before it, and what that leads to.
constexpr std::uint32_t kLocatorSignature = 0x07064b50;
constexpr std::size_t kLocatorBytes = 20;
constexpr std::uint32_t kLargeEndSignature = 0x06064b50;
constexpr std::size_t kLargeEndBytes = 56;
// A header of the central directory.
constexpr std::uint32_t kHeaderSignature = 0x02014b50;
constexpr std::size_t kHeaderBytes = 46;
/// An offset that stands in an extra field instead.
constexpr std::uint32_t kOffsetElsewhere = 0xffffffff;
/// Of the header before the contents of an entry.
constexpr std::uint32_t kLocalHeaderSignature = 0x04034b50;

/// A package may hold archives of its own, whose ends are seen too; each costs libzip some work.
constexpr std::size_t kMostEnds = 16;

std::uint64_t littleEndian(ByteView bytes, std::size_t offset, std::size_t count) noexcept {
    std::uint64_t value = 0;
    for (std::size_t i = count; i > 0; --i) value = value << 8U | bytes[offset + i - 1];
    return value;
}

std::uint16_t u16(ByteView bytes, std::size_t offset) noexcept {
    return static_cast<std::uint16_t>(littleEndian(bytes, offset, 2));
}

std::uint32_t u32(ByteView bytes, std::size_t offset) noexcept {
    return static_cast<std::uint32_t>(littleEndian(bytes, offset, 4));
}

std::uint64_t u64(ByteView bytes, std::size_t offset) noexcept {
    return littleEndian(bytes, offset, 8);
}

ErrorRecord inconsistent(const std::string& what) {
    return packageError(PackageErrorCode::Inconsistent, what + "; copy it or make it again");
}

ErrorRecord tooManyEntries(const PackageLimits& limits) {
    return packageError(PackageErrorCode::TooManyEntries,
                        "it lists more files than a device takes (" +
                            std::to_string(limits.entries) + "); put fewer into it");
}

/// Where the central directory lies, as the end of the archive has it.
struct DirectoryClaim {
    std::uint64_t offset = 0;
    std::uint64_t size = 0;
    std::uint64_t count = 0;
    bool countIsModulo65536 = false;
};

Result<Bytes> readExactly(const PackageFile& file, std::uint64_t offset, std::uint64_t size) {
    Bytes bytes(static_cast<std::size_t>(size));
    Result<std::size_t> count = file.readAt(offset, bytes);
    if (!count) return count.error();
    if (*count < size) return inconsistent("it became shorter while it was read");
    return bytes;
}

/// Looks through the end of a file for ends of archives.
class EndSearch {
  public:
    EndSearch(const PackageFile& file, const PackageLimits& limits, const Bytes& tail)
        : file_(file), limits_(limits), tail_(tail) {}

    /// The one whose comment ends where the file ends.
    Result<DirectoryClaim> run() {
        std::optional<DirectoryClaim> found;
        std::size_t count = 0;
        for (std::size_t at = 0; at + kEndBytes <= tail_.size(); ++at) {
            if (tail_[at] != 'P' || u32(tail_, at) != kEndSignature) continue;
            if (++count > kMostEnds) return inconsistent("it has too many ends");
            const Result<DirectoryClaim> claim = claimAt(at);
            // libzip sets memory aside for what any of them claims.
            if (claim && claim->count > limits_.entries) return tooManyEntries(limits_);
            if (at + kEndBytes + u16(tail_, at + 20) != tail_.size()) continue;
            if (!claim) return claim.error();
            if (found) return inconsistent("it has two ends");
            found = *claim;
        }
        if (!found) return noEnd();
        return *found;
    }

  private:
    [[nodiscard]] Result<DirectoryClaim> claimAt(std::size_t at) const {
        if (isLarge(at)) return largeClaim(at);
        return smallClaim(at);
    }

    [[nodiscard]] bool isLarge(std::size_t at) const {
        return at >= kLocatorBytes && u32(tail_, at - kLocatorBytes) == kLocatorSignature;
    }

    [[nodiscard]] DirectoryClaim smallClaim(std::size_t at) const {
        return {.offset = u32(tail_, at + 16),
                .size = u32(tail_, at + 12),
                .count = u16(tail_, at + 10),
                .countIsModulo65536 = true};
    }

    [[nodiscard]] Result<DirectoryClaim> largeClaim(std::size_t at) const {
        const std::uint64_t offset = u64(tail_, at - kLocatorBytes + 8);
        if (offset > file_.size() || file_.size() - offset < kLargeEndBytes) {
            return inconsistent("its end points outside the file");
        }
        Result<Bytes> end = readExactly(file_, offset, kLargeEndBytes);
        if (!end) return end.error();
        if (u32(*end, 0) != kLargeEndSignature) return inconsistent("its end is damaged");
        return DirectoryClaim{
            .offset = u64(*end, 48), .size = u64(*end, 40), .count = u64(*end, 32)};
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
    const Bytes& tail_;
};

/// A header of the central directory.
struct Header {
    std::string_view name;
    std::uint32_t localOffset = 0;
    std::size_t length = 0;
};

/// The first header of those that are left.
Result<Header> nextHeader(ByteView directory) {
    if (directory.size() < kHeaderBytes || u32(directory, 0) != kHeaderSignature) {
        return inconsistent("its list of entries is damaged");
    }
    const std::size_t nameBytes = u16(directory, 28);
    const std::size_t length = kHeaderBytes + nameBytes + u16(directory, 30) + u16(directory, 32);
    if (length > directory.size()) return inconsistent("its list of entries is cut off");
    const char* name = reinterpret_cast<const char*>(directory.data() + kHeaderBytes);
    return Header{{name, nameBytes}, u32(directory, 42), length};
}

/// libzip compares the two headers of an entry, too, but does not say of which.
Status checkLocalName(const PackageFile& file, const Header& header, Bytes& buffer) {
    if (header.localOffset == kOffsetElsewhere) return {};
    buffer.resize(kLocalHeaderBytes + header.name.size());
    const Result<std::size_t> count = file.readAt(header.localOffset, buffer);
    if (!count) return count.error();
    if (*count < buffer.size() || u32(buffer, 0) != kLocalHeaderSignature) {
        return inconsistent("entry " + quotedName(header.name) + " is not where the list says");
    }
    const char* name = reinterpret_cast<const char*>(buffer.data() + kLocalHeaderBytes);
    if (u16(buffer, 26) == header.name.size() &&
        header.name == std::string_view(name, header.name.size())) {
        return {};
    }
    return inconsistent("entry " + quotedName(header.name) + " has another name in its own header");
}

Status checkDuplicates(std::vector<std::string_view>& names) {
    std::sort(names.begin(), names.end());
    const auto twice = std::adjacent_find(names.begin(), names.end());
    if (twice == names.end()) return {};
    return duplicateEntry(*twice);
}

/// Goes through the central directory header by header.
class DirectoryWalk {
  public:
    DirectoryWalk(const PackageFile& file, const PackageLimits& limits)
        : file_(file), limits_(limits) {}

    Status run(ByteView directory, const DirectoryClaim& claim) {
        while (!directory.empty()) {
            const Result<Header> header = nextHeader(directory);
            if (!header) return header.error();
            if (Status status = visit(*header); !status) return status;
            directory = directory.subspan(header->length);
        }
        if (Status status = checkCount(claim); !status) return status;
        return checkDuplicates(names_);
    }

  private:
    Status visit(const Header& header) {
        if (names_.size() == limits_.entries) return tooManyEntries(limits_);
        names_.push_back(header.name);
        if (header.name.find('\0') != std::string_view::npos) {
            return packageError(PackageErrorCode::IllegalName,
                                "entry " + quotedName(header.name) +
                                    " has a NUL in its name; make the package again");
        }
        return checkLocalName(file_, header, buffer_);
    }

    [[nodiscard]] Status checkCount(const DirectoryClaim& claim) const {
        const std::uint64_t count = names_.size();
        if ((claim.countIsModulo65536 ? count & 0xffffU : count) == claim.count) return {};
        return inconsistent("it says that it has " + std::to_string(claim.count) +
                            " entries and lists " + std::to_string(count));
    }

    const PackageFile& file_;
    const PackageLimits& limits_;
    std::vector<std::string_view> names_;
    Bytes buffer_;
};

Result<DirectoryClaim> findDirectory(const PackageFile& file, const PackageLimits& limits) {
    constexpr std::uint64_t kTailBytes = kLongestComment + 1 + kEndBytes + kLocatorBytes;
    const std::uint64_t size = std::min(file.size(), kTailBytes);
    Result<Bytes> tail = readExactly(file, file.size() - size, size);
    if (!tail) return tail.error();
    return EndSearch(file, limits, *tail).run();
}

}  // namespace

Status checkArchiveEnd(const PackageFile& file, const PackageLimits& limits) {
    Result<DirectoryClaim> claim = findDirectory(file, limits);
    if (!claim) return claim.error();
    if (claim->size > limits.directoryBytes) return tooManyEntries(limits);
    if (claim->offset > file.size() || claim->size > file.size() - claim->offset) {
        return inconsistent("its list of entries lies outside the file");
    }
    Result<Bytes> directory = readExactly(file, claim->offset, claim->size);
    if (!directory) return directory.error();
    return DirectoryWalk(file, limits).run(*directory, *claim);
}

}  // namespace appsync
