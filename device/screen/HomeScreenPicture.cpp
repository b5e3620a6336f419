#include "device/screen/HomeScreenPicture.h"

#include <cairo.h>

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <numbers>
#include <string_view>

#include "device/screen/IconCanvas.h"
#include "device/values/PackageText.h"

namespace appsync {

namespace {

constexpr double kIcon = 120;
constexpr double kCellWidth = 152;
constexpr double kCellHeight = 178;
constexpr double kSideMargin = 26;
constexpr double kStatusBar = 54;
constexpr double kTopMargin = 30;
constexpr double kBottomMargin = 60;
constexpr double kLeastHeight = 1136;
constexpr double kNameSize = 18;
constexpr double kNameBaseline = kIcon + 27;
constexpr double kNameWidth = kCellWidth - 12;

/// More rows than this, and there are more columns.
constexpr std::size_t kColumns = 4;
constexpr std::size_t kUsualRows = 7;
/// A larger picture is drawn smaller: this bounds the memory, also for a device full of icons.
constexpr double kMostPixels = 8e6;
constexpr double kLongestSide = 16'000;

constexpr Color kWhite = {1, 1, 1};
constexpr Color kNameShadow = {0, 0, 0, 0.45};
/// No name that fits is longer.
constexpr std::size_t kLongestName = 128;

/// Where the icons go, in pixels of a picture that is not scaled.
struct Layout {
    std::size_t columns = kColumns;
    double width = 0;
    double height = 0;
    double scale = 1;

