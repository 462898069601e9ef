#pragma once

#include <map>
#include <vector>

#include "platform/x11/ImageGrabber.h"

namespace qv::platform {

/// A part of the picture: what to grab, and where on the screen it stands.
struct PictureLayer {
  xcb_drawable_t drawable = XCB_NONE;
  PixelRect area;         ///< within the drawable
  int32_t x = 0, y = 0;   ///< of the area's corner, on the root window
  bool hasAlpha = false;  ///< premultiplied alpha in the fourth byte
  uint32_t key = 0;       ///< tells layers apart across changes of the drawable
};

/// Where the composed picture went: `source`, on the root window, was fitted into `target`, in the frame.
struct PictureMapping {
  PixelRect source;
  PixelRect target;
};

/// Draws layers, bottom to top, into frames of a fixed size.
///
/// The picture is the layers' bounding box. One layer of exactly the frame's size is grabbed
/// straight into the frame; everything else is scaled, keeping its proportions, with black around.
///
/// Threading: the connection's thread.
class FrameComposer {
 public:
  enum class Outcome {
    Complete,
    LayerLost,       ///< at least one layer could not be grabbed and is black
    NoSharedMemory,  ///< the server does not take the memory: no picture will ever come
  };

  explicit FrameComposer(XcbConnection& connection) : grabber_(connection) {}
  Outcome compose(const std::vector<PictureLayer>& layers, SharedFrame& frame);
  /// Of the last picture; an empty source when there was none.
  [[nodiscard]] const PictureMapping& mapping() const { return mapping_; }

 private:
  Outcome grabDirectly(const PictureLayer& layer, SharedFrame& frame);
  Outcome grabAndScale(const std::vector<PictureLayer>& layers, SharedFrame& frame);
  SharedFrame* scratchFor(const PictureLayer& layer);
  void dropUnusedScratch(const std::vector<PictureLayer>& layers);

  ImageGrabber grabber_;
  PictureMapping mapping_;
  std::map<uint32_t, std::shared_ptr<SharedFrame>> scratch_;  // by layer key
  std::vector<uint8_t> blendRow_;                             // a scaled layer with alpha, before it is blended
};

/// Fits `source` into a frame: the largest rectangle of its proportions, centred.
PixelRect letterboxed(const PixelRect& source, uint32_t frameWidth, uint32_t frameHeight);

}  // namespace qv::platform
