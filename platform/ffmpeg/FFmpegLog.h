#pragma once

namespace qv::platform::ffmpeg {

/// Sends what the codec libraries log to the system's log, at the info level.
///
/// Threading: thread-safe.
void routeLibraryLog();

}  // namespace qv::platform::ffmpeg
