#pragma once

#include <cstdint>
#include <string>

#include "support/QVBundleTexts.h"
#include "support/QVTemporaryFiles.h"

namespace qv {

/// Paths of the temporary store at which movies are to be made. Whoever makes one claims it there, and may get another.
///
/// Threading: thread-safe.
class MovieNames {
 public:
  /// Both are borrowed, and must outlive this.
  MovieNames(const platform::Platform& platform, const QVBundleTexts& texts)
      : platform_(platform), texts_(texts), files_(platform) {}

  /// "<application's display name>.mp4", or by its identifier where it has no name.
  [[nodiscard]] std::string applicationMoviePath(const std::string& bundleID) const;
  /// "ScreenRecording_11-16-2026 19-35-12.mp4", by the local time of the call.
  [[nodiscard]] std::string screenMoviePath() const;
  /// "QVMovie_<identifier>_<seconds since 1970>_<number>.mp4"
  [[nodiscard]] std::string clipPath(const std::string& bundleID, int64_t broadcastFragmentIndex) const;
  /// "<application's display name>_trimmed.mp4"
  [[nodiscard]] std::string trimmedOutputPath(const std::string& bundleID) const;

 private:
  [[nodiscard]] std::string movieName(const std::string& bundleID) const;

  const platform::Platform& platform_;
  const QVBundleTexts& texts_;
  const QVTemporaryFiles files_;
};

}  // namespace qv
