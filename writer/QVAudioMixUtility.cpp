#include "writer/QVAudioMixUtility.h"

#include <utility>
#include <vector>

#include "platform/Platform.h"
#include "platform/threads/Log.h"
#include "support/QVTemporaryFiles.h"
#include "support/QuorvelErrors.h"

namespace qv {
namespace {

using platform::ExportSession;
using platform::ExportStatus;
using platform::Platform;
using platform::URL;
namespace logs = platform::logs;

/// Ready to mix all audio tracks of the movie into a file at the output URL.
std::shared_ptr<ExportSession> mixOf(const URL& movie, const URL& output) {
  platform::ExportService& service = *Platform::current().exportService;
  const auto asset = service.openMovie(movie);
  auto exportSession = service.createExportSession(asset, platform::ExportPreset::HighestQuality);
  exportSession->setOutputURL(output);
  exportSession->setOutputFileType(platform::kFileTypeMPEG4);
  std::vector<platform::AudioMixInputParameters> mix;
  if (asset) {
    for (const int32_t trackID : asset->audioTrackIDs()) mix.push_back({trackID});
  }
  exportSession->setAudioMix(std::move(mix));
  return exportSession;
}

/// Nothing where the mix is there.
const char* failureOf(ExportStatus status, const MovieClaim& mixed) {
  if (status == ExportStatus::Cancelled) return "cancelled";
  if (status == ExportStatus::Failed) return "failed";
  return mixed.hasFile() ? nullptr : "failed: it left no file";
}

void endMix(ExportStatus status, const std::shared_ptr<MovieClaim>& mixed, const QVAudioMixUtility::Handler& handler) {
  const char* failure = failureOf(status, *mixed);
  if (!failure) {
    handler(mixed, std::nullopt);
    return;
  }
  QV_CONSOLE(logs::kWriter, "QVAudioMixUtility: audio mix export %s", failure);
  mixed->remove(nullptr);
  handler(nullptr, _qvUserErrorForCode(errorcode::kFailedToSave));
}

}  // namespace

URL QVAudioMixUtility::tempFileURL() {
  const auto seconds = static_cast<long>(Platform::current().clock->now().secondsSince1970);
  return URL::fileURL(pathInStore("QVQuorvel_Final" + std::to_string(seconds) + ".mp4"));
}

void QVAudioMixUtility::mixAudioForMovie(const std::shared_ptr<QVTemporaryMovies>& movies,
                                         const std::optional<URL>& movie, Handler handler) {
  if (!movie) {
    handler(nullptr, _qvUserErrorForCode(errorcode::kMixingFailure));
    return;
  }
  Platform::current().globalQueue->post([movies, movie = *movie, handler = std::move(handler)] {
    const std::shared_ptr<MovieClaim> mixed = movies->claimNew(tempFileURL().path());
    const auto exportSession = mixOf(movie, mixed->url());
    exportSession->exportAsynchronously(
        [exportSession, mixed, handler] { endMix(exportSession->status(), mixed, handler); });
  });
}

}  // namespace qv
