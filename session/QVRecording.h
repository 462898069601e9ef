#pragma once

#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/ScreenCapture.h"
#include "session/KeepAliveTransaction.h"
#include "session/QVReportingAgent.h"
#include "session/RecordingEnd.h"
#include "session/RecordingOutput.h"
#include "session/RecordingSettings.h"
#include "session/RecordingSources.h"
#include "session/StartAnswer.h"
#include "session/TimingGate.h"

namespace qv {

class QVRecording;

/// What a recording tells its session. On the sequence, but for what is marked otherwise.
class QVRecordingObserver {
 public:
  virtual ~QVRecordingObserver() = default;
  /// The end has begun; nothing of it has happened yet.
  virtual void recordingWillEnd(const std::shared_ptr<QVRecording>& recording) = 0;
  /// Its client, which knows that it had begun, is to be told.
  virtual void recordingStopped(const std::shared_ptr<QVRecording>& recording, const platform::Error& error,
                                const std::optional<platform::URL>& movie) = 0;
  /// Everything is given back.
  virtual void recordingDidEnd(const std::shared_ptr<QVRecording>& recording) = 0;
  /// On a capture thread, with each sample. Seconds.
  virtual void recordingDidUpdateDuration(double seconds) = 0;
};

/// What can be told of a recording that goes on.
struct RecordingFigures {
  std::optional<platform::Date> since = std::nullopt;          ///< when its output was started; nothing before
  platform::MediaTime recorded = platform::MediaTime::zero();  ///< from the first picture to the last, less the pauses
  int64_t pictures = 0;
  uint64_t bytes = 0;  ///< of its movie's file so far; 0 without
  OutputCounts output = {};
};

/// One recording of one application, from a start that has passed its checks to its end. It owns what it takes, and
/// gives it back when it ends, in its destructor at the latest: the keep-alive transaction, the answer that its client
/// waits for, the report of its end, its file and its output, its sources, its metrics.
///
/// It is preparing, running, paused, ending or ended, and goes on in that order, but for pauses. Who ends it first says
/// how; later ends find it ending. Whatever comes late from a source or an extension finds a dead weak pointer, or a
/// state in which it is not taken.
///
/// Threading: lifecycle steps on the sequence; samples and failures on capture threads. `shouldStopLock_` guards state,
/// timing and sources, and is held for the whole way of a picture into the output. It is never held while something is
/// waited for that may deliver a sample.
class QVRecording final : public platform::ScreenCaptureControllerDelegate,
                          public std::enable_shared_from_this<QVRecording> {
 public:
  enum class State { Preparing, Running, Paused, Ending, Ended };

  QVRecording(std::shared_ptr<RecordingContext> context, RecordingSettings settings, StartAnswer answer,
              std::weak_ptr<QVRecordingObserver> observer);
  ~QVRecording() override;
  /// Once, before anything else: where the samples go.
  void setOutput(std::shared_ptr<RecordingOutput> output) { output_ = std::move(output); }

  [[nodiscard]] const RecordingSettings& settings() const { return settings_; }
  [[nodiscard]] State state() const;
  /// Preparing, running or paused.
  [[nodiscard]] bool isRecording() const { return state() < State::Ending; }
  /// Whether it has come as far as to start its output. Sequence only.
  [[nodiscard]] bool wasStarted() const { return reportingAgent_ != nullptr; }
  [[nodiscard]] bool writesMovies() const;
  [[nodiscard]] bool microphoneEnabled() const;
  [[nodiscard]] int32_t frontmostPIDForAudioTap() const;
  /// So far. Sequence only; it looks at the file.
  [[nodiscard]] RecordingFigures figures() const;
  /// How long its pictures have been going on, without the pauses; 0 before the first. Thread-safe.
  [[nodiscard]] double recordedSeconds() const;

  // --- Lifecycle, in this order. A handler does not run when the recording ends first: its answer tells that.
  void prepare(std::function<void()> handler);
  /// `processID`: whose sound is recorded; below 1 nobody's. The handler runs when the sources have been started.
  void startSessionWithHandler(int32_t processID, std::function<void()> handler);
  void answerStarted(RecordedInputs inputs);
  /// Runs it now, or, while the client waits for the answer of the start, after that.
  void whenAnswered(std::function<void()> work);
  void pauseSession();
  void resumeSessionWithContextID(uint32_t contextID);
  /// Its client's stop. The handler gets the movie, which its client may save or discard from then on; without the
  /// first and last seconds where both durations are positive.
  void finishSessionWithStartClipDuration(double startClipDuration, double endClipDuration,
                                          RecordingEnd::Handler handler);
  /// Ends it without a movie. `cause`: nothing where nobody is left to be told.
  void finishAndCleanupSessionFiles(const std::optional<platform::Error>& cause);
  /// False when it is ending already. Thread-safe; what follows runs on the sequence.
  bool end(RecordingEnd end);
  /// A failure has ended it. Its movie stays in the store, or is handed to the client where only the disk is full.
  void fail(const platform::Error& error);
  /// Runs it on the sequence when everything is given back.
  void whenEnded(std::function<void()> work);

  // --- While it runs.
  void setMicrophoneEnabled(bool enabled);
  void updateProcessIDForAudioCaptureWithPID(int32_t processID);
  void checkAndStopAppAudioForPID(int32_t processID);
  void sessionReportCameraUsage(int32_t cameraPosition);
  void notifyRecordingMayBeStopped() { output_->notifyRecordingMayBeStopped(); }
  void notifyRecordingResumed() { output_->notifyRecordingResumed(); }

  // --- Samples and failures of the screen.
  void screenCaptureControllerDidReceiveSampleBuffer(platform::ScreenCaptureController& controller,
                                                     const platform::SampleBufferRef& sample,
                                                     uint64_t transformFlags) override;
  void screenCaptureControllerDidFailWithStatus(platform::ScreenCaptureController& controller, int32_t status) override;
  void screenCaptureControllerWasPreempted(platform::ScreenCaptureController& controller) override;
  void screenCaptureControllerMediaServicesWereReset(platform::ScreenCaptureController& controller) override;

 private:
  void outputStarted(const std::optional<platform::Error>& error, const std::function<void()>& handler);
  /// Of a recording that prepares or is paused, and only of such a one: then it runs.
  void _resumeOrStartSession();
  // With the lock held.
  [[nodiscard]] std::unique_ptr<RecordingSources> startSources();
  [[nodiscard]] bool isMicrophoneWanted() const;
  void setupMicTap(RecordingSources& sources);
  [[nodiscard]] ScreenRequest screenRequest() const;

  void stopAllCapture(std::unique_ptr<RecordingSources> sources);
  void _processSampleBuffer(const platform::SampleBufferRef& sample, uint64_t transformFlags);
  void updateDuartionWithSample(const platform::SampleBufferRef& sample);
  /// The part of a run of sound that is recorded, in the recording's timeline; nothing where none is.
  [[nodiscard]] std::optional<PlacedSound> placeSound(const platform::SampleBufferRef& sample) const;
  void handleAppAudio(const platform::SampleBufferRef& sample);
  void handleMicrophone(const platform::SampleBufferRef& sample);
  void updateBundleIdForFirstForegroundApp();

  // --- The end, in this order, on the sequence.
  void beginEnd();
  void outputFinished(const OutputResult& result);
  void trimMovie(const std::shared_ptr<MovieClaim>& movie);
  void disposeOfMovie(const OutputResult& made, const std::optional<platform::Error>& loss);
  [[nodiscard]] platform::Error errorOfFailedWrite(const std::optional<platform::Error>& failure) const;
  void completeEnd(const std::optional<platform::URL>& movie, const std::optional<platform::Error>& error);
  void report(const std::optional<platform::URL>& movie);
  void reportSummaryEvent();
  [[nodiscard]] uint64_t getRecordedFileSize() const;
  [[nodiscard]] std::string _serviceNameForReporting() const;

  const std::shared_ptr<RecordingContext> context_;
  const RecordingSettings settings_;
  const std::weak_ptr<QVRecordingObserver> observer_;
  std::shared_ptr<RecordingOutput> output_;

  mutable std::mutex shouldStopLock_;
  State state_ = State::Preparing;
  TimingGate timing_;
  std::unique_ptr<RecordingSources> sources_;
  bool microphoneEnabled_;
  int32_t frontmostPIDForAudioTap_ = 0;
  /// When the pause began that lasts, or that no picture has closed, or the end: sound is recorded up to then.
  platform::MediaTime stoppedAt_ = platform::MediaTime::invalid();
  platform::MediaTime firstSampleTimestamp_ = platform::MediaTime::zero();
  RecordingEnd end_;
  std::shared_ptr<QVRecordingObserver> endObserver_;

  // Sequence only.
  std::optional<KeepAliveTransaction> transaction_;
  StartAnswer answer_;
  std::vector<uint32_t> contextIDs_;
  std::optional<std::string> bundleIDOfFirstForegroundApp_;
  std::vector<std::function<void()>> whenAnswered_;
  std::vector<std::function<void()>> whenEnded_;
  /// Made when the output starts; without it there is nothing to be finished or summed up. Its counters are added to
  /// from capture threads, as long as there are sources.
  std::unique_ptr<QVReportingAgent> reportingAgent_;
  std::optional<platform::Date> since_;
};

}  // namespace qv
