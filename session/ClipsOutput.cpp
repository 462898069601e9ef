#include "session/ClipsOutput.h"

#include <utility>

#include "platform/threads/Log.h"
#include "session/PictureTransform.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::URL;
namespace logs = platform::logs;

namespace {

/// `handed` gets what was lost of the clip.
void finishClip(const std::shared_ptr<ClipHandover>& handover, const Clip& clip, bool finished,
                std::function<void(const std::optional<platform::Error>&)> handed) {
  clip.writer->finishWritingWithHandler(
      [handover, clip, finished, handed = std::move(handed)](const std::optional<URL>& url) {
        QV_LOG(logs::kSession, "QVRecordingSession: finishWritingWithHandler");
        const bool isThere = url && clip.writer->isThere() && clip.file->hasFile();
        handover->clipCompleted(clip.number, isThere ? clip.file : nullptr, finished,
                                [handed, failure = clip.writer->failure()] { handed(failure); });
      });
}

}  // namespace

ClipsOutput::ClipsOutput(std::shared_ptr<RecordingContext> context, Clips clips, QVBroadcastInfo info,
                         OutputEvents events)
    : context_(std::move(context)),
      clips_(std::move(clips)),
      info_(std::move(info)),
      events_(std::move(events)),
      configuration_(info_.extensionConfiguration) {}

void ClipsOutput::start(ReadyHandler handler) {
  ClipHandoverEvents events;
  events.configurationReceived = [weak = weak_from_this()](const QVBroadcastConfiguration& configuration) {
    if (const auto self = weak.lock()) self->configurationReceived(configuration);
  };
  events.serviceInfoReceived = events_.serviceInfoReceived;
  events.extensionFailed = [failed = events_.failed] { failed(recordingError(errorcode::kInvalidBroadcastSession)); };
  handover_ =
      std::make_shared<ClipHandover>(context_->platform, info_.extension, info_.extensionUserInfo, std::move(events));
  cutter_ = std::make_shared<ClipCutter>(
      context_->platform, [this](int64_t number) { return makeClip(number, clips_.windowSize); },
      [handover = handover_, failed = events_.failed](const Clip& clip) {
        finishClip(handover, clip, false, [failed](const auto& failure) {
          if (failure) failed(recordingError(errorcode::kFailedToSave));
        });
      });
  cutter_->setConfiguration(configuration_.load());
  const Clip first = makeClip(1, clips_.size);
  cutter_->begin(first);
  first.writer->startWritingHandler([handler = std::move(handler)] { handler(std::nullopt); });
}

Clip ClipsOutput::makeClip(int64_t number, platform::Size size) {
  auto file = context_->movies->claimNew(context_->names.clipPath(clips_.bundleID, number));
  auto writer = std::make_shared<QVMovieWriter>(context_->platform, size, file->path());
  writer->setBroadcastConfig(configuration_.load());
  writer->setSystemRecording(clips_.systemRecording);
  written_.store({writer, counts().droppedPictures.value_or(0)});
  return {number, std::move(file), std::move(writer)};
}

OutputCounts ClipsOutput::counts() const {
  const Written written = written_.load();
  const auto counts = written.last ? written.last->counts() : nullptr;
  if (!counts) return {"", written.droppedBefore};
  return {counts->videoEncoder(), written.droppedBefore + counts->droppedPictures()};
}

void ClipsOutput::configurationReceived(const QVBroadcastConfiguration& configuration) {
  configuration_.store(configuration);
  cutter_->setConfiguration(configuration);
}

bool ClipsOutput::appendVideo(const PlacedPicture& picture) {
  const auto transform = clips_.systemRecording ? _affineTransformFromVellTransformFlags(picture.transformFlags)
                                                : platform::AffineTransform::identity();
  return cutter_->appendVideo(picture.sample, transform);
}

void ClipsOutput::appendAppAudio(const PlacedSound& sound) {
  cutter_->_processAudioSampleBufferForMP4ClipHandler(sound.sample);
}

void ClipsOutput::appendMicrophone(const PlacedSound& sound) { cutter_->appendMicrophone(sound.sample); }

void ClipsOutput::pause() {
  if (cutter_) cutter_->pause();
}

void ClipsOutput::finish(platform::MediaTime endTime, FinishHandler handler) {
  const auto last = cutter_ ? cutter_->end() : std::nullopt;
  if (!last) {
    handler({});
    return;
  }
  if (endTime.isValid()) last->writer->endAtSourceTime(endTime);
  finishClip(handover_, *last, true,
             [handler = std::move(handler)](const auto& failure) { handler({.failure = failure}); });
}

}  // namespace qv
