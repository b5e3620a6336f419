#include "host/timeline/TimelineDrawing.h"

#include <array>

#include "host/console/Text.h"

namespace appsync {
namespace {

/// Colours that people of every kind of colour vision tell apart; what waits has a pattern too.
constexpr std::array<SpanLook, kSpanKinds> kLooks = {{
    {{0x56, 0xB4, 0xE9}, PicturePattern::Plain, 'P', false},
    {{0xD0, 0xD0, 0xD0}, PicturePattern::Dots, 'N', false},
    {{0x00, 0x72, 0xB2}, PicturePattern::Plain, 'T', true},
    {{0xF0, 0xE4, 0x42}, PicturePattern::Dots, 'Q', false},
    {{0xE6, 0x9F, 0x00}, PicturePattern::Rising, 'W', false},
    {{0xCC, 0x79, 0xA7}, PicturePattern::Flat, 'S', false},
    {{0x00, 0x9E, 0x73}, PicturePattern::Plain, 'I', false},
    {{0x99, 0x99, 0x99}, PicturePattern::Crossed, 'R', false},
}};

struct GroundColors {
    PictureColor onLight;
    PictureColor onDark;
};
constexpr std::array<GroundColors, 11> kPens = {{
    {{0xFF, 0xFF, 0xFF}, {0x16, 0x18, 0x1C}},
    {{0xF5, 0xF6, 0xF8}, {0x1E, 0x21, 0x26}},
    {{0x1A, 0x1A, 0x1A}, {0xEC, 0xEC, 0xEC}},
    {{0x55, 0x59, 0x60}, {0xB0, 0xB6, 0xC0}},
    {{0xD9, 0xDC, 0xE1}, {0x3A, 0x3F, 0x48}},
    {{0xDD, 0xE3, 0xEC}, {0x34, 0x3D, 0x4C}},
    {{0x7D, 0x86, 0x93}, {0x8B, 0x95, 0xA5}},
    {{0x00, 0x6B, 0x4E}, {0x3D, 0xD6, 0xA6}},
    {{0xB3, 0x3C, 0x00}, {0xFF, 0x9B, 0x5C}},
    {{0x1A, 0x1A, 0x1A}, {0x1A, 0x1A, 0x1A}},
    {{0xFF, 0xFF, 0xFF}, {0xFF, 0xFF, 0xFF}},
}};

/// More than any text that is cut afterwards may be long.
constexpr std::size_t kMostBytes = 16'384;

std::string printableBegin(const std::string& text) {
    return printable(std::string_view(text).substr(0, kMostBytes));
}

}  // namespace

const SpanLook& lookOf(SpanKind kind) { return kLooks.at(static_cast<std::size_t>(kind)); }

PictureColor colorOf(Pen pen, bool onDarkGround) {
    const GroundColors& colors = kPens.at(static_cast<std::size_t>(pen));
    return onDarkGround ? colors.onDark : colors.onLight;
}

PictureColor colorOf(const Paint& paint, bool onDarkGround) {
    return paint.pen == Pen::Span ? lookOf(paint.kind).color : colorOf(paint.pen, onDarkGround);
}

PicturePattern patternOf(const Paint& paint) {
    const bool hasPattern = paint.pen == Pen::Span && !paint.isPlain;
    return hasPattern ? lookOf(paint.kind).pattern : PicturePattern::Plain;
}

std::string shortened(const std::string& text, std::size_t longest) {
    const std::string safe = printableBegin(text);
    if (displayWidth(safe) <= longest) return safe;
    return std::string(beginOf(safe, longest - 1)) + "\xE2\x80\xA6";
}

std::string shortenedAtFront(const std::string& text, std::size_t longest) {
    const std::string safe = printableBegin(text);
    if (displayWidth(safe) <= longest) return safe;
    return "\xE2\x80\xA6" + std::string(endOf(safe, longest - 1));
}

}  // namespace appsync
