#include "host/timeline/TimelinePng.h"

#include <cairo.h>

#include <memory>
#include <variant>

#include "device/screen/IconCanvas.h"
#include "host/timeline/TimelineDrawing.h"
#include "host/timeline/TimelineLayout.h"

namespace appsync {
namespace {

constexpr double kPatternSide = 6;
constexpr double kFullPart = 255;

Color cairoColor(const PictureColor& color) {
    return {color.red / kFullPart, color.green / kFullPart, color.blue / kFullPart};
}

void strokePattern(cairo_t* context, PicturePattern pattern) {
    constexpr double kEnd = kPatternSide;
    const auto line = [&](double x1, double y1, double x2, double y2) {
        ::cairo_move_to(context, x1, y1);
        ::cairo_line_to(context, x2, y2);
    };
    switch (pattern) {
        case PicturePattern::Dots:
            ::cairo_arc(context, kEnd / 2, kEnd / 2, 1, 0, 2 * 3.14159265);
            ::cairo_fill(context);
            return;
        case PicturePattern::Rising:
            line(-1, kEnd + 1, kEnd + 1, -1);
            line(-1, 1, 1, -1);
            line(kEnd - 1, kEnd + 1, kEnd + 1, kEnd - 1);
            break;
        case PicturePattern::Flat:
            line(0, 1.5, kEnd, 1.5);
            line(0, 4.5, kEnd, 4.5);
            break;
        case PicturePattern::Crossed:
            line(0, 0, kEnd, kEnd);
            line(0, kEnd, kEnd, 0);
            break;
        case PicturePattern::Plain:
            return;
    }
    ::cairo_set_line_width(context, pattern == PicturePattern::Rising ? 1 : 0.8);
    ::cairo_stroke(context);
}

/// Fills the path: with the colour, and with what else the kind of span is known by.
void fillPath(cairo_t* context, const Paint& paint) {
    setColor(context, cairoColor(colorOf(paint, false)));
    const PicturePattern pattern = patternOf(paint);
    if (pattern == PicturePattern::Plain) return ::cairo_fill(context);
    ::cairo_fill_preserve(context);
    const Surface tile(
        ::cairo_surface_create_similar_image(::cairo_get_target(context), CAIRO_FORMAT_ARGB32,
                                             static_cast<int>(kPatternSide * kTimelinePixels),
                                             static_cast<int>(kPatternSide * kTimelinePixels)));
    {
        const DrawingContext onTile = drawOn(tile.get());
        ::cairo_scale(onTile.get(), kTimelinePixels, kTimelinePixels);
        setColor(onTile.get(), cairoColor(colorOf(Pen::OnPale, false)));
        strokePattern(onTile.get(), pattern);
    }
    ::cairo_save(context);
    ::cairo_clip(context);
    ::cairo_identity_matrix(context);
    ::cairo_set_source_surface(context, tile.get(), 0, 0);
    ::cairo_pattern_set_extend(::cairo_get_source(context), CAIRO_EXTEND_REPEAT);
    ::cairo_paint(context);
    ::cairo_restore(context);
}

void drawShape(cairo_t* context, const BoxShape& box) {
    ::cairo_rectangle(context, box.x, box.y, box.width, box.height);
    fillPath(context, box.paint);
}

void drawShape(cairo_t* context, const AreaShape& area) {
    for (const PicturePoint& point : area.points) ::cairo_line_to(context, point.x, point.y);
    ::cairo_close_path(context);
    fillPath(context, area.paint);
}

void drawShape(cairo_t* context, const LineShape& line) {
    setColor(context, cairoColor(colorOf(line.paint, false)));
    ::cairo_set_line_width(context, 1);
    ::cairo_move_to(context, line.from.x, line.from.y);
    ::cairo_line_to(context, line.to.x, line.to.y);
    ::cairo_stroke(context);
}

void drawShape(cairo_t* context, const TextShape& shape) {
    setColor(context, cairoColor(colorOf(shape.paint, false)));
    selectFont(context, shape.size, shape.isBold ? TextWeight::Bold : TextWeight::Normal);
    const std::string text = drawableText(shape.text);
    const double width = shape.side == TextSide::Left ? 0 : textWidth(context, text);
    const double left = shape.side == TextSide::Middle ? shape.x - width / 2 : shape.x - width;
    ::cairo_move_to(context, left, shape.y);
    ::cairo_show_text(context, text.c_str());
}

}  // namespace

Result<Bytes> timelinePng(const Timeline& timeline) {
    const TimelineDrawing drawing = layOutTimeline(timeline);
    const Result<Surface> picture = makeSurface(static_cast<int>(drawing.width * kTimelinePixels),
                                                static_cast<int>(drawing.height * kTimelinePixels));
    if (!picture) return picture.error();
    const DrawingContext context = drawOn(picture->get());
    ::cairo_scale(context.get(), kTimelinePixels, kTimelinePixels);
    for (const PictureShape& shape : drawing.shapes) {
        ::cairo_new_path(context.get());
        std::visit([&](const auto& each) { drawShape(context.get(), each); }, shape);
    }
    return encodePng(picture->get());
}

}  // namespace appsync
