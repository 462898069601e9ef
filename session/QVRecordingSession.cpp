#include "session/QVRecordingSession.h"

#include "platform/Log.h"
#include "support/QVTemporaryFiles.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::Error;
using platform::MediaTime;
using platform::Platform;
using platform::URL;
namespace logs = platform::logs;

QVRecordingSession::QVRecordingSession(std::string bundleID, platform::SerialQueue& sequence,
                                       QVCaptureManager& captureManager)
    : sequence_(sequence), captureManager_(captureManager), bundleID_(std::move(bundleID)) {}

QVRecordingSession::~QVRecordingSession() = default;

void QVRecordingSession::setRecording(bool recording) {
  if (recording) ++generation_;
  recording_ = recording;
}

void QVRecordingSession::startSessionWithHandler(std::function<void()> handler) {
  QV_LOG(logs::kSession, "QVRecordingSession: startSession");
  bundleIDOfFirstForegroundApp_.reset();
  paused_ = false;
  // A recording that a failure ended has left its times behind.
  resetTiming();
  reportingAgent_.store(std::make_shared<QVReportingAgent>(_serviceNameForReporting()));
  const uint64_t generation = generation_;
  auto whenReady = [self = shared_from_this(), generation, handler = std::move(handler)] {
    self->sequence_.async([self, generation, handler] { self->afterStart(generation, handler); });
  };
  if (broadcastProcessMode_ == BroadcastProcessMode::Samples) {
    notifyExtensionAndWait(BroadcastAction::Started, std::move(whenReady));
    return;
  }
  platform::Size size = windowSize_;
  if (systemRecording_) {
    QV_LOG(logs::kSession, "Before windowSize w:%f h:%f", size.width, size.height);
    if ((size.width > size.height) == isNativeScreenOrientationPortrait()) std::swap(size.width, size.height);
    QV_LOG(logs::kSession, "After windowSize w:%f h:%f", size.width, size.height);
  }
  auto writer = std::make_shared<QVMovieWriter>(size, outputPath());
  writer->setBroadcastConfig(broadcastConfiguration_.load());
  writer->setSystemRecording(systemRecording_);
  movieWriter_.store(writer);
  if (isCuttingClips()) {
    // Each clip's request removes it, so there is no movie to clean up.
    movieURL_.reset();
    beginClips();
  } else {
    movieURL_ = writer->outputURL();
  }
  writer->startWritingHandler(std::move(whenReady));
}

void QVRecordingSession::afterStart(uint64_t generation, const std::function<void()>& handler) {
  if (const auto failure = earlyBroadcastFailure_.exchange(std::nullopt); failure && hasBroadcastExtension()) {
    stopRecordingWithNotification(true, failure);
  }
  // Stopped or paused while the file was being prepared: the sources stay as they are.
  if (recording_ && !paused_ && generation_ == generation) _resumeOrStartSession();
  handler();
}

void QVRecordingSession::pauseSession() {
  if (paused_) return;
  pauseTime_.store(Platform::current().clock->hostTime());
  paused_ = true;
  QV_LOG(logs::kSession, "QVRecordingSession: pauseSession");
  stopAllCapture();
  if (hasBroadcastExtension()) _notifyExtensionOfAction(BroadcastAction::Paused, [] {});
}

void QVRecordingSession::resumeSessionWithContextID(uint32_t contextID) {
  if (!paused_) return;
  QV_LOG(logs::kSession, "QVRecordingSession: resumeSessionWithContextID:");
  contextIDs_ = {contextID};
  {
    std::lock_guard lock(shouldStopLock_);
    // A pause before the first frame leaves no stretch to close.
    sessionWasResumed_ = lastSampleTimestamp_.isValid();
  }
  paused_ = false;
  if (hasBroadcastExtension()) _notifyExtensionOfAction(BroadcastAction::Resumed, [] {});
  _resumeOrStartSession();
}

void QVRecordingSession::stopRecordingWithNotification(bool notify, const std::optional<Error>& error) {
  endRecording(notify, error);
}

bool QVRecordingSession::endRecording(bool notify, const std::optional<Error>& error) {
  const uint64_t generation = generation_;
  if (!recording_.exchange(false)) return false;
  QV_LOG(logs::kSession, "QVRecordingSession: stop");
  stopAllCapture();
  isBroadcasting_ = false;
  if (notify) {
    if (const auto delegate = delegate_.load().lock()) {
      delegate->recordingSessionStoppedWithError(shared_from_this(), generation, error);
    }
  }
  reportSummaryEvent(error ? error->code : 0);
  return true;
}

bool QVRecordingSession::takeEndReport(uint64_t generation) {
  if (generation <= reportedGeneration_) return false;
  reportedGeneration_ = generation;
  return true;
}

void QVRecordingSession::finishSessionWithHandler(FinishHandler handler) {
  finishSessionWithStartClipDuration(0, 0, std::move(handler));
}

