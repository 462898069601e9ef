#include <utility>

#include "platform/Log.h"
#include "session/QVRecordingSession.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::Dictionary;
using platform::MediaTime;
using platform::SampleBuffer;
using platform::SampleBufferRef;
namespace logs = platform::logs;

namespace {

/// When the next clip has waited that long for a picture, it begins with the last one again.
constexpr auto kPicturePatience = std::chrono::nanoseconds(1'000'000'000 / 30);
const MediaTime kShortStep = MediaTime::make(1, 1000);

MediaTime endOf(const SampleBuffer& sample) {
  return sample.duration().isNumeric() ? sample.captureTime() + sample.duration() : sample.captureTime();
}

/// The same image as if it had been captured at `captureTime`, the same distance before its presentation.
SampleBufferRef pictureAt(const SampleBuffer& source, MediaTime captureTime) {
  const MediaTime time = captureTime.convertedTo(source.captureTime().timescale);
  const auto picture = SampleBuffer::makeVideo(source.image(), time, source.duration());
  const MediaTime distance = source.captureTime() - source.presentationTime();
  return SampleBuffer::copyWithNewTiming(picture, {{source.duration(), time - distance, MediaTime::invalid()}});
}

}  // namespace

void QVRecordingSession::beginClips() {
  ClipHandoverEvents events;
  events.configurationReceived = [weakSelf = weak_from_this()](const QVBroadcastConfiguration& configuration) {
    if (const auto self = weakSelf.lock()) self->broadcastConfiguration_.store(configuration);
  };
  events.serviceInfoReceived = [weakSelf = weak_from_this()](const Dictionary& serviceInfo) {
    const auto self = weakSelf.lock();
    const auto delegate = self ? self->delegate_.load().lock() : nullptr;
    if (delegate) delegate->broadcastSessionDidUpdateServiceInfo(self, serviceInfo);
  };
  events.extensionFailed = [weakSelf = weak_from_this(), generation = generation_.load()] {
    const auto self = weakSelf.lock();
    if (!self || self->generation_ != generation || !self->recording_) return;
    self->stopRecordingWithNotification(true, _qvUserErrorForCode(errorcode::kInvalidBroadcastSession));
  };
  std::lock_guard lock(clipLock_);
  clips_ = {};
  clips_.handover =
      std::make_shared<ClipHandover>(broadcastExtension_.load(), broadcastUserInfo_.load(), std::move(events));
}

bool QVRecordingSession::isCuttingClips() const {
  return broadcastProcessMode_ == BroadcastProcessMode::MovieClips && hasBroadcastExtension();
}

bool QVRecordingSession::appendVideoToClip(const SampleBufferRef& sample, const platform::AffineTransform& transform) {
  std::lock_guard lock(clipLock_);
  clips_.transform = transform;
  // A repeated picture may have taken a time that is later than this one's.
  const bool isLate = clips_.lastPicture && sample->captureTime() <= clips_.lastPicture->captureTime();
  const bool accepted =
      appendPicture(clips_, isLate ? pictureAt(*sample, clips_.lastPicture->captureTime() + kShortStep) : sample);
  closeSeamIfComplete(clips_, sample->captureTime());
  return accepted;
}

bool QVRecordingSession::appendPicture(Clips& clips, const SampleBufferRef& sample) {
  const auto writer = movieWriter();
  if (!writer) return true;
  if (!writer->appendVideoSampleBuffer(sample, clips.transform)) return false;
  clips.lastPicture = sample;
  clips.isEmpty = false;
  if (clips.seam && !clips.seam->isPlaced()) clips.seam->place(*sample);
  return true;
}

void QVRecordingSession::_processAudioSampleBufferForMP4ClipHandler(const SampleBufferRef& sample) {
  std::lock_guard lock(clipLock_);
  const auto writer = movieWriter();
  if (!writer || !clips_.handover) return;
  if (clips_.seam) {
    clips_.seam->appendAppAudio(sample);
  } else {
    writer->appendAudio1SampleBuffer(sample);
  }
  const MediaTime time = sample->presentationTime();
  // The silence that fills a gap between two taps has no time.
  if (time <= MediaTime::zero()) return;
  closeSeamIfComplete(clips_, sample->captureTime());
  if (!clips_.broadcastFragmentStartTime.isValid()) {
    QV_LOG(logs::kSession, "setting sample time = %i", static_cast<int>(time.seconds()));
    clips_.broadcastFragmentStartTime = time;
  }
  const double limit = broadcastConfiguration_.load().value_or(QVBroadcastConfiguration{}).effectiveClipDuration();
  const bool isOver = (time - clips_.broadcastFragmentStartTime).seconds() > limit;
  // A clip without a picture would be no movie, and one seam is closed before the next is begun.
  if (isOver && !clips_.isEmpty && !clips_.seam) cutClip(clips_, time, endOf(*sample));
}

void QVRecordingSession::appendMicrophoneToClip(const SampleBufferRef& sample) {
  std::lock_guard lock(clipLock_);
  if (clips_.seam) {
    clips_.seam->appendMicrophone(sample);
  } else if (const auto writer = movieWriter()) {
    writer->appendAudio2SampleBuffer(sample);
  }
}

void QVRecordingSession::cutClip(Clips& clips, MediaTime time, MediaTime soundEnd) {
  clips.broadcastFragmentStartTime = time;
  ++broadcastFragmentIndex_;
  QV_LOG(logs::kSession,
         "QVRecordingSession: processSampleBufferForStreaming: fragment exceeded time limit, calling out to extension");
  QV_LOG(logs::kSession, "setting up new movie writer");
  const auto ending = movieWriter();
  const auto beginning = std::make_shared<QVMovieWriter>(ending->windowSize(), outputPath());
  beginning->setBroadcastConfig(broadcastConfiguration_.load());
  beginning->setSystemRecording(systemRecording_);
  beginning->setupAssetWriter();
  movieWriter_.store(beginning);
  clips.isEmpty = true;
  clips.seam = std::make_unique<ClipSeam>(ending, beginning, soundEnd, haveMicTap_.load());
  platform::Platform& platform = platform::Platform::current();
  clips.repeatTimer =
      platform.timers->after(kPicturePatience, [weakSelf = weak_from_this(), beginning, queue = platform.globalQueue] {
        queue->post([weakSelf, beginning] {
          const auto self = weakSelf.lock();
          if (!self) return;
          std::lock_guard lock(self->clipLock_);
          if (self->movieWriter() == beginning) self->repeatLastPicture(self->clips_);
        });
      });
}

void QVRecordingSession::repeatLastPicture(Clips& clips) {
  if (!clips.seam || clips.seam->isPlaced() || !clips.lastPicture) return;
  const SampleBuffer& last = *clips.lastPicture;
  (void)appendPicture(clips, pictureAt(last, clips.seam->timeForRepeatedPicture(last)));
}

void QVRecordingSession::closeSeamIfComplete(Clips& clips, MediaTime now) {
  if (!clips.seam || !clips.seam->isComplete(now)) return;
  finishClip(clips.handover, clips.seam->ending(), broadcastFragmentIndex_ - 1, false, nullptr);
  clips.seam.reset();
  clips.repeatTimer.reset();
}

void QVRecordingSession::finishClip(const std::shared_ptr<ClipHandover>& handover,
                                    const std::shared_ptr<QVMovieWriter>& writer, int64_t number, bool finished,
                                    std::function<void()> handed) {
  writer->finishWritingWithHandler(
      [handover, number, finished, handed = std::move(handed)](const std::optional<platform::URL>& clip) {
        QV_LOG(logs::kSession, "QVRecordingSession: finishWritingWithHandler");
        handover->clipCompleted(number, clip, finished, handed);
      });
}

/// The last clip is never without a picture once there was one, so the extension always gets one that is marked last.
void QVRecordingSession::finishClips(std::function<void()> handler) {
  std::unique_lock lock(clipLock_);
  repeatLastPicture(clips_);
  Clips clips = std::exchange(clips_, {});
  const auto writer = movieWriter_.exchange(nullptr);
  const int64_t number = broadcastFragmentIndex_;
  lock.unlock();
  if (!clips.handover || !writer) {
    handler();
    return;
  }
  if (clips.seam) finishClip(clips.handover, clips.seam->ending(), number - 1, false, nullptr);
  finishClip(clips.handover, writer, number, true, std::move(handler));
}

}  // namespace qv
