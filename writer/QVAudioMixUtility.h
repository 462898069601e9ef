#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <utility>

#include "platform/base/Error.h"
#include "platform/base/Value.h"
#include "support/QVTemporaryMovies.h"

namespace qv {

/// Makes a copy of a movie in which its audio tracks are mixed into one, each at its unchanged
/// level. The movie itself is never changed.
///
/// Threading: thread-safe. The movie is opened on the global queue; handlers are called on a thread of the export's, or
/// at once in the calling thread for a missing movie.
class QVAudioMixUtility {
 public:
  /// Takes the mixed movie, of which there is a file, or what went wrong; then nothing is left of it.
  using Handler = std::function<void(std::shared_ptr<MovieClaim> mixed, const std::optional<platform::Error>&)>;
  /// The platform is borrowed, and must outlive the mixes.
  QVAudioMixUtility(const platform::Platform& platform, std::shared_ptr<QVTemporaryMovies> movies)
      : platform_(platform), movies_(std::move(movies)) {}
  void mixAudioForMovie(const std::optional<platform::URL>& movie, Handler handler) const;
  /// A file of the temporary store, named by the current second. Two mixes within a second ask for the same, and the
  /// later one's is numbered when it is claimed.
  [[nodiscard]] platform::URL tempFileURL() const;

 private:
  const platform::Platform& platform_;
  const std::shared_ptr<QVTemporaryMovies> movies_;
};

}  // namespace qv
