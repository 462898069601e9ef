#include "daemon/QVRecordingManager.h"
#include "platform/Log.h"

namespace qv {

namespace logs = platform::logs;

namespace {
constexpr uint32_t kRecordingBeginsSound = 1117;
constexpr uint32_t kRecordingEndsSound = 1118;
}  // namespace

void QVRecordingManager::clearSystemRecordingUI(const Session& session) {
  if (!session->isSystemRecording()) return;
  QV_LOG(logs::kDaemon, "stop monitoring foreground apps");
  applicationStateMonitor_->setHandler(nullptr);
}

/// Where the region, or a user who does not see the screen, asks for a sound.
void QVRecordingManager::checkAndPlaySystemRecordSound(const Session& session, bool isRecordingOn) {
  if (!session->isSystemRecording()) return;
  if (!platform_.deviceInfo->booleanProperty("RegionalBehaviorShutterClick") && !platform_.screenReader->isRunning()) {
    return;
  }
  platform_.sounds->play(isRecordingOn ? kRecordingBeginsSound : kRecordingEndsSound);
}

}  // namespace qv
