#include "capture/AppAudioCapture.h"

#include <utility>

#include "capture/QVCaptureManager.h"
#include "platform/threads/Log.h"

namespace qv {

using platform::AudioTimeStamp;
using platform::QueueBuffer;
namespace logs = platform::logs;

namespace {
constexpr uint32_t kQueueCreationFlags = 0x800;
}  // namespace

AppAudioCapture::AppAudioCapture(platform::Platform& platform, QVCaptureManager& manager, OutputHandler outputHandler)
    : platform_(platform),
      manager_(manager),
      audioDispatchQueue_(manager.audioDispatchQueue()),
      outputHandler_(std::move(outputHandler)) {}

AppAudioCapture::~AppAudioCapture() { AppAudioCapture::stopAppAudioCapture(); }

void AppAudioCapture::startAppAudioCaptureForProcessID(int32_t processID, DidStartHandler didStartHandler) {
  requestTap(processID, std::move(didStartHandler), false);
}

void AppAudioCapture::resumeAppAudioCaptureForProcessID(int32_t processID, DidStartHandler didStartHandler) {
  requestTap(processID, std::move(didStartHandler), true);
}

void AppAudioCapture::requestTap(int32_t processID, DidStartHandler didStartHandler, bool resumed) {
  audioDispatchQueue_.async([this, processID, didStartHandler = std::move(didStartHandler), resumed]() mutable {
    endTap();
    audioRecorderQueue_ = std::make_shared<AudioRecorderRecord>();
    audioRecorderQueue_->didStartHandler = std::move(didStartHandler);
    audioRecorderQueue_->resumed = resumed;
    startTap(processID);
  });
}

void AppAudioCapture::startTap(int32_t processID) {
  AudioRecorderRecord& record = *audioRecorderQueue_;
  record.dataFormat = manager_.audioBasicDescription();
  openTapQueue(record, processID);
  record.allocateBuffers();
  if (record.queue) {
    (void)record.queue->addIsRunningListener(
        [this, weakRecord = std::weak_ptr(audioRecorderQueue_)] { handleIsRunningChange(weakRecord); });
  }
  const bool started = record.start();
  QV_LOG(logs::kCapture, "QVRecordingManager: startAudioCapture: Successfully started Audio Queue Recording");
  // Somebody waits for the sound to begin the picture.
  if (!started) record.runDidStartHandler();
}

void AppAudioCapture::openTapQueue(AudioRecorderRecord& record, int32_t processID) {
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

/// On the tap's thread.
void AppAudioCapture::handleIsRunningChange(const std::weak_ptr<AudioRecorderRecord>& record) {
  audioDispatchQueue_.async(record, [](AudioRecorderRecord& tap) {
    // Once per start.
    (void)tap.queue->removeIsRunningListener();
    tap.runDidStartHandler();
  });
}

void AppAudioCapture::endTap() {
  if (!audioRecorderQueue_) return;
  audioRecorderQueue_->stop();
  // Behind the work of the buffers that the stop has handed over: until then the tap is theirs.
  audioDispatchQueue_.async([record = std::move(audioRecorderQueue_)]() mutable { record.reset(); });
}

void AppAudioCapture::beginStoppingAppAudioCapture() {
  audioDispatchQueue_.async([this] { endTap(); });
}

void AppAudioCapture::stopAppAudioCapture() {
  audioDispatchQueue_.sync([this] { endTap(); });
  // The tap that has ended, by this stop or one begun before, goes in work that is queued by now.
  audioDispatchQueue_.sync([] {});
}

}  // namespace qv
