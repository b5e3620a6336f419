#include "host/timeline/TimelineSvg.h"

#include <array>
#include <cmath>
#include <type_traits>
#include <variant>

#include "host/timeline/TimelineDrawing.h"
#include "host/timeline/TimelineLayout.h"

namespace appsync {
namespace {

constexpr std::array kGroundPens = {Pen::Ground, Pen::Stripe, Pen::Text, Pen::Faint, Pen::Rule,
                                    Pen::Phase,  Pen::Call,   Pen::Good, Pen::Bad};

/// One digit behind the point: as fine as anybody sees.
std::string coordinate(double value) {
    const auto tenths = static_cast<long>(std::lround(value * 10));
    const long whole = tenths / 10;
    const long rest = std::labs(tenths % 10);
    const std::string sign = tenths < 0 && whole == 0 ? "-" : "";
    return sign + std::to_string(whole) + (rest == 0 ? "" : "." + std::to_string(rest));
}

std::string attribute(const char* name, double value) {
    return std::string(" ") + name + "=\"" + coordinate(value) + "\"";
}

std::string hexColor(const PictureColor& color) {
    constexpr std::string_view kDigits = "0123456789abcdef";
    std::string text = "#";
    for (const unsigned part : {color.red, color.green, color.blue}) {
        text += kDigits[part >> 4U & 15U];
        text += kDigits[part & 15U];
    }
    return text;
}

std::string className(Pen pen) { return "p" + std::to_string(static_cast<int>(pen)); }

std::string patternName(SpanKind kind) {
    return "appsync-span-" + std::to_string(static_cast<int>(kind));
}

/// How a shape is filled: its colour on light ground stands in it, in case style sheets are off.
std::string paintText(const Paint& paint, const char* property) {
    if (paint.pen != Pen::Span) {
        return std::string(" class=\"") + className(paint.pen) + "\" " + property + "=\"" +
               hexColor(colorOf(paint, false)) + "\"";
    }
    const SpanLook& look = lookOf(paint.kind);
    const std::string value = patternOf(paint) == PicturePattern::Plain
                                  ? hexColor(look.color)
                                  : "url(#" + patternName(paint.kind) + ")";
    return std::string(" ") + property + "=\"" + value + "\"";
}

const char* patternContent(PicturePattern pattern) {
    switch (pattern) {
        case PicturePattern::Dots:
            return R"(<circle cx="3" cy="3" r="1" fill="#1a1a1a"/>)";
        case PicturePattern::Rising:
            return R"(<path d="M-1 7L7 -1M-1 1L1 -1M5 7L7 5" stroke="#1a1a1a" fill="none"/>)";
        case PicturePattern::Flat:
            return R"(<path d="M0 1.5H6M0 4.5H6" stroke="#1a1a1a" stroke-width=".8" fill="none"/>)";
        case PicturePattern::Crossed:
            return R"(<path d="M0 0L6 6M0 6L6 0" stroke="#1a1a1a" stroke-width=".8" fill="none"/>)";
        case PicturePattern::Plain:
            return "";
    }
    return "";
}

std::string definitions() {
    std::string text = "<defs>";
    for (std::size_t i = 0; i < kSpanKinds; ++i) {
        const auto kind = static_cast<SpanKind>(i);
        const SpanLook& look = lookOf(kind);
        if (look.pattern == PicturePattern::Plain) continue;
        text +=
            "<pattern id=\"" + patternName(kind) +
            R"(" width="6" height="6" patternUnits="userSpaceOnUse"><rect width="6" height="6" )" +
            "fill=\"" + hexColor(look.color) + "\"/>" + patternContent(look.pattern) + "</pattern>";
    }
    return text + "</defs>\n";
}

/// What is other on dark ground.
std::string darkStyle() {
    std::string text = "<style>@media (prefers-color-scheme: dark) {\n";
    for (const Pen pen : kGroundPens) {
        const std::string name = "." + className(pen);
        const std::string color = hexColor(colorOf(pen, true)) + "}";
        text.append("rect").append(name).append(",text").append(name);
        text.append("{fill:").append(color);
        text.append(" line").append(name).append("{stroke:").append(color).append("\n");
    }
    return text + "}</style>\n";
}

std::string ended(const std::string& element, const char* name, const std::string& title) {
    if (title.empty()) return element + "/>\n";
    return element + "><title>" + escapedMarkup(title) + "</title></" + name + ">\n";
}

std::string svgOf(const BoxShape& box) {
    return ended("<rect" + attribute("x", box.x) + attribute("y", box.y) +
                     attribute("width", box.width) + attribute("height", box.height) +
                     paintText(box.paint, "fill"),
                 "rect", box.title);
}

std::string svgOf(const AreaShape& area) {
    std::string points;
    for (const PicturePoint& point : area.points) {
        points += (points.empty() ? "" : " ") + coordinate(point.x) + "," + coordinate(point.y);
    }
    return ended("<polygon points=\"" + points + "\"" + paintText(area.paint, "fill"), "polygon",
                 area.title);
}

std::string svgOf(const LineShape& line) {
    return "<line" + attribute("x1", line.from.x) + attribute("y1", line.from.y) +
           attribute("x2", line.to.x) + attribute("y2", line.to.y) +
           paintText(line.paint, "stroke") + "/>\n";
}

std::string svgOf(const TextShape& text) {
    static constexpr std::array<const char*, 3> kAnchors = {"", R"( text-anchor="middle")",
                                                            R"( text-anchor="end")"};
    std::string element = "<text" + attribute("x", text.x) + attribute("y", text.y) +
                          attribute("font-size", text.size) +
                          (text.isBold ? R"( font-weight="bold")" : "") +
                          kAnchors.at(static_cast<std::size_t>(text.side)) +
                          paintText(text.paint, "fill") + ">" + escapedMarkup(text.text);
    if (!text.title.empty()) element += "<title>" + escapedMarkup(text.title) + "</title>";
    return element + "</text>\n";
}

/// The character at the start of the text may stand in no XML: U+FFFE, U+FFFF or a control
/// character other than those that space lines and words.
bool isForbidden(std::string_view text) {
    if (text.starts_with("\xEF\xBF\xBE") || text.starts_with("\xEF\xBF\xBF")) return true;
    const auto byte = static_cast<unsigned char>(text.front());
    return byte < 0x20 && byte != '\n' && byte != '\t';
}

}  // namespace

