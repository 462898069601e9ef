#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>

#include "platform/base/FileDescriptor.h"
#include "platform/base/Result.h"

namespace qv::platform {

enum class PixelFormat : uint32_t {
  /// 32 bits per pixel, memory order B, G, R, X; the X byte is undefined.
  BGRX = 1,
};

/// Shape of a frame: `stride` is bytes per row, at least 4 * width for BGRX.
struct FrameLayout {
  uint32_t width = 0;
  uint32_t height = 0;
  uint32_t stride = 0;
  PixelFormat format = PixelFormat::BGRX;
  bool operator==(const FrameLayout&) const = default;
  [[nodiscard]] size_t byteSize() const { return size_t{stride} * height; }
};

/// An image in a memory file that several processes map: nothing copies its pixels.
///
/// The file is sealed against shrinking and growing, so a reader can never fault. A frame is
/// made in one of two ways: by `create` (writable; the pool of a screen service), or by `adopt`
/// from a descriptor that another process sent (mapped read-only, after its seals and size were
/// checked). While a SharedFrame object lives, its pixels do not change, except through
/// `mutableBytes` by the one who is still filling it.
///
/// A frame sent to another process goes with a lease: one end of a socket pair, whose closing,
/// by release or by the receiver's death, ends the sender's hold on the frame. `attachment` is
/// whatever must stay alive as long as the frame does (a received lease).
///
/// Threading: immutable once filled, so thread-safe.
class SharedFrame {
 public:
  /// A zeroed frame; fails for a layout of 0 x 0, over 16384 on a side, or without memory.
  static Result<std::shared_ptr<SharedFrame>> create(const FrameLayout& layout);
  /// Maps a received memory file read-only; fails when it is not sealed or too small.
  static Result<std::shared_ptr<SharedFrame>> adopt(SharedFileDescriptor memory, const FrameLayout& layout,
                                                    std::shared_ptr<void> attachment);
  ~SharedFrame();
  SharedFrame(const SharedFrame&) = delete;
  SharedFrame& operator=(const SharedFrame&) = delete;

  [[nodiscard]] const FrameLayout& layout() const { return layout_; }
  [[nodiscard]] std::span<const uint8_t> bytes() const { return {data_, layout_.byteSize()}; }
  /// Only for the producer, before the frame is handed on; empty for an adopted frame.
  [[nodiscard]] std::span<uint8_t> mutableBytes();
  [[nodiscard]] const SharedFileDescriptor& memory() const { return memory_; }

 private:
  SharedFrame() = default;
  SharedFileDescriptor memory_;
  FrameLayout layout_;
  uint8_t* data_ = nullptr;
  bool writable_ = false;
  std::shared_ptr<const void> attachment_;
};
using SharedFrameRef = std::shared_ptr<const SharedFrame>;

/// A bounded set of reusable frames of one layout.
///
/// `take` gives a frame that returns to the pool when its last reference goes (in whatever
/// thread), or nothing when `capacity` frames are out: the producer then drops its frame.
/// Memory is allocated as it is needed, and frames of a former layout are let go.
///
/// Threading: thread-safe.
class SharedFramePool {
 public:
  explicit SharedFramePool(size_t capacity);
  [[nodiscard]] std::shared_ptr<SharedFrame> take(const FrameLayout& layout);

 private:
  struct State;
  std::shared_ptr<State> state_;
};

/// An image: a frame seen as a picture of `width` x `height`.
class PixelBuffer {
 public:
  explicit PixelBuffer(SharedFrameRef frame) : frame_(std::move(frame)) {}
  [[nodiscard]] size_t width() const { return frame_->layout().width; }
  [[nodiscard]] size_t height() const { return frame_->layout().height; }
  [[nodiscard]] const SharedFrameRef& sharedFrame() const { return frame_; }

 private:
  SharedFrameRef frame_;
};
using PixelBufferRef = std::shared_ptr<const PixelBuffer>;

}  // namespace qv::platform
