#pragma once

#include "platform/AssetWriter.h"
#include "platform/ExportSession.h"
#include "platform/process/LateModule.h"

namespace qv::platform::ffmpeg {

/// Recording needs the encoders alone; trimming and mixing need seventy libraries more, so they stand
/// in a module of their own.
inline constexpr const char kMoviesModule[] = "quorveld-movies.so";
inline constexpr const char kExportsModule[] = "quorveld-exports.so";

/// The modules' entries. The services live as long as the process.
inline constexpr const char kMoviesModuleEntry[] = "qvOpenMovies";
using OpenMovies = AssetWriterService* (*)();
inline constexpr const char kExportsModuleEntry[] = "qvOpenExports";
using OpenExports = ExportService* (*)();

}  // namespace qv::platform::ffmpeg
