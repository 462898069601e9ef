#include "protocol/SampleCoding.h"

#include <utility>

#include "platform/base/RawRecord.h"

namespace qv {

using platform::Data;
using platform::Dictionary;
using platform::find;
using platform::MediaTime;
using platform::recordFromBytes;
using platform::SampleTimingInfo;
using platform::Value;
using platform::valueForKey;

namespace {

constexpr auto kNoTime = MediaTime::invalid();

bool isValid(const PictureMessage& picture) {
  return picture.surface && picture.surface->layout().format == platform::PixelFormat::BGRX &&
         picture.timing.presentationTimeStamp.isNumeric();
}

/// The receiver may trust that the frames it is told of are there.
bool isValid(const SoundMessage& sound) {
  const uint32_t bytesPerFrame = sound.format.bytesPerFrame;
  return (sound.type == SampleType::AppAudio || sound.type == SampleType::Microphone) &&
         sound.format.formatID == platform::kAudioFormatLinearPCM && bytesPerFrame > 0 && sound.numSamples >= 0 &&
         static_cast<uint64_t>(sound.numSamples) <= sound.bytes.size() / bytesPerFrame &&
         sound.timing.presentationTimeStamp.isNumeric() && sound.pauses.isNumeric();
}

template <typename Message>
std::optional<Message> ifValid(Message message) {
  return isValid(message) ? std::optional(std::move(message)) : std::nullopt;
}

/// A record of another length has no time, or is no PCM.
SampleTimingInfo timingOf(const Data& bytes) {
  return recordFromBytes<SampleTimingInfo>(bytes).value_or(SampleTimingInfo{kNoTime, kNoTime, kNoTime});
}
platform::AudioStreamDescription formatOf(const Data& bytes) {
  return recordFromBytes<platform::AudioStreamDescription>(bytes).value_or(platform::AudioStreamDescription{});
}

PictureMessage pictureOf(const Dictionary& payload) {
  return {
      .surface = QVSharedFrameObject::decodeFromIPC(valueForKey(payload, broadcastpayload::kSharedFrame)).sharedFrame(),
      .timing = timingOf(valueForKey(payload, broadcastpayload::kTimingInfo).asData()),
      .orientation = static_cast<uint32_t>(valueForKey(payload, broadcastpayload::kVideoOrientation).asInteger(1))};
}

SoundMessage soundOf(const Dictionary& payload) {
  const Value* pauses = find(payload, broadcastpayload::kPauses);
  return {.type = static_cast<SampleType>(valueForKey(payload, broadcastpayload::kSampleType).asInteger()),
          .bytes = valueForKey(payload, broadcastpayload::kAudioBufferList).asData(),
          .format = formatOf(valueForKey(payload, broadcastpayload::kAudioFormatDescription).asData()),
          .numSamples = valueForKey(payload, broadcastpayload::kNumSamples).asInteger(-1),
          .timing = timingOf(valueForKey(payload, broadcastpayload::kTimingInfo).asData()),
          .pauses = pauses ? recordFromBytes<MediaTime>(pauses->asData()).value_or(kNoTime) : MediaTime::zero()};
}

template <typename Message>
BroadcastMessage validMessage(Message message) {
  return isValid(message) ? BroadcastMessage(std::move(message)) : BroadcastMessage();
}

}  // namespace

SoundMessage makeSoundMessage(SampleType type, const platform::SampleBuffer& sample) {
  const auto bytes = sample.data()->bytes();
  return {.type = type,
          .bytes = Data(bytes.begin(), bytes.end()),
          .format = sample.audioFormat()->streamDescription,
          .numSamples = sample.numSamples(),
          .timing = sample.timing().front()};
}

callback::CaptureHandlerWithSample captureCallOf(const PictureMessage& picture) {
  return {.sample = QVSharedFrameObject(picture.surface), .timingData = rawBytes(picture.timing)};
}

std::optional<PictureMessage> pictureOf(const callback::CaptureHandlerWithSample& call) {
  return ifValid(PictureMessage{.surface = call.sample.sharedFrame(), .timing = timingOf(call.timingData)});
}

callback::CaptureHandlerWithAudioSample captureCallOf(SoundMessage sound) {
  return {.sample = std::move(sound.bytes),
          .absdData = rawBytes(sound.format),
          .itemCount = sound.numSamples,
          .bufferType = static_cast<int64_t>(sound.type),
          .timingData = rawBytes(sound.timing)};
}

std::optional<SoundMessage> soundOf(callback::CaptureHandlerWithAudioSample call) {
  return ifValid(SoundMessage{.type = static_cast<SampleType>(call.bufferType),
                              .bytes = std::move(call.sample),
                              .format = formatOf(call.absdData),
                              .numSamples = call.itemCount,
                              .timing = timingOf(call.timingData)});
}

callback::CaptureTimelineDidChange timelineCallOf(MediaTime pauses) { return {rawBytes(pauses)}; }

std::optional<MediaTime> pausesOf(const callback::CaptureTimelineDidChange& call) {
  const auto pauses = recordFromBytes<MediaTime>(call.pauses);
  return pauses && pauses->isNumeric() ? pauses : std::nullopt;
}

Dictionary payloadOf(const ActionMessage& action) {
  return {{broadcastpayload::kActionType, static_cast<int64_t>(action.action)},
          {broadcastpayload::kUserInfo, action.userInfo}};
}

Dictionary payloadOf(const FrontmostMessage& frontmost) {
  return {{broadcastpayload::kFrontmostApp, frontmost.bundleID}};
}

Dictionary payloadOf(const PictureMessage& picture) {
  return {{broadcastpayload::kVideoOrientation, picture.orientation},
          {broadcastpayload::kSampleType, static_cast<int64_t>(SampleType::Video)},
          {broadcastpayload::kTimingInfo, rawBytes(picture.timing)},
          {broadcastpayload::kPauses, rawBytes(picture.pauses)}};
}

Dictionary payloadOf(SoundMessage sound) {
  return {{broadcastpayload::kSampleType, static_cast<int64_t>(sound.type)},
          {broadcastpayload::kAudioBufferList, std::move(sound.bytes)},
          {broadcastpayload::kAudioFormatDescription, rawBytes(sound.format)},
          {broadcastpayload::kTimingInfo, rawBytes(sound.timing)},
          {broadcastpayload::kNumSamples, sound.numSamples},
          {broadcastpayload::kPauses, rawBytes(sound.pauses)}};
}

BroadcastMessage broadcastMessageOf(const Dictionary& payload) {
  if (const Value* action = find(payload, broadcastpayload::kActionType)) {
    return ActionMessage{static_cast<BroadcastAction>(action->asInteger()),
                         valueForKey(payload, broadcastpayload::kUserInfo).asDictionary()};
  }
  if (const Value* frontmost = find(payload, broadcastpayload::kFrontmostApp)) {
    return FrontmostMessage{frontmost->asString()};
  }
  const auto type = static_cast<SampleType>(valueForKey(payload, broadcastpayload::kSampleType).asInteger());
  return type == SampleType::Video ? validMessage(pictureOf(payload)) : validMessage(soundOf(payload));
}

}  // namespace qv
