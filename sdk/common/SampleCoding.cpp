#include "sdk/common/SampleCoding.h"

#include <cstring>
#include <type_traits>

#include "platform/base/SampleBuffer.h"
#include "protocol/QVSharedFrameObject.h"

namespace qv::sdk {

using platform::Data;
using platform::MediaTime;
using platform::SampleTimingInfo;
using quorvel::SampleTime;

namespace {

/// A record that crosses as its raw bytes; nothing where the length is another.
template <typename T>
std::optional<T> recordFromBytes(const Data& bytes) {
  static_assert(std::is_trivially_copyable_v<T>);
  if (bytes.size() != sizeof(T)) return std::nullopt;
  T record;
  std::memcpy(&record, bytes.data(), sizeof(T));
  return record;
}

std::optional<SampleTime> sampleTime(const MediaTime& time) {
  if (!time.isNumeric()) return std::nullopt;
  return SampleTime(time.valueAt(platform::kHostTimescale));
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

std::optional<quorvel::VideoFrame> videoFrameFromWire(const platform::Value& frame, const Data& timing) {
  const auto record = recordFromBytes<SampleTimingInfo>(timing);
  const auto presentationTime = record ? sampleTime(record->presentationTimeStamp) : std::nullopt;
  const platform::SharedFrameRef surface = QVSharedFrameObject::decodeFromIPC(frame).sharedFrame();
  if (!surface || !presentationTime || surface->layout().format != platform::PixelFormat::BGRX) return std::nullopt;
  return quorvel::VideoFrame{.pixels = surface->bytes(),
                             .width = surface->layout().width,
                             .height = surface->layout().height,
                             .stride = surface->layout().stride,
                             .presentationTime = *presentationTime,
                             .duration = sampleTime(record->duration),
                             .surface = surface};
}

std::optional<SampleTime> sampleTimeFromWire(const Data& time) {
  const auto record = recordFromBytes<MediaTime>(time);
  return record ? sampleTime(*record) : std::nullopt;
}

std::optional<quorvel::AudioSample> audioSampleFromWire(const WireAudioSample& sample) {
  const auto description = recordFromBytes<platform::AudioStreamDescription>(sample.format);
  const auto timing = recordFromBytes<SampleTimingInfo>(sample.timing);
  const auto presentationTime = timing ? sampleTime(timing->presentationTimeStamp) : std::nullopt;
  if (!description || description->formatID != platform::kAudioFormatLinearPCM || !presentationTime)
    return std::nullopt;
  if (sample.sampleType != kApplicationAudioSample && sample.sampleType != kMicrophoneAudioSample) return std::nullopt;
  // The receiver may trust that the frames it is told of are there.
  const uint32_t bytesPerFrame = description->bytesPerFrame;
  if (sample.numSamples < 0 || bytesPerFrame == 0 ||
      static_cast<uint64_t>(sample.numSamples) > sample.bytes.size() / bytesPerFrame)
    return std::nullopt;
  return quorvel::AudioSample{.source = sample.sampleType == kMicrophoneAudioSample
                                            ? quorvel::AudioSample::Source::Microphone
                                            : quorvel::AudioSample::Source::Application,
                              .bytes = sample.bytes,
                              .format = audioFormat(*description),
                              .frameCount = sample.numSamples,
                              .presentationTime = *presentationTime,
                              .duration = sampleTime(timing->duration)};
}

}  // namespace qv::sdk
