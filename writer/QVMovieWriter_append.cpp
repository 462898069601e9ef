#include "platform/threads/Log.h"
#include "writer/QVMovieWriter.h"

namespace qv {

using platform::AssetWriterStatus;
using platform::MediaTime;
using platform::SampleBufferRef;
namespace logs = platform::logs;

namespace {
/// All samples of one track share a timescale, so their values can be compared as they are.
bool isNotLater(const MediaTime& time, const MediaTime& last) { return last.isValid() && last.value >= time.value; }
}  // namespace

bool QVMovieWriter::dispatchedAppendVideoSampleBuffer(const SampleBufferRef& sample,
                                                      const platform::AffineTransform& transform) {
  if (!assetWriter_ || !sample || isFinishingWriting_) return true;
  if (status() != AssetWriterStatus::Writing || !didProcessFirstSample_) {
    return appendFirstVideoSample(sample, transform);
  }
  if (video_.queue.enqueue(sample)) {
    drainVideo();
  } else {
    QV_LOG_ERROR(logs::kWriter, "ERROR Enqueing the Sample Video Buffer");
  }
  return true;
}

/// Starts the file once. A file that has started before and does not write any more has failed.
bool QVMovieWriter::ensureWriting(const platform::AffineTransform& transform) {
  if (!didStartWriting_) {
    didStartWriting_ = true;
    video_.input->setTransform(transform);
    (void)assetWriter_->startWriting();  // the status tells
  }
  if (status() == AssetWriterStatus::Writing) return true;
  noteFailure(assetWriter_->error());
  QV_LOG_ERROR(logs::kWriter, "ERROR starting asset writer");
  return false;
}

bool QVMovieWriter::appendFirstVideoSample(const SampleBufferRef& sample, const platform::AffineTransform& transform) {
  if (!ensureWriting(transform)) return false;
  const MediaTime time = sample->presentationTime();
  if (!time.isValid()) return true;
  if (!didStartSession_) {
    assetWriter_->startSessionAtSourceTime(time);
    didStartSession_ = true;
  }
  if (!video_.input->isReadyForMoreMediaData()) return true;
  (void)video_.input->append(sample);
  didProcessFirstSample_ = true;
  return true;
}

void QVMovieWriter::drainVideo() {
  while (video_.input->isReadyForMoreMediaData()) {
    const SampleBufferRef sample = video_.queue.dequeue();
    if (!sample) return;
    const MediaTime time = sample->presentationTime();
    if (isNotLater(time, video_.lastPresentationTime.load())) {
      QV_LOG(logs::kWriter, "discarding video sample buffer due to timestamp earlier than previous");
      return;
    }
    QV_LOG_DEBUG(logs::kWriter, "appending video sample");
    video_.lastPresentationTime.store(time);
    (void)video_.input->append(sample);
  }
}

void QVMovieWriter::dispatchedAppendAudio1SampleBuffer(const SampleBufferRef& sample) {
  appendAudio(audio1_, 1, sample);
}

void QVMovieWriter::dispatchedAppendAudio2SampleBuffer(const SampleBufferRef& sample) {
  appendAudio(audio2_, 2, sample);
}

void QVMovieWriter::appendAudio(Track& track, int number, const SampleBufferRef& sample) {
  if (!assetWriter_ || !sample) return;
  if (status() != AssetWriterStatus::Writing || !didProcessFirstSample_ || isFinishingWriting_) return;
  if (track.queue.enqueue(sample)) {
    drainAudio(track, number);
  } else {
    QV_LOG_ERROR(logs::kWriter, "ERROR Enqueing the Sample Audio Buffer");
  }
}

void QVMovieWriter::drainAudio(Track& track, int number) {
  while (track.input->isReadyForMoreMediaData()) {
    const SampleBufferRef sample = track.queue.dequeue();
    if (!sample) return;
    const MediaTime time = sample->presentationTime();
    if (isNotLater(time, track.lastPresentationTime.load())) {
      if (number == 1) {
        QV_LOG(logs::kWriter, "discarding audio 1 sample buffer due to timestamp earlier than previous");
      } else {
        QV_LOG(logs::kWriter, "discarding audio 2 sample buffer due to timestamp earlier than previous");
      }
      return;
    }
    track.lastPresentationTime.store(time);
    const auto value = static_cast<long long>(time.value);
    const auto duration = static_cast<long long>(sample->duration().value);
    if (number == 1) {
      QV_LOG_DEBUG(logs::kWriter, "appending audio 1 sample with timestamp:%lld duration:%lld", value, duration);
    } else {
      QV_LOG_DEBUG(logs::kWriter, "appending audio 2 sample with timestamp:%lld duration:%lld", value, duration);
    }
    (void)track.input->append(sample);
  }
}

}  // namespace qv
