#include "platform/ffmpeg/FFmpegWriterInput.h"

namespace qv::platform::ffmpeg {

FFmpegWriterInput::FFmpegWriterInput(MediaType type, Dictionary outputSettings)
    : plan_{type, std::move(outputSettings), AffineTransform::identity()} {}

void FFmpegWriterInput::attach(std::shared_ptr<WriterState> state, size_t index) {
  state_ = std::move(state);
  index_ = index;
}

bool FFmpegWriterInput::isReadyForMoreMediaData() const { return state_ && state_->isReady(plan_.type, realTime_); }

bool FFmpegWriterInput::append(const SampleBufferRef& sample) {
  return state_ && state_->pushSample({plan_.type, index_, sample}, realTime_);
}

}  // namespace qv::platform::ffmpeg
