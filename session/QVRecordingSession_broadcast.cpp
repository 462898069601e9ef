#include "platform/Log.h"
#include "session/QVRecordingSession.h"

namespace qv {

namespace logs = platform::logs;

void QVRecordingSession::setBroadcastConfiguration(std::optional<QVBroadcastConfiguration> configuration) {
  broadcastConfiguration_ = std::move(configuration);
}

void QVRecordingSession::disableBroadcast() {
  QV_LOG(logs::kSession, "QVRecordingSession: disableBroadcast");
  broadcastConfiguration_.reset();
  broadcastProcessMode_ = BroadcastProcessMode::MovieClips;
}

void QVRecordingSession::_notifyExtensionOfAction(int64_t, const std::function<void()>& completion) {
  if (broadcastProcessMode_ == BroadcastProcessMode::Samples) {
    QV_LOG(logs::kSession, "no broadcast extension found!");
  }
  completion();
}

}  // namespace qv
