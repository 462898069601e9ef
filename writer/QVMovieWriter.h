#pragma once

#include <atomic>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "platform/Platform.h"
#include "platform/base/BufferQueue.h"
#include "platform/threads/Guarded.h"
#include "protocol/QVBroadcastConfiguration.h"
#include "support/QVTemporaryFiles.h"

namespace qv {

/// Turns the timed samples of one recording into one MPEG-4 movie: the captured screen as H.264, the
/// app's audio (track 1) and the microphone (track 2) as AAC.
///
/// Decides when the file's timeline starts (at the first video sample; audio before it is dropped),
/// keeps each track's times strictly increasing, and can end the movie at the last frame before a
/// stop was announced. It does not rebase times across a pause: samples come with their final times.
///
/// A writer lives for one file: start; append, only after the start handler has run; finish, once.
///
/// Threading: thread-safe; every step runs on the writer's serial queue. Appends wait for it, the
/// others return at once. Handlers are called on the writer's queue or a background queue.
class QVMovieWriter : public std::enable_shared_from_this<QVMovieWriter> {
 public:
  using FinishHandler = std::function<void(const std::optional<platform::URL>&)>;

  /// The platform is borrowed, and must outlive this and what it has begun.
  QVMovieWriter(const platform::Platform& platform, platform::Size windowSize, std::string outputPath);

  void setBroadcastConfig(std::optional<QVBroadcastConfiguration> configuration);
  void setSystemRecording(bool systemRecording) { systemRecording_ = systemRecording; }
  [[nodiscard]] bool isSystemRecording() const { return systemRecording_; }
  [[nodiscard]] platform::URL outputURL() const { return platform::URL::fileURL(outputPath_); }
  [[nodiscard]] const std::string& outputPath() const { return outputPath_; }
  [[nodiscard]] platform::Size windowSize() const { return windowSize_; }
  /// Offered, not called by this daemon.
  [[nodiscard]] platform::MediaTime trimVideoPresentationTime() const { return trimVideoPresentationTime_.load(); }

  /// Removes any file at the output path, sets the file writer up, then calls the handler, whether
  /// or not that succeeded: a failure shows at the first append or at the finish.
  void startWritingHandler(std::function<void()> handler);
  /// The same without removing a file, and waited for.
  void setupAssetWriter();
  /// False when the sample had to start the file and that failed, or the file has failed since:
  /// the recording is then over. True in every other case, also for a dropped sample.
  bool appendVideoSampleBuffer(const platform::SampleBufferRef& sample, const platform::AffineTransform& transform);
  void appendAudio1SampleBuffer(const platform::SampleBufferRef& sample);
  void appendAudio2SampleBuffer(const platform::SampleBufferRef& sample);
  /// The handler gets the movie's URL, or nothing when no video sample was ever written. A second
  /// finish is ignored, its handler not called. The URL says nothing of the outcome: `isSound` and `isThere` do.
  void finishWritingWithHandler(FinishHandler handler);
  /// From the finish handler on: whether the movie is complete on disk, index included, as was looked at.
  [[nodiscard]] bool isSound() const { return isSound_.load(); }
  /// From the finish handler on: whether there is a movie. One that is not sound holds what was written before the
  /// failure, finished as far as the disk allows.
  [[nodiscard]] bool isThere() const { return isThere_.load(); }
  /// The first thing that went wrong with the file (e.g. ENOSPC of the posix domain), from the time at which an append
  /// or the finish met it, or the set-up when that failed.
  [[nodiscard]] std::optional<platform::Error> failure() const { return failure_.load(); }
  /// Of its encoder, from the set-up on; nothing before.
  [[nodiscard]] std::shared_ptr<const platform::AssetWriterCounts> counts() const { return counts_.load(); }
  /// The movie is to end at the last frame written so far, unless the recording resumes.
  void notifyRecordingMayBeStopped();
  void notifyRecordingResumed();
  /// The movie is to end at this presentation time: its last picture lasts until then, sound that was captured before
  /// is kept, nothing goes beyond. So another movie that begins there continues it without a gap. Before the finish; an
  /// announced stop comes first. Without it the movie ends with its last sample.
  void endAtSourceTime(platform::MediaTime time) { endTime_.store(time); }
  /// Makes a copy of a finished movie without its first and last seconds (rounded to whole seconds).
  /// The handler gets the copy's URL, or nothing when the export failed, was cancelled or left no file. Several may run
  /// at once, and none needs the writer any more once it was asked for.
  void trimMovieWithURL(platform::URL movie, double startClipDuration, double endClipDuration,
                        platform::URL outputFileURL, FinishHandler handler);

 private:
  /// One track's input with what waits for it.
  struct Track {
    std::shared_ptr<platform::WriterInput> input;
    platform::BufferQueue queue;
    /// Of the last sample that went through the queue. The first video sample does not set it.
    platform::Guarded<platform::MediaTime> lastPresentationTime;
  };

  void dispatchedStartWritingHandler(const std::function<void()>& handler);
  void dispatchedSetupAssetWriter();
  bool dispatchedAppendVideoSampleBuffer(const platform::SampleBufferRef& sample,
                                         const platform::AffineTransform& transform);
  void dispatchedAppendAudio1SampleBuffer(const platform::SampleBufferRef& sample);
  void dispatchedAppendAudio2SampleBuffer(const platform::SampleBufferRef& sample);
  void dispatchedFinishWritingWithHandler(FinishHandler handler);
  void dispatchedTrimMovieWithURL(const platform::URL& movie, double startClipDuration, double endClipDuration,
                                  const platform::URL& outputFileURL, FinishHandler handler);

  [[nodiscard]] platform::AssetWriterStatus status() const;
  void createInputs();
  [[nodiscard]] platform::Dictionary compressionProperties() const;
  [[nodiscard]] int64_t bitRate() const;
  bool appendFirstVideoSample(const platform::SampleBufferRef& sample, const platform::AffineTransform& transform);
  bool ensureWriting(const platform::AffineTransform& transform);
  void noteFailure(const std::optional<platform::Error>& error);
  void drainVideo();
  void appendAudio(Track& track, int number, const platform::SampleBufferRef& sample);
  void drainAudio(Track& track, int number);
  void finishNotWriting(const FinishHandler& handler);
  void finishFile(FinishHandler handler);
  void lookAtFile();
  [[nodiscard]] bool keepRest();

  const platform::Platform& platform_;
  const QVTemporaryFiles files_;
  const platform::Size windowSize_;
  const std::string outputPath_;
  platform::SerialQueue movieWriterQueue_;
  std::optional<QVBroadcastConfiguration> broadcastConfig_;
  bool systemRecording_ = false;
  platform::Guarded<platform::MediaTime> trimVideoPresentationTime_;
  platform::Guarded<platform::MediaTime> endTime_;
  platform::Guarded<std::optional<platform::Error>> failure_;
  platform::Guarded<std::shared_ptr<const platform::AssetWriterCounts>> counts_;
  std::atomic<bool> isSound_{false};
  std::atomic<bool> isThere_{false};

  // Writer queue only.
  std::unique_ptr<platform::AssetWriter> assetWriter_;
  Track video_;
  Track audio1_;
  Track audio2_;
  bool didStartWriting_ = false;
  bool didStartSession_ = false;
  bool didProcessFirstSample_ = false;
  bool isFinishingWriting_ = false;
};

}  // namespace qv