void QVRecordingSession::finishSessionWithStartClipDuration(double startClipDuration, double endClipDuration,
                                                            FinishHandler handler) {
  if (!recording_) return;
  QV_LOG(logs::kSession, "QVRecordingSession: finishSessionWithHandler");
  // A failure on a capture thread may be quicker: then that is how the recording ended, and was reported.
  if (!endRecording(false, std::nullopt)) return;
  resetTiming();
  finishWriter(startClipDuration, endClipDuration, std::move(handler));
}

void QVRecordingSession::resetTiming() {
  std::lock_guard lock(shouldStopLock_);
  lastSampleTimestamp_ = MediaTime::invalid();
  sampleTimeOffset_ = MediaTime::zero();
  sessionWasResumed_ = false;
}

void QVRecordingSession::finishWriter(double startClipDuration, double endClipDuration, FinishHandler handler) {
  if (hasBroadcastExtension()) {
    finishBroadcast([handler = std::move(handler)] { handler(std::nullopt, std::nullopt); });
    return;
  }
  const auto writer = movieWriter_.exchange(nullptr);
  if (!writer) {
    handFinishedMovie(std::nullopt, startClipDuration, endClipDuration, handler);
    return;
  }
  writer->finishWritingWithHandler([self = shared_from_this(), startClipDuration, endClipDuration,
                                    handler = std::move(handler)](const std::optional<URL>& movie) {
    QV_LOG(logs::kSession, "QVRecordingSession: finishWritingWithHandler");
    self->handFinishedMovie(movie, startClipDuration, endClipDuration, handler);
  });
}

void QVRecordingSession::handFinishedMovie(const std::optional<URL>& movie, double startClipDuration,
                                           double endClipDuration, const FinishHandler& handler) {
  if (!movie) {
    handler(std::nullopt,
            captureRecording_ ? std::nullopt : std::optional<Error>(_qvUserErrorForCode(errorcode::kFailedToSave)));
  } else if (startClipDuration > 0 && endClipDuration > 0) {
    trimFinishedMovie(*movie, startClipDuration, endClipDuration, handler);
  } else {
    handler(movie, std::nullopt);
  }
}

void QVRecordingSession::trimFinishedMovie(const URL& movie, double startClipDuration, double endClipDuration,
                                           FinishHandler handler) {
  QV_LOG(logs::kSession, "trimming");
  auto writer = std::make_shared<QVMovieWriter>(windowSize_, movie.path());
  writer->trimMovieWithURL(movie, startClipDuration, endClipDuration, trimmedOutputURL(),
                           [movie, handler = std::move(handler)](const std::optional<URL>& trimmed) {
                             if (trimmed) {
                               QV_LOG(logs::kSession, "finished trimming");
                             } else {
                               QV_LOG_ERROR(logs::kSession, "trimming failed, handing on the untrimmed movie");
                             }
                             handler(trimmed ? trimmed : movie, std::nullopt);
                           });
}

void QVRecordingSession::completeMovieAfterFailure(uint64_t generation, std::function<void()> handler) {
  if (generation_ == generation && isBroadcastOpen()) {
    finishBroadcast(std::move(handler));
    return;
  }
  // A later recording has a writer of its own; its start has let go of the failed one's file.
  const auto writer = generation_ == generation ? movieWriter_.exchange(nullptr) : nullptr;
  if (!writer) {
    handler();
    return;
  }
  writer->finishWritingWithHandler([handler = std::move(handler)](const std::optional<URL>&) { handler(); });
}

void QVRecordingSession::finishAndCleanupSessionFilesWithHandler(std::function<void()> handler) {
  QV_LOG(logs::kSession, "QVRecordingSession: cleanupSessionFiles");
  stopRecordingWithNotification(false, std::nullopt);
  if (isBroadcastOpen()) {
    finishBroadcast(std::move(handler));
    return;
  }
  // The last recording's own file: a name made now could be another one.
  const auto writer = movieWriter_.exchange(nullptr);
  const URL movie = movieURL_.value_or(outputURL());
  const auto remove = [movie, handler = std::move(handler)] {
    _srRemoveFile(movie, [handler](const std::optional<Error>& error) {
      if (error) {
        QV_LOG_ERROR(logs::kSession, "error removing file with code: %i", static_cast<int>(error->code));
      }
      handler();
    });
  };
  if (!writer) {
    remove();
    return;
  }
  // The file is closed first, so that nothing is written after its removal.
  writer->finishWritingWithHandler([remove](const std::optional<URL>&) { remove(); });
}

void QVRecordingSession::notifyRecordingMayBeStopped() {
  if (const auto writer = movieWriter()) writer->notifyRecordingMayBeStopped();
}

void QVRecordingSession::notifyRecordingResumed() {
  if (const auto writer = movieWriter()) writer->notifyRecordingResumed();
}

bool QVRecordingSession::shouldStop() {
  std::lock_guard lock(shouldStopLock_);
  return shouldStop_;
}

}  // namespace qv
