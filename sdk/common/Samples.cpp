#include "sdk/common/Samples.h"

#include <utility>

namespace qv::sdk {

using platform::MediaTime;
using quorvel::SampleTime;

namespace {

std::optional<SampleTime> durationOf(const platform::SampleTimingInfo& timing) {
  return timing.duration.isNumeric() ? std::optional(sampleTime(timing.duration)) : std::nullopt;
}

quorvel::AudioFormat audioFormat(const platform::AudioStreamDescription& description) {
  return {.sampleRate = description.sampleRate,
          .channels = description.channelsPerFrame,
          .bitsPerChannel = description.bitsPerChannel,
          .bytesPerFrame = description.bytesPerFrame,
          .isFloat = (description.formatFlags & platform::kAudioFormatFlagIsFloat) != 0,
          .isSigned = (description.formatFlags & platform::kAudioFormatFlagIsSignedInteger) != 0,
          .isBigEndian = (description.formatFlags & platform::kAudioFormatFlagIsBigEndian) != 0};
}

}  // namespace

SampleTime sampleTime(const MediaTime& time) { return SampleTime(time.valueAt(platform::kHostTimescale)); }

quorvel::VideoFrame videoFrame(const PictureMessage& picture) {
  const platform::FrameLayout& layout = picture.surface->layout();
  return {.pixels = picture.surface->bytes(),
          .width = layout.width,
          .height = layout.height,
          .stride = layout.stride,
          .presentationTime = sampleTime(picture.timing.presentationTimeStamp),
          .duration = durationOf(picture.timing),
          .surface = picture.surface};
}

quorvel::AudioSample audioSample(SoundMessage sound) {
  return {.source = sound.type == SampleType::Microphone ? quorvel::AudioSample::Source::Microphone
                                                         : quorvel::AudioSample::Source::Application,
          .bytes = std::move(sound.bytes),
          .format = audioFormat(sound.format),
          .frameCount = sound.numSamples,
          .presentationTime = sampleTime(sound.timing.presentationTimeStamp),
          .duration = durationOf(sound.timing)};
}

}  // namespace qv::sdk
