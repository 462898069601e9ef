#include "session/QVRecording.h"

#include <algorithm>
#include <utility>

#include "platform/threads/Log.h"

namespace qv {

using platform::Error;
namespace logs = platform::logs;

QVRecording::QVRecording(std::shared_ptr<RecordingContext> context, RecordingSettings settings, StartAnswer answer,
                         std::weak_ptr<QVRecordingObserver> observer)
    : context_(std::move(context)),
      settings_(std::move(settings)),
      observer_(std::move(observer)),
      microphoneEnabled_(settings_.microphoneEnabled),
      answer_(std::move(answer)),
      contextIDs_(settings_.contextIDs) {
  QV_LOG(logs::kDaemon, "starting...");
  transaction_.emplace(*context_->platform.keepAlive);
}

QVRecording::~QVRecording() = default;

QVRecording::State QVRecording::state() const {
  std::lock_guard lock(shouldStopLock_);
  return state_;
}

bool QVRecording::microphoneEnabled() const {
  std::lock_guard lock(shouldStopLock_);
  return microphoneEnabled_;
}

int32_t QVRecording::frontmostPIDForAudioTap() const {
  std::lock_guard lock(shouldStopLock_);
  return frontmostPIDForAudioTap_;
}

RecordingFigures QVRecording::figures() const {
  RecordingFigures figures{.since = since_, .output = output_->counts()};
  if (reportingAgent_) figures.pictures = reportingAgent_->videoFrameCount();
  const auto attributes = context_->platform.fileSystem->attributesOfItem(output_->moviePath());
  if (attributes) figures.bytes = attributes.value().size;
  std::lock_guard lock(shouldStopLock_);
  figures.recorded = timing_.recorded(firstSampleTimestamp_);
  return figures;
}

double QVRecording::recordedSeconds() const {
  std::lock_guard lock(shouldStopLock_);
  const bool goesOn = state_ == State::Running && !timing_.isInPause();
  const auto end = timing_.endTime(goesOn ? context_->platform.clock->hostTime() : stoppedAt_);
  return end.isValid() ? std::max(0.0, (end - firstSampleTimestamp_).seconds()) : 0;
}

void QVRecording::prepare(std::function<void()> handler) {
  output_->prepare([weakSelf = weak_from_this(), handler = std::move(handler)](const std::optional<Error>& error) {
    const auto self = weakSelf.lock();
    if (!self) return;
    self->context_->sequence.async([self, handler, error] {
      if (error) self->fail(*error);
      if (self->isRecording()) handler();
    });
  });
}

void QVRecording::startSessionWithHandler(int32_t processID, std::function<void()> handler) {
  if (!isRecording()) return;
  QV_LOG(logs::kSession, "QVRecordingSession: startSession");
  reportingAgent_ = std::make_unique<QVReportingAgent>(_serviceNameForReporting(), *context_->platform.metrics);
  since_ = context_->platform.clock->now();
  {
    std::lock_guard lock(shouldStopLock_);
    frontmostPIDForAudioTap_ = processID;
  }
  output_->start([weakSelf = weak_from_this(), handler = std::move(handler)](const std::optional<Error>& error) {
    const auto self = weakSelf.lock();
    if (self) self->context_->sequence.async([self, error, handler] { self->outputStarted(error, handler); });
  });
}

void QVRecording::outputStarted(const std::optional<Error>& error, const std::function<void()>& handler) {
  if (error) fail(*error);
  if (!isRecording()) return;
  updateBundleIdForFirstForegroundApp();
  _resumeOrStartSession();
  handler();
}

void QVRecording::answerStarted(RecordedInputs inputs) {
  answer_.started(inputs);
  for (const auto& work : std::exchange(whenAnswered_, {})) work();
}

void QVRecording::whenAnswered(std::function<void()> work) {
  if (answer_.isGiven()) {
    work();
  } else {
    whenAnswered_.push_back(std::move(work));
  }
}

void QVRecording::pauseSession() {
  std::unique_ptr<RecordingSources> sources;
  {
    std::lock_guard lock(shouldStopLock_);
    if (state_ != State::Running) return;
    state_ = State::Paused;
    // A pause that no picture has closed goes on.
    if (!timing_.isInPause()) stoppedAt_ = context_->platform.clock->hostTime();
    sources = std::move(sources_);
  }
  QV_LOG(logs::kSession, "QVRecordingSession: pauseSession");
  stopAllCapture(std::move(sources));
  output_->pause();
}

void QVRecording::resumeSessionWithContextID(uint32_t contextID) {
  if (state() != State::Paused) return;
  QV_LOG(logs::kSession, "QVRecordingSession: resumeSessionWithContextID:");
  contextIDs_ = {contextID};
  output_->resume();
  _resumeOrStartSession();
}

void QVRecording::sessionReportCameraUsage(int32_t cameraPosition) {
  if (reportingAgent_) reportingAgent_->setCameraUsed(cameraPosition);
}

}  // namespace qv
