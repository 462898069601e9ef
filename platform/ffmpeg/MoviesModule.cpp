#include "platform/ffmpeg/MoviesModule.h"

#include "platform/ffmpeg/FFmpegMovies.h"

using namespace qv::platform;

extern "C" __attribute__((visibility("default"))) AssetWriterService* qvOpenMovies(const ffmpeg::MoviesHost& host) {
  setLogLevel(host.logLevel);
  setLogSink([log = host.log](const LogLine& line) { log(line.level, line.category, line.text.c_str()); });
  static auto* const assetWriters = new ffmpeg::FFmpegAssetWriterService;
  return assetWriters;
}
