#pragma once

#include <cstdint>
#include <string>

namespace qv {

/// Paths of the temporary store at which movies are to be made. Whoever makes one claims it there, and may get another.
///
/// Threading: thread-safe.

/// "<application's display name>.mp4", or by its identifier where it has no name.
[[nodiscard]] std::string applicationMoviePath(const std::string& bundleID);
/// "ScreenRecording_11-16-2026 19-35-12.mp4", by the local time of the call.
[[nodiscard]] std::string screenMoviePath();
/// "QVMovie_<identifier>_<seconds since 1970>_<number>.mp4"
[[nodiscard]] std::string clipPath(const std::string& bundleID, int64_t broadcastFragmentIndex);
/// "<application's display name>_trimmed.mp4"
[[nodiscard]] std::string trimmedOutputPath(const std::string& bundleID);

}  // namespace qv
