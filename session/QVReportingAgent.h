#pragma once

#include <atomic>
#include <cstdint>
#include <optional>
#include <string>

#include "platform/Metrics.h"
#include "platform/base/Geometry.h"
#include "platform/base/Value.h"
#include "platform/threads/Guarded.h"

namespace qv {

/// Camera positions of a usage report.
enum class CameraPosition : int32_t { Back = 1, Front = 2 };

/// Collects the figures of one recording, from its start to its stop, and sends them as one summary
/// event. Made anew at every start, so that counts never carry over.
///
/// Threading: thread-safe; counters are added to from capture threads.
class QVReportingAgent {
 public:
  static constexpr uint16_t kSessionSummaryEvent = 1;

  /// The reporter is borrowed, and must outlive this.
  QVReportingAgent(std::string serviceName, platform::MetricsReporter& metrics)
      : serviceName_(std::move(serviceName)), metrics_(metrics) {}

  [[nodiscard]] const std::string& serviceName() const { return serviceName_; }
  void addVideoFrame() { ++videoFrameCount_; }
  void addAppAudioFrame() { ++appAudioFrameCount_; }
  void addMicFrame() { ++micFrameCount_; }
  /// The counts so far.
  [[nodiscard]] int64_t videoFrameCount() const { return videoFrameCount_; }
  /// Offered, not called by this daemon, as the next.
  [[nodiscard]] int64_t appAudioFrameCount() const { return appAudioFrameCount_; }
  [[nodiscard]] int64_t micFrameCount() const { return micFrameCount_; }
  /// Seconds.
  void addActiveDuration(double seconds);
  /// Pixels, and frames per second.
  void setVideoCapture(platform::Size size, int64_t rate);
  /// Each camera counts once; other positions are ignored.
  void setCameraUsed(int32_t position);
  /// Bytes.
  void setRecordedFileSize(uint64_t size) { recordedFileSize_ = size; }
  /// Of the output; nothing where it counts none.
  void setDroppedPictures(std::optional<uint64_t> count) { droppedPictures_.store(count); }
  /// 0 for a normal stop, else the error code.
  void setEndReason(int64_t reason) { endReason_ = reason; }

  /// The 15 entries of the summary.
  [[nodiscard]] platform::Dictionary collectSummaryEventMetrics() const;
  /// Sends one event; an empty payload and a failed send are logged, nothing is retried.
  void reportEventWithType(uint16_t eventType, const platform::Dictionary& dictionary) const;

 private:
  const std::string serviceName_;
  platform::MetricsReporter& metrics_;
  std::atomic<bool> frontCameraUsed_{false};
  std::atomic<bool> backCameraUsed_{false};
  std::atomic<double> activeDuration_{0};
  std::atomic<int64_t> videoCaptureRate_{0};
  std::atomic<int64_t> videoFrameCount_{0};
  std::atomic<int64_t> appAudioFrameCount_{0};
  std::atomic<int64_t> micFrameCount_{0};
  std::atomic<uint64_t> recordedFileSize_{0};
  std::atomic<int64_t> endReason_{0};
  platform::Guarded<platform::Size> videoCaptureSize_;
  platform::Guarded<std::optional<uint64_t>> droppedPictures_;
};

}  // namespace qv
