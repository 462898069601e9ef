#include "platform/ffmpeg/MoviesModule.h"

#include "platform/ffmpeg/FFmpegMovies.h"

using namespace qv::platform;

QV_MODULE_DEFINE_ABI;

QV_MODULE_EXPORT AssetWriterService* qvOpenMovies() {
  static auto* const assetWriters = new ffmpeg::FFmpegAssetWriterService;
  return assetWriters;
}
