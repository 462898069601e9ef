#include "platform/Log.h"
#include "support/QVTemporaryFiles.h"
#include "writer/QVMovieWriter.h"

namespace qv {

using platform::ExportStatus;
using platform::MediaTime;
using platform::Platform;
using platform::URL;
namespace logs = platform::logs;

namespace {

/// Clip durations count in whole seconds, rounded, halves away from zero.
constexpr int32_t kClipTimescale = 1;

void reportTrim(const platform::ExportSession& exportSession, const QVMovieWriter::FinishHandler& handler) {
  switch (exportSession.status()) {
    case ExportStatus::Failed: {
      const auto error = exportSession.error();
      QV_LOG_ERROR(logs::kWriter, "QVMovieWriter: Export Trim Video Failed, due to error: %i",
                   error ? static_cast<int>(error->code) : 0);
      handler(std::nullopt);
      return;
    }
    case ExportStatus::Cancelled:
      QV_LOG(logs::kWriter, "QVMovieWriter: Export Trim Video Cancelled");
      handler(std::nullopt);
      return;
    default:
      QV_LOG(logs::kWriter, "QVMovieWriter: Export Trim succeeded");
      handler(exportSession.outputURL());
  }
}

}  // namespace

void QVMovieWriter::trimMovieWithURL(URL movie, double startClipDuration, double endClipDuration, URL outputFileURL,
                                     FinishHandler handler) {
  movieWriterQueue_.async([self = shared_from_this(), movie = std::move(movie), startClipDuration, endClipDuration,
                           outputFileURL = std::move(outputFileURL), handler = std::move(handler)]() mutable {
    self->dispatchedTrimMovieWithURL(movie, startClipDuration, endClipDuration, outputFileURL, std::move(handler));
  });
}

void QVMovieWriter::dispatchedTrimMovieWithURL(const URL& movie, double startClipDuration, double endClipDuration,
                                               const URL& outputFileURL, FinishHandler handler) {
  _srRemoveFile(outputFileURL, [movie, startClipDuration, endClipDuration, outputFileURL,
                                handler = std::move(handler)](const auto&) {
    platform::ExportService& service = *Platform::current().exportService;
    auto asset = service.openMovie(movie);
    const MediaTime movieDuration = asset ? asset->duration() : MediaTime::zero();
    auto exportSession = service.createExportSession(asset, platform::ExportPreset::PassThrough);
    exportSession->setOutputURL(outputFileURL);
    exportSession->setOutputFileType(platform::kFileTypeMPEG4);
    const MediaTime start = MediaTime::fromSeconds(startClipDuration, kClipTimescale);
    const MediaTime end = MediaTime::fromSeconds(endClipDuration, kClipTimescale);
    exportSession->setTimeRange({start, (movieDuration - end) - start});
    exportSession->exportAsynchronously([exportSession, handler] { reportTrim(*exportSession, handler); });
  });
}

}  // namespace qv
