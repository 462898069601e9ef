#pragma once

#include <memory>
#include <optional>

#include "capture/AppAudioLease.h"
#include "capture/AudioRecorderRecord.h"
#include "platform/Platform.h"
#include "platform/threads/Clock.h"
#include "platform/threads/Guarded.h"

namespace qv {

/// The lease as the capture manager makes it. The work of its tap captures it plainly: the destructor waits until the
/// tap is gone and with it whatever could call.
///
/// Threading: as AppAudioLease. What has no lock is the audio dispatch queue's.
class AppAudioCapture final : public AppAudioLease {
 public:
  AppAudioCapture(platform::Platform& platform, QVCaptureManager& manager, OutputHandler outputHandler);
  ~AppAudioCapture() override;

  void startAppAudioCaptureForProcessID(int32_t processID, DidStartHandler didStartHandler) override;
  void resumeAppAudioCaptureForProcessID(int32_t processID, DidStartHandler didStartHandler) override;
  void stopAppAudioCapture() override;
  void beginStoppingAppAudioCapture() override;
  [[nodiscard]] platform::MediaTime captureStartTime() const override { return captureStartTime_.load(); }
  void setCaptureStartTime(platform::MediaTime time) override { captureStartTime_.store(time); }

 private:
  void requestTap(int32_t processID, DidStartHandler didStartHandler, bool resumed);
  void startTap(int32_t processID);
  void openTapQueue(AudioRecorderRecord& record, int32_t processID);
  void endTap();

  void handleInputBuffer(const std::weak_ptr<AudioRecorderRecord>& record, platform::QueueBuffer* buffer,
                         const platform::AudioTimeStamp& startTime, uint32_t packetCount);
  void processInputBuffer(AudioRecorderRecord& record, platform::QueueBuffer* buffer,
                          const platform::AudioTimeStamp& startTime, uint32_t packetCount);
  void deliverAppAudio(const AudioRecorderRecord& record, const platform::QueueBuffer& buffer,
                       platform::MediaTime presentationTime, uint32_t packetCount);
  void handleIsRunningChange(const std::weak_ptr<AudioRecorderRecord>& record);
  void fillGapAfterResume();

  platform::Platform& platform_;
  QVCaptureManager& manager_;
  platform::SerialQueue& audioDispatchQueue_;
  const OutputHandler outputHandler_;
  platform::Guarded<platform::MediaTime> captureStartTime_;
  /// When the last sound handed on will have finished playing, by the wall clock.
  std::optional<platform::Date> lastAudioDate_;
  std::shared_ptr<AudioRecorderRecord> audioRecorderQueue_;  ///< the running tap
};

}  // namespace qv
