#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "platform/base/Error.h"
#include "platform/base/SampleBuffer.h"
#include "support/QVTemporaryMovies.h"

namespace qv {

/// What an output tells its recording, on any thread and never with a lock of the output's held.
struct OutputEvents {
  /// The recording cannot go on.
  std::function<void(const platform::Error&)> failed;
  std::function<void(const platform::Dictionary&)> serviceInfoReceived;
  std::function<void(const platform::URL&)> broadcastURLReceived;
};

/// Where a picture stands. `sample` has its final presentation time: its capture time less the pauses so far.
struct PlacedPicture {
  platform::SampleBufferRef sample;
  uint64_t transformFlags = 0;
  /// The sum of the pauses before it.
  platform::MediaTime pauses = platform::MediaTime::zero();
};

/// A run of sound with its capture time, and the sum of the pauses so far. Silence that stands for a gap has no time
/// (zero).
struct PlacedSound {
  platform::SampleBufferRef sample;
  platform::MediaTime pauses = platform::MediaTime::zero();
};

/// What an output has made.
struct OutputResult {
  /// The movie. Nothing where the output makes none, no picture ever came, or nothing is left of it.
  std::shared_ptr<MovieClaim> movie = nullptr;
  /// What was lost, by what went wrong with the file; the movie can be played up to there. Nothing where all that came
  /// is complete on the disk.
  std::optional<platform::Error> failure = std::nullopt;
};

/// What can be told of an output while it runs.
struct OutputCounts {
  std::string videoEncoder = {};  ///< empty where nothing is encoded, or not yet
  /// That whoever takes them was too slow for; nothing where they are not counted.
  std::optional<uint64_t> droppedPictures = std::nullopt;
};

/// Where the samples of one recording go: chosen once, when the recording is made.
///
/// Order: `prepare`; `start`; samples, `pause` and `resume`; `finish`. An output that is destroyed unfinished lets go
/// of all that it holds. Handlers are called once, on any thread, at once where there is nothing to wait for.
///
/// Threading: thread-safe. Pictures come on the capture thread with the recording's lock held, so nothing that an
/// output waits for may wait for that lock.
class RecordingOutput {
 public:
  using ReadyHandler = std::function<void(const std::optional<platform::Error>&)>;
  using FinishHandler = std::function<void(const OutputResult&)>;

  virtual ~RecordingOutput() = default;
  /// Takes what must be had before the recording begins: the link to an extension, a path of the store.
  virtual void prepare(ReadyHandler handler) { handler(std::nullopt); }
  /// The recording begins; the sources are started when the handler runs.
  virtual void start(ReadyHandler handler) { handler(std::nullopt); }
  /// False when the output can take no more: the recording is over.
  [[nodiscard]] virtual bool appendVideo(const PlacedPicture& picture) = 0;
  virtual void appendAppAudio(const PlacedSound& sound) = 0;
  virtual void appendMicrophone(const PlacedSound& sound) = 0;
  virtual void pause() {}
  virtual void resume() {}
  virtual void tellFrontmostApplication(const std::string& /*bundleID*/) {}
  /// Completes what was taken so far. `endTime` is the presentation time at which the recording ends: the last picture
  /// lasts until then. Invalid where no picture came. The handler runs when everything is let go of.
  virtual void finish(platform::MediaTime endTime, FinishHandler handler) = 0;
  /// Whether it ends in a movie for the client.
  [[nodiscard]] virtual bool makesMovie() const { return false; }
  /// The path of the movie that is being written; empty without.
  [[nodiscard]] virtual std::string moviePath() const { return {}; }
  /// What went wrong with its file, where that is known.
  [[nodiscard]] virtual std::optional<platform::Error> failure() const { return std::nullopt; }
  /// So far. It waits for nothing.
  [[nodiscard]] virtual OutputCounts counts() const { return {}; }
  virtual void notifyRecordingMayBeStopped() {}
  virtual void notifyRecordingResumed() {}
};

}  // namespace qv
