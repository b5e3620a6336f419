#pragma once

#include <cstddef>
#include <string>
#include <variant>
#include <vector>

#include "host/timeline/Timeline.h"

namespace appsync {

/// What something is drawn with. What a pen looks like on light and on dark ground is known to the
/// writers of pictures.
enum class Pen {
    Ground,
    Stripe,  // the ground of every other lane
    Text,
    Faint,  // text that matters less
    Rule,   // lines of the grid
    Phase,  // the phases of the session
    Call,   // the host's calls
    Good,
    Bad,
    OnPale,  // text on pale colours, whatever the ground
    OnDeep,  // on deep ones
    Span,    // with the kind of span
};

/// A kind of span for `Pen::Span`; else of no meaning.
struct Paint {
    Pen pen = Pen::Text;
    SpanKind kind = SpanKind::Install;
    /// Without the pattern of the kind.
    bool isPlain = false;
};

/// A point of a picture, in pixels from its left upper corner.
struct PicturePoint {
    double x = 0;
    double y = 0;
};

struct BoxShape {
    double x = 0;
    double y = 0;
    double width = 0;
    double height = 0;
    Paint paint;
    /// What is shown while somebody points at it.
    std::string title;
};

/// A closed line, filled.
struct AreaShape {
    std::vector<PicturePoint> points;
    Paint paint;
    std::string title;
};

struct LineShape {
    PicturePoint from;
    PicturePoint to;
    Paint paint;
};

enum class TextSide { Left, Middle, Right };

/// Where the text's left end, middle or right end stands on its base line.
struct TextShape {
    double x = 0;
    double y = 0;
    double size = 11;
    std::string text;
    Paint paint;
    bool isBold = false;
    TextSide side = TextSide::Left;
    std::string title;
};

using PictureShape = std::variant<BoxShape, AreaShape, LineShape, TextShape>;

/// A picture: shapes, each above those before it. Texts are safe to print.
struct TimelineDrawing {
    double width = 0;
    double height = 0;
    std::string title;
    std::string description;
    std::vector<PictureShape> shapes;
};

/// A colour as a picture's writers take it.
struct PictureColor {
    unsigned red = 0;
    unsigned green = 0;
    unsigned blue = 0;
};

/// The pattern that a kind of span has beside its colour, and the letter that stands in it.
enum class PicturePattern { Plain, Dots, Rising, Flat, Crossed };
struct SpanLook {
    PictureColor color;
    PicturePattern pattern = PicturePattern::Plain;
    char letter = ' ';
    /// Whether text on it is light.
    bool isDark = false;
};

[[nodiscard]] const SpanLook& lookOf(SpanKind kind);
[[nodiscard]] PictureColor colorOf(Pen pen, bool onDarkGround);
[[nodiscard]] PictureColor colorOf(const Paint& paint, bool onDarkGround);
[[nodiscard]] PicturePattern patternOf(const Paint& paint);

/// What somebody named, safe to print and cut to `longest` characters.
[[nodiscard]] std::string shortened(const std::string& text, std::size_t longest);
/// The same, its end kept: what identifiers of one maker differ in.
[[nodiscard]] std::string shortenedAtFront(const std::string& text, std::size_t longest);

}  // namespace appsync
