#pragma once

#include <atomic>
#include <memory>

#include "platform/AssetWriter.h"
#include "platform/ffmpeg/MovieEncoder.h"
#include "platform/ffmpeg/WriterState.h"

namespace qv::platform::ffmpeg {

/// An input of FFmpegAssetWriter.
///
/// Threading: as WriterInput.
class FFmpegWriterInput final : public WriterInput {
 public:
  FFmpegWriterInput(MediaType type, Dictionary outputSettings);

  void setTransform(const AffineTransform& transform) override { plan_.transform = transform; }
  void setExpectsMediaDataInRealTime(bool realTime) override { realTime_ = realTime; }
  [[nodiscard]] bool isReadyForMoreMediaData() const override;
  bool append(const SampleBufferRef& sample) override;

  /// Joins a writer, as its input number `index`; once.
  void attach(std::shared_ptr<WriterState> state, size_t index);
  [[nodiscard]] const TrackPlan& plan() const { return plan_; }

 private:
  TrackPlan plan_;
  bool realTime_ = false;
  std::shared_ptr<WriterState> state_;
  size_t index_ = 0;
};

}  // namespace qv::platform::ffmpeg
