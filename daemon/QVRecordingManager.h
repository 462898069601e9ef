#pragma once

#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>

#include "daemon/DisplayLayoutRule.h"
#include "daemon/ForegroundFollower.h"
#include "daemon/MovieHandover.h"
#include "daemon/QVBroadcastBook.h"
#include "daemon/RecordingNotices.h"
#include "daemon/RequestTable.h"
#include "daemon/SessionAlerts.h"
#include "daemon/SessionRegistry.h"
#include "daemon/StartDesk.h"
#include "daemon/StatusDesk.h"
#include "daemon/StorePurge.h"
#include "platform/Platform.h"
#include "platform/threads/LogQuotas.h"
#include "ui/QVExemptionBook.h"

namespace qv {

/// The central object of the daemon: it admits clients, has their requests served, and sees to it that one application
/// records at a time. What it knows is kept by its parts: sessions and their recordings by the registry, starts by the
/// desk, finished movies by the hand-over, set-up broadcasts by their book.
///
/// Sources: QVRecordingManager.cpp (start-up, storage), _admission (clients come and go), _requests (of a recording),
/// _application (of the application and its broadcasts), _ends (how recordings end), _systemRecording.
///
/// Threading: manager sequence only, except the constructor, `finishStartup`, `shutDown` and the callbacks of the
/// platform, which hop onto it.
class QVRecordingManager final : public platform::IPCListenerDelegate,
                                 public platform::IPCExportedObject,
                                 public QVRecordingSessionDelegate,
                                 public std::enable_shared_from_this<QVRecordingManager> {
 public:
  /// Sets up the temporary store, finishes what a crash left there, and does everything of the start-up but the
  /// listener.
  static std::shared_ptr<QVRecordingManager> create(platform::Platform& platform, QVCaptureManager& captureManager);
  ~QVRecordingManager() override;

  /// Opens the listener: from now on clients are admitted. An error when the service is taken.
  std::optional<platform::Error> finishStartup();
  /// Completes the movies of all running recordings, then calls the handler.
  void shutDown(std::function<void()> handler);
  [[nodiscard]] platform::SerialQueue& sequence() { return sequence_; }
  [[nodiscard]] SessionRegistry& sessions() { return *sessions_; }
  /// Observed while an application records.
  void setLayoutMonitor(std::shared_ptr<platform::DisplayLayoutMonitor> monitor);

  bool listenerShouldAcceptNewConnection(platform::IPCListener& listener,
                                         const std::shared_ptr<platform::IPCConnection>& connection) override;
  void handleCall(const std::shared_ptr<platform::IPCConnection>& connection, const platform::IPCOperation& operation,
                  platform::IPCArguments arguments, platform::IPCReply reply) override;

  // --- System recordings, from the device: it locks, sleeps, wakes. Thread-safe.
  /// Ends every running system recording; its movie goes to the photo library.
  void stopSystemRecordingWithInterruption();
  void notifySystemRecordingMayBeStopped();
  void notifySystemRecordingResumed();

  // --- What sessions report.
  void recordingSessionWillStop(const std::shared_ptr<QVRecordingSession>& session,
                                const std::shared_ptr<QVRecording>& recording) override;
  void recordingSessionStoppedWithError(const std::shared_ptr<QVRecordingSession>& session,
                                        const std::optional<platform::Error>& error,
                                        const std::optional<platform::URL>& movie) override;
  void recordingSessionDidStop(const std::shared_ptr<QVRecordingSession>& session,
                               const std::shared_ptr<QVRecording>& recording) override;
  void broadcastSessionDidUpdateServiceInfo(const std::shared_ptr<QVRecordingSession>& session,
                                            const platform::Dictionary& serviceInfo) override;
  void broadcastSessionDidUpdateDuration(QVRecordingSession& session, double seconds) override;

 private:
  using Session = SessionRegistry::Session;

  QVRecordingManager(platform::Platform& platform, QVCaptureManager& captureManager);
  [[nodiscard]] StartServices startServices();
  void registerPurgeableSpace();

  // --- Admission.
  void applicationDisconnectedWithBundleID(const std::optional<std::string>& bundleID);
  void connectionEnded(const std::weak_ptr<platform::IPCConnection>& connection, const char* line);
  void adoptConnection(const Session& session, const std::string& bundleID,
                       const std::shared_ptr<platform::IPCConnection>& connection);
  void callerWasRefused(const Caller& caller, platform::PeerStanding standing);

  // --- Requests.
  void addRecordingRequests();
  void addApplicationRequests();
  void addBroadcastRequests();
  void requestStop(const Caller& caller, double startClipDuration, double endClipDuration,
                   const platform::IPCReply& reply);
  void stopForClient(const Caller& caller, const Session& session, double startClipDuration, double endClipDuration,
                     const platform::IPCReply& reply);
  void discardRecording(const Caller& caller, const platform::IPCReply& reply);
  void pauseRecording(const Session& session);
  void resumeRecording(const Caller& caller, const Session& session, uint32_t contextID);
  void updateProcessID(const Caller& caller, int32_t processID);
  void clientDidBecomeActive(const Session& session);
  void setupBroadcast(const Caller& caller, const request::SetupBroadcast& request, const platform::IPCReply& reply);

  // --- Ends.
  void stopRecordingSession(const Session& session, const std::function<void(QVRecording&)>& end);
  void stopCurrentRecordingSessionWithHandler();
  [[nodiscard]] MovieFate storeInPhotoLibrary(const std::string& owner) const;
  /// The same for a recording that nothing waits for: its sound is mixed first.
  [[nodiscard]] MovieFate saveInPhotoLibrary(const std::string& owner) const;
  void stopForUser(const std::shared_ptr<QVRecording>& recording);
  void interruptOtherRecordingSessionAgainstSession(const Session& session);
  void endRecordingsOfApplications(const platform::Error& cause);
  void recordingStarted(const Session& session);

  // --- System recording.
  void checkAndPlaySystemRecordSound(const Session& session, bool isRecordingOn);
  void stopSystemRecordingWithHandler(const std::function<void(QVRecording&)>& end);

  platform::Platform& platform_;
  platform::SerialQueue sequence_;
  const std::shared_ptr<RecordingContext> context_;
  platform::LogQuotas logQuotas_;
  QVExemptionBook exemptions_;
  const QVAcknowledgementAlert acknowledgements_;
  const std::shared_ptr<QVBroadcastBook> broadcasts_;
  const std::shared_ptr<MovieHandover> handover_;
  const std::shared_ptr<ForegroundFollower> foreground_;
  const std::shared_ptr<DisplayLayoutRule> layoutRule_;
  const std::shared_ptr<RecordingNotices> notices_;
  /// The connections of all clients. The one of an application with a session is its proxy's.
  std::map<std::shared_ptr<platform::IPCConnection>, std::optional<std::string>> connections_;
  const std::shared_ptr<SessionRegistry> sessions_;
  StartDesk starts_;
  StorePurge purge_;
  SessionAlerts alerts_;
  RequestTable requests_;
  StatusDesk status_;
  std::unique_ptr<platform::IPCListener> publicListener_;
};

}  // namespace qv
