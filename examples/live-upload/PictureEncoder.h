#pragma once

#include <functional>
#include <memory>

#include "../common/AVHandles.h"
#include "PictureConverter.h"
#include "Settings.h"

namespace upload {

/// The time base of everything that the encoders hand on.
inline constexpr AVRational kMicroseconds{1, 1'000'000};

/// H.264 for a live stream: no picture waits for a later one. The stream keeps the size that it begins with.
///
/// Threading: one thread.
class PictureEncoder {
 public:
  /// Nothing where the machine has no encoder.
  static std::unique_ptr<PictureEncoder> open(const Settings& settings, PictureSize size, bool hasGlobalHeader);

  [[nodiscard]] const AVCodecContext& context() const { return *context_; }
  /// `time` in microseconds, greater each time.
  void encode(const quorvel::VideoFrame& frame, quorvel::Orientation orientation, int64_t time, bool asKeyFrame,
              const std::function<void(Packet)>& output);

 private:
  PictureEncoder(CodecContext context, int64_t keyFrameInterval);

  const CodecContext context_;
  const Frame picture_;
  const int64_t keyFrameInterval_;  // microseconds
  int64_t lastKeyFrame_ = INT64_MIN / 2;
  PictureConverter converter_;
};

}  // namespace upload
