#include "session/RecordingOutputs.h"

#include <utility>

#include "platform/threads/Log.h"
#include "session/ClipsOutput.h"
#include "session/MovieOutput.h"
#include "session/SamplesOutput.h"
#include "session/VideoSize.h"

namespace qv {

namespace logs = platform::logs;

namespace {

/// A system recording's movie is never wider than tall: the asset writer lays a wide screen into it by a quarter turn,
/// which players turn back.
platform::Size codedSize(const RecordingSettings& settings) {
  platform::Size size = settings.windowSize;
  if (!settings.systemRecording) return size;
  QV_LOG(logs::kSession, "Before windowSize w:%f h:%f", size.width, size.height);
  if ((size.width > size.height) == isNativeScreenOrientationPortrait()) std::swap(size.width, size.height);
  QV_LOG(logs::kSession, "After windowSize w:%f h:%f", size.width, size.height);
  return size;
}

}  // namespace

std::shared_ptr<RecordingOutput> makeRecordingOutput(const std::shared_ptr<RecordingContext>& context,
                                                     const RecordingSettings& settings, OutputEvents events,
                                                     ClientOutput::Client client) {
  const platform::Size size = codedSize(settings);
  if (const auto& broadcast = settings.broadcast) {
    QV_LOG(logs::kSession, "QVRecordingSession: enableBroadcastWithExtension");
    if (broadcast->info.extensionProcessMode == BroadcastProcessMode::Samples) {
      return std::make_shared<SamplesOutput>(context->platform, *broadcast, std::move(events));
    }
    return std::make_shared<ClipsOutput>(
        context, ClipsOutput::Clips{settings.bundleID, size, settings.windowSize, settings.systemRecording},
        broadcast->info, std::move(events));
  }
  QV_LOG(logs::kSession, "QVRecordingSession: disableBroadcast");
  if (settings.captureEnabled) return std::make_shared<ClientOutput>(std::move(client));
  const std::string path = settings.systemRecording ? context->names.screenMoviePath()
                                                    : context->names.applicationMoviePath(settings.bundleID);
  return std::make_shared<MovieOutput>(context,
                                       MovieOutput::Movie{path, settings.owner, size, settings.systemRecording});
}

}  // namespace qv
