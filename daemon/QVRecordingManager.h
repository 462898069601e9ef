#pragma once

#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "daemon/QVBroadcastBook.h"
#include "platform/Platform.h"
#include "session/QVRecordingSession.h"
#include "ui/QVAcknowledgementAlert.h"
#include "ui/QVExemptionBook.h"

namespace qv {

/// A start on its way: what was asked, what the user allowed, and who waits for the answer. It keeps
/// itself waiting (for an ending recording, the user, a process id), never the manager.
struct StartRequest;

/// The central object of the daemon: admits clients, keeps one recording session for each client
/// application, serves the clients' requests and sees to it that one application records at a time.
///
/// A "recording" is one generation of a session. Every successful start opens one keep-alive
/// transaction, and the reset that follows the recording's end closes it. A session outlives its
/// client's connection; an application that connects anew gets its session back. Endings take time
/// (files are completed and removed), so a start of an application whose former recording is still
/// ending waits for it: nothing of the old one can then reach the new one.
///
/// Sources: QVRecordingManager.cpp (start-up, registry, disk space), _admission (clients come and
/// go), _requests (the interface), _start, _stop, _arbitration (one among many), _consent,
/// _systemRecording, _broadcast, _alerts.
///
/// Threading: manager sequence only, except the constructor, `finishStartup`, `shutDown` and the
/// callbacks of the sessions, the state monitor and the disk-space service, which hop onto it.
class QVRecordingManager final : public platform::IPCListenerDelegate,
                                 public platform::IPCExportedObject,
                                 public platform::DisplayLayoutObserver,
                                 public QVRecordingSessionDelegate,
                                 public std::enable_shared_from_this<QVRecordingManager> {
 public:
  /// Sets up the temporary store, finishes what a crash left there, and does everything of the start-up but the
  /// listener.
  static std::shared_ptr<QVRecordingManager> create(QVCaptureManager& captureManager);
  ~QVRecordingManager() override;

  /// Opens the listener: from now on clients are admitted. An error when the service is taken.
  std::optional<platform::Error> finishStartup();
  /// Completes the movies of all running recordings, then calls the handler.
  void shutDown(std::function<void()> handler);
  [[nodiscard]] platform::SerialQueue& sequence() { return sequence_; }

  bool listenerShouldAcceptNewConnection(platform::IPCListener& listener,
                                         const std::shared_ptr<platform::IPCConnection>& connection) override;
  void handleCall(const std::shared_ptr<platform::IPCConnection>& connection, const platform::IPCOperation& operation,
                  platform::IPCArguments arguments, platform::IPCReply reply) override;

  [[nodiscard]] std::shared_ptr<QVRecordingSession> recordingSessionForBundleID(
      const std::optional<std::string>& bundleID);
  void removeSessionForBundleID(const std::string& bundleID);
  /// Of the request being served.
  [[nodiscard]] std::optional<std::string> getCallingConnectionBundleID() const;
  [[nodiscard]] std::shared_ptr<QVRecordingSession> getCallingConnectionRecordingSession() const;

  // --- System recordings, from the device: it locks, sleeps, wakes. Thread-safe.
  /// Ends every running system recording; its movie goes to the photo library.
  void stopSystemRecordingWithInterruption();
  void notifySystemRecordingMayBeStopped();
  void notifySystemRecordingResumed();

  // --- What sessions and platform services report.
  void recordingSessionStoppedWithError(const std::shared_ptr<QVRecordingSession>& session, uint64_t generation,
                                        const std::optional<platform::Error>& error) override;
  void broadcastSessionDidUpdateServiceInfo(const std::shared_ptr<QVRecordingSession>& session,
                                            const platform::Dictionary& serviceInfo) override;
  void broadcastSessionDidUpdateDuration(QVRecordingSession& session, double seconds) override;
  void layoutMonitorDidUpdateDisplayLayout(platform::DisplayLayoutMonitor& monitor,
                                           const platform::DisplayLayout& layout) override;
  /// Observed while an application records.
  void setLayoutMonitor(std::shared_ptr<platform::DisplayLayoutMonitor> monitor);

 private:
  using Session = std::shared_ptr<QVRecordingSession>;
  using FinishHandler = QVRecordingSession::FinishHandler;
  using RequestMember = void (QVRecordingManager::*)(const platform::IPCArguments&, const platform::IPCReply&);

  /// Of the system's own clients.
  static constexpr const char* kPrivateEntitlement = "com.tarnwick.private.quorvel";

  explicit QVRecordingManager(QVCaptureManager& captureManager);
  void registerPurgeableSpace();
  int64_t purgeableSpace();
  int64_t purge(int32_t urgency);
  int64_t purgePeriodically();

  // --- Admission.
  void applicationDisconnectedWithBundleID(const std::optional<std::string>& bundleID,
                                           const std::shared_ptr<platform::IPCConnection>& connection);
  void connectionEnded(const std::weak_ptr<platform::IPCConnection>& connection, const char* line);
  void adoptConnection(const Session& session, const std::string& bundleID,
                       const std::shared_ptr<platform::IPCConnection>& connection);
  void beginTransaction();
  void endTransaction();

  // --- The request interface.
  static const std::map<std::string_view, RequestMember>& requestMembers();
  void startRecordingWindowLayerContextIDs(const platform::IPCArguments& arguments, const platform::IPCReply& reply);
  void setupBroadcastWithHostBundleID(const platform::IPCArguments& arguments, const platform::IPCReply& reply);
  void getCurrentBroadcastImages(const platform::IPCArguments& arguments, const platform::IPCReply& reply);
  void getSystemBroadcastExtensionInfo(const platform::IPCArguments& arguments, const platform::IPCReply& reply);
  void stopRecordingWithHandler(const platform::IPCArguments& arguments, const platform::IPCReply& reply);
  void stopRecordingWithStartClipDuration(const platform::IPCArguments& arguments, const platform::IPCReply& reply);
  void saveVideoToCameraRoll(const platform::IPCArguments& arguments, const platform::IPCReply& reply);
  void pauseRecording(const platform::IPCArguments& arguments, const platform::IPCReply& reply);
  void resumeRecordingWithWindowLayerContextID(const platform::IPCArguments& arguments,
                                               const platform::IPCReply& reply);
  void setMicrophoneEnabled(const platform::IPCArguments& arguments, const platform::IPCReply& reply);
  void updateProcessIDForAudioCaptureWithPID(const platform::IPCArguments& arguments, const platform::IPCReply& reply);
  void discardRecordingWithHandler(const platform::IPCArguments& arguments, const platform::IPCReply& reply);
  void clientDidBecomeActive(const platform::IPCArguments& arguments, const platform::IPCReply& reply);
  void clientDidResignActive(const platform::IPCArguments& arguments, const platform::IPCReply& reply);
  void synchronousGetCurrentState(const platform::IPCArguments& arguments, const platform::IPCReply& reply);
  void setHasUserConsentForCamera(const platform::IPCArguments& arguments, const platform::IPCReply& reply);
  void setHasUserConsentForMicrophone(const platform::IPCArguments& arguments, const platform::IPCReply& reply);
  void setBroadcastURL(const platform::IPCArguments& arguments, const platform::IPCReply& reply);
  void setMicrophoneEnabledPersistent(const platform::IPCArguments& arguments, const platform::IPCReply& reply);
  void reportCameraUsage(const platform::IPCArguments& arguments, const platform::IPCReply& reply);

  // --- Start, in the order in which a start passes them.
  using Start = std::shared_ptr<StartRequest>;
  [[nodiscard]] bool checkContextIDsMatch(const std::vector<uint32_t>& contextIDs);
  [[nodiscard]] std::optional<platform::Error> checkStartIsAllowed(const StartRequest& start);
  void continueStartAfterStops(const Start& start);
  void showAcknowledgementAlertForSession(const Start& start);
  void continueStartAfterAcknowledgement(const Start& start, const AcknowledgementAnswer& answer);
  void beginRecording(const Start& start);
  void enableBroadcast(const Start& start);
  void continueStartAfterEnabling(const Start& start, const std::optional<platform::Error>& error);
  void recordWhatIsFrontmost(const Start& start);
  void configureSession(const Start& start);
  void frontmostSession(const Session& session, std::function<void(int32_t processID)> handler);
  void startSession(const Start& start, int32_t processID);
  void recordingStarted(const Start& start);
  void refuseStart(const Start& start, const platform::Error& error);
  void endStart(const Start& start);
  void cancelPendingStart(const std::string& bundleID);
  /// The start that began this recording, while it has not been answered.
  [[nodiscard]] Start unansweredStart(const Session& session, uint64_t generation) const;
  [[nodiscard]] bool isApplicationInForegroundWithBundleIdentifier(const std::string& bundleID);

  // --- Stop.
  void stopCurrentRecordingSessionWithHandler();
  void stopRecordingSession(const Session& session, double startClipDuration, double endClipDuration,
                            FinishHandler handler);
  void reportStoppedByOtherStart(const Session& session, uint64_t generation);
  void saveStoppedSystemRecording(const Session& session, uint64_t generation,
                                  const std::optional<platform::URL>& movie);
  void requestStop(double startClipDuration, double endClipDuration, const platform::IPCReply& reply);
  void saveMovie(const platform::URL& movie, std::function<void(const std::optional<platform::Error>&)> handler);
  /// Whether a file is a movie of the temporary store that was handed to this application.
  [[nodiscard]] bool wasHandedTo(const std::string& bundleID, const platform::URL& movie) const;
  void handMovieTo(const std::string& bundleID, const platform::URL& movie);

  // --- Arbitration.
  void interruptOtherRecordingSessionAgainstSession(const Session& session);
  void resetStatesForSession(const Session& session, uint64_t generation);
  /// How one recording ended, for its client.
  struct RecordingEnd {
    uint64_t generation = 0;
    std::optional<platform::Error> error = std::nullopt;
    std::optional<platform::URL> movie = std::nullopt;
  };
  void recordingSessionStoppedWithErrorMovieURL(const Session& session, const RecordingEnd& end);
  void recordingSessionInterruptedWithError(const Session& session, const RecordingEnd& end);
  void tellRecordingEnded(const Session& session, const RecordingEnd& end);
  void finishRecording(const Session& session, double startClipDuration, double endClipDuration, FinishHandler handler);
  void replaceSessionAfterMediaServicesReset(const Session& session);
  void observeDisplayLayout();
  void applyDisplayLayout(const platform::DisplayLayout& layout);
  void installForegroundFollower(const Session& session);
  void followForeground(const Session& session, const platform::Dictionary& report);
  void lookAtForeground(const Session& session);
  /// While a hold lives, a start of that application waits.
  std::shared_ptr<void> holdEnding(const std::string& bundleID);
  void whenEnded(const std::string& bundleID, std::function<void()> continuation);
  void endingReleased(const std::string& bundleID);

  // --- Alerts: hooks for a device that shows them. They present nothing here, and answer true.
  /// Made when it is first used.
  [[nodiscard]] platform::SerialQueue& quorvelAlertQueue();
  void alertUserOfEnd(const Session& session, const std::optional<platform::Error>& error);
  /// These two on the alert queue.
  static bool showAlertForRecordingSession(const Session& session, const std::optional<platform::Error>& error);
  static bool showAlertForBroadcastSession(const Session& session, const std::optional<platform::Error>& error);
  static bool showResumeBroadcastAlert(const Session& session, uint32_t contextID);
  static bool showStopRecordingAlert();

  // --- System recording.
  void clearSystemRecordingUI(const Session& session);
  void checkAndPlaySystemRecordSound(const Session& session, bool isRecordingOn);
  using SystemStopHandler =
      std::function<void(const std::optional<platform::URL>&, const std::optional<platform::Error>&, const Session&)>;
  void stopSystemRecordingWithHandler(const SystemStopHandler& handler);
  [[nodiscard]] std::vector<Session> runningSystemRecordings() const;

  platform::Platform& platform_;
  QVCaptureManager& captureManager_;
  platform::SerialQueue sequence_;
  std::unique_ptr<platform::IPCListener> publicListener_;
  std::unique_ptr<platform::ApplicationStateMonitor> applicationStateMonitor_;
  /// Whose audio follows the front: the monitor has a handler while this is set.
  Session followedSession_;
  std::shared_ptr<platform::DisplayLayoutMonitor> layoutMonitor_;
  int64_t previousElementCount_ = 0;
  bool didAcceptResume_ = false;
  std::unique_ptr<platform::SerialQueue> alertQueue_;
  QVExemptionBook exemptions_;
  const std::shared_ptr<QVBroadcastBook> broadcasts_ = std::make_shared<QVBroadcastBook>(sequence_);

  std::map<std::string, Session> bundleIDToRecordingSessionLookup_;
  /// The connections of all clients. The one of an application with a session is its proxy's.
  std::map<std::shared_ptr<platform::IPCConnection>, std::optional<std::string>> connections_;
  std::map<std::string, Start> pendingStarts_;
  struct Ending {
    int holds = 0;
    std::vector<std::function<void()>> waiting;
  };
  std::map<std::string, Ending> endings_;
  /// The recordings whose start opened a transaction that is not closed yet.
  std::set<std::pair<const QVRecordingSession*, uint64_t>> openTransactions_;
  std::map<std::string, std::set<std::string>> handedMovies_;
  std::shared_ptr<platform::IPCConnection> callingConnection_;
};

}  // namespace qv
