#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "platform/Bytes.h"
#include "platform/Result.h"

// The names are cairo's.
using cairo_t = struct _cairo;                  // NOLINT(bugprone-reserved-identifier)
using cairo_surface_t = struct _cairo_surface;  // NOLINT(bugprone-reserved-identifier)

namespace appsync {

struct SurfaceReleaser {
    void operator()(cairo_surface_t* surface) const noexcept;
};
struct ContextReleaser {
    void operator()(cairo_t* context) const noexcept;
};
using Surface = std::unique_ptr<cairo_surface_t, SurfaceReleaser>;
using DrawingContext = std::unique_ptr<cairo_t, ContextReleaser>;

/// A colour; each part from 0 to 1.
struct Color {
    double red = 0;
    double green = 0;
    double blue = 0;
    double alpha = 1;
};

/// A square that icons are drawn into.
struct IconPlace {
    double x = 0;
    double y = 0;
    double side = 0;
};

/// An empty image. Fails when there is no memory for it.
[[nodiscard]] Result<Surface> makeSurface(int width, int height);

/// Draws on the image; both are kept alive by whoever called.
[[nodiscard]] DrawingContext drawOn(cairo_surface_t* surface);

/// Decodes an image; see renderIcon for what is refused.
[[nodiscard]] Result<Surface> decodePng(ByteView png);

/// Encodes an image. Fails, too, when drawing it failed.
[[nodiscard]] Result<Bytes> encodePng(cairo_surface_t* surface);

void setColor(cairo_t* context, const Color& color);

/// Adds the outline of an icon, its corners rounded, to the path.
void addIconOutline(cairo_t* context, const IconPlace& place);

/// Draws an image as an icon: scaled until it fills the place, its middle shown.
void drawIcon(cairo_t* context, cairo_surface_t* image, const IconPlace& place);

/// Draws the icon of an application that has none.
void drawLetterIcon(cairo_t* context, std::string_view identifier, std::string_view name,
                    const IconPlace& place);

enum class TextWeight { Normal, Bold };

/// What may be given to cairo: valid UTF-8 without control characters, of any text.
[[nodiscard]] std::string drawableText(std::string_view text);

/// Chooses the font for the text that follows.
void selectFont(cairo_t* context, double size, TextWeight weight);

/// Shows a drawable text centred about x, on the base line y.
void showCentered(cairo_t* context, const std::string& text, double x, double y);

/// The width of a drawable text.
[[nodiscard]] double textWidth(cairo_t* context, const std::string& text);

}  // namespace appsync
