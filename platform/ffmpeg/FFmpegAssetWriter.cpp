#include "platform/ffmpeg/FFmpegAssetWriter.h"

#include <malloc.h>
#include <pthread.h>

#include "platform/ffmpeg/MovieEncoder.h"
#include "platform/threads/Executor.h"
#include "platform/threads/Log.h"

namespace qv::platform::ffmpeg {

FFmpegAssetWriter::FFmpegAssetWriter(URL outputURL, MovieFileFactory createFile,
                                     std::shared_ptr<VideoEncoderChoice> videoEncoders)
    : outputURL_(std::move(outputURL)), createFile_(std::move(createFile)), videoEncoders_(std::move(videoEncoders)) {}

FFmpegAssetWriter::~FFmpegAssetWriter() {
  if (!finishing_) state_->close();
  if (encoderThread_.joinable()) encoderThread_.join();
}

void FFmpegAssetWriter::addInput(std::shared_ptr<WriterInput> input) {
  auto own = std::dynamic_pointer_cast<FFmpegWriterInput>(std::move(input));
  if (!own || status() != AssetWriterStatus::Unknown) return;
  own->attach(state_, inputs_.size());
  inputs_.push_back(std::move(own));
}

bool FFmpegAssetWriter::startWriting() {
  if (status() != AssetWriterStatus::Unknown || inputs_.empty()) {
    if (status() == AssetWriterStatus::Unknown) state_->fail(Error::posix(EINVAL, "asset writer without inputs"));
    return false;
  }
  auto file = createFile_(outputURL_.path());
  if (!file) {
    QV_LOG_ERROR(logs::kMovie, "movie file: %s", file.error().description().c_str());
    state_->fail(file.error());
    return false;
  }
  std::vector<TrackPlan> plans;
  for (const auto& input : inputs_) plans.push_back(input->plan());
  state_->start();
  encoderThread_ = std::thread([state = state_, movieFile = std::move(*file), plans = std::move(plans),
                                videoEncoders = videoEncoders_]() mutable {
    MovieEncoder(state, std::move(movieFile), plans, *videoEncoders).run();
    // Encoders leave tens of megabytes of free heap behind, which the next recording may never need.
    ::malloc_trim(0);
  });
  pthread_setname_np(encoderThread_.native_handle(), "qv-encoder");
  return true;
}

void FFmpegAssetWriter::startSessionAtSourceTime(MediaTime time) {
  if (sessionStarted_ || !time.isNumeric() || status() != AssetWriterStatus::Writing) return;
  sessionStarted_ = true;
  state_->pushControl(SessionStart{time});
}

void FFmpegAssetWriter::endSessionAtSourceTime(MediaTime time) { endTime_ = time; }

void FFmpegAssetWriter::finishWriting(std::function<void()> completion) {
  if (finishing_) return;
  if (!encoderThread_.joinable()) {
    if (status() == AssetWriterStatus::Unknown) state_->fail(Error::posix(EINVAL, "asset writer was not started"));
    globalQueue().post(std::move(completion));
    return;
  }
  finishing_ = true;
  state_->pushControl(SessionFinish{endTime_, std::move(completion)});
}

}  // namespace qv::platform::ffmpeg
