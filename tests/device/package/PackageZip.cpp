#include "tests/device/package/PackageZip.h"

#include <cstddef>

namespace appsync {

namespace {

constexpr std::uint16_t kUnixVersion = 3U << 8U | 20U;
constexpr std::uint16_t kDeflate = 8;

void put(std::string& bytes, std::uint64_t value, std::size_t count) {
    for (std::size_t i = 0; i < count; ++i) bytes += static_cast<char>(value >> (8U * i) & 0xffU);
}

std::uint32_t crcOfText(std::string_view bytes) {
    std::uint32_t crc = 0xffffffff;
    for (const char character : bytes) {
        crc ^= static_cast<unsigned char>(character);
        for (int bit = 0; bit < 8; ++bit) crc = crc >> 1U ^ ((crc & 1U) != 0 ? 0xedb88320U : 0U);
    }
    return ~crc;
}

/// Writes bits as deflate has them: from the lowest of each byte up.
class BitWriter {
  public:
    void value(std::uint32_t bits, int count) {
        for (int i = 0; i < count; ++i) bit((bits >> i & 1U) != 0);
    }
    /// A Huffman code stands the other way round.
    void code(std::uint32_t bits, int count) {
        for (int i = count - 1; i >= 0; --i) bit((bits >> i & 1U) != 0);
    }
    std::string finish() {
        while (used_ != 0) bit(false);
        return bytes_;
    }

  private:
    void bit(bool set) {
        if (used_ == 0) bytes_ += '\0';
        if (set) bytes_.back() = static_cast<char>(bytes_.back() | 1 << used_);
        used_ = (used_ + 1) % 8;
    }

