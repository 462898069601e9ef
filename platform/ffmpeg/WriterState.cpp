#include "platform/ffmpeg/WriterState.h"

namespace qv::platform::ffmpeg {

std::optional<Error> WriterState::error() const {
  std::lock_guard lock(mutex_);
  return error_;
}

std::string WriterState::videoEncoder() const {
  std::lock_guard lock(mutex_);
  return videoEncoder_;
}

void WriterState::setVideoEncoder(const std::string& name) {
  std::lock_guard lock(mutex_);
  videoEncoder_ = name;
}

void WriterState::fail(const Error& error) {
  std::lock_guard lock(mutex_);
  if (!error_) error_ = error;
  status_.store(AssetWriterStatus::Failed, std::memory_order_release);
}

void WriterState::complete() {
  std::lock_guard lock(mutex_);
  if (!error_) status_.store(AssetWriterStatus::Completed, std::memory_order_release);
}

bool WriterState::hasRoom(MediaType type) const {
  return type == MediaType::Video ? pictures_ < kMaximumPictures : audioSamples_ < kMaximumAudioSamples;
}

bool WriterState::isReady(MediaType type, bool realTime) const {
  if (status() != AssetWriterStatus::Writing) return false;
  std::lock_guard lock(mutex_);
  if (finishing_) return false;
  return (realTime && type == MediaType::Video) || hasRoom(type);
}

bool WriterState::pushSample(QueuedSample sample, bool realTime) {
  const MediaType type = sample.type;
  if (status() != AssetWriterStatus::Writing || !sample.sample) return false;
  {
    std::lock_guard lock(mutex_);
    if (finishing_) return false;
    if (hasRoom(type)) {
      ++(type == MediaType::Video ? pictures_ : audioSamples_);
      items_.emplace_back(std::move(sample));
    } else if (realTime && type == MediaType::Video) {
      droppedPictures_.fetch_add(1, std::memory_order_relaxed);
      items_.emplace_back(QueuedPictureTimes{sample.sample->captureTime(), sample.sample->presentationTime()});
    } else {
      return false;
    }
  }
  changed_.notify_one();
  return true;
}

void WriterState::pushControl(WriterItem control) {
  {
    std::lock_guard lock(mutex_);
    if (std::holds_alternative<SessionFinish>(control)) finishing_ = true;
    items_.push_back(std::move(control));
  }
  changed_.notify_one();
}

std::vector<WriterItem> WriterState::take() {
  std::unique_lock lock(mutex_);
  changed_.wait(lock, [this] { return closed_ || !items_.empty(); });
  std::vector<WriterItem> taken;
  if (!closed_) taken.swap(items_);
  return taken;
}

void WriterState::close() {
  {
    std::lock_guard lock(mutex_);
    closed_ = true;
  }
  changed_.notify_one();
}

void WriterState::sampleDone(MediaType type) {
  std::lock_guard lock(mutex_);
  --(type == MediaType::Video ? pictures_ : audioSamples_);
}

}  // namespace qv::platform::ffmpeg
