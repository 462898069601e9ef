#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "capture/QVCaptureManager.h"
#include "capture/QVScreenSource.h"
#include "session/BroadcastPlan.h"
#include "support/QVTemporaryMovies.h"

namespace qv {

/// What all recordings of the daemon work with. Each holds it, also one that ends after the daemon's other parts.
struct RecordingContext {
  RecordingContext(platform::SerialQueue& managerSequence, QVCaptureManager& capture,
                   std::shared_ptr<QVScreenSource> screenSource, std::shared_ptr<QVTemporaryMovies> temporaryMovies)
      : sequence("com.tarnwick.quorveld.recordings", managerSequence),
        captureManager(capture),
        screen(std::move(screenSource)),
        movies(std::move(temporaryMovies)) {}

  platform::SerialQueue sequence;  ///< the manager's: lifecycle steps run there
  QVCaptureManager& captureManager;
  const std::shared_ptr<QVScreenSource> screen;
  const std::shared_ptr<QVTemporaryMovies> movies;
};

/// What one recording is: settled before it is made.
struct RecordingSettings {
  std::string bundleID;
  bool systemRecording = false;
  bool captureEnabled = false;
  bool microphoneEnabled = false;
  std::vector<uint32_t> contextIDs = {};
  /// Of the pictures, as the device records them.
  platform::Size windowSize;
  std::optional<BroadcastPlan> broadcast = std::nullopt;
};

}  // namespace qv
