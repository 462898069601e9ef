#include <utility>

#include "platform/base/RawRecord.h"
#include "platform/threads/Log.h"
#include "session/PictureTransform.h"
#include "session/SamplesOutput.h"

namespace qv {

using platform::Data;
using platform::SampleBufferRef;
using platform::Value;
namespace logs = platform::logs;

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
  payload.entries = {{broadcastpayload::kActionType, Value(static_cast<int64_t>(action))},
                     {broadcastpayload::kUserInfo, Value(plan_.info.extensionUserInfo)}};
  to->processPayload(std::move(payload), [completion = std::move(completion)](PayloadOutcome) { completion(); });
}

bool SamplesOutput::appendVideo(const PlacedPicture& picture) {
  _notifyExtensionOfVideoSampleBuffer(picture, SampleType::Video, orientationFromVellTransform(picture.transformFlags));
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

void SamplesOutput::_notifyExtensionOfVideoSampleBuffer(const PlacedPicture& picture, SampleType type,
                                                        uint32_t sampleOrientation) {
  const Link to = link();
  if (!to) return;
  const SampleBufferRef& sample = picture.sample;
  BroadcastPayload payload;
  payload.kind = BroadcastPayload::Kind::Video;
  payload.entries = {{broadcastpayload::kVideoOrientation, Value(sampleOrientation)},
                     {broadcastpayload::kSampleType, Value(static_cast<int64_t>(type))},
                     {broadcastpayload::kTimingInfo, Value(rawBytes(sample->timing().front()))},
                     {broadcastpayload::kPauses, Value(rawBytes(picture.pauses))}};
  payload.frame.setSharedFrame(sample->image()->sharedFrame());
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
  const SampleBufferRef& sample = sound.sample;
  const auto bytes = sample->data()->bytes();
  const platform::AudioStreamDescription& format = sample->audioFormat()->streamDescription;
  BroadcastPayload payload;
  payload.kind = type == SampleType::Microphone ? BroadcastPayload::Kind::Microphone : BroadcastPayload::Kind::AppAudio;
  payload.duration = format.sampleRate > 0 ? static_cast<double>(sample->numSamples()) / format.sampleRate : 0;
  payload.entries = {{broadcastpayload::kSampleType, Value(static_cast<int64_t>(type))},
                     {broadcastpayload::kAudioBufferList, Value(Data(bytes.begin(), bytes.end()))},
                     {broadcastpayload::kAudioFormatDescription, Value(rawBytes(format))},
                     {broadcastpayload::kTimingInfo, Value(rawBytes(sample->timing().front()))},
                     {broadcastpayload::kNumSamples, Value(sample->numSamples())},
                     {broadcastpayload::kPauses, Value(rawBytes(sound.pauses))}};
  to->processPayload(std::move(payload), [](PayloadOutcome outcome) {
    if (outcome != PayloadOutcome::Answered) return;
    QV_LOG_DEBUG(logs::kSession, "quorveld sending audio payload to broadcast extension...");
  });
}

void SamplesOutput::_notifyExtensionOfFrontmostProcessBundleID(const std::string& bundleID) {
  const Link to = link();
  if (!to) return;
  BroadcastPayload payload;
  payload.entries = {{broadcastpayload::kFrontmostApp, Value(bundleID)}};
  to->processPayload(std::move(payload), [](PayloadOutcome outcome) {
    if (outcome != PayloadOutcome::Answered) return;
    QV_LOG(logs::kSession, "quorveld sending frontmost app bundleID to broadcast extension...");
  });
}

}  // namespace qv
