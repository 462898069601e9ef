#include "session/QVRecordingSession.h"

#include <utility>

#include "session/RecordingOutputs.h"

namespace qv {

using platform::Dictionary;
using platform::Error;
using platform::URL;

QVRecordingSession::QVRecordingSession(std::string bundleID, uid_t userIdentifier,
                                       std::shared_ptr<RecordingContext> context)
    : bundleID_(std::move(bundleID)), userIdentifier_(userIdentifier), context_(std::move(context)) {}

QVRecordingSession::~QVRecordingSession() = default;

std::shared_ptr<QVRecording> QVRecordingSession::beginRecording(RecordingSettings settings, StartAnswer answer) {
  systemRecording_ = settings.systemRecording;
  microphoneEnabled_ = settings.microphoneEnabled;
  recording_ = std::make_shared<QVRecording>(context_, std::move(settings), std::move(answer), weak_from_this());
  recording_->setOutput(
      makeRecordingOutput(context_, recording_->settings(), outputEvents(recording_), [weakSelf = weak_from_this()] {
        const auto self = weakSelf.lock();
        return self ? self->clientProxy() : nullptr;
      }));
  return recording_;
}

/// An output speaks for its own recording: what comes late finds that one gone, not the next.
OutputEvents QVRecordingSession::outputEvents(const std::shared_ptr<QVRecording>& recording) {
  OutputEvents events;
  const std::weak_ptr<QVRecording> weakRecording = recording;
  events.failed = [weakRecording](const Error& error) {
    if (const auto to = weakRecording.lock()) to->fail(error);
  };
  events.serviceInfoReceived = [weakSelf = weak_from_this(), weakRecording,
                                context = context_](const Dictionary& serviceInfo) {
    if (weakRecording.expired()) return;
    context->sequence.async(weakSelf, [serviceInfo](QVRecordingSession& self) {
      const auto delegate = self.delegate_.load().lock();
      if (delegate) delegate->broadcastSessionDidUpdateServiceInfo(self.shared_from_this(), serviceInfo);
    });
  };
  events.broadcastURLReceived = [weakSelf = weak_from_this(), weakRecording](const URL& broadcastURL) {
    const auto self = weakRecording.expired() ? nullptr : weakSelf.lock();
    const auto client = self ? self->clientProxy() : nullptr;
    if (client) client->updateBroadcastURL(broadcastURL);
  };
  return events;
}

void QVRecordingSession::setMicrophoneEnabled(bool enabled) {
  microphoneEnabled_ = enabled;
  if (isRecording()) recording_->setMicrophoneEnabled(enabled);
}

void QVRecordingSession::recordingWillEnd(const std::shared_ptr<QVRecording>& recording) {
  if (const auto delegate = delegate_.load().lock()) delegate->recordingSessionWillStop(shared_from_this(), recording);
}

void QVRecordingSession::recordingStopped(const std::shared_ptr<QVRecording>&, const Error& error,
                                          const std::optional<URL>& movie) {
  if (const auto delegate = delegate_.load().lock()) {
    delegate->recordingSessionStoppedWithError(shared_from_this(), error, movie);
  }
}

void QVRecordingSession::recordingDidEnd(const std::shared_ptr<QVRecording>& recording) {
  if (recording_ == recording) recording_.reset();
  if (const auto delegate = delegate_.load().lock()) delegate->recordingSessionDidStop(shared_from_this(), recording);
}

void QVRecordingSession::recordingDidUpdateDuration(double seconds) {
  if (const auto delegate = delegate_.load().lock()) delegate->broadcastSessionDidUpdateDuration(*this, seconds);
}

}  // namespace qv
