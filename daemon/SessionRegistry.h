#pragma once

#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "session/QVRecordingSession.h"

namespace qv {

/// The sessions of the applications, by bundle identifier, and the recordings that go on or are ending, also those
/// whose session has left.
///
/// A bundle has one session, which is of one user. As long as it lives nobody else gets in; after that the next user's
/// session takes its place, and begins empty.
///
/// Threading: sequence only. It must be held by a shared pointer.
class SessionRegistry : public std::enable_shared_from_this<SessionRegistry> {
 public:
  using Session = std::shared_ptr<QVRecordingSession>;
  explicit SessionRegistry(std::shared_ptr<RecordingContext> context) : context_(std::move(context)) {}

  /// Nothing for a missing identifier; made where there is none of this user.
  [[nodiscard]] Session recordingSessionForBundleID(const std::optional<std::string>& bundleID, uid_t user);
  /// The session that keeps this user out: the bundle's, of another user, with a client or a recording.
  [[nodiscard]] Session livingOfAnotherUser(const std::optional<std::string>& bundleID, uid_t user) const;
  /// Never made.
  [[nodiscard]] Session find(const std::optional<std::string>& bundleID) const;
  void removeSessionForBundleID(const std::string& bundleID);
  /// A copy: what is done to them may change the registry.
  [[nodiscard]] std::vector<Session> recordingSessions() const;
  [[nodiscard]] std::vector<Session> systemRecordingSessions() const;

  void noteRecording(const std::shared_ptr<QVRecording>& recording);
  /// Runs it when no recording of this application is ending any more: nothing of a former one reaches what comes then.
  void whenEnded(const std::string& bundleID, std::function<void()> continuation);

 private:
  const std::shared_ptr<RecordingContext> context_;
  std::map<std::string, Session> bundleIDToRecordingSessionLookup_;
  std::vector<std::weak_ptr<QVRecording>> recordings_;
};

}  // namespace qv
