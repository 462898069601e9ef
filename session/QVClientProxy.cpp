#include "session/QVClientProxy.h"

#include "platform/threads/Log.h"

namespace qv {

namespace logs = platform::logs;

namespace {

bool isDrop(const platform::Error& error) {
  return error.domain == platform::kIPCErrorDomain &&
         error.code == static_cast<int64_t>(platform::IPCErrorCode::MessageDropped);
}

}  // namespace

QVClientProxy::QVClientProxy(const QuorvelErrors& errors, std::string bundleIdentifier,
                             const std::shared_ptr<platform::IPCConnection>& connection)
    : errors_(errors), bundleIdentifier_(std::move(bundleIdentifier)), connection_(connection) {}

void QVClientProxy::send(OutgoingCall call, const char* failureLine, const std::shared_ptr<platform::RareLog>& failures,
                         const std::shared_ptr<std::atomic<uint64_t>>& dropped) {
  const auto target = connection();
  if (!target) return;
  const auto failed = [failureLine, failures, dropped](const platform::Error& error) {
    if (dropped && isDrop(error)) ++*dropped;
    const auto number = failures ? failures->count() : std::optional<uint64_t>(1);
    if (!number) return;
    std::string line = failureLine;
    line.replace(line.find("%d"), 2, std::to_string(static_cast<int>(error.code)));
    if (*number > 1) line += " (" + std::to_string(*number) + " times)";
    QV_LOG_ERROR(logs::kDaemon, "%s", line.c_str());
  };
  target->call(call.member, std::move(call.arguments), nullptr, failed);
}

void QVClientProxy::updateScreenRecordingState(bool recording) {
  QV_LOG(logs::kDaemon, "QVClientProxy:updateScreenRecordingState:");
  send(callback::UpdateScreenRecordingState{recording},
       "QVClientProxy:updateScreenRecordingState: error getting remote proxy: %d");
}

void QVClientProxy::stopRecordingWithError(const std::optional<platform::Error>& error,
                                           const std::optional<platform::URL>& movieURL) {
  QV_LOG(logs::kDaemon, "QVClientProxy:stopRecordingWithError:movieURL:");
  send(callback::StopRecordingWithError{errors_.encoded(error), movieURL.value_or(platform::URL())},
       "QVClientProxy:recordingDidStopWithError: error getting remote proxy: %d");
}

void QVClientProxy::updateBroadcastServiceInfo(const platform::Dictionary& serviceInfo) {
  QV_LOG(logs::kDaemon, "QVClientProxy:updateBroadcastServiceInfo:");
  send(callback::UpdateBroadcastServiceInfo{serviceInfo},
       "QVClientProxy:updateBroadcastServiceInfo: error getting remote proxy: %d");
}

void QVClientProxy::updateBroadcastURL(const platform::URL& broadcastURL) {
  QV_LOG(logs::kDaemon, "QVClientProxy:updateBroadcastURL:");
  send(callback::UpdateBroadcastURL{broadcastURL}, "QVClientProxy:updateBroadcastURL: error getting remote proxy: %d");
}

void QVClientProxy::captureHandlerWithSample(const PictureMessage& picture,
                                             const std::shared_ptr<std::atomic<uint64_t>>& dropped) {
  QV_LOG_DEBUG(logs::kDaemon, "QVClientProxy:captureHandlerWithSample:");
  send(captureCallOf(picture), "QVClientProxy:captureHandlerWithSample: error getting remote proxy: %d", lostFrames_,
       dropped);
}

void QVClientProxy::captureHandlerWithAudioSample(SoundMessage sound) {
  QV_LOG_DEBUG(logs::kDaemon, "QVClientProxy:captureHandlerWithAudioSample:");
  send(captureCallOf(std::move(sound)), "QVClientProxy:captureHandlerWithAudioSample: error getting remote proxy: %d",
       lostSound_);
}

void QVClientProxy::captureTimelineDidChange(platform::MediaTime pauses) {
  QV_LOG(logs::kDaemon, "QVClientProxy:captureTimelineDidChange:");
  send(timelineCallOf(pauses), "QVClientProxy:captureTimelineDidChange: error getting remote proxy: %d");
}

void QVClientProxy::recordingLockInterrupted(const platform::Error& error) {
  QV_LOG(logs::kDaemon, "QVClientProxy:recordingLockInterrupted:");
  send(callback::RecordingLockInterrupted{errors_.encoded(error)},
       "QVClientProxy:recordingLockInterrupted: error getting remote proxy: %d");
}

void QVClientProxy::recordingTimerDidUpdate(const std::string& time) {
  QV_LOG_DEBUG(logs::kDaemon, "QVClientProxy:recordingTimerDidUpdate:");
  send(callback::RecordingTimerDidUpdate{time},
       "QVClientProxy:recordingTimerDidUpdate: error getting remote proxy: %d");
}

}  // namespace qv
