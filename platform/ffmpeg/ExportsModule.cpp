#include "platform/ffmpeg/FFmpegMovies.h"
#include "platform/ffmpeg/MoviesModule.h"

using namespace qv::platform;

extern "C" __attribute__((visibility("default"))) ExportService* qvOpenExports(const ffmpeg::MoviesHost& host) {
  setLogLevel(host.logLevel);
  setLogSink([log = host.log](const LogLine& line) { log(line.level, line.category, line.text.c_str()); });
  static auto* const exports = new ffmpeg::FFmpegExportService;
  return exports;
}
