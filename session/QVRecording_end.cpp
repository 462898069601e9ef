#include <utility>

#include "platform/threads/Log.h"
#include "session/QVRecording.h"
#include "support/QVDiskSpace.h"
#include "support/QuorvelErrors.h"
#include "writer/QVMovieWriter.h"

namespace qv {

using platform::Error;
using platform::URL;
namespace logs = platform::logs;

bool QVRecording::end(RecordingEnd end) {
  {
    std::lock_guard lock(shouldStopLock_);
    if (state_ >= State::Ending) return false;
    if (state_ == State::Running && !timing_.isInPause()) stoppedAt_ = context_->platform.clock->hostTime();
    state_ = State::Ending;
    end_ = std::move(end);
    // Whoever is to be told stays until the end is complete.
    endObserver_ = observer_.lock();
  }
  context_->sequence.async([self = shared_from_this()] { self->beginEnd(); });
  return true;
}

void QVRecording::finishSessionWithStartClipDuration(double startClipDuration, double endClipDuration,
                                                     RecordingEnd::Handler handler) {
  end({.movie = moviefate::handTo(settings_.owner),
       .handler = std::move(handler),
       .startClipDuration = startClipDuration,
       .endClipDuration = endClipDuration});
}

void QVRecording::finishAndCleanupSessionFiles(const std::optional<Error>& cause) {
  end({.cause = cause, .movie = moviefate::remove()});
}

void QVRecording::fail(const Error& error) {
  // What a disk has taken is the client's, whatever it takes no more.
  const bool isOfDisk = error.domain == kQVRecordingErrorDomain &&
                        (error.code == errorcode::kInsufficientStorage || error.code == errorcode::kFailedToSave);
  end({.cause = error,
       .endReason = error.code,
       .movie = isOfDisk ? moviefate::handTo(settings_.owner) : moviefate::keep()});
}

void QVRecording::beginEnd() {
  if (endObserver_) endObserver_->recordingWillEnd(shared_from_this());
  QV_LOG(logs::kSession, "QVRecordingSession: stop");
  std::unique_ptr<RecordingSources> sources;
  platform::MediaTime endTime;
  {
    std::lock_guard lock(shouldStopLock_);
    sources = std::move(sources_);
    endTime = timing_.endTime(stoppedAt_);
  }
  stopAllCapture(std::move(sources));
  if (!reportingAgent_) {
    completeEnd(std::nullopt, std::nullopt);
    return;
  }
  reportSummaryEvent();
  QV_LOG(logs::kSession, "QVRecordingSession: finishSessionWithHandler");
  output_->finish(endTime, [self = shared_from_this()](const OutputResult& result) {
    self->context_->sequence.async([self, result] { self->outputFinished(result); });
  });
}

/// A client that does not know yet that it records cannot ask for the movie.
void QVRecording::outputFinished(const OutputResult& result) {
  if (!answer_.isGiven()) end_.movie = moviefate::remove();
  // A stop that says success means a whole movie.
  std::optional<Error> loss;
  if (result.failure) {
    QV_LOG_ERROR(logs::kSession, "the recording was not kept whole: %s", result.failure->description().c_str());
    loss = errorOfFailedWrite(result.failure);
  }
  if (!result.movie) {
    if (output_->makesMovie() && !loss) loss = recordingError(errorcode::kFailedToSave);
    completeEnd(std::nullopt, loss);
  } else if (!loss && end_.startClipDuration > 0 && end_.endClipDuration > 0) {
    trimMovie(result.movie);
  } else {
    disposeOfMovie(result, loss);
  }
}

Error QVRecording::errorOfFailedWrite(const std::optional<Error>& failure) const {
  const bool isDiskFull =
      isLackOfSpace(failure) || !context_->space._srDeviceHasSufficientFreeSpaceToContinueRecording();
  return recordingError(isDiskFull ? errorcode::kInsufficientStorage : errorcode::kFailedToSave);
}

/// The untrimmed movie goes when the trimmed one is known to be there.
void QVRecording::trimMovie(const std::shared_ptr<MovieClaim>& movie) {
  QV_LOG(logs::kSession, "trimming");
  const auto trimmed =
      context_->movies->claimTrimmed(context_->names.trimmedOutputPath(settings_.bundleID), settings_.owner);
  auto writer = std::make_shared<QVMovieWriter>(context_->platform, settings_.windowSize, movie->path());
  writer->trimMovieWithURL(
      movie->url(), end_.startClipDuration, end_.endClipDuration, trimmed->url(),
      [self = shared_from_this(), movie, trimmed](const std::optional<URL>& url) {
        self->context_->sequence.async([self, movie, trimmed, isTrimmed = url && trimmed->hasFile()] {
          if (isTrimmed) {
            QV_LOG(logs::kSession, "finished trimming");
            movie->remove(nullptr);
          } else {
            QV_LOG_ERROR(logs::kSession, "trimming failed, handing on the untrimmed movie");
            trimmed->remove(nullptr);
          }
          self->disposeOfMovie({isTrimmed ? trimmed : movie}, std::nullopt);
        });
      });
}

void QVRecording::disposeOfMovie(const OutputResult& made, const std::optional<Error>& loss) {
  const auto dispose = std::exchange(end_.movie, nullptr);
  dispose(made, [self = shared_from_this(), loss](const std::optional<URL>& url) {
    self->context_->sequence.async([self, url, loss] { self->completeEnd(url, loss); });
  });
}

void QVRecording::completeEnd(const std::optional<URL>& movie, const std::optional<Error>& error) {
  if (const auto handler = std::exchange(end_.handler, nullptr)) {
    handler(movie, error);
  } else {
    report(movie);
  }
  output_.reset();
  transaction_.reset();
  {
    std::lock_guard lock(shouldStopLock_);
    state_ = State::Ended;
  }
  if (const auto observer = std::exchange(endObserver_, nullptr)) observer->recordingDidEnd(shared_from_this());
  for (const auto& work : std::exchange(whenAnswered_, {})) work();
  for (const auto& work : std::exchange(whenEnded_, {})) work();
}

void QVRecording::report(const std::optional<URL>& movie) {
  if (!answer_.isGiven()) {
    answer_.refused(end_.cause.value_or(recordingError(errorcode::kInterrupted)));
  } else if (end_.cause) {
    if (endObserver_) endObserver_->recordingStopped(shared_from_this(), *end_.cause, movie);
  }
}

void QVRecording::whenEnded(std::function<void()> work) {
  if (state() == State::Ended) {
    work();
  } else {
    whenEnded_.push_back(std::move(work));
  }
}

std::string QVRecording::_serviceNameForReporting() const {
  if (settings_.systemRecording) return settings_.broadcast ? "SystemBroadcast" : "SystemRecording";
  if (settings_.broadcast) return "InAppBroadcast";
  return settings_.captureEnabled ? "InAppCapture" : "InAppRecording";
}

uint64_t QVRecording::getRecordedFileSize() const {
  if (!output_->makesMovie()) return 0;
  const auto attributes = context_->platform.fileSystem->attributesOfItem(output_->moviePath());
  if (!attributes) {
    QV_LOG_ERROR(logs::kSession, "error getting recordedFileSize :%ld", static_cast<long>(attributes.error().code));
    return 0;
  }
  QV_LOG(logs::kSession, "recordedFileSize for URL %lu bytes", static_cast<unsigned long>(attributes.value().size));
  return attributes.value().size;
}

bool QVRecording::writesMovies() const {
  if (settings_.broadcast) return settings_.broadcast->info.extensionProcessMode == BroadcastProcessMode::MovieClips;
  return !settings_.captureEnabled;
}

void QVRecording::reportSummaryEvent() {
  reportingAgent_->setRecordedFileSize(getRecordedFileSize());
  reportingAgent_->setEndReason(end_.endReason);
  reportingAgent_->setDroppedPictures(output_->counts().droppedPictures);
  reportingAgent_->reportEventWithType(QVReportingAgent::kSessionSummaryEvent,
                                       reportingAgent_->collectSummaryEventMetrics());
}

}  // namespace qv
