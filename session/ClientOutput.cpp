#include "session/ClientOutput.h"

#include "platform/base/RawRecord.h"

namespace qv {

using platform::Data;
using platform::MediaTime;
using platform::SampleBufferRef;

void ClientOutput::tellTimeline(QVClientProxy& to, MediaTime pauses) {
  if (pauses == toldPauses_) return;
  toldPauses_ = pauses;
  to.captureTimelineDidChange(rawBytes(pauses));
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
  QVSharedFrameObject frame;
  frame.setSharedFrame(sample->image()->sharedFrame());
  to.captureHandlerWithSample(frame, rawBytes(sample->timing().front()));
}

void ClientOutput::packageAudioSampleBufferForCapture(const PlacedSound& sound, SampleType type) {
  const SampleBufferRef& sample = sound.sample;
  // The silence that stands for a gap is for movies.
  if (sample->presentationTime() <= MediaTime::zero()) return;
  const auto bytes = sample->data()->bytes();
  std::lock_guard lock(mutex_);
  const auto to = client_();
  if (!to) return;
  tellTimeline(*to, sound.pauses);
  to->captureHandlerWithAudioSample(Data(bytes.begin(), bytes.end()),
                                    rawBytes(sample->audioFormat()->streamDescription), sample->numSamples(),
                                    static_cast<int64_t>(type), rawBytes(sample->timing().front()));
}

}  // namespace qv
