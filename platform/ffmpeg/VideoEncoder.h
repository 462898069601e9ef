#pragma once

#include <cstdint>
#include <memory>
#include <vector>

#include "platform/Geometry.h"
#include "platform/Result.h"
#include "platform/SharedFrame.h"
#include "platform/ffmpeg/ColorConversion.h"
#include "platform/ffmpeg/FFmpegHandles.h"
#include "platform/ffmpeg/WriterSettings.h"
#include "platform/mp4/MovieTrack.h"

namespace qv::platform::ffmpeg {

/// Encodes pictures to H.264 High in the order in which they come, without reordering.
///
/// Threading: confined to one thread.
class VideoEncoder {
 public:
  /// Takes tens of milliseconds.
  static Result<std::unique_ptr<VideoEncoder>> open(const VideoSettings& settings);

  [[nodiscard]] mp4::MovieTrack track(uint32_t trackID, const AffineTransform& transform) const;
  /// `tick` is the time in mp4::kMovieTimescale; it rises from call to call. What is ready is added to `out`.
  std::optional<Error> encode(const PixelBuffer& image, int64_t tick, std::vector<mp4::EncodedSample>& out);
  /// The same for a picture of the encoder's size that is 4:2:0 already.
  std::optional<Error> encode(const AVFrame& picture, int64_t tick, std::vector<mp4::EncodedSample>& out);
  /// No more pictures follow.
  std::optional<Error> flush(std::vector<mp4::EncodedSample>& out);

 private:
  VideoEncoder(const VideoSettings& settings, CodecContext context);
  std::optional<Error> sendAt(AVFrame& frame, int64_t tick, std::vector<mp4::EncodedSample>& out);
  std::optional<Error> send(const AVFrame* frame, std::vector<mp4::EncodedSample>& out);
  void receive(std::vector<mp4::EncodedSample>& out);

  const VideoSettings settings_;
  CodecContext context_;
  Frame frame_;
  Packet packet_;
  ColorConverter converter_;
  int64_t lastKeyFrame_ = 0;
};

}  // namespace qv::platform::ffmpeg