    [[nodiscard]] IconPlace place(std::size_t index) const {
        const std::size_t column = index % columns;
        const std::size_t row = index / columns;
        const double left = kSideMargin + static_cast<double>(column) * kCellWidth;
        const double top = kStatusBar + kTopMargin + static_cast<double>(row) * kCellHeight;
        return {left + (kCellWidth - kIcon) / 2, top, kIcon};
    }
};

Layout layOut(std::size_t count) {
    Layout layout;
    if (count > kColumns * kUsualRows) {
        const double ratio = static_cast<double>(kUsualRows) / static_cast<double>(kColumns);
        const double columns = std::ceil(std::sqrt(static_cast<double>(count) / ratio));
        layout.columns = std::max(kColumns, static_cast<std::size_t>(columns));
    }
    const std::size_t rows = (count + layout.columns - 1) / layout.columns;
    layout.width = 2 * kSideMargin + static_cast<double>(layout.columns) * kCellWidth;
    layout.height = std::max(kLeastHeight, kStatusBar + kTopMargin + kBottomMargin +
                                               static_cast<double>(rows) * kCellHeight);
    const double byPixels = std::sqrt(kMostPixels / (layout.width * layout.height));
    layout.scale = std::min({1.0, byPixels, kLongestSide / layout.height});
    return layout;
}

/// A light in the wallpaper.
struct Glow {
    double x = 0;
    double y = 0;
    double radius = 0;
    Color color;
};

void paint(cairo_t* context, cairo_pattern_t* pattern) {
    ::cairo_set_source(context, pattern);
    ::cairo_pattern_destroy(pattern);
    ::cairo_paint(context);
}

void paintGlow(cairo_t* context, const Layout& layout, const Glow& glow) {
    const double x = glow.x * layout.width;
    const double y = glow.y * layout.height;
    cairo_pattern_t* light =
        ::cairo_pattern_create_radial(x, y, 0, x, y, glow.radius * layout.height);
    const Color& color = glow.color;
    ::cairo_pattern_add_color_stop_rgba(light, 0, color.red, color.green, color.blue, color.alpha);
    ::cairo_pattern_add_color_stop_rgba(light, 1, color.red, color.green, color.blue, 0);
    paint(context, light);
}

void paintWallpaper(cairo_t* context, const Layout& layout) {
    cairo_pattern_t* sky = ::cairo_pattern_create_linear(0, 0, layout.width / 3, layout.height);
    ::cairo_pattern_add_color_stop_rgb(sky, 0.0, 0.07, 0.11, 0.30);
    ::cairo_pattern_add_color_stop_rgb(sky, 0.5, 0.24, 0.18, 0.46);
    ::cairo_pattern_add_color_stop_rgb(sky, 1.0, 0.62, 0.31, 0.44);
    paint(context, sky);
    paintGlow(context, layout, {0.95, 0.05, 0.50, {0.20, 0.55, 0.85, 0.45}});
    paintGlow(context, layout, {0.05, 0.55, 0.45, {0.45, 0.25, 0.75, 0.40}});
    paintGlow(context, layout, {0.80, 1.00, 0.55, {1.00, 0.62, 0.42, 0.55}});
}

void drawSignal(cairo_t* context, double x, double baseline) {
    for (int bar = 0; bar < 4; ++bar) {
        const double height = 6 + 4 * bar;
        ::cairo_rectangle(context, x + 9 * bar, baseline - height, 6, height);
    }
    ::cairo_fill(context);
}

void drawBattery(cairo_t* context, double right, double baseline) {
    ::cairo_set_line_width(context, 2);
    ::cairo_rectangle(context, right - 38, baseline - 17, 33, 16);
    ::cairo_stroke(context);
    ::cairo_rectangle(context, right - 35, baseline - 14, 22, 10);
    ::cairo_rectangle(context, right - 3, baseline - 12, 3, 6);
    ::cairo_fill(context);
}

/// The text, or as much of it as fits with an ellipsis.
std::string elided(cairo_t* context, std::string_view text, double width) {
    std::string whole = drawableText(utf8Prefix(text, kLongestName));
    if (text.size() <= kLongestName && textWidth(context, whole) <= width) return whole;
    std::string_view kept = whole;
    while (!kept.empty()) {
        kept = utf8Prefix(kept, kept.size() - 1);
        while (kept.ends_with(' ')) kept.remove_suffix(1);
        std::string cut = std::string(kept) + "\u2026";
        if (textWidth(context, cut) <= width) return cut;
    }
    return {};
}

void drawStatusBar(cairo_t* context, const Layout& layout, const std::string& title) {
    const double baseline = kStatusBar - 18;
    setColor(context, {1, 1, 1, 0.92});
    drawSignal(context, kSideMargin, baseline);
    drawBattery(context, layout.width - kSideMargin, baseline);
    selectFont(context, 20, TextWeight::Bold);
    const std::string shown = elided(context, title, layout.width - 2 * kSideMargin - 160);
    showCentered(context, shown, layout.width / 2, baseline);
}

/// A soft edge below the icon.
void drawShadow(cairo_t* context, const IconPlace& place) {
    for (int step = 3; step > 0; --step) {
        addIconOutline(context, {place.x - step, place.y - step + 4, place.side + 2.0 * step});
        setColor(context, {0, 0, 0, 0.07});
        ::cairo_fill(context);
    }
}

void drawImage(cairo_t* context, const HomeScreenItem& item, const IconPlace& place) {
    if (!item.icon.empty()) {
        const Result<Surface> image = decodePng(item.icon);
        if (image) return drawIcon(context, image->get(), place);
    }
    drawLetterIcon(context, item.identifier, item.name, place);
}

void drawProgress(cairo_t* context, const IconPlace& place, double progress) {
    constexpr double kStart = -std::numbers::pi / 2;
    const double share = std::isfinite(progress) ? std::clamp(progress, 0.0, 1.0) : 0.0;
    const double x = place.x + place.side / 2;
    const double y = place.y + place.side / 2;
    const double radius = place.side * 0.29;
    ::cairo_new_path(context);
    ::cairo_set_line_width(context, place.side * 0.06);
    ::cairo_set_line_cap(context, CAIRO_LINE_CAP_ROUND);
    ::cairo_arc(context, x, y, radius, 0, 2 * std::numbers::pi);
    setColor(context, {0, 0, 0, 0.45});
    ::cairo_fill_preserve(context);
    setColor(context, {1, 1, 1, 0.30});
    ::cairo_stroke(context);
    setColor(context, kWhite);
    ::cairo_arc(context, x, y, radius, kStart, kStart + share * 2 * std::numbers::pi);
    ::cairo_stroke(context);
    const std::string percent = std::to_string(static_cast<int>(share * 100)) + "%";
    selectFont(context, place.side * 0.14, TextWeight::Bold);
    showCentered(context, percent, x, y + place.side * 0.05);
}

void drawName(cairo_t* context, const HomeScreenItem& item, const IconPlace& place) {
    selectFont(context, kNameSize, TextWeight::Normal);
    const std::string& name = item.name.empty() ? item.identifier : item.name;
    const std::string shown = elided(context, name, kNameWidth);
    const double middle = place.x + place.side / 2;
    setColor(context, kNameShadow);
    showCentered(context, shown, middle, place.y + kNameBaseline + 1.5);
    setColor(context, {1, 1, 1, item.isPlaceholder ? 0.65 : 1.0});
    showCentered(context, shown, middle, place.y + kNameBaseline);
}

void drawItem(cairo_t* context, const HomeScreenItem& item, const IconPlace& place) {
    drawShadow(context, place);
    drawImage(context, item, place);
    if (item.isPlaceholder || item.progress) {
        addIconOutline(context, place);
        setColor(context, {0, 0, 0, item.isPlaceholder ? 0.58 : 0.40});
        ::cairo_fill(context);
    }
    if (item.progress) drawProgress(context, place, *item.progress);
    drawName(context, item, place);
}

}  // namespace

Result<Bytes> drawHomeScreen(std::span<const HomeScreenItem> items, const std::string& title) {
    const Layout layout = layOut(items.size());
    const Result<Surface> picture = makeSurface(static_cast<int>(layout.width * layout.scale),
                                                static_cast<int>(layout.height * layout.scale));
    if (!picture) return picture.error();
    const DrawingContext context = drawOn(picture->get());
    ::cairo_scale(context.get(), layout.scale, layout.scale);
    paintWallpaper(context.get(), layout);
    drawStatusBar(context.get(), layout, title);
    for (std::size_t index = 0; index < items.size(); ++index) {
        drawItem(context.get(), items[index], layout.place(index));
    }
    return encodePng(picture->get());
}

}  // namespace appsync
