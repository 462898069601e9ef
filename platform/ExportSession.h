#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/base/Error.h"
#include "platform/base/MediaTime.h"

namespace qv::platform {

enum class ExportPreset { PassThrough, HighestQuality };
enum class ExportStatus : int32_t { Unknown = 0, Waiting = 1, Exporting = 2, Completed = 3, Failed = 4, Cancelled = 5 };

/// A movie opened for reading. An unreadable one has duration zero and no tracks.
class MovieAsset {
 public:
  virtual ~MovieAsset() = default;
  [[nodiscard]] virtual MediaTime duration() const = 0;
  [[nodiscard]] virtual std::vector<int32_t> audioTrackIDs() const = 0;
};

/// How one track enters the mix. Without volume or ramp: at its unchanged level.
struct AudioMixInputParameters {
  int32_t trackID = 0;
};

/// Makes a new movie file out of an asset. Configure, then export once.
///
/// PassThrough copies the samples and plays exactly the asked range (cut at the key frame before
/// it, hidden by an edit list). HighestQuality mixes the audio tracks anew and copies video that is
/// already H.264, and re-encodes any other. Nothing is left at the output URL after a failure or a
/// cancellation.
///
/// Threading: configuration from one thread; `cancel` from any; the completion comes
/// on a thread of the service's.
class ExportSession {
 public:
  virtual ~ExportSession() = default;
  virtual void setOutputURL(const URL& url) = 0;
  virtual void setOutputFileType(const std::string& fileType) = 0;
  virtual void setTimeRange(const MediaTimeRange& range) = 0;
  virtual void setAudioMix(std::vector<AudioMixInputParameters> mix) = 0;
  virtual void exportAsynchronously(std::function<void()> completion) = 0;
  virtual void cancel() = 0;
  [[nodiscard]] virtual ExportStatus status() const = 0;
  [[nodiscard]] virtual std::optional<Error> error() const = 0;
  [[nodiscard]] virtual const URL& outputURL() const = 0;
};

class ExportService {
 public:
  virtual ~ExportService() = default;
  /// Reads the movie's head, and at its first use what exports need: blocks for as long as the disk takes, so not for
  /// the daemon's sequence. `createExportSession` neither reads nor waits after it.
  virtual std::shared_ptr<MovieAsset> openMovie(const URL& url) = 0;
  virtual std::shared_ptr<ExportSession> createExportSession(std::shared_ptr<MovieAsset> asset,
                                                             ExportPreset preset) = 0;
};

}  // namespace qv::platform
