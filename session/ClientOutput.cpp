#include "session/ClientOutput.h"

namespace qv {

using platform::MediaTime;
using platform::SampleBufferRef;

void ClientOutput::tellTimeline(QVClientProxy& to, MediaTime pauses) {
  if (pauses == toldPauses_) return;
  toldPauses_ = pauses;
  to.captureTimelineDidChange(pauses);
}

bool ClientOutput::appendVideo(const PlacedPicture& picture) {
  std::lock_guard lock(mutex_);
  if (const auto to = client_()) {
    tellTimeline(*to, picture.pauses);
    packageVideoSampleBufferForCapture(*to, picture.sample);
  }
  return true;
}

void ClientOutput::appendAppAudio(const PlacedSound& sound) {
  packageAudioSampleBufferForCapture(sound, SampleType::AppAudio);
}

void ClientOutput::appendMicrophone(const PlacedSound& sound) {
  packageAudioSampleBufferForCapture(sound, SampleType::Microphone);
}

void ClientOutput::packageVideoSampleBufferForCapture(QVClientProxy& to, const SampleBufferRef& sample) {
  to.captureHandlerWithSample({.surface = sample->image()->sharedFrame(), .timing = sample->timing().front()},
                              droppedPictures_);
}

void ClientOutput::packageAudioSampleBufferForCapture(const PlacedSound& sound, SampleType type) {
  // The silence that stands for a gap is for movies.
  if (sound.sample->presentationTime() <= MediaTime::zero()) return;
  std::lock_guard lock(mutex_);
  const auto to = client_();
  if (!to) return;
  tellTimeline(*to, sound.pauses);
  to->captureHandlerWithAudioSample(makeSoundMessage(type, *sound.sample));
}

}  // namespace qv
