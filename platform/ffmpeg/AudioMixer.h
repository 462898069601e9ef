#pragma once

#include <memory>
#include <optional>
#include <vector>

#include "platform/base/Result.h"
#include "platform/ffmpeg/AACEncoder.h"
#include "platform/ffmpeg/MovieReader.h"
#include "platform/ffmpeg/TrackCopier.h"

namespace qv::platform::ffmpeg {

/// Mixes audio tracks, each at its own level, into one of AAC. Where the sum leaves the range it is
/// clipped.
///
/// Threading: confined to one thread.
class AudioMixer {
 public:
  static Result<std::unique_ptr<AudioMixer>> create(const std::vector<AVStream*>& streams, const ExportRange& range);

  [[nodiscard]] mp4::MovieTrack track(uint32_t trackID) const { return encoder_->track(trackID); }
  /// `packet` of the stream with index `stream`.
  std::optional<Error> add(int stream, const AVPacket& packet, std::vector<mp4::EncodedSample>& out);
  std::optional<Error> finish(std::vector<mp4::EncodedSample>& out);

 private:
  struct Source {
    int stream;
    CodecContext decoder;
    AVFilterContext* entry;  ///< of the graph
  };
  AudioMixer() = default;
  std::optional<Error> addSource(const AVStream& stream);
  std::optional<Error> buildGraph(const ExportRange& range);
  std::optional<Error> decode(Source& source, const AVPacket* packet, std::vector<mp4::EncodedSample>& out);
  std::optional<Error> encodeMixed(std::vector<mp4::EncodedSample>& out);

  std::vector<Source> sources_;
  FilterGraph graph_;
  AVFilterContext* mixed_ = nullptr;
  std::unique_ptr<AACEncoder> encoder_;
  Frame frame_;
  int64_t rangeFrames_ = 0;
};

}  // namespace qv::platform::ffmpeg
