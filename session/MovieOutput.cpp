#include "session/MovieOutput.h"

#include <utility>

#include "platform/threads/Log.h"
#include "session/PictureTransform.h"

namespace qv {

using platform::URL;
namespace logs = platform::logs;

MovieOutput::MovieOutput(std::shared_ptr<RecordingContext> context, Movie movie)
    : context_(std::move(context)), movie_(std::move(movie)) {}

std::shared_ptr<MovieClaim> MovieOutput::claim() const {
  std::lock_guard lock(mutex_);
  return claim_;
}

std::shared_ptr<QVMovieWriter> MovieOutput::writer() const {
  std::lock_guard lock(mutex_);
  return writer_;
}

std::string MovieOutput::moviePath() const {
  const auto claimed = claim();
  return claimed ? claimed->path() : std::string();
}

void MovieOutput::prepare(ReadyHandler handler) {
  context_->movies->claimForRecording(
      movie_.path, movie_.owner,
      [weak = weak_from_this(), handler = std::move(handler)](std::shared_ptr<MovieClaim> claim) {
        const auto self = weak.lock();
        if (!self) return;
        {
          std::lock_guard lock(self->mutex_);
          self->claim_ = std::move(claim);
        }
        handler(std::nullopt);
      });
}

void MovieOutput::start(ReadyHandler handler) {
  auto writer = std::make_shared<QVMovieWriter>(context_->platform, movie_.size, moviePath());
  writer->setSystemRecording(movie_.systemRecording);
  {
    std::lock_guard lock(mutex_);
    writer_ = writer;
  }
  writer->startWritingHandler([handler = std::move(handler)] { handler(std::nullopt); });
}

bool MovieOutput::appendVideo(const PlacedPicture& picture) {
  const auto to = writer();
  if (!to) return true;
  const auto transform = movie_.systemRecording ? _affineTransformFromVellTransformFlags(picture.transformFlags)
                                                : platform::AffineTransform::identity();
  return to->appendVideoSampleBuffer(picture.sample, transform);
}

void MovieOutput::appendAppAudio(const PlacedSound& sound) {
  if (const auto to = writer()) to->appendAudio1SampleBuffer(sound.sample);
}

void MovieOutput::appendMicrophone(const PlacedSound& sound) {
  if (const auto to = writer()) to->appendAudio2SampleBuffer(sound.sample);
}

void MovieOutput::finish(platform::MediaTime endTime, FinishHandler handler) {
  std::shared_ptr<QVMovieWriter> writer;
  std::shared_ptr<MovieClaim> claim;
  {
    std::lock_guard lock(mutex_);
    writer = std::exchange(writer_, nullptr);
    claim = std::exchange(claim_, nullptr);
  }
  if (!writer) {
    handler({});
    return;
  }
  if (endTime.isValid()) writer->endAtSourceTime(endTime);
  writer->finishWritingWithHandler([claim, writer, handler = std::move(handler)](const std::optional<URL>& movie) {
    QV_LOG(logs::kSession, "QVRecordingSession: finishWritingWithHandler");
    const bool isThere = movie && claim && writer->isThere() && claim->hasFile();
    if (movie && !isThere) QV_LOG_ERROR(logs::kSession, "the movie's file is gone");
    handler({isThere ? claim : nullptr, writer->failure()});
  });
}

std::optional<platform::Error> MovieOutput::failure() const {
  const auto of = writer();
  return of ? of->failure() : std::nullopt;
}

OutputCounts MovieOutput::counts() const {
  const auto of = writer();
  const auto counts = of ? of->counts() : nullptr;
  return counts ? OutputCounts{counts->videoEncoder(), counts->droppedPictures()} : OutputCounts{};
}

void MovieOutput::notifyRecordingMayBeStopped() {
  if (const auto to = writer()) to->notifyRecordingMayBeStopped();
}

void MovieOutput::notifyRecordingResumed() {
  if (const auto to = writer()) to->notifyRecordingResumed();
}

}  // namespace qv
