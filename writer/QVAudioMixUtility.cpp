#include "writer/QVAudioMixUtility.h"

#include <cstdio>

#include "platform/Log.h"
#include "platform/Platform.h"
#include "support/QVTemporaryFiles.h"
#include "support/QuorvelErrors.h"

namespace qv {

using platform::ExportStatus;
using platform::Platform;
using platform::URL;
namespace logs = platform::logs;

URL QVAudioMixUtility::tempFileURL() {
  const auto seconds = static_cast<long>(Platform::current().clock->now().secondsSince1970);
  // "%@/QVQuorvel_Final", the second, ".mp4"
  return URL::fileURL(_srTempPath() + "/QVQuorvel_Final" + std::to_string(seconds) + ".mp4");
}

void QVAudioMixUtility::mixAudioForMovie(const std::optional<URL>& movie, Handler handler) {
  if (!movie) {
    handler(std::nullopt, _qvUserErrorForCode(errorcode::kMixingFailure));
    return;
  }
  platform::ExportService& service = *Platform::current().exportService;
  auto asset = service.openMovie(*movie);
  auto exportSession = service.createExportSession(asset, platform::ExportPreset::HighestQuality);
  exportSession->setOutputURL(tempFileURL());
  exportSession->setOutputFileType(platform::kFileTypeMPEG4);
  std::vector<platform::AudioMixInputParameters> mix;
  if (asset) {
    for (const int32_t trackID : asset->audioTrackIDs()) mix.push_back({trackID});
  }
  exportSession->setAudioMix(std::move(mix));
  exportSession->exportAsynchronously([exportSession, handler = std::move(handler)] {
    const ExportStatus status = exportSession->status();
    if (status != ExportStatus::Cancelled && status != ExportStatus::Failed) {
      handler(exportSession->outputURL(), std::nullopt);
      return;
    }
    QV_CONSOLE(logs::kWriter, "QVAudioMixUtility: audio mix export %s",
               status == ExportStatus::Failed ? "failed" : "cancelled");
    handler(std::nullopt, _qvUserErrorForCode(errorcode::kFailedToSave));
  });
}

}  // namespace qv
