#pragma once

#include <atomic>
#include <condition_variable>
#include <functional>
#include <mutex>
#include <optional>
#include <variant>
#include <vector>

#include "platform/AssetWriter.h"

namespace qv::platform::ffmpeg {

/// A sample on its way to the encoders. A picture that found the queue full has lost its image: its
/// times still tell the place of the sound.
struct QueuedSample {
  MediaType type;
  size_t input;
  SampleBufferRef sample;
};
struct QueuedPictureTimes {
  MediaTime captureTime;
  MediaTime presentationTime;
};
struct SessionStart {
  MediaTime time;
};
struct SessionFinish {
  std::optional<MediaTime> endTime;
  std::function<void()> completion;
};
using WriterItem = std::variant<QueuedSample, QueuedPictureTimes, SessionStart, SessionFinish>;

/// What a writer, its inputs and its encoder thread share: the status and the queue between them.
///
/// Threading: thread-safe.
class WriterState final : public AssetWriterCounts {
 public:
  /// Pictures that wait for the encoder: a tenth of a second at 60 per second.
  static constexpr size_t kMaximumPictures = 6;
  /// Audio samples that wait; reached only when the encoder stands still.
  static constexpr size_t kMaximumAudioSamples = 1024;

  [[nodiscard]] AssetWriterStatus status() const { return status_.load(std::memory_order_acquire); }
  [[nodiscard]] std::optional<Error> error() const;
  void start() { status_.store(AssetWriterStatus::Writing, std::memory_order_release); }
  /// The first failure counts. What is queued is let go.
  void fail(const Error& error);
  void complete();

  [[nodiscard]] bool isReady(MediaType type, bool realTime) const;
  /// False where the sample is refused: not writing, finishing, or no room.
  bool pushSample(QueuedSample sample, bool realTime);
  /// Queues control items; no sample follows a finish.
  void pushControl(WriterItem control);
  /// Waits for items; empty when the writer goes away.
  std::vector<WriterItem> take();
  void close();
  [[nodiscard]] uint64_t droppedPictures() const override { return droppedPictures_.load(std::memory_order_relaxed); }
  [[nodiscard]] std::string videoEncoder() const override;
  void setVideoEncoder(const std::string& name);
  /// A sample that was taken has been dealt with: there is room for the next.
  void sampleDone(MediaType type);

 private:
  [[nodiscard]] bool hasRoom(MediaType type) const;

  std::atomic<AssetWriterStatus> status_{AssetWriterStatus::Unknown};
  std::atomic<uint64_t> droppedPictures_{0};
  mutable std::mutex mutex_;
  std::condition_variable changed_;
  std::optional<Error> error_;
  std::string videoEncoder_;
  std::vector<WriterItem> items_;
  size_t pictures_ = 0;  ///< queued or being encoded
  size_t audioSamples_ = 0;
  bool finishing_ = false;
  bool closed_ = false;
};

}  // namespace qv::platform::ffmpeg
