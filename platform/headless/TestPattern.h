#pragma once

#include <unordered_map>

#include "platform/base/SharedFrame.h"

namespace qv::platform {

/// Paints the test picture into the frames of one pool, repainting in each what has changed since
/// it was last used.
///
/// Threading: one thread.
class TestPattern {
 public:
  /// The next frame of a picture taken at `hostTime`; nothing while all frames are held.
  std::shared_ptr<SharedFrame> paint(const FrameLayout& layout, uint32_t number, uint64_t hostTime);
  /// A black one.
  std::shared_ptr<SharedFrame> paintBlack(const FrameLayout& layout);

 private:
  /// What a frame shows.
  struct Painted {
    uint64_t code = 0;
    bool isFlash = false;
    bool isWhole = false;  ///< its ground has been painted
  };
  static void paintGround(SharedFrame& frame);
  static void paintCode(SharedFrame& frame, uint64_t code, uint64_t changed);
  static void paintBar(SharedFrame& frame, uint64_t hostTime);

  /// As many as a real screen source has.
  static constexpr size_t kFrames = 14;
  SharedFramePool pool_{kFrames};
  /// The pool keeps its frames as long as the layout stays the same, so that an address is a frame.
  std::unordered_map<const SharedFrame*, Painted> painted_;
  FrameLayout layout_;
};

}  // namespace qv::platform