    std::string bytes_;
    int used_ = 0;
};

/// Zeros (at least one) in one block of fixed codes: a literal, then copies of what came right
/// before.
std::string deflatedZeros(std::uint32_t size) {
    BitWriter bits;
    bits.value(1, 1);
    bits.value(1, 2);
    do {
        bits.code(0x30, 8);
        --size;
    } while (size % 258 != 0);
    for (; size > 0; size -= 258) {
        bits.code(0xc5, 8);
        bits.code(0, 5);
    }
    bits.code(0, 7);
    return bits.finish();
}

std::string extraOf(const ZipEntry& entry) {
    std::string extra;
    if (!entry.unicodeName) return extra;
    put(extra, 0x7075, 2);
    put(extra, 5 + entry.unicodeName->size(), 2);
    put(extra, 1, 1);
    put(extra, crcOfText(entry.name), 4);
    return extra + *entry.unicodeName;
}

/// What the two headers say each for itself.
struct Claims {
    std::uint16_t method = 0;
    std::uint32_t crc = 0;
    std::uint64_t packedSize = 0;
    std::uint32_t size = 0;
};

void putShared(std::string& header, std::uint16_t flags, const Claims& claims, std::size_t nameSize,
               std::size_t extraSize) {
    put(header, 20, 2);
    put(header, flags, 2);
    put(header, claims.method, 2);
    put(header, 0, 2);
    put(header, 0x21, 2);
    put(header, claims.crc, 4);
    put(header, claims.packedSize, 4);
    put(header, claims.size, 4);
    put(header, nameSize, 2);
    put(header, extraSize, 2);
}

std::uint32_t crcClaim(const ZipEntry& entry) {
    return entry.crc.value_or(crcOfText(entry.contents));
}

std::string localHeader(const ZipEntry& entry, std::size_t packedSize, std::uint32_t size) {
    const std::string& name = entry.localName ? *entry.localName : entry.name;
    const std::string extra = extraOf(entry) + entry.localExtra;
    const Claims claims = {.method = entry.localMethod.value_or(entry.method),
                           .crc = entry.localCrc.value_or(crcClaim(entry)),
                           .packedSize = entry.localPackedSize.value_or(packedSize),
                           .size = entry.localSize.value_or(size)};
    std::string header = "PK\3\4";
    putShared(header, entry.flags, claims, name.size(), extra.size());
    return header + name + extra;
}

std::string centralHeader(const ZipEntry& entry, std::size_t packedSize, std::uint32_t size,
                          std::uint32_t offset) {
    const std::string extra = extraOf(entry) + entry.centralExtra;
    const Claims claims = {.method = entry.method,
                           .crc = crcClaim(entry),
                           .packedSize = entry.centralPackedSize.value_or(packedSize),
                           .size = entry.centralSize.value_or(size)};
    std::string header = "PK\1\2";
    put(header, kUnixVersion, 2);
    putShared(header, entry.flags, claims, entry.name.size(), extra.size());
    put(header, 0, 2 + 2 + 2);
    put(header, entry.mode << 16U, 4);
    put(header, offset, 4);
    return header + entry.name + extra;
}

}  // namespace

ZipEntry zipFile(std::string_view name, std::string_view contents) {
    return {.name = std::string(name), .contents = std::string(contents)};
}

ZipEntry zipDirectory(std::string_view name) { return zipOfMode(name, S_IFDIR | 0755); }

ZipEntry zipOfMode(std::string_view name, std::uint32_t mode) {
    return {.name = std::string(name), .contents = "", .mode = mode};
}

ZipEntry zipZeros(std::string_view name, std::uint32_t size) {
    ZipEntry entry = zipFile(name, std::string(size, '\0'));
    entry.packed = deflatedZeros(size);
    entry.method = kDeflate;
    return entry;
}

ZipEntry zipStreamed(ZipEntry entry, ZipDescriptorForm form) {
    constexpr std::uint16_t kHasDescriptor = 8;
    entry.flags = kHasDescriptor;
    entry.localCrc = entry.localPackedSize = entry.localSize = 0;
    const std::size_t width = form.isLarge ? 8 : 4;
    entry.descriptor = form.hasSignature ? "PK\7\10" : "";
    put(entry.descriptor, crcOfText(entry.contents), 4);
    put(entry.descriptor, entry.packed.value_or(entry.contents).size(), width);
    put(entry.descriptor, entry.contents.size(), width);
    return entry;
}

std::string zipLargeSizes(const std::vector<std::uint64_t>& sizes) {
    std::string extra;
    put(extra, 1, 2);
    put(extra, 8 * sizes.size(), 2);
    for (const std::uint64_t size : sizes) put(extra, size, 8);
    return extra;
}

ZipBuilder& ZipBuilder::add(const ZipEntry& entry) {
    const std::string& packed = entry.packed ? *entry.packed : entry.contents;
    const std::uint32_t size =
        entry.size.value_or(static_cast<std::uint32_t>(entry.contents.size()));
    if (!entry.overlapsLast) {
        lastOffset_ = static_cast<std::uint32_t>(files_.size());
        files_ += localHeader(entry, packed.size(), size) + packed + entry.descriptor;
    }
    if (entry.isHidden) return *this;
    directory_ += centralHeader(entry, packed.size(), size, lastOffset_);
    ++count_;
    return *this;
}

ZipBuilder& ZipBuilder::add(const std::vector<ZipEntry>& entries) {
    for (const ZipEntry& entry : entries) add(entry);
    return *this;
}

ZipBuilder& ZipBuilder::claimCount(std::uint16_t count) {
    claimedCount_ = count;
    return *this;
}

ZipBuilder& ZipBuilder::claimExtraDirectoryBytes(std::uint32_t bytes) {
    extraDirectoryBytes_ = bytes;
    return *this;
}

ZipBuilder& ZipBuilder::gap(std::string_view bytes) {
    files_ += bytes;
    return *this;
}

ZipBuilder& ZipBuilder::comment(std::string_view text) {
    comment_ = text;
    return *this;
}

ZipBuilder& ZipBuilder::largeEnd(std::uint64_t count) {
    largeCount_ = count;
    return *this;
}

std::string ZipBuilder::largeEndBytes(std::uint64_t count) const {
    std::string end = "PK\6\6";
    put(end, 44, 8);
    put(end, 45, 2);
    put(end, 45, 2);
    put(end, 0, 8);
    put(end, count, 8);
    put(end, count, 8);
    put(end, directory_.size(), 8);
    put(end, files_.size(), 8);
    end += "PK\6\7";
    put(end, 0, 4);
    put(end, files_.size() + directory_.size(), 8);
    put(end, 1, 4);
    return end;
}

std::string ZipBuilder::bytes() const {
    const std::uint32_t elsewhere = largeCount_ ? 0xffffffffU : 0U;
    const std::uint64_t count = claimedCount_.value_or(count_) | elsewhere;
    std::string end = largeCount_ ? largeEndBytes(*largeCount_) : std::string();
    end += "PK\5\6";
    put(end, 0, 4);
    put(end, count, 2);
    put(end, count, 2);
    put(end, (directory_.size() + extraDirectoryBytes_) | elsewhere, 4);
    put(end, files_.size() | elsewhere, 4);
    put(end, comment_.size(), 2);
    return files_ + directory_ + end + comment_;
}

}  // namespace appsync
