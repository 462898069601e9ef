#pragma once

#include <atomic>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "capture/QVCaptureManager.h"
#include "daemon/client/QVClientProxy.h"
#include "extensions/QVBroadcastConfiguration.h"
#include "extensions/QVBroadcastExtensionProxy.h"
#include "extensions/QVBroadcastProtocols.h"
#include "platform/Guarded.h"
#include "platform/Platform.h"
#include "session/ClipHandover.h"
#include "session/ClipSeam.h"
#include "session/QVReportingAgent.h"
#include "writer/QVMovieWriter.h"

namespace qv {

class QVRecordingSession;

/// Through which a session reports. Calls come from whatever thread the event is on, and never with
/// a lock of the session's held.
class QVRecordingSessionDelegate {
 public:
  virtual ~QVRecordingSessionDelegate() = default;
  /// A failure has ended the recording of this generation (see QVRecordingSession::generation).
  virtual void recordingSessionStoppedWithError(const std::shared_ptr<QVRecordingSession>& session, uint64_t generation,
                                                const std::optional<platform::Error>& error) = 0;
  virtual void broadcastSessionDidUpdateServiceInfo(const std::shared_ptr<QVRecordingSession>& session,
                                                    const platform::Dictionary& serviceInfo) = 0;
  /// Seconds. On every sample.
  virtual void broadcastSessionDidUpdateDuration(QVRecordingSession& session, double seconds) = 0;
};

/// What reaches a capture client, and the routing of samples.
enum class SampleType : int64_t { Video = 1, AppAudio = 2, Microphone = 3 };

/// The recordings of one client application, one after another, each from start to finish: into a
/// movie (of its own windows, or of the whole screen for the system), handed to the client sample by
/// sample ("capture"), or to an upload extension ("broadcast"), sample by sample or in movie clips.
///
/// The manager configures the session, marks it recording and starts it. Each such recording has a
/// generation number, so that what still belongs to an ended one never touches the next. Paused, all
/// sources stand still and the movie stays open; resumed, video goes on with the time of the last
/// frame before the pause. Audio times are never touched: the movie file places audio by the steps
/// that it learns from the video.
///
/// Threading: lifecycle on the manager sequence; samples and failures on capture threads. Flags are
/// atomics; `shouldStopLock` is held for the whole video gate.
class QVRecordingSession final : public platform::ScreenCaptureControllerDelegate,
                                 public std::enable_shared_from_this<QVRecordingSession> {
 public:
  using FinishHandler = std::function<void(const std::optional<platform::URL>&, const std::optional<platform::Error>&)>;

  using EnableHandler = std::function<void(const std::optional<platform::Error>&)>;

  /// `sequence` is the manager's: lifecycle steps that follow a wait run there.
  QVRecordingSession(std::string bundleID, platform::SerialQueue& sequence, QVCaptureManager& captureManager);
  ~QVRecordingSession() override;

  // --- Configuration, by the manager.
  [[nodiscard]] const std::string& bundleID() const { return bundleID_; }
  [[nodiscard]] bool isRecording() const { return recording_; }
  /// True begins a new generation.
  void setRecording(bool recording);
  [[nodiscard]] uint64_t generation() const { return generation_; }
  [[nodiscard]] bool isPaused() const { return paused_; }
  void setPaused(bool paused) { paused_ = paused; }
  [[nodiscard]] bool isSystemRecording() const { return systemRecording_; }
  void setSystemRecording(bool systemRecording) { systemRecording_ = systemRecording; }
  [[nodiscard]] bool isBroadcasting() const { return isBroadcasting_; }
  void setIsBroadcasting(bool broadcasting) { isBroadcasting_ = broadcasting; }
  [[nodiscard]] bool isCapturing() const { return captureRecording_; }
  void setCaptureRecording(bool capture) { captureRecording_ = capture; }
  [[nodiscard]] bool microphoneEnabled() const { return microphoneEnabled_; }
  /// Off: microphone samples carry silence. A system recording sets up its tap when it is first on.
  void setMicrophoneEnabled(bool enabled);
  [[nodiscard]] bool microphoneEnabledPersistent() const { return microphoneEnabledPersistent_; }
  void setMicrophoneEnabledPersistent(bool enabled) { microphoneEnabledPersistent_ = enabled; }
  [[nodiscard]] bool hasUserConsentForCamera() const { return hasUserConsentForCamera_; }
  void setHasUserConsentForCamera(bool consent) { hasUserConsentForCamera_ = consent; }
  [[nodiscard]] bool hasUserConsentForMicrophone() const { return hasUserConsentForMicrophone_; }
  void setHasUserConsentForMicrophone(bool consent) { hasUserConsentForMicrophone_ = consent; }
  [[nodiscard]] const std::optional<std::string>& broadcastURL() const { return broadcastURL_; }
  void setBroadcastURL(std::optional<std::string> url) { broadcastURL_ = std::move(url); }
  void setContextIDs(std::vector<uint32_t> contextIDs) { contextIDs_ = std::move(contextIDs); }
  /// Clamped to what the device records; the size asked for is kept beside it.
  void setWindowSize(platform::Size size);
  [[nodiscard]] platform::Size windowSize() const { return windowSize_; }
  [[nodiscard]] platform::Size originalWindowSize() const { return originalWindowSize_; }
  [[nodiscard]] platform::Size _maximumSizeWithSize(platform::Size size);
  [[nodiscard]] int64_t chipId();
  /// So a system recording's movie is never wider than tall. The asset writer lays a wide screen into it by a quarter
  /// turn, which players turn back.
  [[nodiscard]] bool isNativeScreenOrientationPortrait() const { return true; }
  void setDelegate(std::weak_ptr<QVRecordingSessionDelegate> delegate) { delegate_.store(std::move(delegate)); }
  void setFrontmostPIDForAudioTap(int32_t pid) { frontmostPIDForAudioTap_ = pid; }
  [[nodiscard]] int32_t frontmostPIDForAudioTap() const { return frontmostPIDForAudioTap_; }
  [[nodiscard]] std::shared_ptr<QVClientProxy> clientProxy() const { return clientProxy_.load(); }
  void setClientProxy(std::shared_ptr<QVClientProxy> proxy) { clientProxy_.store(std::move(proxy)); }
  [[nodiscard]] const std::optional<platform::URL>& interruptedMovieURL() const { return interruptedMovieURL_; }
  void setInterruptedMovieURL(std::optional<platform::URL> url) { interruptedMovieURL_ = std::move(url); }
  [[nodiscard]] bool hasBroadcastExtension() const { return broadcastExtension_.load() != nullptr; }
  [[nodiscard]] std::shared_ptr<QVMovieWriter> movieWriter() const { return movieWriter_.load(); }
  /// The display server went away: this object passes no video any more.
  [[nodiscard]] bool shouldStop();

  // --- Lifecycle.
  /// The handler runs on the sequence, once capture has been started (or could not be).
  void startSessionWithHandler(std::function<void()> handler);
  void pauseSession();
  void resumeSessionWithContextID(uint32_t contextID);
  void finishSessionWithHandler(FinishHandler handler);
  /// Ends the recording and completes its movie, without the first and last seconds where both
  /// durations are positive. Ignored, and the handler never called, when nothing records.
  void finishSessionWithStartClipDuration(double startClipDuration, double endClipDuration, FinishHandler handler);
  /// Ends all capture without completing the movie. Nothing happens when nothing records.
  void stopRecordingWithNotification(bool notify, const std::optional<platform::Error>& error);
  /// Ends the recording and removes its movie. The handler runs on a background queue.
  void finishAndCleanupSessionFilesWithHandler(std::function<void()> handler);
  /// After a failure ended the recording: completes what was written, so that it can be played.
  void completeMovieAfterFailure(uint64_t generation, std::function<void()> handler);
  void stopAllCapture();
  /// True once for each recording: whoever gets it tells the client that this recording has ended.
  /// Sequence only.
  [[nodiscard]] bool takeEndReport(uint64_t generation);
  void notifyRecordingMayBeStopped();
  void notifyRecordingResumed();

  // --- Files.
  [[nodiscard]] std::string outputPath() const;
  [[nodiscard]] std::string trimmedOutputPath() const;
  [[nodiscard]] platform::URL outputURL() const { return platform::URL::fileURL(outputPath()); }
  [[nodiscard]] platform::URL trimmedOutputURL() const { return platform::URL::fileURL(trimmedOutputPath()); }

  // --- Broadcast.
  void setBroadcastConfiguration(std::optional<QVBroadcastConfiguration> configuration);
  /// The next recording is a broadcast to this extension. In samples mode its link is set up first: the extension is
  /// launched, or connected to at `listenerEndpoint` where that is valid. The handler runs on the sequence, with an
  /// error where the link could not be made: then broadcasting is disabled again.
  void enableBroadcastWithExtension(const platform::ExtensionRecordRef& extension, BroadcastProcessMode processMode,
                                    const platform::Dictionary& userInfo,
                                    const platform::ListenerEndpoint& listenerEndpoint, EnableHandler handler);
  void disableBroadcast();
  /// Ends the link of a broadcast that never started.
  void abandonBroadcast();

  // --- Samples.
  void updateProcessIDForAudioCaptureWithPID(int32_t processID);
  void checkAndStopAppAudioForPID(int32_t processID);
  void screenCaptureControllerDidReceiveSampleBuffer(platform::ScreenCaptureController& controller,
                                                     const platform::SampleBufferRef& sample,
                                                     uint64_t transformFlags) override;
  void screenCaptureControllerDidFailWithStatus(platform::ScreenCaptureController& controller, int32_t status) override;
  void screenCaptureControllerWasPreempted(platform::ScreenCaptureController& controller) override;
  void screenCaptureControllerMediaServicesWereReset(platform::ScreenCaptureController& controller) override;

  // --- Metrics.
  void sessionReportCameraUsage(int32_t cameraPosition);
  [[nodiscard]] std::shared_ptr<QVReportingAgent> reportingAgent() const { return reportingAgent_.load(); }

 private:
  /// False when the recording had ended already, by whatever was quicker.
  bool endRecording(bool notify, const std::optional<platform::Error>& error);
  void _resumeOrStartSession();
  void prepareScreenCapture(int32_t frameRate);
  void startScreenCapture(uint64_t stretch);
  void afterStart(uint64_t generation, const std::function<void()>& handler);
  void finishWriter(double startClipDuration, double endClipDuration, FinishHandler handler);
  void handFinishedMovie(const std::optional<platform::URL>& movie, double startClipDuration, double endClipDuration,
                         const FinishHandler& handler);
  void trimFinishedMovie(const platform::URL& movie, double startClipDuration, double endClipDuration,
                         FinishHandler handler);

  void _processSampleBuffer(const platform::SampleBufferRef& sample, uint64_t transformFlags);
  void _updateSampleBufferWithOffset(const platform::SampleBufferRef& sample,
                                     const std::function<void(const platform::SampleBufferRef&)>& handler);
  [[nodiscard]] platform::SampleBufferRef _copySampleBufferFromSourceBuffer(const platform::SampleBufferRef& sample,
                                                                            platform::MediaTime updatedTimeStamp);
  void resetTiming();
  void accountForPause(platform::MediaTime presentationTime);
  /// False when the movie writer refused it.
  [[nodiscard]] bool deliverVideo(const platform::SampleBufferRef& sample, platform::MediaTime unadjustedTime,
                                  uint64_t transformFlags);
  void updateDuartionWithSample(const platform::SampleBufferRef& sample);
  [[nodiscard]] platform::SampleBufferRef soundBeforePause(const platform::SampleBufferRef& sample) const;
  void handleAppAudio(const platform::SampleBufferRef& sample);
  void routeAppAudio(const platform::SampleBufferRef& sample);
  void setupMicTap();
  void handleMicrophone(const platform::SampleBufferRef& sample);
  void updateBundleIdForFirstForegroundApp();
  void packageVideoSampleBufferForCapture(const platform::SampleBufferRef& sample);
  void packageAudioSampleBufferForCapture(const platform::SampleBufferRef& sample, SampleType type);

  // --- Broadcast: the link.
  void adoptExtensionProxy(const std::shared_ptr<QVBroadcastExtensionProxy>& proxy);
  void launchExtension(const std::shared_ptr<QVBroadcastExtensionProxy>& proxy, EnableHandler handler);
  void broadcastFailed(const platform::Error& error);
  void _notifyExtensionOfAction(BroadcastAction action, std::function<void()> completion);
  /// The same, and the completion runs in any case: also when the extension fails, or has not answered in time.
  void notifyExtensionAndWait(BroadcastAction action, std::function<void()> completion);
  /// Tells the extension that the broadcast is over, waits for what it still has to be given, and lets it go.
  void finishBroadcast(std::function<void()> handler);
  [[nodiscard]] bool isBroadcastOpen() const;

  // --- Broadcast: samples.
  [[nodiscard]] std::shared_ptr<QVBroadcastExtensionProxy> readyExtensionProxy() const;
  void _notifyExtensionOfVideoSampleBuffer(const platform::SampleBufferRef& sample, SampleType type,
                                           uint32_t orientation);
  void _notifyExtensionOfAudioSampleBuffer(const platform::SampleBufferRef& sample, SampleType type);
  void _notifyExtensionOfFrontmostProcessBundleID(const std::string& bundleID);

  // --- Broadcast: clips.
  void beginClips();
  [[nodiscard]] bool isCuttingClips() const;
  [[nodiscard]] bool appendVideoToClip(const platform::SampleBufferRef& sample,
                                       const platform::AffineTransform& transform);
  void _processAudioSampleBufferForMP4ClipHandler(const platform::SampleBufferRef& sample);
  void appendMicrophoneToClip(const platform::SampleBufferRef& sample);
  void finishClips(std::function<void()> handler);

  [[nodiscard]] std::string _serviceNameForReporting() const;
  [[nodiscard]] uint64_t getRecordedFileSize() const;
  void reportSummaryEvent(int64_t endReason);

  platform::SerialQueue& sequence_;
  QVCaptureManager& captureManager_;
  const std::string bundleID_;

  /// Guards `shouldStop_` and the timing state of the video gate. Not recursive.
  std::mutex shouldStopLock_;
  bool shouldStop_ = false;
  bool sessionWasResumed_ = false;
  platform::MediaTime lastSampleTimestamp_ = platform::MediaTime::invalid();
  platform::MediaTime sampleTimeOffset_ = platform::MediaTime::zero();
  /// Of the first frame that this object ever saw.
  platform::Guarded<platform::MediaTime> firstSampleTimestamp_{platform::MediaTime::zero()};

  std::atomic<bool> recording_{false};
  std::atomic<uint64_t> generation_{0};
  uint64_t reportedGeneration_ = 0;
  std::atomic<bool> paused_{false};
  /// The host time at which the pause that lasts, or the last one, began.
  platform::Guarded<platform::MediaTime> pauseTime_;
  std::atomic<bool> systemRecording_{false};
  std::atomic<bool> isBroadcasting_{false};
  std::atomic<bool> captureRecording_{false};
  std::atomic<bool> microphoneEnabled_{false};
  std::atomic<bool> haveMicTap_{false};
  std::atomic<int32_t> frontmostPIDForAudioTap_{0};
  std::atomic<BroadcastProcessMode> broadcastProcessMode_{BroadcastProcessMode::MovieClips};
  std::atomic<int64_t> broadcastFragmentIndex_{0};

  bool microphoneEnabledPersistent_ = false;
  bool hasUserConsentForCamera_ = false;
  bool hasUserConsentForMicrophone_ = false;
  std::atomic<int64_t> chipId_{0};
  std::vector<uint32_t> contextIDs_;
  platform::Size windowSize_;
  platform::Size originalWindowSize_;
  std::optional<std::string> broadcastURL_;
  std::optional<std::string> bundleIDOfFirstForegroundApp_;
  std::optional<platform::URL> interruptedMovieURL_;
  std::optional<platform::URL> movieURL_;
  platform::Guarded<std::optional<platform::Date>> captureStartTime_;

  platform::Guarded<std::weak_ptr<QVRecordingSessionDelegate>> delegate_;
  platform::Guarded<std::shared_ptr<QVClientProxy>> clientProxy_;
  platform::Guarded<std::shared_ptr<QVMovieWriter>> movieWriter_;
  platform::Guarded<std::shared_ptr<QVReportingAgent>> reportingAgent_;

  platform::Guarded<platform::ExtensionRecordRef> broadcastExtension_;
  platform::Guarded<platform::Dictionary> broadcastUserInfo_;
  platform::Guarded<std::optional<QVBroadcastConfiguration>> broadcastConfiguration_;
  platform::Guarded<std::shared_ptr<QVBroadcastExtensionProxy>> broadcastUploadExtensionProxy_;
  /// Of the action that somebody waits for.
  platform::Guarded<std::shared_ptr<AnswerDeadline>> awaitedAnswer_;
  /// Of a link that failed before its recording had begun.
  platform::Guarded<std::optional<platform::Error>> earlyBroadcastFailure_;

  /// The clips of one broadcast; without a hand-over there are none.
  struct Clips {
    std::shared_ptr<ClipHandover> handover;
    platform::MediaTime broadcastFragmentStartTime = platform::MediaTime::invalid();
    platform::SampleBufferRef lastPicture;
    platform::AffineTransform transform;
    std::unique_ptr<ClipSeam> seam;
    std::unique_ptr<platform::TimerHandle> repeatTimer;
    bool isEmpty = true;  ///< the current clip has no picture yet
  };
  void cutClip(Clips& clips, platform::MediaTime time, platform::MediaTime soundEnd);
  bool appendPicture(Clips& clips, const platform::SampleBufferRef& sample);
  void repeatLastPicture(Clips& clips);
  void closeSeamIfComplete(Clips& clips, platform::MediaTime now);
  static void finishClip(const std::shared_ptr<ClipHandover>& handover, const std::shared_ptr<QVMovieWriter>& writer,
                         int64_t number, bool finished, std::function<void()> handed);
  mutable std::mutex clipLock_;  ///< taken after `shouldStopLock_`, where both are
  Clips clips_;

  /// One stretch of capture lasts from a start or resume to the next stop: a tap that reports its
  /// start after that must not start the screen any more.
  struct ScreenCapture {
    std::shared_ptr<platform::ScreenCaptureController> controller;
    platform::Size size;
    int32_t frameRate = 0;
    uint64_t stretch = 0;
  };
  platform::Guarded<ScreenCapture> screenCapture_;
};

/// The EXIF orientation (1 to 8) of the capture service's transform flags.
uint32_t orientationFromVellTransform(uint64_t transformFlags);
/// The movie transform of the flags: bit 2 quarter turn, bit 1 mirrored in x, bit 0 in y.
platform::AffineTransform _affineTransformFromVellTransformFlags(uint64_t transformFlags);

}  // namespace qv
