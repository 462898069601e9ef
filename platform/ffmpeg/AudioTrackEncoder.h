#pragma once

#include <cstdint>
#include <deque>
#include <memory>
#include <optional>
#include <vector>

#include "platform/base/SampleBuffer.h"
#include "platform/ffmpeg/AACEncoder.h"
#include "platform/ffmpeg/PCMConverter.h"
#include "platform/ffmpeg/RecordingTimeline.h"

namespace qv::platform::ffmpeg {

/// Places the sound of one track by its capture time and encodes it.
///
/// Sound waits until a picture captured after it has told its place, for 1.5 s of sound at most.
/// What was captured before the movie or inside a pause is left out; a gap becomes silence; what
/// overlaps earlier sound is dropped. Capture times jitter, so sound that follows within 20 ms is
/// simply continued; a clock that drifts is put right whenever it has drifted that far.
///
/// Threading: confined to one thread.
class AudioTrackEncoder {
 public:
  explicit AudioTrackEncoder(std::unique_ptr<AACEncoder> encoder);

  [[nodiscard]] const AACEncoder& encoder() const { return *encoder_; }
  /// Takes a sample of any format that `readPCM` reads; others are dropped.
  void enqueue(const SampleBuffer& sample);
  /// Encodes what has a settled place by now.
  std::optional<Error> advance(const RecordingTimeline& timeline, std::vector<mp4::EncodedSample>& out);
  /// Encodes the rest; no more is enqueued. `movieEnd` (nanoseconds; 0 where it is not known) is no mistake for a time
  /// of sound, however far behind the last picture it lies.
  std::optional<Error> placeRest(const RecordingTimeline& timeline, int64_t movieEnd,
                                 std::vector<mp4::EncodedSample>& out);
  /// Where the sound so far ends, in mp4::kMovieTimescale.
  [[nodiscard]] int64_t endTick() const;
  /// After `placeRest`: silence until `movieEnd` (mp4::kMovieTimescale) where the track has any sound.
  std::optional<Error> finish(int64_t movieEnd, std::vector<mp4::EncodedSample>& out);

 private:
  struct Held {
    int64_t captureTime;  ///< nanoseconds
    StereoSound sound;
    [[nodiscard]] int64_t endTime() const;
    [[nodiscard]] int64_t duration() const { return endTime() - captureTime; }
  };
  std::optional<Error> place(const Held& held, const RecordingTimeline& timeline, std::vector<mp4::EncodedSample>& out);
  std::optional<Error> placePiece(const StereoSound& sound, int64_t from, int64_t to, double position, bool exactly,
                                  double limit, std::vector<mp4::EncodedSample>& out);
  std::optional<Error> moveTo(double position, int64_t& skip, double inputRate, std::vector<mp4::EncodedSample>& out);
  std::optional<Error> endRun(std::vector<mp4::EncodedSample>& out);
  std::optional<Error> encodeConverted(std::vector<mp4::EncodedSample>& out);

  std::unique_ptr<AACEncoder> encoder_;
  RateConverter converter_;
  StereoSound converted_;
  std::deque<Held> held_;
  int64_t heldDuration_ = 0;
  size_t segment_ = SIZE_MAX;  ///< of the last piece placed
  bool hasRun_ = false;
  double runEnd_ = 0;  ///< where the next sound of the run belongs, in frames of the movie
  double runRate_ = 0;
  int64_t movieEnd_ = 0;  ///< nanoseconds
};

}  // namespace qv::platform::ffmpeg
