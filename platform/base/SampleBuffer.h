#pragma once

#include <cstdint>
#include <memory>
#include <span>
#include <vector>

#include "platform/base/Audio.h"
#include "platform/base/MediaTime.h"
#include "platform/base/SharedFrame.h"

namespace qv::platform {

/// An immutable, reference-counted block of sample bytes.
class DataBlock {
 public:
  explicit DataBlock(std::vector<uint8_t> bytes) : bytes_(std::move(bytes)) {}
  [[nodiscard]] std::span<const uint8_t> bytes() const { return bytes_; }
  [[nodiscard]] size_t size() const { return bytes_.size(); }

 private:
  std::vector<uint8_t> bytes_;
};
using DataBlockRef = std::shared_ptr<const DataBlock>;

class SampleBuffer;
using SampleBufferRef = std::shared_ptr<const SampleBuffer>;

/// One timed media sample: a picture, or a run of audio frames.
///
/// `captureTime` is the host time at which the sample was captured. It equals the presentation
/// time of a fresh sample, and a copy with new timing keeps it: the asset writer places audio by
/// it after the video's times were rebased across a pause.
///
/// Threading: immutable, so thread-safe.
class SampleBuffer {
 public:
  /// `duration` may be invalid. The capture time is `presentationTime`.
  static SampleBufferRef makeVideo(PixelBufferRef image, MediaTime presentationTime, MediaTime duration);
  /// One timing entry. With an invalid `duration` it is numSamples / sample rate. Nothing when
  /// there is no data or no format.
  static SampleBufferRef makeAudio(DataBlockRef data, AudioFormatDescriptionRef format, int64_t numSamples,
                                   MediaTime presentationTime, MediaTime duration = MediaTime::invalid());
  /// Shares image and data with `source`, keeps its capture time, takes `timing` (at least one
  /// entry, else nothing is returned).
  static SampleBufferRef copyWithNewTiming(const SampleBufferRef& source, std::vector<SampleTimingInfo> timing);
  /// The same audio with every byte of its data zero.
  static SampleBufferRef silencedCopy(const SampleBufferRef& source);

  [[nodiscard]] const PixelBufferRef& image() const { return image_; }
  [[nodiscard]] const DataBlockRef& data() const { return data_; }
  [[nodiscard]] const AudioFormatDescriptionRef& audioFormat() const { return format_; }
  [[nodiscard]] std::span<const SampleTimingInfo> timing() const { return timing_; }
  [[nodiscard]] int64_t numSamples() const { return numSamples_; }
  [[nodiscard]] MediaTime presentationTime() const { return timing_.front().presentationTimeStamp; }
  [[nodiscard]] MediaTime duration() const { return timing_.front().duration; }
  [[nodiscard]] MediaTime captureTime() const { return captureTime_; }
  /// `captureTime` and `duration`, where that is known.
  [[nodiscard]] MediaTime captureEnd() const {
    return duration().isNumeric() ? captureTime_ + duration() : captureTime_;
  }

 private:
  SampleBuffer() = default;
  PixelBufferRef image_;
  DataBlockRef data_;
  AudioFormatDescriptionRef format_;
  std::vector<SampleTimingInfo> timing_;
  int64_t numSamples_ = 0;
  MediaTime captureTime_;
};

}  // namespace qv::platform
