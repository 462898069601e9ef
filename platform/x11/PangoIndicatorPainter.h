#pragma once

#include <pango/pangocairo.h>

#include "platform/x11/IndicatorModule.h"

namespace qv::platform {

struct GObjectDeleter {
  void operator()(void* object) const { g_object_unref(object); }
};
template <typename T>
using GObjectPtr = std::unique_ptr<T, GObjectDeleter>;

/// Draws with Pango and Cairo, in a font map of its own. On a device without fonts the dot is all there is.
///
/// Threading: one thread.
class PangoIndicatorPainter final : public IndicatorPainter {
 public:
  PangoIndicatorPainter();
  IndicatorImage draw(const StatusBarOverride& shown, uint16_t screenWidth, uint16_t screenHeight) override;

 private:
  /// `width` in pixels, at most; 0 for as long as it is.
  [[nodiscard]] GObjectPtr<PangoLayout> layoutOf(const std::string& text, double fontSize, int width) const;

  const GObjectPtr<PangoFontMap> fonts_;
  const GObjectPtr<PangoContext> context_;
  bool hasFonts_ = false;
};

}  // namespace qv::platform
