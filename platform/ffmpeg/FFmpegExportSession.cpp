#include "platform/ffmpeg/FFmpegExportSession.h"

#include "platform/AssetWriter.h"
#include "platform/threads/Executor.h"
#include "platform/threads/Log.h"

namespace qv::platform::ffmpeg {

FFmpegMovieAsset::FFmpegMovieAsset(const URL& url) : path_(url.path()) {
  auto reader = path_.empty() ? Result<std::unique_ptr<MovieReader>>(Error::posix(EINVAL, url.absoluteString()))
                              : MovieReader::open(path_, nullptr);
  if (!reader) {
    QV_LOG_INFO(logs::kMovie, "unreadable: %s", reader.error().description().c_str());
    return;
  }
  duration_ = MediaTime::make(reader.value()->duration(), mp4::kMovieTimescale);
  for (const AVStream* stream : reader.value()->streams(AVMEDIA_TYPE_AUDIO)) {
    audioTrackIDs_.push_back(static_cast<int32_t>(stream->id));
  }
}

FFmpegExportSession::FFmpegExportSession(std::shared_ptr<MovieAsset> asset, ExportPreset preset)
    : asset_(std::move(asset)), preset_(preset) {}

std::optional<Error> FFmpegExportSession::error() const {
  std::lock_guard lock(mutex_);
  return error_;
}

std::optional<Error> FFmpegExportSession::run() {
  const auto* asset = dynamic_cast<const FFmpegMovieAsset*>(asset_.get());
  if (asset == nullptr || asset->path().empty()) return mp4::movieError(mp4::kMovieNotReadable, "no movie to export");
  if (fileType_ != kFileTypeMPEG4) return Error::posix(ENOTSUP, fileType_);
  const std::string destination = outputURL_.path();
  if (destination.empty() || destination == asset->path()) return Error::posix(EINVAL, outputURL_.absoluteString());
  return MovieExport({asset->path(), destination, preset_, range_}, cancelled_).run();
}

void FFmpegExportSession::exportAsynchronously(std::function<void()> completion) {
  auto expected = ExportStatus::Unknown;
  if (!status_.compare_exchange_strong(expected, ExportStatus::Waiting)) return;
  globalQueue().post([self = shared_from_this(), completion = std::move(completion)] {
    self->status_.store(ExportStatus::Exporting);
    const auto error = self->run();
    {
      std::lock_guard lock(self->mutex_);
      self->error_ = error;
    }
    const bool isCancelled = error && self->cancelled_.load();
    self->status_.store(isCancelled ? ExportStatus::Cancelled : error ? ExportStatus::Failed : ExportStatus::Completed);
    completion();
  });
}

}  // namespace qv::platform::ffmpeg
