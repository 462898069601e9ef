#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>

#include "platform/Guarded.h"
#include "platform/Platform.h"
#include "platform/SampleBuffer.h"

namespace qv {

struct AudioRecorderRecord;

/// Owns every capture source other than the screen: the microphone, a camera route, and the tap on
/// one process's audio. There is one for the process, shared by all sessions; only one records at
/// a time.
///
/// A microphone interruption and a change of the tapped process leave a gap in the audio, which one
/// silent filler sample covers. Samples reach the output handlers as they come; a handler that
/// keeps one takes its own reference. Handlers must accept an absent sample (a filler that could
/// not be made).
///
/// Normal order: start the app-audio tap and, where there is a microphone, microphone capture; set
/// `captureStartTime` at the first screen frame (app audio before it is dropped); `stopAllCapture`.
///
/// Threading: thread-safe. Starts work asynchronously on the audio dispatch queue; stops wait for it and for the
/// capture sample queue, and must not be called from them. Microphone and camera handlers are called on the capture
/// sample queue, the app-audio handler on the audio dispatch queue.
class QVCaptureManager final : public platform::CaptureOutputDelegate {
 public:
  using OutputHandler = std::function<void(const platform::SampleBufferRef&)>;
  using DidStartHandler = std::function<void()>;

  static QVCaptureManager& sharedManager();

  explicit QVCaptureManager(platform::Platform& platform);
  ~QVCaptureManager() override;

  /// Whether the device has a microphone, by its description.
  [[nodiscard]] bool hasAudioCaptureDevice() const;
  [[nodiscard]] platform::SerialQueue& audioDispatchQueue() { return audioDispatchQueue_; }
  [[nodiscard]] platform::SerialQueue& sessionSampleBufferQueue() { return sessionSampleBufferQueue_; }

  void startCaptureSession();
  void stopCaptureSession();
  void startMicrophoneCaptureWithOutput(OutputHandler outputHandler, DidStartHandler didStartHandler);
  void stopMicrophoneCapture();
  void startAppAudioCaptureForProcessID(int32_t processID, OutputHandler outputHandler,
                                        DidStartHandler didStartHandler);
  /// Like a start; the gap since the last app audio is filled before the first buffer.
  void resumeAppAudioCaptureForProcessID(int32_t processID, OutputHandler outputHandler);
  /// What was played up to the call reaches the output handler first; so does in `stopAllCapture` what the
  /// microphone heard.
  void stopAppAudioCapture();
  /// Stops every source, clears the handlers and the timing state.
  void stopAllCapture();

  /// `type` 1: an interruption of the audio session began; 0: it ended.
  void handleAudioSessionInterruption(uint32_t type);
  void checkAndHandleMicInterruption();
  void captureOutputDidOutputSampleBuffer(const platform::CaptureOutput& output,
                                          const platform::SampleBufferRef& sample) override;

  /// Silence of `gap` seconds in the format of `audioBasicDescription`, as one timing entry. Nothing
  /// for a gap beyond ten minutes: only a jump of the wall clock looks like that.
  [[nodiscard]] platform::SampleBufferRef createEmptyAudioSampleBuffer(platform::MediaTime presentationTime,
                                                                       double gap) const;
  [[nodiscard]] platform::AudioFormatDescriptionRef createAudioFormatDescription() const;

  /// The presentation time of the recording's first screen frame; invalid until the session sets it.
  [[nodiscard]] platform::MediaTime captureStartTime() const { return captureStartTime_.load(); }
  void setCaptureStartTime(platform::MediaTime time) { captureStartTime_.store(time); }
  [[nodiscard]] bool isRecordingMicrophone() const { return recordingMicrophone_; }
  [[nodiscard]] bool isRecordingCamera() const { return false; }
  [[nodiscard]] bool sessionInProgress() const { return sessionInProgress_; }
  [[nodiscard]] bool micInterrupted() const { return micInterrupted_; }
  void setCameraOutputHandler(OutputHandler handler) { cameraOutputHandler_.store(std::move(handler)); }
  void setCaptureSessionVideoDataOutput(std::shared_ptr<platform::VideoDataOutput> output);
  [[nodiscard]] const platform::AudioStreamDescription& audioBasicDescription() const { return audioBasicDescription_; }

 private:
  void setCaptureSession(std::shared_ptr<platform::DeviceCaptureSession> session);
  void attachMicrophone(OutputHandler outputHandler, DidStartHandler didStartHandler);
  void runMicDidStartHandler();

  void startTap(int32_t processID, OutputHandler outputHandler, DidStartHandler didStartHandler);
  void openTapQueue(AudioRecorderRecord& record, int32_t processID);
  void allocateTapBuffers(AudioRecorderRecord& record);
  void handleInputBuffer(const std::weak_ptr<AudioRecorderRecord>& record, platform::QueueBuffer* buffer,
                         const platform::AudioTimeStamp& startTime, uint32_t packetCount);
  void processInputBuffer(const std::shared_ptr<AudioRecorderRecord>& record, platform::QueueBuffer* buffer,
                          const platform::AudioTimeStamp& startTime, uint32_t packetCount);
  void deliverAppAudio(AudioRecorderRecord& record, const platform::QueueBuffer& buffer,
                       platform::MediaTime presentationTime, uint32_t packetCount);
  void handleIsRunningChange(const std::weak_ptr<AudioRecorderRecord>& record);
  void fillGapAfterResume();
  std::shared_ptr<AudioRecorderRecord> stopTap();
  void forgetTap(const std::shared_ptr<AudioRecorderRecord>& record);
  static void closeTapQueue(AudioRecorderRecord& record);

  platform::Platform& platform_;
  const platform::AudioStreamDescription audioBasicDescription_;
  const platform::AudioTimeStamp initialTimestamp_;
  platform::SerialQueue audioDispatchQueue_;
  platform::SerialQueue sessionSampleBufferQueue_;

  std::atomic<bool> recordingMicrophone_{false};
  std::atomic<bool> sessionInProgress_{false};
  std::atomic<bool> micInterrupted_{false};
  std::atomic<bool> resumed_{false};
  platform::Guarded<platform::MediaTime> captureStartTime_;
  platform::Guarded<OutputHandler> microphoneOutputHandler_;
  platform::Guarded<OutputHandler> cameraOutputHandler_;
  platform::Guarded<OutputHandler> appAudioOutputHandler_;
  platform::Guarded<DidStartHandler> micDidStartHandler_;
  platform::Guarded<DidStartHandler> appTapDidStartHandler_;
  /// When the last sample handed on will have finished playing, by the wall clock.
  platform::Guarded<std::optional<platform::Date>> lastMicAudioDate_;
  platform::Guarded<std::optional<platform::Date>> lastAudioDate_;
  /// The presentation time at which the last microphone sample ends.
  platform::Guarded<platform::MediaTime> micInterruptionPresentationTimeStamp_;

  platform::Guarded<std::shared_ptr<platform::DeviceCaptureSession>> captureSession_;
  platform::Guarded<std::shared_ptr<platform::CaptureDeviceInput>> captureDeviceAudioInput_;
  platform::Guarded<std::shared_ptr<platform::AudioDataOutput>> captureSessionAudioDataOutput_;
  platform::Guarded<std::shared_ptr<platform::VideoDataOutput>> captureSessionVideoDataOutput_;
  /// The running tap. Audio dispatch queue only.
  std::shared_ptr<AudioRecorderRecord> audioRecorderQueue_;
};

}  // namespace qv
