#pragma once

#include "platform/base/SharedFrame.h"
#include "platform/base/Value.h"

namespace qv {

/// Carries one video frame's shared image surface to another process: image bytes never travel
/// in a message.
///
/// On the wire it is the struct (h memory, h lease, u width, u height, u stride, u pixelFormat).
/// The receiver maps the memory read-only and closes the lease when it has finished with the
/// frame; the sender keeps the frame's memory unchanged until then. An object without a surface
/// has no wire form.
///
/// Threading: a value.
class QVSharedFrameObject {
 public:
  QVSharedFrameObject() = default;
  explicit QVSharedFrameObject(platform::SharedFrameRef frame) : sharedFrame_(std::move(frame)) {}

  [[nodiscard]] const platform::SharedFrameRef& sharedFrame() const { return sharedFrame_; }
  void setSharedFrame(platform::SharedFrameRef frame) { sharedFrame_ = std::move(frame); }

  /// The wire struct with a lease of its own, or a none value without a surface (or when no lease
  /// could be made).
  [[nodiscard]] platform::Value encodeForIPC() const;
  /// The object with the received surface; without one where the struct is malformed or its memory
  /// is not sealed or too small.
  static QVSharedFrameObject decodeFromIPC(const platform::Value& value);

 private:
  platform::SharedFrameRef sharedFrame_;
};

}  // namespace qv
