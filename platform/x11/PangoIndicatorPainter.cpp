#include "platform/x11/PangoIndicatorPainter.h"

#include <algorithm>
#include <cmath>
#include <cstring>

namespace qv::platform {
namespace {

/// Read across a room, and small enough to leave the picture alone.
constexpr double kFontOfScreenHeight = 1.0 / 42;
constexpr double kSmallestFont = 11;  // pixels

struct Color {
  double red, green, blue;
};
constexpr Color kBackground{0.11, 0.11, 0.12}, kText{1, 1, 1}, kSign{1, 0, 0};

struct CairoDeleter {
  void operator()(cairo_t* canvas) const { cairo_destroy(canvas); }
  void operator()(cairo_surface_t* surface) const { cairo_surface_destroy(surface); }
};
using Surface = std::unique_ptr<cairo_surface_t, CairoDeleter>;
using Canvas = std::unique_ptr<cairo_t, CairoDeleter>;

struct Extent {
  int width = 0, height = 0;
};

Extent extentOf(PangoLayout* layout) {
  Extent extent;
  if (layout) pango_layout_get_pixel_size(layout, &extent.width, &extent.height);
  return extent;
}

void setColor(cairo_t* canvas, const Color& color) { cairo_set_source_rgb(canvas, color.red, color.green, color.blue); }

/// In a square of this side, beginning there.
void drawSign(cairo_t* canvas, double x, double y, double side, bool isPaused) {
  setColor(canvas, kSign);
  if (isPaused) {
    cairo_rectangle(canvas, x, y, side * 0.36, side);
    cairo_rectangle(canvas, x + side * 0.64, y, side * 0.36, side);
  } else {
    cairo_arc(canvas, x + side / 2, y + side / 2, side / 2, 0, 2 * M_PI);
  }
  cairo_fill(canvas);
}

void drawText(cairo_t* canvas, PangoLayout* layout, double x, double height) {
  if (!layout) return;
  setColor(canvas, kText);
  cairo_move_to(canvas, x, std::floor((height - extentOf(layout).height) / 2));
  pango_cairo_show_layout(canvas, layout);
}

IndicatorImage imageOf(cairo_surface_t* surface) {
  cairo_surface_flush(surface);
  if (cairo_surface_status(surface) != CAIRO_STATUS_SUCCESS) return {};
  IndicatorImage image{static_cast<uint16_t>(cairo_image_surface_get_width(surface)),
                       static_cast<uint16_t>(cairo_image_surface_get_height(surface)),
                       {}};
  image.pixels.resize(size_t{image.width} * image.height);
  const unsigned char* rows = cairo_image_surface_get_data(surface);
  const auto stride = static_cast<size_t>(cairo_image_surface_get_stride(surface));
  for (size_t row = 0; row < image.height; ++row)
    std::memcpy(&image.pixels[row * image.width], rows + row * stride, size_t{image.width} * 4);
  return image;
}

}  // namespace

PangoIndicatorPainter::PangoIndicatorPainter()
    : fonts_(pango_cairo_font_map_new()), context_(pango_font_map_create_context(fonts_.get())) {
  PangoFontFamily** families = nullptr;
  int count = 0;
  pango_font_map_list_families(fonts_.get(), &families, &count);
  g_free(families);
  hasFonts_ = count > 0;
}

GObjectPtr<PangoLayout> PangoIndicatorPainter::layoutOf(const std::string& text, double fontSize, int width) const {
  if (!hasFonts_) return nullptr;
  GObjectPtr<PangoLayout> layout(pango_layout_new(context_.get()));
  PangoFontDescription* font = pango_font_description_from_string("Sans");
  pango_font_description_set_absolute_size(font, fontSize * PANGO_SCALE);
  pango_layout_set_font_description(layout.get(), font);
  pango_font_description_free(font);
  pango_layout_set_single_paragraph_mode(layout.get(), TRUE);
  pango_layout_set_text(layout.get(), text.c_str(), static_cast<int>(text.size()));
  if (width > 0 && extentOf(layout.get()).width > width) {
    pango_layout_set_width(layout.get(), width * PANGO_SCALE);
    pango_layout_set_ellipsize(layout.get(), PANGO_ELLIPSIZE_END);
  }
  return layout;
}

IndicatorImage PangoIndicatorPainter::draw(const StatusBarOverride& shown, uint16_t screenWidth,
                                           uint16_t screenHeight) {
  const double font = std::max(kSmallestFont, std::round(screenHeight * kFontOfScreenHeight));
  const double sign = std::round(font * 0.8), gap = std::round(font * 0.6);
  const auto text = layoutOf(shown.text, font, screenWidth / 2);
  const auto time = layoutOf(shown.time, font, 0);
  const double textWidth = extentOf(text.get()).width, timeWidth = extentOf(time.get()).width;
  const double height = std::max<double>(extentOf(text.get()).height, font) + gap;
  const double width = gap + sign + gap + (text ? textWidth + gap + timeWidth + gap : 0);
  const Surface surface(
      cairo_image_surface_create(CAIRO_FORMAT_RGB24, static_cast<int>(width), static_cast<int>(height)));
  const Canvas canvas(cairo_create(surface.get()));
  setColor(canvas.get(), kBackground);
  cairo_paint(canvas.get());
  drawSign(canvas.get(), gap, std::floor((height - sign) / 2), sign, shown.isPaused);
  drawText(canvas.get(), text.get(), gap + sign + gap, height);
  drawText(canvas.get(), time.get(), gap + sign + gap + textWidth + gap, height);
  return imageOf(surface.get());
}

}  // namespace qv::platform
