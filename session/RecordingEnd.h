#pragma once

#include <functional>
#include <memory>
#include <optional>

#include "platform/base/Error.h"
#include "session/RecordingOutput.h"

namespace qv {

/// What becomes of the movie of a recording that ends, of which there is one in `made`. It takes the claim over, and
/// calls `done` (on any thread) when that is complete, with the URL that the client is told.
using MovieFate =
    std::function<void(const OutputResult& made, std::function<void(const std::optional<platform::URL>&)> done)>;

namespace moviefate {
/// The client may save or discard it. `owner` as in applicationOwner.
[[nodiscard]] MovieFate handTo(const std::string& owner);
[[nodiscard]] MovieFate remove();
/// It stays in the store, and ages out there.
[[nodiscard]] MovieFate keep();
}  // namespace moviefate

/// How a recording ends.
struct RecordingEnd {
  using Handler = std::function<void(const std::optional<platform::URL>&, const std::optional<platform::Error>&)>;

  /// Why, for the client; nothing where the client itself wants it, or has gone.
  std::optional<platform::Error> cause = std::nullopt;
  /// The end reason of the metrics: the code of a failure, 0 where somebody stopped it.
  int64_t endReason = 0;
  MovieFate movie = moviefate::keep();
  /// The answer of a stop, on the sequence, when the end is complete. It is the report of the end too: with a handler
  /// the client gets no message.
  Handler handler = nullptr;
  /// Seconds that are cut off, where both are positive.
  double startClipDuration = 0;
  double endClipDuration = 0;
};

}  // namespace qv
