#include "platform/ffmpeg/FFmpegExportSession.h"
#include "platform/ffmpeg/FFmpegLog.h"
#include "platform/ffmpeg/FFmpegMovies.h"

namespace qv::platform::ffmpeg {

FFmpegExportService::FFmpegExportService() { routeLibraryLog(); }

std::shared_ptr<MovieAsset> FFmpegExportService::openMovie(const URL& url) {
  return std::make_shared<FFmpegMovieAsset>(url);
}

std::shared_ptr<ExportSession> FFmpegExportService::createExportSession(std::shared_ptr<MovieAsset> asset,
                                                                        ExportPreset preset) {
  return std::make_shared<FFmpegExportSession>(std::move(asset), preset);
}

}  // namespace qv::platform::ffmpeg
