#include "device/screen/PngFile.h"

#include <libdeflate.h>

#include <array>
#include <cerrno>
#include <memory>
#include <string_view>

#include "platform/Error.h"

namespace appsync {

namespace {

constexpr std::size_t kPixelBytes = 4;
constexpr std::size_t kFilterBytes = 1;

struct FreeDeflater {
    void operator()(libdeflate_compressor* deflater) const noexcept {
        libdeflate_free_compressor(deflater);
    }
};

/// Nothing where there is no memory for it; else it is never empty.
Bytes deflated(ByteView rows) {
    constexpr int kFastest = 1;
    const std::unique_ptr<libdeflate_compressor, FreeDeflater> deflater(
        libdeflate_alloc_compressor(kFastest));
    if (deflater == nullptr) return {};
    Bytes packed(libdeflate_zlib_compress_bound(deflater.get(), rows.size()));
    packed.resize(libdeflate_zlib_compress(deflater.get(), rows.data(), rows.size(), packed.data(),
                                           packed.size()));
    return packed;
}

void appendNumber(Bytes& file, std::uint32_t value) {
    for (const unsigned int shift : {24U, 16U, 8U, 0U}) {
        file.push_back(static_cast<std::uint8_t>(value >> shift));
    }
}

/// The length of the content, the type and the content, and the sum of these two.
void appendChunk(Bytes& file, std::string_view type, ByteView content) {
    appendNumber(file, static_cast<std::uint32_t>(content.size()));
    const std::size_t summed = file.size();
    file.insert(file.end(), type.begin(), type.end());
    file.insert(file.end(), content.begin(), content.end());
    appendNumber(file, libdeflate_crc32(0, file.data() + summed, file.size() - summed));
}

Bytes imageHead(std::uint32_t width, std::uint32_t height) {
    constexpr std::uint8_t kBitsOfAPart = 8;
    constexpr std::uint8_t kColorsAndAlpha = 6;
    Bytes head;
    appendNumber(head, width);
    appendNumber(head, height);
    head.insert(head.end(), {kBitsOfAPart, kColorsAndAlpha});
    // The one way to compress; the one set of filters; not interlaced.
    head.insert(head.end(), {0, 0, 0});
    return head;
}

}  // namespace

PngRows::PngRows(std::uint32_t width, std::uint32_t height)
    : width_(width), height_(height), rows_(height * (kFilterBytes + width * kPixelBytes)) {}

std::uint8_t* PngRows::row(std::size_t number) noexcept {
    return rows_.data() + number * (kFilterBytes + width_ * kPixelBytes) + kFilterBytes;
}

Result<Bytes> PngRows::file() const {
    constexpr std::string_view kSignature = "\x89PNG\r\n\x1a\n";
    constexpr std::uint8_t kPerceptual = 0;  // how colours that a screen lacks are shown
    const Bytes pixels = deflated(rows_);
    if (pixels.empty()) {
        return ErrorRecord::make(kPosixErrorDomain, ENOMEM, "cannot write the image: no memory");
    }
    Bytes file(kSignature.begin(), kSignature.end());
    appendChunk(file, "IHDR", imageHead(width_, height_));
    appendChunk(file, "sRGB", std::array<std::uint8_t, 1>{kPerceptual});
    appendChunk(file, "IDAT", pixels);
    appendChunk(file, "IEND", {});
    return file;
}

}  // namespace appsync
