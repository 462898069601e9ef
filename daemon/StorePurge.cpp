#include "daemon/StorePurge.h"

#include "platform/threads/Log.h"

namespace qv {

namespace logs = platform::logs;

namespace {
constexpr double kTimeToLive = 86400.0;  // seconds
}  // namespace

int64_t StorePurge::purgeableSpace() {
  QV_LOG(logs::kDaemon, "QVRecordingManager: cache delete purgeable space callback");
  std::optional<platform::Error> error;
  return context_->files._srSizeOfTempDir(&error);
}

int64_t StorePurge::purge(int32_t urgency) {
  QV_LOG(logs::kDaemon, "QVRecordingManager: cache delete purge callback");
  if (urgency >= kUrgencyRemovesMovies) {
    recordings_.endAndRemove();
    return context_->movies->deleteAllTempFiles();
  }
  const bool wasRecording = recordings_.isAnyRecording();
  if (urgency >= kUrgencyEndsRecordings && !context_->space._srDeviceHasSufficientFreeSpaceToContinueRecording()) {
    recordings_.endKeepingMovies();
  }
  // Only a recording that stopped while it was looked at leaves files that may go.
  if (!wasRecording || recordings_.isAnyRecording()) return 0;
  return context_->movies->deleteFilesOlderThanTimeToLiveInSeconds(kTimeToLive);
}

int64_t StorePurge::purgePeriodically() {
  QV_LOG(logs::kDaemon, "QVRecordingManager: cache delete periodic callback");
  return context_->movies->deleteFilesOlderThanTimeToLiveInSeconds(kTimeToLive);
}

}  // namespace qv
