#include "capture/AudioRecorderRecord.h"

#include <algorithm>
#include <utility>

#include "platform/threads/Log.h"

namespace qv {

namespace logs = platform::logs;

namespace {

constexpr double kBufferSeconds = 1.0;
constexpr double kMaximumBufferBytes = 57344.0;

void logRelease(int32_t status, const char* success) {
  if (status != 0) {
    QV_LOG_ERROR(logs::kCapture, "QVRecordingManager: error: %i", status);
  } else {
    QV_LOG_INFO(logs::kCapture, "%s", success);
  }
}

}  // namespace

void checkStartStatus(int32_t status) {
  if (status != 0) QV_LOG_ERROR(logs::kCapture, "QVRecordingManager: startAudioCapture error: %i", status);
}

uint32_t computeBufferByteSize(platform::AppAudioTapQueue& queue, const platform::AudioStreamDescription& format,
                               double seconds) {
  uint32_t maxPacketSize = format.bytesPerPacket;
  if (maxPacketSize == 0) (void)queue.maximumOutputPacketSize(maxPacketSize);
  return static_cast<uint32_t>(std::min(format.sampleRate * maxPacketSize * seconds, kMaximumBufferBytes));
}

AudioRecorderRecord::~AudioRecorderRecord() {
  if (!queue) return;
  // A queue that refused to stop disposes of itself, with buffers that it may still hold.
  if (isRunning) freeBuffersAndDispose();
  (void)queue->removeIsRunningListener();
}

void AudioRecorderRecord::allocateBuffers() {
  if (!queue) return;
  bufferByteSize = computeBufferByteSize(*queue, dataFormat, kBufferSeconds);
  for (platform::QueueBuffer*& buffer : buffers) {
    // A missing buffer leaves the queue running on the others.
    if (queue->allocateBuffer(bufferByteSize, buffer) == 0) (void)queue->enqueueBuffer(buffer);
  }
}

bool AudioRecorderRecord::start() {
  if (!queue) return false;
  const int32_t status = queue->start();
  checkStartStatus(status);
  return status == 0;
}

void AudioRecorderRecord::stop() {
  // The queue also tells its listener that it runs no more.
  didStartHandler = nullptr;
  if (!queue) return;
  const int32_t status = queue->stop();
  isRunning = status == 0;
  if (isRunning) {
    QV_LOG(logs::kCapture, "QVRecordingManager:stopAudioCapture: Audio Queue successfully stopped");
  } else {
    QV_LOG_ERROR(logs::kCapture, "QVRecordingManager:stopAudioCapture:error: %i", status);
  }
}

void AudioRecorderRecord::runDidStartHandler() {
  if (const auto handler = std::exchange(didStartHandler, nullptr)) handler();
}

void AudioRecorderRecord::freeBuffersAndDispose() {
  for (platform::QueueBuffer* buffer : buffers) {
    if (buffer == nullptr) continue;
    logRelease(queue->freeBuffer(buffer), "QVRecordingManager: Audio Queue buffer released");
  }
  logRelease(queue->dispose(), "QVRecordingManager: Audio Queue has been disposed");
}

}  // namespace qv
