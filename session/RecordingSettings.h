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
#include "session/MovieNames.h"
#include "support/QVDiskSpace.h"
#include "support/QVTemporaryMovies.h"
#include "support/QuorvelErrors.h"

namespace qv {

/// What all recordings of the daemon work with. Each holds it, also one that ends after the daemon's other parts.
struct RecordingContext {
  RecordingContext(platform::Platform& services, platform::SerialQueue& managerSequence, QVCaptureManager& capture)
      : platform(services),
        sequence("com.tarnwick.quorveld.recordings", managerSequence),
        captureManager(capture),
        screen(std::make_shared<QVScreenSource>(*services.screenCapture)) {}
  RecordingContext(const RecordingContext&) = delete;
  RecordingContext& operator=(const RecordingContext&) = delete;

  platform::Platform& platform;
  platform::SerialQueue sequence;  ///< the manager's: lifecycle steps run there
  QVCaptureManager& captureManager;
  const std::shared_ptr<QVScreenSource> screen;
  const QVBundleTexts texts{platform};
  const QuorvelErrors errors{texts};
  const MovieNames names{platform, texts};
  const QVTemporaryFiles files{platform};
  const QVDiskSpace space{files};
  const std::shared_ptr<QVTemporaryMovies> movies = QVTemporaryMovies::create(files);
};

/// What one recording is: settled before it is made.
struct RecordingSettings {
  std::string bundleID;
  std::string owner;  ///< whose its movies are (applicationOwner)
  bool systemRecording = false;
  bool captureEnabled = false;
  bool microphoneEnabled = false;
  std::vector<uint32_t> contextIDs = {};
  /// Of the pictures, as the device records them.
  platform::Size windowSize;
  std::optional<BroadcastPlan> broadcast = std::nullopt;
};

}  // namespace qv
