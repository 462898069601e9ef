#include "session/ClipSeam.h"

#include <algorithm>
#include <cmath>
#include <utility>

namespace qv {

using platform::DataBlock;
using platform::MediaTime;
using platform::SampleBuffer;
using platform::SampleBufferRef;

namespace {

/// How long the ending clip waits for its sound, e.g. of a process that has gone silent for good.
const MediaTime kPatience = MediaTime::make(1, 1);
const MediaTime kFrameInterval = MediaTime::make(1, 30);

SampleBufferRef part(const SampleBufferRef& sample, int64_t from, int64_t to) {
  const platform::AudioStreamDescription& format = sample->audioFormat()->streamDescription;
  const auto bytes = sample->data()->bytes();
  const auto begin = bytes.begin() + from * format.bytesPerFrame;
  const auto end = bytes.begin() + std::min<int64_t>(to * format.bytesPerFrame, static_cast<int64_t>(bytes.size()));
  const MediaTime start = sample->captureTime();
  const MediaTime offset = MediaTime::fromSeconds(static_cast<double>(from) / format.sampleRate, start.timescale);
  return SampleBuffer::makeAudio(std::make_shared<DataBlock>(std::vector<uint8_t>(begin, end)), sample->audioFormat(),
                                 to - from, start + offset);
}

}  // namespace

SplitSound splitSound(const SampleBufferRef& sample, MediaTime time) {
  if (sample->captureTime() >= time) return {nullptr, sample};
  if (sample->captureEnd() <= time) return {sample, nullptr};
  const platform::AudioStreamDescription& format = sample->audioFormat()->streamDescription;
  const double seconds = (time - sample->captureTime()).seconds();
  const auto frames = static_cast<int64_t>(std::llround(seconds * format.sampleRate));
  const bool isSplittable = format.framesPerPacket == 1 && format.bytesPerFrame > 0 &&
                            sample->data()->size() >= static_cast<size_t>(sample->numSamples()) * format.bytesPerFrame;
  if (!isSplittable || frames >= sample->numSamples()) return {sample, nullptr};
  if (frames <= 0) return {nullptr, sample};
  return {part(sample, 0, frames), part(sample, frames, sample->numSamples())};
}

ClipSeam::ClipSeam(std::shared_ptr<QVMovieWriter> ending, std::shared_ptr<QVMovieWriter> beginning, MediaTime soundEnd,
                   bool hasMicrophone)
    : ending_(std::move(ending)),
      beginning_(std::move(beginning)),
      app_{&QVMovieWriter::appendAudio1SampleBuffer, true, soundEnd},
      microphone_{&QVMovieWriter::appendAudio2SampleBuffer, hasMicrophone} {}

MediaTime ClipSeam::timeForRepeatedPicture(const SampleBuffer& last) const {
  const MediaTime next = last.captureTime() + kFrameInterval;
  return std::max(next, app_.end).convertedTo(last.captureTime().timescale);
}

void ClipSeam::place(const SampleBuffer& firstPicture) {
  time_ = firstPicture.captureTime();
  ending_->endAtSourceTime(firstPicture.presentationTime());
  for (Track* track : {&app_, &microphone_}) {
    for (const SampleBufferRef& sample : std::exchange(track->held, {})) appendAcross(*track, sample);
  }
}

void ClipSeam::append(Track& track, const SampleBufferRef& sample) {
  if (isPlaced()) {
    appendAcross(track, sample);
  } else {
    track.held.push_back(sample);
  }
}

void ClipSeam::appendAcross(Track& track, const SampleBufferRef& sample) {
  track.end = sample->captureEnd();
  const auto [before, after] = splitSound(sample, time_);
  if (before) ((*ending_).*track.append)(before);
  if (after) ((*beginning_).*track.append)(after);
}

bool ClipSeam::isComplete(const Track& track) const {
  return !track.isAwaited || (track.end.isValid() && track.end >= time_);
}

bool ClipSeam::isComplete(MediaTime now) const {
  return isPlaced() && ((isComplete(app_) && isComplete(microphone_)) || now - time_ > kPatience);
}

}  // namespace qv
