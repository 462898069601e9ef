#include "capture/QVCaptureManager.h"

namespace qv {

using platform::MediaTime;
using platform::SampleBuffer;
using platform::SampleBufferRef;

namespace {
constexpr double kFillerRate = 44100.0;
constexpr double kLongestFiller = 600.0;  // seconds
}  // namespace

platform::AudioFormatDescriptionRef QVCaptureManager::createAudioFormatDescription() const {
  return std::make_shared<const platform::AudioFormatDescription>(
      platform::AudioFormatDescription{audioBasicDescription_});
}

SampleBufferRef QVCaptureManager::createEmptyAudioSampleBuffer(MediaTime presentationTime, double gap) const {
  if (!(gap >= 0.0) || gap > kLongestFiller) return nullptr;
  auto format = createAudioFormatDescription();
  const platform::AudioStreamDescription& d = format->streamDescription;
  const auto count = static_cast<uint64_t>(gap * kFillerRate / d.framesPerPacket);
  auto silence = std::make_shared<const platform::DataBlock>(std::vector<uint8_t>(d.bytesPerPacket * count, 0));
  return SampleBuffer::makeAudio(std::move(silence), std::move(format), static_cast<int64_t>(count), presentationTime,
                                 MediaTime::fromSeconds(gap, static_cast<int32_t>(kFillerRate)));
}

}  // namespace qv
