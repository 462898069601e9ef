#include "session/ClipCutter.h"

#include <utility>

#include "platform/threads/Log.h"

namespace qv {

using platform::MediaTime;
using platform::SampleBuffer;
using platform::SampleBufferRef;
namespace logs = platform::logs;

namespace {

/// When the next clip has waited that long for a picture, it begins with the last one again.
constexpr auto kPicturePatience = std::chrono::nanoseconds(1'000'000'000 / 30);
const MediaTime kShortStep = MediaTime::make(1, 1000);

/// The same image as if it had been captured at `captureTime`, the same distance before its presentation.
SampleBufferRef pictureAt(const SampleBuffer& source, MediaTime captureTime) {
  const MediaTime time = captureTime.convertedTo(source.captureTime().timescale);
  const auto picture = SampleBuffer::makeVideo(source.image(), time, source.duration());
  const MediaTime distance = source.captureTime() - source.presentationTime();
  return SampleBuffer::copyWithNewTiming(picture, {{source.duration(), time - distance, MediaTime::invalid()}});
}

}  // namespace

ClipCutter::ClipCutter(const platform::Platform& platform, MakeClip makeClip, ClipEnded clipEnded)
    : platform_(platform), makeClip_(std::move(makeClip)), clipEnded_(std::move(clipEnded)) {}

void ClipCutter::begin(Clip first) {
  std::lock_guard lock(mutex_);
  current_ = std::move(first);
}

void ClipCutter::setConfiguration(const QVBroadcastConfiguration& configuration) {
  std::lock_guard lock(mutex_);
  configuration_ = configuration;
}

bool ClipCutter::appendVideo(const SampleBufferRef& sample, const platform::AffineTransform& transform) {
  std::lock_guard lock(mutex_);
  transform_ = transform;
  // A repeated picture may have taken a time that is later than this one's.
  const bool isLate = lastPicture_ && sample->captureTime() <= lastPicture_->captureTime();
  const bool accepted = appendPicture(isLate ? pictureAt(*sample, lastPicture_->captureTime() + kShortStep) : sample);
  closeSeamIfComplete(sample->captureTime());
  return accepted;
}

bool ClipCutter::appendPicture(const SampleBufferRef& sample) {
  if (!current_) return true;
  if (!current_->writer->appendVideoSampleBuffer(sample, transform_)) return false;
  lastPicture_ = sample;
  if (seam_ && !seam_->seam->isPlaced()) seam_->seam->place(*sample);
  return true;
}

void ClipCutter::_processAudioSampleBufferForMP4ClipHandler(const SampleBufferRef& sample) {
  std::lock_guard lock(mutex_);
  if (!current_) return;
  if (seam_) {
    seam_->seam->appendAppAudio(sample);
  } else {
    current_->writer->appendAudio1SampleBuffer(sample);
  }
  const MediaTime time = sample->presentationTime();
  // The silence that fills a gap between two taps has no time.
  if (time <= MediaTime::zero()) return;
  closeSeamIfComplete(sample->captureTime());
  if (!broadcastFragmentStartTime_.isValid()) {
    QV_LOG(logs::kSession, "setting sample time = %i", static_cast<int>(time.seconds()));
    broadcastFragmentStartTime_ = time;
  }
  const bool isOver = (time - broadcastFragmentStartTime_).seconds() > configuration_.effectiveClipDuration();
  if (isOver && lastPicture_ && !seam_) cutClip(time, sample->captureEnd());
}

void ClipCutter::appendMicrophone(const SampleBufferRef& sample) {
  std::lock_guard lock(mutex_);
  if (!current_) return;
  hasMicrophone_ = true;
  if (seam_) {
    seam_->seam->appendMicrophone(sample);
  } else {
    current_->writer->appendAudio2SampleBuffer(sample);
  }
}

void ClipCutter::pause() {
  std::lock_guard lock(mutex_);
  hasMicrophone_ = false;
}

void ClipCutter::cutClip(MediaTime time, MediaTime soundEnd) {
  QV_LOG(logs::kSession,
         "QVRecordingSession: processSampleBufferForStreaming: fragment exceeded time limit, calling out to extension");
  QV_LOG(logs::kSession, "setting up new movie writer");
  Clip beginning = makeClip_(current_->number + 1);
  beginning.writer->setupAssetWriter();
  broadcastFragmentStartTime_ = time;
  auto seam = std::make_shared<ClipSeam>(current_->writer, beginning.writer, soundEnd, hasMicrophone_);
  seam_ = Seam{*std::exchange(current_, std::move(beginning)), std::move(seam)};
  armRepeat();
}

/// For this seam only: it may have closed, and another be open, when the timer's work comes to its turn.
void ClipCutter::armRepeat() {
  repeatTimer_ = platform_.timers->after(
      kPicturePatience,
      [weakSelf = weak_from_this(), seam = std::weak_ptr(seam_->seam), queue = platform_.globalQueue] {
        queue->post([weakSelf, seam] {
          const auto self = weakSelf.lock();
          if (!self) return;
          std::lock_guard lock(self->mutex_);
          if (!seam.expired()) self->repeatLastPicture();
        });
      });
}

void ClipCutter::repeatLastPicture() {
  if (!seam_ || seam_->seam->isPlaced()) return;
  const SampleBuffer& last = *lastPicture_;
  (void)appendPicture(pictureAt(last, seam_->seam->timeForRepeatedPicture(last)));
}

void ClipCutter::closeSeamIfComplete(MediaTime now) {
  if (!seam_ || !seam_->seam->isComplete(now)) return;
  clipEnded_(std::move(seam_->ending));
  seam_.reset();
}

std::optional<Clip> ClipCutter::end() {
  std::lock_guard lock(mutex_);
  repeatLastPicture();
  if (auto open = std::exchange(seam_, std::nullopt)) clipEnded_(std::move(open->ending));
  return std::exchange(current_, std::nullopt);
}

}  // namespace qv
