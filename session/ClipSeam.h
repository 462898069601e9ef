#pragma once

#include <memory>
#include <vector>

#include "platform/base/SampleBuffer.h"
#include "writer/QVMovieWriter.h"

namespace qv {

/// Where one clip of a broadcast ends and the next begins.
///
/// The next clip begins at its first picture. Sound reaches the daemon later than pictures of the same time, so when
/// that picture comes the ending clip still lacks sound: it stays open until its sound has reached the seam. What is
/// heard across the seam is cut at it. So nothing is lost or heard twice when the clips are played one after another.
///
/// All times are capture times unless they say otherwise.
///
/// Threading: none of its own.
class ClipSeam {
 public:
  /// `soundEnd`: up to where application sound is in the ending clip. With `hasMicrophone` its sound is waited for too.
  ClipSeam(std::shared_ptr<QVMovieWriter> ending, std::shared_ptr<QVMovieWriter> beginning,
           platform::MediaTime soundEnd, bool hasMicrophone);

  [[nodiscard]] bool isPlaced() const { return time_.isValid(); }
  /// The earliest time for a picture that only repeats the one before the seam, one frame after it.
  [[nodiscard]] platform::MediaTime timeForRepeatedPicture(const platform::SampleBuffer& last) const;
  /// The next clip's writer has its first picture: that is the seam.
  void place(const platform::SampleBuffer& firstPicture);
  void appendAppAudio(const platform::SampleBufferRef& sample) { append(app_, sample); }
  void appendMicrophone(const platform::SampleBufferRef& sample) { append(microphone_, sample); }
  /// Whether the ending clip has all its sound, or has waited a second for it.
  [[nodiscard]] bool isComplete(platform::MediaTime now) const;
  [[nodiscard]] const std::shared_ptr<QVMovieWriter>& ending() const { return ending_; }

 private:
  struct Track {
    void (QVMovieWriter::*append)(const platform::SampleBufferRef&);
    bool isAwaited;
    platform::MediaTime end = platform::MediaTime::invalid();
    /// What came before the seam was placed.
    std::vector<platform::SampleBufferRef> held = {};
  };
  void append(Track& track, const platform::SampleBufferRef& sample);
  void appendAcross(Track& track, const platform::SampleBufferRef& sample);
  [[nodiscard]] bool isComplete(const Track& track) const;

  const std::shared_ptr<QVMovieWriter> ending_;
  const std::shared_ptr<QVMovieWriter> beginning_;
  platform::MediaTime time_ = platform::MediaTime::invalid();
  Track app_;
  Track microphone_;
};

/// The frames of `sample` before and from `time` on; either may be nothing.
struct SplitSound {
  platform::SampleBufferRef before;
  platform::SampleBufferRef after;
};
SplitSound splitSound(const platform::SampleBufferRef& sample, platform::MediaTime time);

}  // namespace qv
