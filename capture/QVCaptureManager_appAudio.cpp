#include <algorithm>

#include "capture/AudioRecorderRecord.h"
#include "capture/QVCaptureManager.h"
#include "platform/Log.h"

namespace qv {

using platform::AudioTimeStamp;
using platform::Date;
using platform::MediaTime;
using platform::QueueBuffer;
namespace logs = platform::logs;

namespace {

constexpr uint32_t kQueueCreationFlags = 0x800;
constexpr double kBufferSeconds = 1.0;
constexpr double kMaximumBufferBytes = 57344.0;

void checkStartStatus(int32_t status) {
  if (status != 0) QV_LOG_ERROR(logs::kCapture, "QVRecordingManager: startAudioCapture error: %i", status);
}

void logRelease(int32_t status, const char* success) {
  if (status != 0) {
    QV_LOG_ERROR(logs::kCapture, "QVRecordingManager: error: %i", status);
  } else {
    QV_LOG_INFO(logs::kCapture, "%s", success);
  }
}

}  // namespace

uint32_t computeBufferByteSize(platform::AppAudioTapQueue& queue, const platform::AudioStreamDescription& format,
                               double seconds) {
  uint32_t maxPacketSize = format.bytesPerPacket;
  if (maxPacketSize == 0) (void)queue.maximumOutputPacketSize(maxPacketSize);
  return static_cast<uint32_t>(std::min(format.sampleRate * maxPacketSize * seconds, kMaximumBufferBytes));
}

void QVCaptureManager::startAppAudioCaptureForProcessID(int32_t processID, OutputHandler outputHandler,
                                                        DidStartHandler didStartHandler) {
  audioDispatchQueue_.async([this, processID, outputHandler = std::move(outputHandler),
                             didStartHandler = std::move(didStartHandler)]() mutable {
    startTap(processID, std::move(outputHandler), std::move(didStartHandler));
  });
}

void QVCaptureManager::resumeAppAudioCaptureForProcessID(int32_t processID, OutputHandler outputHandler) {
  resumed_ = true;
  startAppAudioCaptureForProcessID(processID, std::move(outputHandler), nullptr);
}

void QVCaptureManager::startTap(int32_t processID, OutputHandler outputHandler, DidStartHandler didStartHandler) {
  appAudioOutputHandler_.store(std::move(outputHandler));
  audioRecorderQueue_ = std::make_shared<AudioRecorderRecord>();
  AudioRecorderRecord& record = *audioRecorderQueue_;
  record.dataFormat = audioBasicDescription_;
  openTapQueue(record, processID);
  allocateTapBuffers(record);
  record.currentPacket = 0;
  record.isRunning = true;
  if (record.queue) {
    (void)record.queue->addIsRunningListener(
        [this, weakRecord = std::weak_ptr(audioRecorderQueue_)] { handleIsRunningChange(weakRecord); });
    checkStartStatus(record.queue->start());
  }
  QV_LOG(logs::kCapture, "QVRecordingManager: startAudioCapture: Successfully started Audio Queue Recording");
  // The is-running callback defers to this queue, so the handler is in place before it is looked for.
  appTapDidStartHandler_.store(std::move(didStartHandler));
}

void QVCaptureManager::openTapQueue(AudioRecorderRecord& record, int32_t processID) {
  auto callback = [this, weakRecord = std::weak_ptr(audioRecorderQueue_)](
                      QueueBuffer* buffer, const AudioTimeStamp& startTime, uint32_t packetCount) {
    handleInputBuffer(weakRecord, buffer, startTime, packetCount);
  };
  checkStartStatus(platform_.appAudioTap->createInputQueue(record.dataFormat, std::move(callback), kQueueCreationFlags,
                                                           record.queue));
  QV_LOG(logs::kCapture, "QVRecordingManager: startAudioCapture: Created Audio Queue Input");
  if (record.queue) checkStartStatus(record.queue->setTappedProcess(processID));
  QV_LOG(logs::kCapture, "QVRecordingManager: startAudioCapture: Successfully set Audio Queue to PID");
  if (record.queue) checkStartStatus(record.queue->streamDescription(record.dataFormat));
}

void QVCaptureManager::allocateTapBuffers(AudioRecorderRecord& record) {
  if (!record.queue) return;
  record.bufferByteSize = computeBufferByteSize(*record.queue, record.dataFormat, kBufferSeconds);
  for (QueueBuffer*& buffer : record.buffers) {
    // A missing buffer leaves the queue running on the others.
    if (record.queue->allocateBuffer(record.bufferByteSize, buffer) == 0) (void)record.queue->enqueueBuffer(buffer);
  }
}

void QVCaptureManager::handleInputBuffer(const std::weak_ptr<AudioRecorderRecord>& record, QueueBuffer* buffer,
                                         const AudioTimeStamp& startTime, uint32_t packetCount) {
  if (captureStartTime() == MediaTime::invalid()) return;
  audioDispatchQueue_.async([this, record, buffer, startTime, packetCount] {
    if (const auto strong = record.lock()) processInputBuffer(strong, buffer, startTime, packetCount);
  });
}

void QVCaptureManager::processInputBuffer(const std::shared_ptr<AudioRecorderRecord>& record, QueueBuffer* buffer,
                                          const AudioTimeStamp& startTime, uint32_t packetCount) {
  if (record != audioRecorderQueue_) return;
  const MediaTime presentationTime = platform::mediaTimeFromHostTime(startTime.hostTime);
  if (resumed_.exchange(false)) fillGapAfterResume();
  if (!record->isRunning) {
    QV_LOG(logs::kCapture, "recorder is not running, ignoring audio data");
    return;
  }
  const uint32_t bytesPerPacket = record->dataFormat.bytesPerPacket;
  const uint32_t packets = packetCount != 0 ? packetCount : bytesPerPacket != 0 ? buffer->byteSize / bytesPerPacket : 0;
  deliverAppAudio(*record, *buffer, presentationTime, packetCount);
  record->currentPacket += packets;
  if (record->queue->enqueueBuffer(buffer) == 0) {
    QV_LOG_DEBUG(logs::kCapture, "QVRecordingManager: HandleInputBuffer: Successfully enqueued the audio buffer");
  }
}

void QVCaptureManager::deliverAppAudio(AudioRecorderRecord& record, const QueueBuffer& buffer,
                                       MediaTime presentationTime, uint32_t packetCount) {
  auto format =
      std::make_shared<const platform::AudioFormatDescription>(platform::AudioFormatDescription{record.dataFormat});
  auto data =
      std::make_shared<const platform::DataBlock>(std::vector<uint8_t>(buffer.data, buffer.data + buffer.byteSize));
  const auto sample =
      platform::SampleBuffer::makeAudio(std::move(data), std::move(format), packetCount, presentationTime);
  if (!sample) return;
  lastAudioDate_.store(Date{platform_.clock->now().secondsSince1970 + sample->duration().seconds()});
  if (const OutputHandler handler = appAudioOutputHandler_.load()) handler(sample);
}

void QVCaptureManager::fillGapAfterResume() {
  const std::optional<Date> last = lastAudioDate_.load();
  if (!last) return;
  const double gap = platform_.clock->now().secondsSince1970 - last->secondsSince1970;
  if (!(gap > 0.0)) return;
  QV_LOG(logs::kCapture, "gap since last audio tap, filling with empty sample buffer");
  const auto filler = createEmptyAudioSampleBuffer(MediaTime::zero(), gap);
  if (const OutputHandler handler = appAudioOutputHandler_.load()) handler(filler);
}

void QVCaptureManager::handleIsRunningChange(const std::weak_ptr<AudioRecorderRecord>& record) {
  audioDispatchQueue_.async([this, record] {
    const auto strong = record.lock();
    if (!strong || strong != audioRecorderQueue_ || !strong->isRunning || strong->stopStatus) return;
    // Once per start.
    (void)strong->queue->removeIsRunningListener();
    if (const DidStartHandler handler = appTapDidStartHandler_.load()) handler();
  });
}

void QVCaptureManager::stopAppAudioCapture() {
  std::shared_ptr<AudioRecorderRecord> record;
  audioDispatchQueue_.sync([&] { record = stopTap(); });
  // By now the work of the buffers that the stop handed over is queued.
  audioDispatchQueue_.sync([&] { forgetTap(record); });
}

std::shared_ptr<AudioRecorderRecord> QVCaptureManager::stopTap() {
  const std::shared_ptr<AudioRecorderRecord> record = audioRecorderQueue_;
  if (!record || !record->queue || !record->isRunning || record->stopStatus) return record;
  record->stopStatus = record->queue->stop();
  if (*record->stopStatus != 0) {
    QV_LOG_ERROR(logs::kCapture, "QVRecordingManager:stopAudioCapture:error: %i", *record->stopStatus);
  } else {
    QV_LOG(logs::kCapture, "QVRecordingManager:stopAudioCapture: Audio Queue successfully stopped");
  }
  return record;
}

/// Not a tap that was started since.
void QVCaptureManager::forgetTap(const std::shared_ptr<AudioRecorderRecord>& record) {
  if (!record || record != audioRecorderQueue_) return;
  if (record->queue) {
    if (record->stopStatus == 0) closeTapQueue(*record);
    (void)record->queue->removeIsRunningListener();
  }
  // A queue that refused to stop is disposed of with its record.
  audioRecorderQueue_.reset();
}

void QVCaptureManager::closeTapQueue(AudioRecorderRecord& record) {
  record.isRunning = false;
  for (QueueBuffer*& buffer : record.buffers) {
    if (buffer == nullptr) continue;
    logRelease(record.queue->freeBuffer(buffer), "QVRecordingManager: Audio Queue buffer released");
    buffer = nullptr;
  }
  logRelease(record.queue->dispose(), "QVRecordingManager: Audio Queue has been disposed");
}

}  // namespace qv
