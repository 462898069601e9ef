#pragma once

#include "platform/AssetWriter.h"
#include "platform/ExportSession.h"
#include "platform/Log.h"

namespace qv::platform::ffmpeg {

/// What passes between the daemon and its movie module. The module carries its own copy of the
/// platform library, so it logs through the daemon's.
struct MoviesHost {
  void (*log)(LogLevel level, const char* category, const char* text);
  LogLevel logLevel;
};
struct MoviesModule {
  AssetWriterService* assetWriters;
  ExportService* exports;
};

inline constexpr const char kMoviesModuleEntry[] = "qvOpenMovies";
/// The services live as long as the process.
using OpenMovies = MoviesModule (*)(const MoviesHost&);

}  // namespace qv::platform::ffmpeg
