#include "device/screen/IconCanvas.h"

#include <cairo.h>

#include <algorithm>
#include <array>
#include <bit>
#include <cstddef>
#include <cstring>
#include <numbers>

#include "device/screen/IconDrawing.h"
#include "device/screen/PngFile.h"
#include "device/values/PackageText.h"
#include "platform/Error.h"

#if defined(__SANITIZE_ADDRESS__)
#define APPSYNC_LEAKS_ARE_SOUGHT 1
#elif defined(__has_feature)
#if __has_feature(address_sanitizer)
#define APPSYNC_LEAKS_ARE_SOUGHT 1
#endif
#endif

#ifdef APPSYNC_LEAKS_ARE_SOUGHT
// fontconfig finds what it keeps by offsets instead of pointers, so that LeakSanitizer does not.
// NOLINTNEXTLINE(bugprone-reserved-identifier)
extern "C" const char* __lsan_default_suppressions();
// NOLINTNEXTLINE(bugprone-reserved-identifier)
extern "C" const char* __lsan_default_suppressions() { return "leak:libfontconfig\n"; }
#endif

namespace appsync {

namespace {

/// The radius of an icon's corners, as a share of its side.
constexpr double kCornerShare = 0.225;
constexpr const char* kFontFamily = "DejaVu Sans";

constexpr std::array<std::uint8_t, 8> kPngSignature = {0x89, 'P', 'N', 'G', '\r', '\n', 0x1a, '\n'};
// The signature, and the first chunk's length, type, width and height.
constexpr std::size_t kPngSizeBytes = 24;

ErrorRecord refusal(std::string_view reason) {
    constexpr std::int64_t kInvalidImage = kPosixInvalidArgument;
    return ErrorRecord::make(kPosixErrorDomain, kInvalidImage, reason);
}

ErrorRecord cairoFailure(cairo_status_t status) {
    constexpr std::int64_t kNoMemory = 12;
    return ErrorRecord::make(kPosixErrorDomain,
                             status == CAIRO_STATUS_NO_MEMORY ? kNoMemory : kPosixInvalidArgument,
                             std::string("cannot draw: ") + ::cairo_status_to_string(status));
}

std::uint32_t bigEndian(ByteView bytes) noexcept {
    return static_cast<std::uint32_t>(bytes[0]) << 24U |
           static_cast<std::uint32_t>(bytes[1]) << 16U |
           static_cast<std::uint32_t>(bytes[2]) << 8U | bytes[3];
}

/// Refuses by what the beginning says, before anything is allocated for the image.
Status checkPngClaims(ByteView png) {
    if (png.size() > kMaximumIconFileBytes) return refusal("the image is larger than 16 MiB");
    if (png.size() < kPngSizeBytes ||
        !std::equal(kPngSignature.begin(), kPngSignature.end(), png.begin()) ||
        std::memcmp(png.data() + 12, "IHDR", 4) != 0) {
        return refusal("the image is not a PNG");
    }
    const std::uint32_t width = bigEndian(png.subspan(16, 4));
    const std::uint32_t height = bigEndian(png.subspan(20, 4));
    const bool isTooLong = width > kMaximumIconSide || height > kMaximumIconSide;
    if (width == 0 || height == 0 || isTooLong ||
        std::uint64_t{width} * height > kMaximumIconPixels) {
        return refusal("the image claims " + std::to_string(width) + " x " +
                       std::to_string(height) +
                       " pixels; at most 2048 x 2048 are allowed, or as many with a side of up to "
                       "4096");
    }
    return {};
}

/// Refuses chunks that claim more than there is: for some, memory would be taken as claimed.
Status checkPngChunks(ByteView png) {
    constexpr std::size_t kLengthBytes = 4;
    constexpr std::size_t kFrameBytes = 12;  // the chunk's length, type and sum
    ByteView rest = png.subspan(kPngSignature.size());
    while (rest.size() >= kFrameBytes) {
        const std::size_t length = bigEndian(rest.first(kLengthBytes));
        if (length > rest.size() - kFrameBytes) return refusal("the PNG is damaged or cut off");
        if (std::memcmp(rest.data() + kLengthBytes, "IEND", 4) == 0) return {};
        rest = rest.subspan(kFrameBytes + length);
    }
    return refusal("the PNG is damaged or cut off");
}

cairo_status_t readPng(void* closure, unsigned char* data, unsigned int length) {
    auto* rest = static_cast<ByteView*>(closure);
    if (length > rest->size()) return CAIRO_STATUS_READ_ERROR;
    std::copy_n(rest->begin(), length, data);
    *rest = rest->subspan(length);
    return CAIRO_STATUS_SUCCESS;
}

/// A pixel as PNG has it, in the order of its bytes: its colours not yet multiplied by how opaque
/// it is.
void putStraight(std::uint32_t pixel, std::uint8_t* to) noexcept {
    const std::uint32_t alpha = pixel >> 24U;
    std::uint32_t straight = pixel << 8U | alpha;
    if (alpha != 0 && alpha != 255) {
        const auto color = [&](unsigned int shift) {
            return ((pixel >> shift & 0xffU) * 255U + alpha / 2) / alpha;
        };
        straight = color(16) << 24U | color(8) << 16U | color(0) << 8U | alpha;
    }
    to[0] = static_cast<std::uint8_t>(straight >> 24U);
    to[1] = static_cast<std::uint8_t>(straight >> 16U);
    to[2] = static_cast<std::uint8_t>(straight >> 8U);
    to[3] = static_cast<std::uint8_t>(straight);
}

PngRows rowsOf(cairo_surface_t* surface) {
    const auto width = static_cast<std::uint32_t>(::cairo_image_surface_get_width(surface));
    const auto height = static_cast<std::uint32_t>(::cairo_image_surface_get_height(surface));
    const auto stride = static_cast<std::size_t>(::cairo_image_surface_get_stride(surface));
    const unsigned char* from = ::cairo_image_surface_get_data(surface);
    PngRows rows(width, height);
    for (std::size_t row = 0; row < height; ++row, from += stride) {
        std::uint8_t* to = rows.row(row);
        for (std::size_t column = 0; column < width; ++column, to += sizeof(std::uint32_t)) {
            std::uint32_t pixel = 0;  // cairo's are numbers of 32 bits
            std::memcpy(&pixel, from + column * sizeof pixel, sizeof pixel);
            putStraight(pixel, to);
        }
    }
    return rows;
}

std::uint32_t hashOf(std::string_view text) noexcept {
    std::uint32_t hash = 2166136261U;
    for (const char character : text) {
        hash = (hash ^ static_cast<unsigned char>(character)) * 16777619U;
    }
    return hash;
}

/// A colour of that hue (from 0 to 6), as far from grey as `saturation` and as light as `value`.
Color ofHue(double hue, double saturation, double value) noexcept {
    const auto part = [&](double shift) {
        double place = hue + shift;
        place -= 6.0 * static_cast<double>(static_cast<int>(place / 6.0));
        const double distance = std::clamp(std::min(place, 4.0 - place), 0.0, 1.0);
        return value * (1.0 - saturation * distance);
    };
    return {part(5), part(3), part(1)};
}

std::string initialOf(std::string_view name) {
    std::string initial = drawableText(name);
    initial.resize(utf8SequenceLength(initial));
    if (initial.empty()) return "?";
    if (initial[0] >= 'a' && initial[0] <= 'z') initial[0] = static_cast<char>(initial[0] - 32);
    return initial;
}

void fillWithGradient(cairo_t* context, const IconPlace& place, const Color& top,
                      const Color& bottom) {
    cairo_pattern_t* gradient = ::cairo_pattern_create_linear(0, place.y, 0, place.y + place.side);
    ::cairo_pattern_add_color_stop_rgb(gradient, 0, top.red, top.green, top.blue);
    ::cairo_pattern_add_color_stop_rgb(gradient, 1, bottom.red, bottom.green, bottom.blue);
    ::cairo_set_source(context, gradient);
    ::cairo_pattern_destroy(gradient);
    ::cairo_fill(context);
}

}  // namespace

void SurfaceReleaser::operator()(cairo_surface_t* surface) const noexcept {
    ::cairo_surface_destroy(surface);
}

void ContextReleaser::operator()(cairo_t* context) const noexcept { ::cairo_destroy(context); }

Result<Surface> makeSurface(int width, int height) {
    Surface surface(::cairo_image_surface_create(CAIRO_FORMAT_ARGB32, width, height));
    const cairo_status_t status = ::cairo_surface_status(surface.get());
    if (status != CAIRO_STATUS_SUCCESS) return cairoFailure(status);
    return surface;
}

DrawingContext drawOn(cairo_surface_t* surface) { return DrawingContext(::cairo_create(surface)); }

Result<Surface> decodePng(ByteView png) {
    if (Status status = checkPngClaims(png); !status) return status.error();
    if (Status status = checkPngChunks(png); !status) return status.error();
    ByteView rest = png;
    Surface surface(::cairo_image_surface_create_from_png_stream(&readPng, &rest));
    const cairo_status_t status = ::cairo_surface_status(surface.get());
    if (status == CAIRO_STATUS_NO_MEMORY) return cairoFailure(status);
    if (status != CAIRO_STATUS_SUCCESS) return refusal("the PNG is damaged or cut off");
    return surface;
}

Result<Bytes> encodePng(cairo_surface_t* surface) {
    ::cairo_surface_flush(surface);
    const cairo_status_t status = ::cairo_surface_status(surface);
    if (status != CAIRO_STATUS_SUCCESS) return cairoFailure(status);
    return rowsOf(surface).file();
}

void setColor(cairo_t* context, const Color& color) {
    ::cairo_set_source_rgba(context, color.red, color.green, color.blue, color.alpha);
}

void addIconOutline(cairo_t* context, const IconPlace& place) {
    constexpr double kQuarter = std::numbers::pi / 2;
    const double radius = place.side * kCornerShare;
    const double left = place.x + radius;
    const double top = place.y + radius;
    const double right = place.x + place.side - radius;
    const double bottom = place.y + place.side - radius;
    ::cairo_new_sub_path(context);
    ::cairo_arc(context, right, top, radius, -kQuarter, 0);
    ::cairo_arc(context, right, bottom, radius, 0, kQuarter);
    ::cairo_arc(context, left, bottom, radius, kQuarter, 2 * kQuarter);
    ::cairo_arc(context, left, top, radius, 2 * kQuarter, 3 * kQuarter);
    ::cairo_close_path(context);
}

void drawIcon(cairo_t* context, cairo_surface_t* image, const IconPlace& place) {
    const double width = ::cairo_image_surface_get_width(image);
    const double height = ::cairo_image_surface_get_height(image);
    const double scale = place.side / std::min(width, height);
    ::cairo_save(context);
    addIconOutline(context, place);
    ::cairo_translate(context, place.x + (place.side - width * scale) / 2,
                      place.y + (place.side - height * scale) / 2);
    ::cairo_scale(context, scale, scale);
    ::cairo_set_source_surface(context, image, 0, 0);
    ::cairo_pattern_set_filter(::cairo_get_source(context), CAIRO_FILTER_GOOD);
    // Else the edges blend with what lies outside the image: nothing.
    ::cairo_pattern_set_extend(::cairo_get_source(context), CAIRO_EXTEND_PAD);
    ::cairo_fill(context);
    ::cairo_restore(context);
}

void drawLetterIcon(cairo_t* context, std::string_view identifier, std::string_view name,
                    const IconPlace& place) {
    const double hue = hashOf(identifier) % 360 / 60.0;
    addIconOutline(context, place);
    fillWithGradient(context, place, ofHue(hue, 0.45, 0.92), ofHue(hue, 0.70, 0.66));
    const std::string initial = initialOf(name.empty() ? identifier : name);
    selectFont(context, place.side * 0.5, TextWeight::Bold);
    setColor(context, {1, 1, 1, 0.95});
    showCentered(context, initial, place.x + place.side / 2, place.y + place.side * 0.68);
}

std::string drawableText(std::string_view text) {
    std::string drawable;
    while (!text.empty()) {
        const std::size_t length = utf8SequenceLength(text);
        if (length == 0) {
            drawable += "\xef\xbf\xbd";  // the replacement character
        } else if (!isControlCharacter(static_cast<unsigned char>(text[0]))) {
            drawable += text.substr(0, length);
        }
        text.remove_prefix(std::max<std::size_t>(length, 1));
    }
    return drawable;
}

void selectFont(cairo_t* context, double size, TextWeight weight) {
    ::cairo_select_font_face(
        context, kFontFamily, CAIRO_FONT_SLANT_NORMAL,
        weight == TextWeight::Bold ? CAIRO_FONT_WEIGHT_BOLD : CAIRO_FONT_WEIGHT_NORMAL);
    ::cairo_set_font_size(context, size);
}

void showCentered(cairo_t* context, const std::string& text, double x, double y) {
    cairo_text_extents_t extents = {};
    ::cairo_text_extents(context, text.c_str(), &extents);
    ::cairo_move_to(context, x - extents.width / 2 - extents.x_bearing, y);
    ::cairo_show_text(context, text.c_str());
}

double textWidth(cairo_t* context, const std::string& text) {
    cairo_text_extents_t extents = {};
    ::cairo_text_extents(context, text.c_str(), &extents);
    return extents.width;
}

}  // namespace appsync
