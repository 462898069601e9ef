#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>

#include "platform/threads/Timer.h"
#include "protocol/QVBroadcastConfiguration.h"
#include "session/ClipSeam.h"
#include "session/RecordingOutput.h"

namespace qv {

/// One clip while it is being made.
struct Clip {
  int64_t number = 0;  ///< from 1
  std::shared_ptr<MovieClaim> file;
  std::shared_ptr<QVMovieWriter> writer;
};

/// Cuts what a broadcast records into movie clips. The length of a clip is counted in application sound: without any,
/// everything goes into the first clip. A clip that has no picture yet is not ended, and one seam is closed before the
/// next is begun.
///
/// Threading: thread-safe.
class ClipCutter : public std::enable_shared_from_this<ClipCutter> {
 public:
  /// Makes the file and the writer of the clip of this number.
  using MakeClip = std::function<Clip(int64_t number)>;
  /// A clip has all that belongs to it: its writer is to be finished. Called with the cutter's lock held.
  using ClipEnded = std::function<void(Clip)>;
  ClipCutter(const platform::Platform& platform, MakeClip makeClip, ClipEnded clipEnded);

  /// The first clip, whose writer the owner has made ready.
  void begin(Clip first);
  /// Of the clips from the next cut on.
  void setConfiguration(const QVBroadcastConfiguration& configuration);
  [[nodiscard]] bool appendVideo(const platform::SampleBufferRef& sample, const platform::AffineTransform& transform);
  void _processAudioSampleBufferForMP4ClipHandler(const platform::SampleBufferRef& sample);
  void appendMicrophone(const platform::SampleBufferRef& sample);
  /// The sources stop: no microphone is waited for until it is heard again.
  void pause();
  /// Ends the clip before a seam that is open, and gives back the last one. It is never without a picture once there
  /// was one, so the extension always gets one that is marked last. Nothing where none was begun.
  [[nodiscard]] std::optional<Clip> end();

 private:
  // With the lock held.
  bool appendPicture(const platform::SampleBufferRef& sample);
  void cutClip(platform::MediaTime time, platform::MediaTime soundEnd);
  void armRepeat();
  void repeatLastPicture();
  void closeSeamIfComplete(platform::MediaTime now);
  /// The clip before an open seam.
  struct Seam {
    Clip ending;
    std::shared_ptr<ClipSeam> seam;  ///< the timer knows it weakly
  };

  const platform::Platform& platform_;
  const MakeClip makeClip_;
  const ClipEnded clipEnded_;
  std::mutex mutex_;
  std::optional<Clip> current_;
  std::optional<Seam> seam_;
  QVBroadcastConfiguration configuration_;
  platform::MediaTime broadcastFragmentStartTime_ = platform::MediaTime::invalid();
  platform::SampleBufferRef lastPicture_;  ///< none before the first
  platform::AffineTransform transform_;
  std::unique_ptr<platform::TimerHandle> repeatTimer_;
  bool hasMicrophone_ = false;
};

}  // namespace qv
