#pragma once

#include <functional>
#include <optional>

#include "platform/Error.h"
#include "platform/Value.h"

namespace qv {

/// Makes a copy of a movie in which its audio tracks are mixed into one, each at its unchanged
/// level. The movie itself is never changed.
///
/// Threading: thread-safe. Handlers are called on a thread of the export's, or at once in the
/// calling thread for a missing movie.
class QVAudioMixUtility {
 public:
  using Handler = std::function<void(const std::optional<platform::URL>&, const std::optional<platform::Error>&)>;
  static void mixAudioForMovie(const std::optional<platform::URL>& movie, Handler handler);
  /// A new file of the temporary store, named by the current second.
  static platform::URL tempFileURL();
};

}  // namespace qv
