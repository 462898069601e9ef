#pragma once

#include <cstdint>
#include <memory>
#include <vector>

#include "platform/base/Geometry.h"
#include "platform/base/Result.h"
#include "platform/base/SharedFrame.h"
#include "platform/ffmpeg/ColorConversion.h"
#include "platform/ffmpeg/H264Codec.h"
#include "platform/mp4/MovieTrack.h"

namespace qv::platform::ffmpeg {

/// Encodes pictures to H.264 in the order in which they come, without reordering.
///
/// A screen that stands still (pictures come by the heartbeat alone) is held to a small rate where the encoder
/// can change it: its key frames would otherwise cost a megabit a second to show nothing new.
///
/// Threading: confined to one thread.
class VideoEncoder {
 public:
  /// `node` is the codec's device; empty where it has none. Takes tens of milliseconds.
  static Result<std::unique_ptr<VideoEncoder>> open(const H264Codec& codec, const std::string& node,
                                                    const VideoSettings& settings);
  /// The software encoder.
  static Result<std::unique_ptr<VideoEncoder>> open(const VideoSettings& settings);
  /// Encodes one picture; what failed, or nothing.
  static std::optional<Error> tryOut(const H264Codec& codec, const std::string& node, const VideoSettings& settings);

  /// libavcodec's name of it.
  [[nodiscard]] std::string name() const;
  /// Whether a picture is wide where the track is tall, or the other way round.
  [[nodiscard]] bool liesAcross(const PixelBuffer& image) const;
  /// Pictures are turned by a quarter so that they fill the track, and the track turns them back when it is shown: a
  /// wide screen keeps its shape and its sharpness in a movie that has to be tall. Before `track`.
  void turnPictures() { isTurned_ = true; }
  [[nodiscard]] mp4::MovieTrack track(uint32_t trackID, const AffineTransform& transform) const;
  /// `tick` is the time in mp4::kMovieTimescale; it rises from call to call. What is ready is added to `out`.
  std::optional<Error> encode(const PixelBuffer& image, int64_t tick, std::vector<mp4::EncodedSample>& out);
  /// The same for a picture of the encoder's size that is 4:2:0 already, in three planes.
  std::optional<Error> encode(const AVFrame& picture, int64_t tick, std::vector<mp4::EncodedSample>& out);
  /// No more pictures follow.
  std::optional<Error> flush(std::vector<mp4::EncodedSample>& out);

 private:
  VideoEncoder(const VideoSettings& settings, CodecContext context, FrameUpload upload, bool canChangeRate);
  static Result<std::unique_ptr<VideoEncoder>> openCodec(const H264Codec& codec, const std::string& node,
                                                         const VideoSettings& settings);
  static Result<std::vector<uint8_t>> encodeTrial(const H264Codec& codec, const std::string& node,
                                                  const VideoSettings& settings);
  std::optional<Error> sendAt(Frame frame, int64_t tick, std::vector<mp4::EncodedSample>& out);
  std::optional<Error> send(const AVFrame* frame, std::vector<mp4::EncodedSample>& out);
  std::optional<Error> receive(std::vector<mp4::EncodedSample>& out);
  std::optional<Error> checkParameterSets(const AVPacket& packet);
  void adaptRate(int64_t tick);

  const VideoSettings settings_;
  const bool canChangeRate_;
  CodecContext context_;
  FrameUpload upload_;  ///< after the context, whose surfaces it uses
  Frame frame_;
  Packet packet_;
  ColorConverter converter_;
  bool isTurned_ = false;
  /// The decoder configuration that the movie's header holds; every picture refers to it.
  std::vector<uint8_t> configuration_;
  int64_t lastKeyFrame_ = 0;
  int64_t lastTick_ = 0;
  int slowPictures_ = 0;  ///< in a row
};

}  // namespace qv::platform::ffmpeg
