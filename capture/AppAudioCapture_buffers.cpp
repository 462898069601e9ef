#include <utility>

#include "capture/AppAudioCapture.h"
#include "capture/QVCaptureManager.h"
#include "platform/threads/Log.h"

namespace qv {

using platform::AudioTimeStamp;
using platform::Date;
using platform::MediaTime;
using platform::QueueBuffer;
namespace logs = platform::logs;

/// On the tap's thread. The tap is told on the audio dispatch queue even of a buffer that it gets back unread: a queue
/// takes its operations from one thread at a time.
void AppAudioCapture::handleInputBuffer(const std::weak_ptr<AudioRecorderRecord>& record, QueueBuffer* buffer,
                                        const AudioTimeStamp& startTime, uint32_t packetCount) {
  const bool isHeard = captureStartTime() != MediaTime::invalid();
  audioDispatchQueue_.async(record, [this, buffer, startTime, packetCount, isHeard](AudioRecorderRecord& tap) {
    if (isHeard) {
      processInputBuffer(tap, buffer, startTime, packetCount);
    } else {
      (void)tap.queue->enqueueBuffer(buffer);
    }
  });
}

void AppAudioCapture::processInputBuffer(AudioRecorderRecord& record, QueueBuffer* buffer,
                                         const AudioTimeStamp& startTime, uint32_t packetCount) {
  if (std::exchange(record.resumed, false)) fillGapAfterResume();
  if (!record.isRunning) {
    QV_LOG(logs::kCapture, "recorder is not running, ignoring audio data");
    return;
  }
  const uint32_t bytesPerPacket = record.dataFormat.bytesPerPacket;
  const uint32_t packets = packetCount != 0 ? packetCount : bytesPerPacket != 0 ? buffer->byteSize / bytesPerPacket : 0;
  deliverAppAudio(record, *buffer, platform::mediaTimeFromHostTime(startTime.hostTime), packetCount);
  record.currentPacket += packets;
  if (record.queue->enqueueBuffer(buffer) == 0) {
    QV_LOG_DEBUG(logs::kCapture, "QVRecordingManager: HandleInputBuffer: Successfully enqueued the audio buffer");
  }
}

void AppAudioCapture::deliverAppAudio(const AudioRecorderRecord& record, const QueueBuffer& buffer,
                                      MediaTime presentationTime, uint32_t packetCount) {
  auto format =
      std::make_shared<const platform::AudioFormatDescription>(platform::AudioFormatDescription{record.dataFormat});
  auto data =
      std::make_shared<const platform::DataBlock>(std::vector<uint8_t>(buffer.data, buffer.data + buffer.byteSize));
  const auto sample =
      platform::SampleBuffer::makeAudio(std::move(data), std::move(format), packetCount, presentationTime);
  if (!sample) return;
  lastAudioDate_ = Date{platform_.clock->now().secondsSince1970 + sample->duration().seconds()};
  if (outputHandler_) outputHandler_(sample);
}

void AppAudioCapture::fillGapAfterResume() {
  if (!lastAudioDate_) return;
  const double gap = platform_.clock->now().secondsSince1970 - lastAudioDate_->secondsSince1970;
  if (!(gap > 0.0)) return;
  QV_LOG(logs::kCapture, "gap since last audio tap, filling with empty sample buffer");
  const auto filler = manager_.createEmptyAudioSampleBuffer(MediaTime::zero(), gap);
  if (outputHandler_) outputHandler_(filler);
}

}  // namespace qv
