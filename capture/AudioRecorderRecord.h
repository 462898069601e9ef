#pragma once

#include <array>
#include <cstdint>
#include <functional>
#include <memory>

#include "platform/AppAudioTap.h"

namespace qv {

inline constexpr size_t kTapBufferCount = 10;

/// One tap on one process, from its start on. The destructor frees the buffers and disposes of the queue. The
/// platform's callbacks hold it weakly, so that a late one never reaches a tap that is gone.
///
/// Threading: audio dispatch queue only.
struct AudioRecorderRecord {
  AudioRecorderRecord() = default;
  ~AudioRecorderRecord();
  AudioRecorderRecord(const AudioRecorderRecord&) = delete;
  AudioRecorderRecord& operator=(const AudioRecorderRecord&) = delete;

  void allocateBuffers();
  [[nodiscard]] bool start();
  /// What was played up to now comes to the input callback before this returns.
  void stop();
  /// Once: what comes later is ignored.
  void runDidStartHandler();

  std::unique_ptr<platform::AppAudioTapQueue> queue;  ///< nothing where the platform gave none
  /// First the requested format, then the one that the queue reports.
  platform::AudioStreamDescription dataFormat;
  std::array<platform::QueueBuffer*, kTapBufferCount> buffers{};
  uint32_t bufferByteSize = 0;
  int64_t currentPacket = 0;  ///< packets received since the start
  /// False once the queue has refused to stop: nobody asked for what it goes on to bring.
  bool isRunning = true;
  bool resumed = false;  ///< the gap before its first buffer is still to be filled
  std::function<void()> didStartHandler;

 private:
  void freeBuffersAndDispose();
};

/// Tells the log of a step of a tap's start that the platform refused; the start goes on.
void checkStartStatus(int32_t status);

/// The size of one tap buffer: `seconds` of audio, 57344 bytes at most.
uint32_t computeBufferByteSize(platform::AppAudioTapQueue& queue, const platform::AudioStreamDescription& format,
                               double seconds);

}  // namespace qv
