#include "daemon/RecordingNotices.h"

#include <utility>

namespace qv {

namespace {
constexpr const char kOwnStatusBar[] = "ownStatusBar";
}

void RecordingNotices::recordingStarted(const std::shared_ptr<QVRecording>& recording) {
  const platform::Platform& platform = context_->platform;
  const bool hasOwnStatusBar = platform.deviceInfo->booleanProperty(kOwnStatusBar);
  for (const auto& client : connectedClients()) client->updateScreenRecordingState(true);
  indicator_ = RecordingIndicator::show(context_, hasOwnStatusBar ? nullptr : platform.statusBar, recording,
                                        {.timeChanged =
                                             [weakSelf = weak_from_this()](const std::string& time) {
                                               const auto self = weakSelf.lock();
                                               if (!self) return;
                                               for (const auto& client : self->connectedClients())
                                                 client->recordingTimerDidUpdate(time);
                                             },
                                         .stop = stop_});
}

void RecordingNotices::recordingWillStop(const QVRecording& recording) {
  if (!indicator_ || !indicator_->isOf(recording)) return;
  indicator_.reset();
  for (const auto& client : connectedClients()) client->updateScreenRecordingState(false);
}

void RecordingNotices::systemClientConnected(const std::shared_ptr<QVClientProxy>& client) {
  (void)connectedClients();  // those that have gone are forgotten
  clients_.push_back(client);
  if (!indicator_) return;
  client->updateScreenRecordingState(true);
  if (!indicator_->time().empty()) client->recordingTimerDidUpdate(indicator_->time());
}

std::vector<std::shared_ptr<QVClientProxy>> RecordingNotices::connectedClients() {
  std::vector<std::shared_ptr<QVClientProxy>> connected;
  std::erase_if(clients_, [&](const std::weak_ptr<QVClientProxy>& weak) {
    const auto client = weak.lock();
    if (!client || !client->connection()) return true;
    connected.push_back(client);
    return false;
  });
  return connected;
}

}  // namespace qv
