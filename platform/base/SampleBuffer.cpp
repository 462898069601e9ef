#include "platform/base/SampleBuffer.h"

namespace qv::platform {

SampleBufferRef SampleBuffer::makeVideo(PixelBufferRef image, MediaTime presentationTime, MediaTime duration) {
  std::shared_ptr<SampleBuffer> sample(new SampleBuffer);
  sample->image_ = std::move(image);
  sample->timing_ = {{duration, presentationTime, MediaTime::invalid()}};
  sample->numSamples_ = 1;
  sample->captureTime_ = presentationTime;
  return sample;
}

SampleBufferRef SampleBuffer::makeAudio(DataBlockRef data, AudioFormatDescriptionRef format, int64_t numSamples,
                                        MediaTime presentationTime, MediaTime duration) {
  if (!data || !format || numSamples < 0) return nullptr;
  if (!duration.isValid()) {
    const double rate = format->streamDescription.sampleRate;
    if (rate >= 1 && rate <= 1e9) duration = MediaTime::make(numSamples, static_cast<int32_t>(rate));
  }
  std::shared_ptr<SampleBuffer> sample(new SampleBuffer);
  sample->data_ = std::move(data);
  sample->format_ = std::move(format);
  sample->timing_ = {{duration, presentationTime, MediaTime::invalid()}};
  sample->numSamples_ = numSamples;
  sample->captureTime_ = presentationTime;
  return sample;
}

SampleBufferRef SampleBuffer::copyWithNewTiming(const SampleBufferRef& source, std::vector<SampleTimingInfo> timing) {
  if (!source || timing.empty()) return nullptr;
  std::shared_ptr<SampleBuffer> copy(new SampleBuffer(*source));
  copy->timing_ = std::move(timing);
  return copy;
}

SampleBufferRef SampleBuffer::silencedCopy(const SampleBufferRef& source) {
  if (!source || !source->data_) return source;
  std::shared_ptr<SampleBuffer> copy(new SampleBuffer(*source));
  copy->data_ = std::make_shared<DataBlock>(std::vector<uint8_t>(source->data_->size(), 0));
  return copy;
}

}  // namespace qv::platform
