#include "platform/ffmpeg/FFmpegMovies.h"
#include "platform/ffmpeg/MoviesModule.h"

using namespace qv::platform;

QV_MODULE_DEFINE_ABI;

QV_MODULE_EXPORT ExportService* qvOpenExports() {
  static auto* const exports = new ffmpeg::FFmpegExportService;
  return exports;
}
