#include <cerrno>

#include "platform/threads/Log.h"
#include "writer/QVMovieWriter.h"

namespace qv {

using platform::ExportStatus;
using platform::MediaTime;
using platform::URL;
namespace logs = platform::logs;

namespace {

/// Clip durations count in whole seconds, rounded, halves away from zero.
constexpr int32_t kClipTimescale = 1;

/// Nothing where there is a file with something in it.
std::optional<platform::Error> checkFile(const QVTemporaryFiles& files, const URL& url) {
  const auto attributes = files.disk().attributesOfItem(url.path());
  if (!attributes) return attributes.error();
  if (attributes.value().size > 0 && !attributes.value().isDirectory) return std::nullopt;
  files._srRemoveFile(url, {});
  return platform::Error::posix(ENODATA, url.path());
}

void reportTrimFailure(const std::optional<platform::Error>& error) {
  QV_LOG_ERROR(logs::kWriter, "QVMovieWriter: Export Trim Video Failed, due to error: %i",
               error ? static_cast<int>(error->code) : 0);
}

/// Whether there is a trimmed movie, told in the log.
bool succeeded(const QVTemporaryFiles& files, const platform::ExportSession& exportSession) {
  switch (exportSession.status()) {
    case ExportStatus::Failed:
      reportTrimFailure(exportSession.error());
      return false;
    case ExportStatus::Cancelled:
      QV_LOG(logs::kWriter, "QVMovieWriter: Export Trim Video Cancelled");
      return false;
    default:
      break;
  }
  if (const auto error = checkFile(files, exportSession.outputURL())) {
    reportTrimFailure(error);
    return false;
  }
  QV_LOG(logs::kWriter, "QVMovieWriter: Export Trim succeeded");
  return true;
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
  files_._srRemoveFile(outputFileURL, [&service = *platform_.exportService, files = files_, movie, startClipDuration,
                                       endClipDuration, outputFileURL, handler = std::move(handler)](const auto&) {
    auto asset = service.openMovie(movie);
    const MediaTime movieDuration = asset ? asset->duration() : MediaTime::zero();
    auto exportSession = service.createExportSession(asset, platform::ExportPreset::PassThrough);
    exportSession->setOutputURL(outputFileURL);
    exportSession->setOutputFileType(platform::kFileTypeMPEG4);
    const MediaTime start = MediaTime::fromSeconds(startClipDuration, kClipTimescale);
    const MediaTime end = MediaTime::fromSeconds(endClipDuration, kClipTimescale);
    exportSession->setTimeRange({start, (movieDuration - end) - start});
    exportSession->exportAsynchronously([files, exportSession, handler] {
      handler(succeeded(files, *exportSession) ? std::optional(exportSession->outputURL()) : std::nullopt);
    });
  });
}

}  // namespace qv
