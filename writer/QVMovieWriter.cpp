#include "writer/QVMovieWriter.h"

#include <cerrno>

#include "platform/threads/Log.h"

namespace qv {

using platform::AssetWriterStatus;
using platform::MediaTime;
using platform::SampleBufferRef;
using platform::URL;
namespace logs = platform::logs;

QVMovieWriter::QVMovieWriter(const platform::Platform& platform, platform::Size windowSize, std::string outputPath)
    : platform_(platform),
      files_(platform),
      windowSize_(windowSize),
      outputPath_(std::move(outputPath)),
      movieWriterQueue_("com.tarnwick.Quorvel.QVMovieWriterQueue", *platform.globalQueue) {}

void QVMovieWriter::setBroadcastConfig(std::optional<QVBroadcastConfiguration> configuration) {
  broadcastConfig_ = std::move(configuration);
}

void QVMovieWriter::startWritingHandler(std::function<void()> handler) {
  movieWriterQueue_.async(
      [self = shared_from_this(), handler = std::move(handler)] { self->dispatchedStartWritingHandler(handler); });
}

void QVMovieWriter::dispatchedStartWritingHandler(const std::function<void()>& handler) {
  QV_LOG(logs::kWriter, "QVMovieWriter: startWritingHandler");
  files_._srRemoveFile(outputURL(), [self = shared_from_this(), handler](const auto&) {
    // On the writer's queue, so that a finish which came meanwhile cannot overlap.
    self->movieWriterQueue_.sync([&] { self->dispatchedSetupAssetWriter(); });
    if (handler) handler();
  });
}

void QVMovieWriter::setupAssetWriter() {
  movieWriterQueue_.sync([this] { dispatchedSetupAssetWriter(); });
}

bool QVMovieWriter::appendVideoSampleBuffer(const SampleBufferRef& sample, const platform::AffineTransform& transform) {
  return movieWriterQueue_.syncResult<bool>([&] { return dispatchedAppendVideoSampleBuffer(sample, transform); });
}

void QVMovieWriter::appendAudio1SampleBuffer(const SampleBufferRef& sample) {
  movieWriterQueue_.sync([&] { dispatchedAppendAudio1SampleBuffer(sample); });
}

void QVMovieWriter::appendAudio2SampleBuffer(const SampleBufferRef& sample) {
  movieWriterQueue_.sync([&] { dispatchedAppendAudio2SampleBuffer(sample); });
}

void QVMovieWriter::finishWritingWithHandler(FinishHandler handler) {
  movieWriterQueue_.async([self = shared_from_this(), handler = std::move(handler)]() mutable {
    self->dispatchedFinishWritingWithHandler(std::move(handler));
  });
}

void QVMovieWriter::notifyRecordingMayBeStopped() {
  trimVideoPresentationTime_.store(video_.lastPresentationTime.load());
}

void QVMovieWriter::notifyRecordingResumed() { trimVideoPresentationTime_.store(MediaTime::invalid()); }

AssetWriterStatus QVMovieWriter::status() const {
  return assetWriter_ ? assetWriter_->status() : AssetWriterStatus::Unknown;
}

void QVMovieWriter::noteFailure(const std::optional<platform::Error>& error) {
  failure_.with([&](auto& failure) {
    if (!failure) failure = error;
  });
}

void QVMovieWriter::dispatchedFinishWritingWithHandler(FinishHandler handler) {
  if (isFinishingWriting_) return;
  isFinishingWriting_ = true;
  video_.queue.reset();
  audio1_.queue.reset();
  audio2_.queue.reset();
  QV_LOG(logs::kWriter, "QVMovieWriter: finishWritingWithHandler: status = %i", static_cast<int>(status()));
  if (!didProcessFirstSample_) {
    QV_LOG(logs::kWriter, "QVMovieWriter: finishWritingWithHandler: first sample buffer was not processed or appended");
    if (handler) handler(std::nullopt);
  } else if (status() != AssetWriterStatus::Writing) {
    finishNotWriting(handler);
  } else {
    finishFile(std::move(handler));
  }
}

void QVMovieWriter::finishNotWriting(const FinishHandler& handler) {
  std::optional<URL> url;
  if (assetWriter_) {
    QV_LOG(logs::kWriter, "not writing, returning video url set on assetwriter (most likely nil)");
    const auto error = assetWriter_->error();
    QV_LOG_ERROR(logs::kWriter, "asset writer error = %i", error ? static_cast<int>(error->code) : 0);
    url = assetWriter_->outputURL();
    lookAtFile();
  }
  if (handler) handler(url);
}

void QVMovieWriter::finishFile(FinishHandler handler) {
  MediaTime end = trimVideoPresentationTime_.exchange(MediaTime::invalid());
  if (!end.isValid()) end = endTime_.load();
  if (end.isValid()) assetWriter_->endSessionAtSourceTime(end);
  assetWriter_->finishWriting([self = shared_from_this(), handler = std::move(handler)]() mutable {
    // Goes on on the writer's queue, so that the last reference never ends on the file's own thread.
    auto& queue = self->movieWriterQueue_;
    queue.async([self = std::move(self), handler = std::move(handler)] {
      const URL url = self->assetWriter_->outputURL();
      self->lookAtFile();
      if (handler) handler(url);
    });
  });
}

/// A success is what the file shows. Without a writer, which holds the file, it can be looked at.
void QVMovieWriter::lookAtFile() {
  const bool isCompleted = status() == AssetWriterStatus::Completed;
  noteFailure(assetWriter_->error());
  assetWriter_.reset();
  const auto state = platform_.movieSalvage->stateOfMovie(outputPath_);
  isSound_ = isCompleted && state && state.value() == platform::MovieState::Finished;
  if (!isSound_) noteFailure(state ? platform::Error::posix(EIO, outputPath_) : state.error());
  isThere_ = isSound_ || keepRest();
}

/// Makes the most of what was written before the failure. False where there is nothing.
bool QVMovieWriter::keepRest() {
  const auto failure = failure_.load();
  QV_LOG_ERROR(logs::kWriter, "the movie could not be completed: %s", failure->description().c_str());
  // Whatever is at the path now is another file.
  if (failure->domain == platform::kPosixErrorDomain && failure->code == ENOENT) return false;
  const auto length = platform_.movieSalvage->salvageMovie(outputPath_);
  if (!length) {
    QV_LOG_ERROR(logs::kWriter, "the movie stays as it is: %s", length.error().description().c_str());
    return true;
  }
  return length.value() != MediaTime::zero();
}

}  // namespace qv
