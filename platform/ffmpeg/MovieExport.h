#pragma once

#include <atomic>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/ExportSession.h"
#include "platform/ffmpeg/AudioMixer.h"
#include "platform/ffmpeg/MovieReader.h"
#include "platform/ffmpeg/PictureTranscoder.h"
#include "platform/ffmpeg/TrackCopier.h"
#include "platform/mp4/MovieWriter.h"

namespace qv::platform::ffmpeg {

/// What an export is to do.
struct ExportPlan {
  std::string source;
  std::string destination;
  ExportPreset preset = ExportPreset::PassThrough;
  /// Invalid times: the whole movie.
  MediaTimeRange range;
};

/// One run of an export, from opening the source to the renaming of the complete result.
///
/// Threading: confined to one thread; `cancelled` (borrowed) is shared with others.
class MovieExport {
 public:
  MovieExport(ExportPlan plan, const std::atomic<bool>& cancelled);
  /// Nothing where the result stands at the destination.
  std::optional<Error> run();

 private:
  /// One track of the result: copied, mixed, or encoded anew.
  struct Output {
    std::optional<TrackCopier> copier;
    std::unique_ptr<PictureTranscoder> transcoder;
    std::unique_ptr<AudioMixer> mixer;
    std::vector<int> streams;  ///< of the source
  };
  std::optional<Error> exportTo(const std::string& path);
  std::optional<Error> chooseRange();
  std::optional<Error> planOutputs();
  std::optional<Error> planVideo(const AVStream& stream);
  std::optional<Error> openDestination(const std::string& path);
  std::optional<Error> copyMedia();
  std::optional<Error> handle(const AVPacket& packet);
  std::optional<Error> finishMedia();
  std::optional<Error> writePending(bool all);
  [[nodiscard]] bool isDone() const;
  [[nodiscard]] mp4::MovieTrack trackOf(const Output& output, uint32_t trackID) const;

  const ExportPlan plan_;
  const std::atomic<bool>& cancelled_;
  ExportRange range_;
  std::unique_ptr<MovieReader> reader_;
  std::vector<Output> outputs_;
  std::vector<std::vector<mp4::EncodedSample>> pending_;
  std::unique_ptr<mp4::MovieWriter> writer_;
};

}  // namespace qv::platform::ffmpeg
