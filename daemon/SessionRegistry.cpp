#include "daemon/SessionRegistry.h"

#include <algorithm>
#include <utility>

#include "platform/threads/Log.h"

namespace qv {

namespace logs = platform::logs;

namespace {
bool isLiving(const QVRecordingSession& session) {
  const auto proxy = session.clientProxy();
  return (proxy && proxy->connection()) || session.recording();
}

bool isOver(const std::weak_ptr<QVRecording>& recording) {
  const auto living = recording.lock();
  return !living || living->state() == QVRecording::State::Ended;
}
}  // namespace

SessionRegistry::Session SessionRegistry::recordingSessionForBundleID(const std::optional<std::string>& bundleID,
                                                                      uid_t user) {
  QV_LOG(logs::kDaemon, "QVRecordingManager:recordingSessionForBundleID");
  if (!bundleID) return nullptr;
  if (Session known = find(bundleID); known && known->userIdentifier() == user) return known;
  QV_LOG(logs::kDaemon, "no session, creating a new one");
  auto session = std::make_shared<QVRecordingSession>(*bundleID, user, context_);
  bundleIDToRecordingSessionLookup_.insert_or_assign(*bundleID, session);
  return session;
}

SessionRegistry::Session SessionRegistry::livingOfAnotherUser(const std::optional<std::string>& bundleID,
                                                              uid_t user) const {
  Session session = find(bundleID);
  return session && session->userIdentifier() != user && isLiving(*session) ? session : nullptr;
}

SessionRegistry::Session SessionRegistry::find(const std::optional<std::string>& bundleID) const {
  if (!bundleID) return nullptr;
  const auto found = bundleIDToRecordingSessionLookup_.find(*bundleID);
  return found == bundleIDToRecordingSessionLookup_.end() ? nullptr : found->second;
}

void SessionRegistry::removeSessionForBundleID(const std::string& bundleID) {
  QV_LOG(logs::kDaemon, "QVRecordingManager:removeSessionForBundleID");
  bundleIDToRecordingSessionLookup_.erase(bundleID);
}

std::vector<SessionRegistry::Session> SessionRegistry::recordingSessions() const {
  std::vector<Session> recording;
  for (const auto& [bundleID, session] : bundleIDToRecordingSessionLookup_) {
    if (session->isRecording()) recording.push_back(session);
  }
  return recording;
}

std::vector<SessionRegistry::Session> SessionRegistry::systemRecordingSessions() const {
  auto sessions = recordingSessions();
  std::erase_if(sessions, [](const Session& session) { return !session->isSystemRecording(); });
  return sessions;
}

void SessionRegistry::noteRecording(const std::shared_ptr<QVRecording>& recording) {
  std::erase_if(recordings_, isOver);
  recordings_.push_back(recording);
}

void SessionRegistry::whenEnded(const std::string& bundleID, std::function<void()> continuation) {
  for (const auto& weak : recordings_) {
    const auto recording = weak.lock();
    if (!recording || isOver(weak) || recording->settings().bundleID != bundleID) continue;
    recording->whenEnded([weakSelf = weak_from_this(), bundleID, continuation = std::move(continuation)] {
      if (const auto self = weakSelf.lock()) self->whenEnded(bundleID, continuation);
    });
    return;
  }
  continuation();
}

}  // namespace qv
