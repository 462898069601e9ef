#pragma once

#include <array>
#include <optional>

#include "sdk/common/quorvel/Types.h"

namespace qv::sdk {

/// Puts sound on the timeline of the pictures: capture time less the pauses so far.
///
/// A pause takes away what lies between the last picture before it and the first one after it. The sound up to the
/// pause was given by then, so the first that comes after overlaps it: by as much as the last picture was shown. That
/// is cut off, so that the times of each source only grow.
///
/// Threading: one thread at a time.
class SoundTimeline {
 public:
  using Time = quorvel::SampleTime;

  /// Moves `sample`, whose time is that of its capture, and cuts off what overlaps the former sound of its source.
  /// False where nothing is left of it, or where its times make no sense.
  [[nodiscard]] bool place(quorvel::AudioSample& sample, Time pauses);

 private:
  std::array<std::optional<Time>, 2> ends_;  // of what was given, by source
};

}  // namespace qv::sdk
