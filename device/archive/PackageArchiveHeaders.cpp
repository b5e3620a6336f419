#include "device/archive/PackageArchiveHeaders.h"

#include <zlib.h>

#include <algorithm>
#include <array>
#include <optional>
#include <span>
#include <string>

#include "device/archive/PackageArchiveFormat.h"
#include "device/values/PackageText.h"

namespace appsync {

namespace {

// Flags.
constexpr std::uint16_t kEncrypted = 1U << 0U;
constexpr std::uint16_t kDescriptor = 1U << 3U;
constexpr std::uint16_t kStronglyEncrypted = 1U << 6U;
constexpr std::uint16_t kMasked = 1U << 13U;
/// The method that says that an extra field has the method, and how it is encrypted.
constexpr std::uint16_t kMethodOfEncrypted = 99;

constexpr std::uint16_t kLargeNumbers = 0x0001;
constexpr std::uint16_t kUnicodeName = 0x7075;

constexpr std::uint32_t kDescriptorSignature = 0x08074b50;

std::string_view textOf(ByteView bytes) noexcept {
    return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

/// The extra fields that change or add to what a header says.
struct ExtraFields {
    std::optional<ByteView> largeNumbers;
    std::optional<ByteView> unicodeName;
    std::optional<std::int64_t> modified;
};

/// Nothing when the field tells of other times only.
std::optional<std::int64_t> modificationTimeOf(ByteView field) noexcept {
    if (field.size() < kTimesFieldBytes || (field[0] & kHasModificationTime) == 0) return {};
    return static_cast<std::int32_t>(u32(field, 1));
}

/// Nothing when they are cut off, or have something twice.
std::optional<ExtraFields> parseExtraFields(ByteView bytes) noexcept {
    ExtraFields fields;
    while (bytes.size() >= kExtraFieldHead) {
        const std::uint16_t kind = u16(bytes, 0);
        const std::size_t length = u16(bytes, 2);
        bytes = bytes.subspan(kExtraFieldHead);
        if (length > bytes.size()) return std::nullopt;
        if (kind == kLargeNumbers || kind == kUnicodeName) {
            auto& field = kind == kLargeNumbers ? fields.largeNumbers : fields.unicodeName;
            if (field) return std::nullopt;
            field = bytes.first(length);
        }
        if (kind == kTimesField && !fields.modified) {
            fields.modified = modificationTimeOf(bytes.first(length));
        }
        bytes = bytes.subspan(length);
    }
    // Archivers that align contents fill up with zeros.
    const bool isPadding = std::all_of(bytes.begin(), bytes.end(), [](auto b) { return b == 0; });
    return isPadding ? std::optional(fields) : std::nullopt;
}

/// The name of the extra field; empty when it is for another name than this.
std::string_view unicodeNameFor(std::string_view name, ByteView field) noexcept {
    constexpr std::size_t kHead = 5;
    if (field.size() < kHead || field[0] != 1) return {};
    const auto* bytes = reinterpret_cast<const Bytef*>(name.data());
    if (::crc32_z(0, bytes, name.size()) != u32(field, 1)) return {};
    return textOf(field.subspan(kHead));
}

/// A number of a header that may stand in the extra field for large ones instead.
struct LargeNumber {
    std::uint64_t* value;
    std::uint64_t elsewhere;
    std::size_t bytes;

    [[nodiscard]] bool isElsewhere() const noexcept { return *value == elsewhere; }
};

/// Takes the numbers that stand in the field. It has those that the header lacks; or more, from the
/// first on, which then must not contradict the header.
bool takeLargeNumbers(std::span<const LargeNumber> numbers, ByteView field) noexcept {
    std::size_t lacking = 0;
    for (const LargeNumber& number : numbers) lacking += number.isElsewhere() ? number.bytes : 0;
    const bool hasOnlyLacking = field.size() == lacking;
    for (const LargeNumber& number : numbers) {
        const bool isElsewhere = number.isElsewhere();
        if (field.empty() || (hasOnlyLacking && !isElsewhere)) {
            if (isElsewhere) return false;
            continue;
        }
        if (field.size() < number.bytes) return false;
        const std::uint64_t value = littleEndian(field, 0, number.bytes);
        if (!isElsewhere && *number.value != value) return false;
        *number.value = value;
        field = field.subspan(number.bytes);
    }
    return field.empty();
}

bool takeExtraFields(ArchiveHeader& header, ByteView extra, std::span<const LargeNumber> numbers) {
    const std::optional<ExtraFields> fields = parseExtraFields(extra);
    if (!fields) return false;
    if (fields->unicodeName) {
        header.unicodeName = unicodeNameFor(header.name, *fields->unicodeName);
    }
    header.modified = fields->modified;
    return takeLargeNumbers(numbers, fields->largeNumbers.value_or(ByteView()));
}

/// What both headers have, from the flags on.
void takeShared(ArchiveHeader& header, ByteView bytes) noexcept {
    header.flags = u16(bytes, 0);
    header.method = u16(bytes, 2);
    header.time = u32(bytes, 4);
    header.crc = u32(bytes, 8);
    header.packedSize = u32(bytes, 12);
    header.size = u32(bytes, 16);
}

ErrorRecord damagedExtraFields(std::string_view name) {
    return inconsistentArchive("entry " + quotedName(name) + " has damaged extra fields");
}

}  // namespace

bool ArchiveHeader::isEncrypted() const noexcept {
    return (flags & (kEncrypted | kStronglyEncrypted | kMasked)) != 0 ||
           method == kMethodOfEncrypted;
}

bool ArchiveHeader::hasDescriptor() const noexcept { return (flags & kDescriptor) != 0; }

Result<ArchiveHeader> parseCentralHeader(ByteView directory) {
    if (directory.size() < kCentralHeaderBytes || u32(directory, 0) != kCentralHeaderSignature) {
        return inconsistentArchive("its list of entries is damaged");
    }
    const std::size_t nameBytes = u16(directory, 28);
    const std::size_t extraBytes = u16(directory, 30);
    ArchiveHeader header;
    header.bytes = kCentralHeaderBytes + nameBytes + extraBytes + u16(directory, 32);
    if (header.bytes > directory.size()) {
        return inconsistentArchive("its list of entries is cut off");
    }
    header.name = textOf(directory.subspan(kCentralHeaderBytes, nameBytes));
    takeShared(header, directory.subspan(8));
    header.mode = u32(directory, 38) >> 16U;
    header.localOffset = u32(directory, 42);
    std::uint64_t part = u16(directory, 34);
    const std::array numbers = {LargeNumber{&header.size, kElsewhere32, 8},
                                LargeNumber{&header.packedSize, kElsewhere32, 8},
                                LargeNumber{&header.localOffset, kElsewhere32, 8},
                                LargeNumber{&part, kElsewhere16, 4}};
    const ByteView extra = directory.subspan(kCentralHeaderBytes + nameBytes, extraBytes);
    if (!takeExtraFields(header, extra, numbers)) return damagedExtraFields(header.name);
    if (part != 0) {
        return inconsistentArchive("entry " + quotedName(header.name) + " is in another part");
    }
    return header;
}

std::size_t localHeaderLength(ByteView begin) noexcept {
    return kLocalHeaderBytes + u16(begin, 26) + u16(begin, 28);
}

Result<ArchiveHeader> parseLocalHeader(ByteView bytes) {
    const std::size_t nameBytes = u16(bytes, 26);
    ArchiveHeader header;
    header.bytes = localHeaderLength(bytes);
    header.name = textOf(bytes.subspan(kLocalHeaderBytes, nameBytes));
    takeShared(header, bytes.subspan(6));
    const std::array numbers = {LargeNumber{&header.size, kElsewhere32, 8},
                                LargeNumber{&header.packedSize, kElsewhere32, 8}};
    const ByteView extra = bytes.subspan(kLocalHeaderBytes + nameBytes, u16(bytes, 28));
    if (!takeExtraFields(header, extra, numbers)) return damagedExtraFields(header.name);
    return header;
}

const char* contradictionOf(const ArchiveHeader& local, const ArchiveHeader& central) noexcept {
    const auto contradicts = [&](std::uint64_t said, std::uint64_t truth) {
        return said != truth && !(said == 0 && local.hasDescriptor());
    };
    if (local.name != central.name) return "another name";
    if (!local.unicodeName.empty() && local.unicodeName != central.effectiveName()) {
        return "another name";
    }
    if (local.isEncrypted() != central.isEncrypted()) return "another encryption";
    if (local.method != central.method) return "another compression";
    if (local.time != central.time) return "another time";
    if (contradicts(local.crc, central.crc)) return "another CRC";
    if (contradicts(local.packedSize, central.packedSize)) return "another packed size";
    if (contradicts(local.size, central.size)) return "another size";
    return nullptr;
}

bool isDescriptorOf(ByteView bytes, const ArchiveHeader& central) noexcept {
    constexpr std::size_t kSmall = 12;
    constexpr std::size_t kLarge = 20;
    if (bytes.size() == kSmall + 4 || bytes.size() == kLarge + 4) {
        if (u32(bytes, 0) != kDescriptorSignature) return false;
        bytes = bytes.subspan(4);
    }
    if (bytes.size() != kSmall && bytes.size() != kLarge) return false;
    const std::size_t width = (bytes.size() - 4) / 2;
    return u32(bytes, 0) == central.crc && littleEndian(bytes, 4, width) == central.packedSize &&
           littleEndian(bytes, 4 + width, width) == central.size;
}

}  // namespace appsync
