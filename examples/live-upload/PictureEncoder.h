#pragma once

#include <quorvel/Types.h>

#include <functional>
#include <memory>

#include "../common/AVHandles.h"
#include "Settings.h"

struct SwsContext;

namespace upload {

/// The time base of everything that the encoders hand on.
inline constexpr AVRational kMicroseconds{1, 1'000'000};

/// H.264 for a live stream: no picture waits for a later one. Pictures of another size are scaled to the first one's.
///
/// Threading: one thread.
class PictureEncoder {
 public:
  /// Nothing where the machine has no encoder.
  static std::unique_ptr<PictureEncoder> open(const Settings& settings, uint32_t width, uint32_t height,
                                              bool hasGlobalHeader);
  ~PictureEncoder();
  PictureEncoder(const PictureEncoder&) = delete;
  PictureEncoder& operator=(const PictureEncoder&) = delete;

  [[nodiscard]] const AVCodecContext& context() const { return *context_; }
  /// `time` in microseconds, greater each time.
  void encode(const quorvel::VideoFrame& frame, int64_t time, bool asKeyFrame,
              const std::function<void(Packet)>& output);

 private:
  PictureEncoder(CodecContext context, int64_t keyFrameInterval);
  [[nodiscard]] bool convert(const quorvel::VideoFrame& frame);

  const CodecContext context_;
  const Frame picture_;
  const int64_t keyFrameInterval_;  // microseconds
  int64_t lastKeyFrame_ = INT64_MIN / 2;
  SwsContext* scaler_ = nullptr;
};

}  // namespace upload
