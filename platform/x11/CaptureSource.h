#pragma once

#include <cstdint>
#include <optional>
#include <vector>

#include "platform/x11/FrameComposer.h"

namespace qv::platform {

/// Why a capture failed for good, as given to the delegate.
inline constexpr int32_t kCaptureStatusUnsupportedPixelFormat = -1;  ///< not 8 bits a channel in 32 bits a pixel
inline constexpr int32_t kCaptureStatusUnavailable = -2;  ///< the server lacks an extension, or shared memory

/// What is captured: the screen, or windows.
///
/// Threading: the capture thread.
class CaptureSource {
 public:
  virtual ~CaptureSource() = default;
  virtual void handleEvent(const xcb_generic_event_t& event) = 0;
  /// Whether the picture may have changed since `takeLayers`.
  [[nodiscard]] virtual bool hasChanged() const = 0;
  /// The layers of the picture, bottom to top. From here on changes count as new ones.
  virtual const std::vector<PictureLayer>& takeLayers() = 0;
  /// A layer could not be grabbed: look at everything anew.
  virtual void layerWasLost() = 0;
  /// Whether the pointer belongs to the picture when it is over this child of the root.
  [[nodiscard]] virtual bool showsTopLevel(xcb_window_t topLevel) const = 0;
  /// Set when the source can never be captured.
  [[nodiscard]] virtual std::optional<int32_t> failure() const = 0;
};

/// Whether images of this depth and visual are B, G, R, X bytes in memory.
bool isPixelFormatSupported(XcbConnection& connection, uint8_t depth, xcb_visualid_t visual);

}  // namespace qv::platform
