#pragma once

#include <memory>
#include <optional>
#include <vector>

#include "platform/base/Result.h"
#include "platform/ffmpeg/MovieReader.h"
#include "platform/ffmpeg/TrackCopier.h"
#include "platform/ffmpeg/VideoEncoder.h"

namespace qv::platform::ffmpeg {

/// Encodes a video track anew, as H.264, where its own codec does not belong in the file.
///
/// Threading: confined to one thread.
class PictureTranscoder {
 public:
  static Result<std::unique_ptr<PictureTranscoder>> create(const AVStream& stream, const ExportRange& range);

  [[nodiscard]] mp4::MovieTrack track(uint32_t trackID) const;
  std::optional<Error> add(const AVPacket& packet, std::vector<mp4::EncodedSample>& out);
  std::optional<Error> finish(std::vector<mp4::EncodedSample>& out);

 private:
  PictureTranscoder() = default;
  std::optional<Error> openDecoder(const AVStream& stream);
  std::optional<Error> buildGraph(const AVStream& stream, int width, int height);
  std::optional<Error> decode(const AVPacket* packet, std::vector<mp4::EncodedSample>& out);
  std::optional<Error> encodeConverted(std::vector<mp4::EncodedSample>& out);

  ExportRange range_;
  CodecContext decoder_;
  FilterGraph graph_;
  AVFilterContext* entry_ = nullptr;
  AVFilterContext* converted_ = nullptr;
  std::unique_ptr<VideoEncoder> encoder_;
  mp4::DisplayMatrix matrix_ = mp4::kIdentityMatrix;
  Frame frame_;
  int64_t lastTick_ = -1;
};

}  // namespace qv::platform::ffmpeg
