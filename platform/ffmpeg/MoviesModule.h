#pragma once

#include "platform/AssetWriter.h"
#include "platform/ExportSession.h"
#include "platform/Log.h"

namespace qv::platform::ffmpeg {

/// What passes between the daemon and its movie modules. Each carries its own copy of the platform
/// library, so it logs through the daemon's.
struct MoviesHost {
  void (*log)(LogLevel level, const char* category, const char* text);
  LogLevel logLevel;
};

/// Recording needs the encoders alone; trimming and mixing need seventy libraries more, so they stand
/// in a module of their own.
inline constexpr const char kMoviesModule[] = "quorveld-movies.so";
inline constexpr const char kExportsModule[] = "quorveld-exports.so";

/// The modules' entries. The services live as long as the process.
inline constexpr const char kMoviesModuleEntry[] = "qvOpenMovies";
using OpenMovies = AssetWriterService* (*)(const MoviesHost&);
inline constexpr const char kExportsModuleEntry[] = "qvOpenExports";
using OpenExports = ExportService* (*)(const MoviesHost&);

}  // namespace qv::platform::ffmpeg
