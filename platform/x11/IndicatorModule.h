#pragma once

#include <cstdint>
#include <memory>
#include <vector>

#include "platform/StatusBar.h"
#include "platform/process/LateModule.h"

namespace qv::platform {

/// Rows of 0x00RRGGBB, without padding; empty where nothing could be drawn.
struct IndicatorImage {
  uint16_t width = 0, height = 0;
  std::vector<uint32_t> pixels;
};

/// Draws what the indicator shows: a red dot (two bars while it is paused), the text, the time.
///
/// Threading: one thread.
class IndicatorPainter {
 public:
  virtual ~IndicatorPainter() = default;
  /// For a screen of this size, in pixels. A text that is too long for half of it ends with an ellipsis.
  virtual IndicatorImage draw(const StatusBarOverride& shown, uint16_t screenWidth, uint16_t screenHeight) = 0;
};

/// Setting text in every language needs Pango, Cairo and what they stand on, so it stands in a module of its own.
inline constexpr const char kIndicatorModule[] = "quorveld-indicator.so";
using MakeIndicatorPainter = void (*)(std::unique_ptr<IndicatorPainter>& painter);
inline constexpr const char kIndicatorModuleEntry[] = "qvMakeIndicatorPainter";

}  // namespace qv::platform
