#include <utility>

#include "platform/threads/Log.h"
#include "protocol/SampleCoding.h"
#include "session/PictureTransform.h"
#include "session/SamplesOutput.h"

namespace qv {

using platform::SampleBufferRef;
namespace logs = platform::logs;

OutputCounts SamplesOutput::counts() const {
  std::lock_guard lock(mutex_);
  return {.droppedPictures = broadcastUploadExtensionProxy_ ? broadcastUploadExtensionProxy_->droppedFrames() : 0};
}

SamplesOutput::Link SamplesOutput::link() {
  std::lock_guard lock(mutex_);
  if (!broadcastUploadExtensionProxy_ && absences_.count()) {
    QV_LOG(logs::kSession, "broadcast extension not ready");
  }
  return broadcastUploadExtensionProxy_;
}

void SamplesOutput::_notifyExtensionOfAction(BroadcastAction action, std::function<void()> completion) {
  const Link to = link();
  if (!to) {
    completion();
    return;
  }
  BroadcastPayload payload;
  payload.entries = payloadOf(ActionMessage{action, plan_.info.extensionUserInfo});
  to->processPayload(std::move(payload), [completion = std::move(completion)](PayloadOutcome) { completion(); });
}

bool SamplesOutput::appendVideo(const PlacedPicture& picture) {
  _notifyExtensionOfVideoSampleBuffer(picture, orientationFromVellTransform(picture.transformFlags));
  return true;
}

void SamplesOutput::appendAppAudio(const PlacedSound& sound) {
  _notifyExtensionOfAudioSampleBuffer(sound, SampleType::AppAudio);
}

void SamplesOutput::appendMicrophone(const PlacedSound& sound) {
  _notifyExtensionOfAudioSampleBuffer(sound, SampleType::Microphone);
}

void SamplesOutput::tellFrontmostApplication(const std::string& bundleID) {
  _notifyExtensionOfFrontmostProcessBundleID(bundleID);
}

void SamplesOutput::_notifyExtensionOfVideoSampleBuffer(const PlacedPicture& picture, uint32_t sampleOrientation) {
  const Link to = link();
  if (!to) return;
  const SampleBufferRef& sample = picture.sample;
  BroadcastPayload payload;
  payload.kind = BroadcastPayload::Kind::Video;
  const PictureMessage message{.surface = sample->image()->sharedFrame(),
                               .timing = sample->timing().front(),
                               .pauses = picture.pauses,
                               .orientation = sampleOrientation};
  payload.entries = payloadOf(message);
  payload.frame.setSharedFrame(message.surface);
  to->processPayload(std::move(payload), [](PayloadOutcome outcome) {
    if (outcome != PayloadOutcome::Answered) return;
    QV_LOG_DEBUG(logs::kSession, "quorveld sending video payload to broadcast extension...");
  });
}

void SamplesOutput::_notifyExtensionOfAudioSampleBuffer(const PlacedSound& sound, SampleType type) {
  // The silence that stands for a gap is for movies.
  if (sound.sample->presentationTime() <= platform::MediaTime::zero()) return;
  const Link to = link();
  if (!to) return;
  SoundMessage message = makeSoundMessage(type, *sound.sample);
  message.pauses = sound.pauses;
  const double sampleRate = message.format.sampleRate;
  BroadcastPayload payload;
  payload.kind = type == SampleType::Microphone ? BroadcastPayload::Kind::Microphone : BroadcastPayload::Kind::AppAudio;
  payload.duration = sampleRate > 0 ? static_cast<double>(message.numSamples) / sampleRate : 0;
  payload.entries = payloadOf(std::move(message));
  to->processPayload(std::move(payload), [](PayloadOutcome outcome) {
    if (outcome != PayloadOutcome::Answered) return;
    QV_LOG_DEBUG(logs::kSession, "quorveld sending audio payload to broadcast extension...");
  });
}

void SamplesOutput::_notifyExtensionOfFrontmostProcessBundleID(const std::string& bundleID) {
  const Link to = link();
  if (!to) return;
  BroadcastPayload payload;
  payload.entries = payloadOf(FrontmostMessage{bundleID});
  to->processPayload(std::move(payload), [](PayloadOutcome outcome) {
    if (outcome != PayloadOutcome::Answered) return;
    QV_LOG(logs::kSession, "quorveld sending frontmost app bundleID to broadcast extension...");
  });
}

}  // namespace qv
