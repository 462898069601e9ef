#pragma once

#include <sys/types.h>

#include <memory>
#include <optional>
#include <string>

#include "platform/threads/Guarded.h"
#include "session/QVClientProxy.h"
#include "session/QVRecording.h"
#include "support/ApplicationOwner.h"

namespace qv {

class QVRecordingSession;

/// Through which a session reports. On the sequence, but for the duration.
class QVRecordingSessionDelegate {
 public:
  virtual ~QVRecordingSessionDelegate() = default;
  /// A recording is about to end; nothing of its end has happened yet.
  virtual void recordingSessionWillStop(const std::shared_ptr<QVRecordingSession>& session,
                                        const std::shared_ptr<QVRecording>& recording) = 0;
  /// Its client is to be told why it ended, and of the movie that it may have.
  virtual void recordingSessionStoppedWithError(const std::shared_ptr<QVRecordingSession>& session,
                                                const std::optional<platform::Error>& error,
                                                const std::optional<platform::URL>& movie) = 0;
  /// It has given everything back.
  virtual void recordingSessionDidStop(const std::shared_ptr<QVRecordingSession>& session,
                                       const std::shared_ptr<QVRecording>& recording) = 0;
  virtual void broadcastSessionDidUpdateServiceInfo(const std::shared_ptr<QVRecordingSession>& session,
                                                    const platform::Dictionary& serviceInfo) = 0;
  /// Seconds. On every sample, on capture threads.
  virtual void broadcastSessionDidUpdateDuration(QVRecordingSession& session, double seconds) = 0;
};

/// What the daemon keeps of one application: how to reach its client, what it asked to be remembered, and its
/// recording. It outlives its recordings; what belongs to one of them belongs to that object (QVRecording).
///
/// Threading: sequence only, but for the client proxy.
class QVRecordingSession final : public QVRecordingObserver, public std::enable_shared_from_this<QVRecordingSession> {
 public:
  QVRecordingSession(std::string bundleID, uid_t userIdentifier, std::shared_ptr<RecordingContext> context);
  ~QVRecordingSession() override;

  // --- The application.
  [[nodiscard]] const std::string& bundleID() const { return bundleID_; }
  /// Who runs it.
  [[nodiscard]] uid_t userIdentifier() const { return userIdentifier_; }
  [[nodiscard]] std::string owner() const { return applicationOwner(bundleID_, userIdentifier_); }
  void setDelegate(std::weak_ptr<QVRecordingSessionDelegate> delegate) { delegate_.store(std::move(delegate)); }
  /// Thread-safe.
  [[nodiscard]] std::shared_ptr<QVClientProxy> clientProxy() const { return clientProxy_.load(); }
  void setClientProxy(std::shared_ptr<QVClientProxy> proxy) { clientProxy_.store(std::move(proxy)); }
  [[nodiscard]] bool microphoneEnabledPersistent() const { return microphoneEnabledPersistent_; }
  void setMicrophoneEnabledPersistent(bool enabled) { microphoneEnabledPersistent_ = enabled; }
  [[nodiscard]] bool hasUserConsentForCamera() const { return hasUserConsentForCamera_; }
  void setHasUserConsentForCamera(bool consent) { hasUserConsentForCamera_ = consent; }
  [[nodiscard]] bool hasUserConsentForMicrophone() const { return hasUserConsentForMicrophone_; }
  void setHasUserConsentForMicrophone(bool consent) { hasUserConsentForMicrophone_ = consent; }
  [[nodiscard]] const std::optional<std::string>& broadcastURL() const { return broadcastURL_; }
  void setBroadcastURL(std::optional<std::string> url) { broadcastURL_ = std::move(url); }
  /// The movie of a recording that another application's start interrupted, until the client was told of it again.
  [[nodiscard]] const std::optional<platform::URL>& interruptedMovieURL() const { return interruptedMovieURL_; }
  void setInterruptedMovieURL(std::optional<platform::URL> url) { interruptedMovieURL_ = std::move(url); }

  // --- Its recording.
  /// The one that goes on, or that is ending still; nothing otherwise.
  [[nodiscard]] const std::shared_ptr<QVRecording>& recording() const { return recording_; }
  [[nodiscard]] bool isRecording() const { return recording_ && recording_->isRecording(); }
  [[nodiscard]] bool isPaused() const { return recording_ && recording_->state() == QVRecording::State::Paused; }
  [[nodiscard]] bool isBroadcasting() const { return isRecording() && recording_->settings().broadcast; }
  /// Of the recording that goes on, or the last one.
  [[nodiscard]] bool isSystemRecording() const { return systemRecording_; }
  [[nodiscard]] bool microphoneEnabled() const { return microphoneEnabled_; }
  void setMicrophoneEnabled(bool enabled);
  /// Makes the recording of a start that has passed its checks; the former one has ended.
  std::shared_ptr<QVRecording> beginRecording(RecordingSettings settings, StartAnswer answer);

  void recordingWillEnd(const std::shared_ptr<QVRecording>& recording) override;
  void recordingStopped(const std::shared_ptr<QVRecording>& recording, const platform::Error& error,
                        const std::optional<platform::URL>& movie) override;
  void recordingDidEnd(const std::shared_ptr<QVRecording>& recording) override;
  void recordingDidUpdateDuration(double seconds) override;

 private:
  [[nodiscard]] OutputEvents outputEvents(const std::shared_ptr<QVRecording>& recording);

  const std::string bundleID_;
  const uid_t userIdentifier_;
  const std::shared_ptr<RecordingContext> context_;
  platform::Guarded<std::weak_ptr<QVRecordingSessionDelegate>> delegate_;
  platform::Guarded<std::shared_ptr<QVClientProxy>> clientProxy_;
  std::shared_ptr<QVRecording> recording_;
  bool systemRecording_ = false;
  bool microphoneEnabled_ = false;
  bool microphoneEnabledPersistent_ = false;
  bool hasUserConsentForCamera_ = false;
  bool hasUserConsentForMicrophone_ = false;
  std::optional<std::string> broadcastURL_;
  std::optional<platform::URL> interruptedMovieURL_;
};

}  // namespace qv
