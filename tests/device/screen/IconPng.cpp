#include "tests/device/screen/IconPng.h"

#include <cairo.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>

namespace appsync {

namespace {

void putBigEndian(Bytes& bytes, std::size_t offset, std::uint32_t value) {
    for (std::size_t i = 0; i < 4; ++i) {
        bytes[offset + i] = static_cast<std::uint8_t>(value >> (24U - 8U * i));
    }
}

std::uint32_t crcOfChunk(ByteView bytes) {
    std::uint32_t crc = 0xffffffff;
    for (const std::uint8_t byte : bytes) {
        crc ^= byte;
        for (int bit = 0; bit < 8; ++bit) crc = crc >> 1U ^ ((crc & 1U) != 0 ? 0xedb88320U : 0U);
    }
    return ~crc;
}

cairo_status_t readSome(void* closure, unsigned char* data, unsigned int length) {
    auto* rest = static_cast<ByteView*>(closure);
    if (length > rest->size()) return CAIRO_STATUS_READ_ERROR;
    std::copy_n(rest->begin(), length, data);
    *rest = rest->subspan(length);
    return CAIRO_STATUS_SUCCESS;
}

/// Without the limits that hold for icons.
Surface load(ByteView png) {
    Surface surface(::cairo_image_surface_create_from_png_stream(&readSome, &png));
    EXPECT_EQ(::cairo_surface_status(surface.get()), CAIRO_STATUS_SUCCESS);
    return surface;
}

}  // namespace

Bytes pngOf(int width, int height, const Color& color) {
    Result<Surface> surface = makeSurface(width, height);
    const DrawingContext context = drawOn(surface->get());
    setColor(context.get(), color);
    ::cairo_paint(context.get());
    return *encodePng(surface->get());
}

Bytes claimingSize(Bytes png, std::uint32_t width, std::uint32_t height) {
    putBigEndian(png, 16, width);
    putBigEndian(png, 20, height);
    putBigEndian(png, 29, crcOfChunk(ByteView(png).subspan(12, 17)));
    return png;
}

std::uint32_t pixelOf(ByteView png, int x, int y) {
    const Surface surface = load(png);
    const unsigned char* pixels = ::cairo_image_surface_get_data(surface.get());
    if (pixels == nullptr) return 0;
    std::uint32_t pixel = 0;
    std::memcpy(&pixel, pixels + y * ::cairo_image_surface_get_stride(surface.get()) + 4 * x, 4);
    return pixel;
}

std::string sizeOf(ByteView png) {
    const Surface surface = load(png);
    return std::to_string(::cairo_image_surface_get_width(surface.get())) + "x" +
           std::to_string(::cairo_image_surface_get_height(surface.get()));
}

}  // namespace appsync