std::string escapedMarkup(std::string_view text) {
    std::string escaped;
    escaped.reserve(text.size());
    while (!text.empty()) {
        const char each = text.front();
        if (isForbidden(text)) {
            escaped += '?';
            text.remove_prefix(static_cast<unsigned char>(each) < 0x20 ? 1 : 3);
            continue;
        }
        text.remove_prefix(1);
        if (each == '&') {
            escaped += "&amp;";
        } else if (each == '<') {
            escaped += "&lt;";
        } else if (each == '>') {
            escaped += "&gt;";
        } else if (each == '"') {
            escaped += "&quot;";
        } else if (each == '\'') {
            escaped += "&#39;";
        } else {
            escaped += each;
        }
    }
    return escaped;
}

std::string timelineSvg(const Timeline& timeline) {
    const TimelineDrawing drawing = layOutTimeline(timeline);
    const std::string width = coordinate(drawing.width);
    const std::string height = coordinate(drawing.height);
    std::string svg = "<svg xmlns=\"http://www.w3.org/2000/svg\" width=\"" + width +
                      "\" height=\"" + height + "\" viewBox=\"0 0 " + width + " " + height +
                      "\" role=\"img\" font-family=\"DejaVu Sans, Verdana, sans-serif\">\n<title>" +
                      escapedMarkup(drawing.title) + "</title>\n<desc>" +
                      escapedMarkup(drawing.description) + "</desc>\n" + darkStyle() +
                      definitions();
    for (const PictureShape& shape : drawing.shapes) {
        svg += std::visit([](const auto& each) { return svgOf(each); }, shape);
    }
    return svg + "</svg>\n";
}

}  // namespace appsync
