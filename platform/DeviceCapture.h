#pragma once

#include <cstdint>
#include <functional>
#include <memory>

#include "platform/base/SampleBuffer.h"
#include "platform/threads/SerialQueue.h"

namespace qv::platform {

/// A capture device attached to a session.
class CaptureDeviceInput {
 public:
  virtual ~CaptureDeviceInput() = default;
};

class CaptureOutput;

/// Receives samples of an output on the queue given to `setSampleDelegate`.
class CaptureOutputDelegate {
 public:
  virtual ~CaptureOutputDelegate() = default;
  virtual void captureOutputDidOutputSampleBuffer(const CaptureOutput& output, const SampleBufferRef& sample) = 0;
};

/// Where a session's samples come out. After removal from its session no callback starts.
class CaptureOutput {
 public:
  virtual ~CaptureOutput() = default;
  /// `delegate` and `queue` must outlive the output's membership in a session.
  virtual void setSampleDelegate(CaptureOutputDelegate* delegate, SerialQueue* queue) = 0;
};
class AudioDataOutput : public CaptureOutput {};
class VideoDataOutput : public CaptureOutput {};

/// A running set of capture devices. Audio comes as 16-bit signed big-endian or little-endian
/// linear PCM, as each sample's format says, stamped on the host clock.
///
/// Threading: thread-safe. The running observer is called on the session's own thread.
class DeviceCaptureSession {
 public:
  virtual ~DeviceCaptureSession() = default;
  virtual void setUsesApplicationAudioSession(bool uses) = 0;
  virtual void setAutomaticallyConfiguresApplicationAudioSession(bool configures) = 0;
  /// False for an absent input, and for a second one of its kind.
  [[nodiscard]] virtual bool canAddInput(const std::shared_ptr<CaptureDeviceInput>& input) const = 0;
  virtual void addInput(std::shared_ptr<CaptureDeviceInput> input) = 0;
  virtual void removeInput(const std::shared_ptr<CaptureDeviceInput>& input) = 0;
  [[nodiscard]] virtual bool canAddOutput(const std::shared_ptr<CaptureOutput>& output) const = 0;
  virtual void addOutput(std::shared_ptr<CaptureOutput> output) = 0;
  virtual void removeOutput(const std::shared_ptr<CaptureOutput>& output) = 0;
  virtual void startRunning() = 0;
  /// What was heard up to the call has then been queued for the delegate: waits 50 ms at most for what is
  /// still on its way.
  virtual void stopRunning() = 0;
  [[nodiscard]] virtual bool isRunning() const = 0;
  /// Called after each change of `isRunning`. Nothing removes the observer.
  virtual void setRunningObserver(std::function<void()> observer) = 0;
};

enum class AudioSessionCategory { PlayAndRecord };
enum AudioSessionCategoryOptions : uint32_t {
  kAudioSessionMixWithOthers = 1,
  kAudioSessionAllowBluetooth = 4,
};
enum class AudioSessionInterruption : uint32_t { Ended = 0, Began = 1 };

/// This process's stand in the device's audio.
class AudioSession {
 public:
  virtual ~AudioSession() = default;
  /// A platform status, 0 for success.
  virtual int32_t setCategory(AudioSessionCategory category, uint32_t options) = 0;
  /// Called on the platform's thread with the interruption type's raw number. Nothing removes it.
  virtual void setInterruptionObserver(std::function<void(uint32_t type)> observer) = 0;
};

class DeviceCaptureService {
 public:
  virtual ~DeviceCaptureService() = default;
  virtual std::shared_ptr<DeviceCaptureSession> createSession() = 0;
  /// The default microphone; nothing where there is none or it cannot be opened.
  virtual std::shared_ptr<CaptureDeviceInput> createDefaultAudioInput() = 0;
  virtual std::shared_ptr<AudioDataOutput> createAudioDataOutput() = 0;
  virtual AudioSession& audioSession() = 0;
};

}  // namespace qv::platform
