#include "writer/QVAudioMixUtility.h"

#include <utility>
#include <vector>

#include "platform/threads/Log.h"
#include "support/QuorvelErrors.h"

namespace qv {
namespace {

using platform::ExportSession;
using platform::ExportStatus;
using platform::URL;
namespace logs = platform::logs;

/// Ready to mix all audio tracks of the movie into a file at the output URL.
std::shared_ptr<ExportSession> mixOf(platform::ExportService& service, const URL& movie, const URL& output) {
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
  handler(nullptr, recordingError(errorcode::kFailedToSave));
}

}  // namespace

URL QVAudioMixUtility::tempFileURL() const {
  const auto seconds = static_cast<long>(platform_.clock->now().secondsSince1970);
  return URL::fileURL(QVTemporaryFiles(platform_).pathInStore("QVQuorvel_Final" + std::to_string(seconds) + ".mp4"));
}

void QVAudioMixUtility::mixAudioForMovie(const std::optional<URL>& movie, Handler handler) const {
  if (!movie) {
    handler(nullptr, recordingError(errorcode::kMixingFailure));
    return;
  }
  platform_.globalQueue->post([self = *this, movie = *movie, handler = std::move(handler)] {
    const std::shared_ptr<MovieClaim> mixed = self.movies_->claimNew(self.tempFileURL().path());
    const auto exportSession = mixOf(*self.platform_.exportService, movie, mixed->url());
    exportSession->exportAsynchronously(
        [exportSession, mixed, handler] { endMix(exportSession->status(), mixed, handler); });
  });
}

}  // namespace qv
