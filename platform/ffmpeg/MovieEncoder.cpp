#include "platform/ffmpeg/MovieEncoder.h"

#include <algorithm>
#include <cinttypes>
#include <future>

#include "platform/mp4/MovieWriter.h"
#include "platform/threads/Executor.h"
#include "platform/threads/Log.h"

namespace qv::platform::ffmpeg {
namespace {

/// What may pass for the interval between two frames of a film when its end has to be guessed.
constexpr int64_t kShortestInterval = mp4::kMovieTimescale / 240;
constexpr int64_t kLongestInterval = mp4::kMovieTimescale / 10;
/// Times in a movie file are 32 bit from sample to sample.
constexpr int64_t kLongestGap = int64_t{mp4::kMovieTimescale} * 3600 * 12;
constexpr int64_t kNanosecondsPerSecond = 1'000'000'000;

/// Pictures that had been taken when the file failed count among neither.
void logEnd(uint64_t pictures, uint64_t dropped, const std::optional<Error>& error) {
  if (error) {
    QV_LOG_ERROR(logs::kMovie, "movie not completed after %" PRIu64 " pictures, %" PRIu64 " dropped: %s", pictures,
                 dropped, error->description().c_str());
  } else {
    QV_LOG(logs::kMovie, "movie finished: %" PRIu64 " pictures, %" PRIu64 " dropped", pictures, dropped);
  }
}

}  // namespace

MovieEncoder::MovieEncoder(std::shared_ptr<WriterState> state, std::unique_ptr<mp4::MovieFile> file,
                           const std::vector<TrackPlan>& plans, VideoEncoderChoice& videoEncoders)
    : state_(std::move(state)), file_(std::move(file)) {
  check(open(plans, videoEncoders));
}

std::optional<Error> MovieEncoder::open(const std::vector<TrackPlan>& plans, VideoEncoderChoice& videoEncoders) {
  for (const TrackPlan& plan : plans) {
    Track track{{}, {}, plan.transform};
    if (plan.type == MediaType::Video) {
      const VideoSettings settings = parseVideoSettings(plan.settings);
      auto encoder = videoEncoders.open(settings);
      if (!encoder) return encoder.error();
      track.video = std::move(*encoder);
      state_->setVideoEncoder(track.video->name());
      expectedInterval_ = mp4::kMovieTimescale / settings.frameRate;
    } else {
      auto encoder = AACEncoder::open(parseAudioSettings(plan.settings));
      if (!encoder) return encoder.error();
      track.audio = std::make_unique<AudioTrackEncoder>(std::move(*encoder));
    }
    tracks_.push_back(std::move(track));
  }
  return std::nullopt;
}

void MovieEncoder::beginFile() {
  if (recorder_ || tracks_.empty()) return;
  std::vector<mp4::MovieTrack> descriptions;
  for (const Track& track : tracks_) {
    const auto trackID = static_cast<uint32_t>(descriptions.size() + 1);
    descriptions.push_back(track.video ? track.video->track(trackID, track.transform)
                                       : track.audio->encoder().track(trackID));
  }
  recorder_ = std::make_unique<mp4::MovieRecorder>(std::move(file_), std::move(descriptions),
                                                   [state = state_](const Error& error) { state->fail(error); });
}

void MovieEncoder::check(const std::optional<Error>& error) {
  if (!error || isFileEnded_ || state_->status() != AssetWriterStatus::Writing) return;
  QV_LOG_ERROR(logs::kMovie, "movie writing failed: %s", error->description().c_str());
  endWith(*error);
}

/// The status tells of the failure only when the file is whole, since whoever sees it takes the file. Its parameter
/// sets are fixed by then, so another encoder cannot go on with it.
void MovieEncoder::endWith(const Error& error) {
  if (recorder_) {
    isFileEnded_ = true;
    const mp4::MovieEnd end = finishTracks(std::nullopt);
    std::promise<void> ended;
    recorder_->finish(end, [&ended](const std::optional<Error>&) { ended.set_value(); });
    ended.get_future().wait();
  }
  state_->fail(error);
}

void MovieEncoder::run() {
  for (;;) {
    auto items = state_->take();
    if (items.empty()) return;
    for (WriterItem& item : items) {
      if (!handle(std::move(item))) return;
    }
  }
}

bool MovieEncoder::handle(WriterItem item) {
  if (auto* finishRequest = std::get_if<SessionFinish>(&item)) {
    finish(std::move(*finishRequest));
    return false;
  }
  if (const auto* start = std::get_if<SessionStart>(&item)) {
    sessionStart_ = start->time;
    timeline_.begin(start->time.valueAt(kHostTimescale));
  } else if (const auto* times = std::get_if<QueuedPictureTimes>(&item)) {
    observe(times->captureTime, times->presentationTime);
  } else {
    handleSample(std::get<QueuedSample>(item));
  }
  return true;
}

void MovieEncoder::handleSample(const QueuedSample& queued) {
  if (state_->status() == AssetWriterStatus::Writing && sessionStart_) {
    const Track& track = tracks_[queued.input];
    if (track.video && queued.sample->image()) check(handlePicture(queued.input, *queued.sample));
    if (track.audio) track.audio->enqueue(*queued.sample);
    advanceAudio();
  }
  state_->sampleDone(queued.type);
}

void MovieEncoder::observe(MediaTime captureTime, MediaTime presentationTime) {
  if (!captureTime.isNumeric() || !presentationTime.isNumeric() || !sessionStart_) return;
  timeline_.observe(captureTime.valueAt(kHostTimescale), presentationTime.valueAt(kHostTimescale));
}

int64_t MovieEncoder::tickOf(MediaTime presentationTime) const {
  return (presentationTime - *sessionStart_).convertedTo(mp4::kMovieTimescale).value;
}

std::optional<Error> MovieEncoder::handlePicture(size_t track, const SampleBuffer& sample) {
  if (!sample.presentationTime().isNumeric()) return std::nullopt;
  observe(sample.captureTime(), sample.presentationTime());
  const int64_t tick = tickOf(sample.presentationTime());
  if (tick <= lastTick_.value_or(-1) || tick - lastTick_.value_or(0) > kLongestGap) return std::nullopt;
  if (lastTick_) lastInterval_ = tick - *lastTick_;
  lastTick_ = tick;
  if (!firstTick_) firstTick_ = tick;
  ++pictures_;
  VideoEncoder& encoder = *tracks_[track].video;
  if (!recorder_ && encoder.liesAcross(*sample.image())) encoder.turnPictures();
  beginFile();
  std::vector<mp4::EncodedSample> samples;
  if (auto error = encoder.encode(*sample.image(), tick, samples)) return error;
  write(track, samples);
  return std::nullopt;
}

void MovieEncoder::advanceAudio() {
  for (size_t i = 0; i < tracks_.size(); ++i) {
    if (!tracks_[i].audio) continue;
    std::vector<mp4::EncodedSample> samples;
    check(tracks_[i].audio->advance(timeline_, samples));
    write(i, samples);
  }
}

void MovieEncoder::write(size_t track, std::vector<mp4::EncodedSample>& samples) {
  if (state_->status() != AssetWriterStatus::Writing) return;  // the file may be whole by now
  for (mp4::EncodedSample& sample : samples) recorder_->append(track, std::move(sample));
}

std::optional<int64_t> MovieEncoder::endTick(const std::optional<MediaTime>& endTime) const {
  if (!endTime || !endTime->isNumeric() || !firstTick_) return std::nullopt;
  const int64_t tick = tickOf(*endTime);
  if (tick - *lastTick_ <= kLongestGap) return std::max(tick, *firstTick_);
  QV_LOG_ERROR(logs::kMovie, "the end of the movie lies hours behind its last picture, ignored");
  return std::nullopt;
}

mp4::MovieEnd MovieEncoder::movieEnd(std::optional<int64_t> endTick) const {
  mp4::MovieEnd end;
  if (!lastTick_) return end;
  if (endTick) return {endTick, static_cast<uint64_t>(*endTick), static_cast<uint64_t>(expectedInterval_)};
  const bool isRegular = lastInterval_ >= kShortestInterval && lastInterval_ <= kLongestInterval;
  int64_t last = *lastTick_ + (isRegular ? lastInterval_ : expectedInterval_);
  for (const Track& track : tracks_) last = std::max(last, track.audio ? track.audio->endTick() : 0);
  end.duration = static_cast<uint64_t>(last);
  return end;
}

void MovieEncoder::placeRestOfSound(std::optional<int64_t> endTick) {
  const auto nanoseconds =
      static_cast<int64_t>(static_cast<__int128>(endTick.value_or(0)) * kNanosecondsPerSecond / mp4::kMovieTimescale);
  for (size_t i = 0; i < tracks_.size() && state_->status() == AssetWriterStatus::Writing; ++i) {
    if (!tracks_[i].audio) continue;
    std::vector<mp4::EncodedSample> samples;
    check(tracks_[i].audio->placeRest(timeline_, nanoseconds, samples));
    write(i, samples);
  }
}

mp4::MovieEnd MovieEncoder::finishTracks(const std::optional<MediaTime>& endTime) {
  const auto tick = endTick(endTime);
  placeRestOfSound(tick);
  const mp4::MovieEnd end = movieEnd(tick);
  const auto soundEnd = static_cast<int64_t>(end.duration.value_or(0) + end.lastPictureShown);
  for (size_t i = 0; i < tracks_.size() && state_->status() == AssetWriterStatus::Writing; ++i) {
    std::vector<mp4::EncodedSample> samples;
    if (tracks_[i].video && pictures_ > 0) check(tracks_[i].video->flush(samples));
    if (tracks_[i].audio) check(tracks_[i].audio->finish(soundEnd, samples));
    write(i, samples);
  }
  return end;
}

void MovieEncoder::finish(SessionFinish request) {
  if (state_->status() == AssetWriterStatus::Writing) beginFile();
  const mp4::MovieEnd end = isFileEnded_ ? mp4::MovieEnd() : finishTracks(request.endTime);
  // Moved all the way: the last reference to whatever it holds must not end on a thread of the writer's.
  auto complete = [state = state_, completion = std::move(request.completion),
                   pictures = pictures_](std::optional<Error> error) mutable {
    logEnd(pictures, state->droppedPictures(), error);
    error ? state->fail(*error) : state->complete();
    globalQueue().post(std::move(completion));
  };
  recorder_ && !isFileEnded_ ? recorder_->finish(end, std::move(complete)) : complete(state_->error());
}

}  // namespace qv::platform::ffmpeg
