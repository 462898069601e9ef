#pragma once

#include <cstdint>
#include <functional>
#include <memory>

#include "session/RecordingSettings.h"

namespace qv {

/// What the daemon gives up when the disk gets full.
///
/// Threading: sequence only.
class StorePurge {
 public:
  struct Recordings {
    /// Whether anything records now.
    std::function<bool()> isAnyRecording;
    /// Ends what writes movies; the clients keep them.
    std::function<void()> endKeepingMovies;
    /// Ends what records, and removes what it wrote.
    std::function<void()> endAndRemove;
  };
  StorePurge(std::shared_ptr<RecordingContext> context, Recordings recordings)
      : context_(std::move(context)), recordings_(std::move(recordings)) {}

  // Each answers bytes.
  int64_t purgeableSpace();
  int64_t purge(int32_t urgency);
  int64_t purgePeriodically();

 private:
  const std::shared_ptr<RecordingContext> context_;
  const Recordings recordings_;
};

}  // namespace qv
