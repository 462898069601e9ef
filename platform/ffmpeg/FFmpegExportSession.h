#pragma once

#include <atomic>
#include <memory>
#include <mutex>

#include "platform/ExportSession.h"
#include "platform/ffmpeg/MovieExport.h"

namespace qv::platform::ffmpeg {

/// A movie file, looked into when it is opened and not kept open.
///
/// Threading: immutable, so thread-safe.
class FFmpegMovieAsset final : public MovieAsset {
 public:
  explicit FFmpegMovieAsset(const URL& url);
  [[nodiscard]] MediaTime duration() const override { return duration_; }
  [[nodiscard]] std::vector<int32_t> audioTrackIDs() const override { return audioTrackIDs_; }
  [[nodiscard]] const std::string& path() const { return path_; }

 private:
  const std::string path_;
  MediaTime duration_ = MediaTime::zero();
  std::vector<int32_t> audioTrackIDs_;
};

/// Exports on a thread of the global queue.
///
/// Threading: as ExportSession.
class FFmpegExportSession final : public ExportSession, public std::enable_shared_from_this<FFmpegExportSession> {
 public:
  FFmpegExportSession(std::shared_ptr<MovieAsset> asset, ExportPreset preset);

  void setOutputURL(const URL& url) override { outputURL_ = url; }
  void setOutputFileType(const std::string& fileType) override { fileType_ = fileType; }
  void setTimeRange(const MediaTimeRange& range) override { range_ = range; }
  /// Every track is mixed at its unchanged level, which is all that the parameters can say.
  void setAudioMix(std::vector<AudioMixInputParameters>) override {}
  void exportAsynchronously(std::function<void()> completion) override;
  void cancel() override { cancelled_.store(true); }
  [[nodiscard]] ExportStatus status() const override { return status_.load(); }
  [[nodiscard]] std::optional<Error> error() const override;
  [[nodiscard]] const URL& outputURL() const override { return outputURL_; }

 private:
  std::optional<Error> run();

  const std::shared_ptr<MovieAsset> asset_;
  const ExportPreset preset_;
  URL outputURL_;
  std::string fileType_;
  MediaTimeRange range_;
  std::atomic<bool> cancelled_{false};
  std::atomic<ExportStatus> status_{ExportStatus::Unknown};
  mutable std::mutex mutex_;
  std::optional<Error> error_;
};

}  // namespace qv::platform::ffmpeg
