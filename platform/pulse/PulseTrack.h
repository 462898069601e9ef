#pragma once

#include <pulse/pulseaudio.h>

#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "platform/pulse/MixTimeline.h"

namespace qv::platform {

/// One record stream, whose sound is placed on a timeline by the host clock.
///
/// Samples are counted from an anchor: the first one's time by the server's latency report. The
/// first reports of a stream may be off by a fragment, so the anchor is set anew after 100 ms; from
/// then on only when counted and reported time differ by more than 40 ms, for between lie the
/// report's own swings. A part that would overlap what the track has placed already is left out.
///
/// Threading: the connection's thread.
class PulseTrack {
 public:
  /// Of one sink input (without it: of the source `device`). `ended` is called once the stream has failed;
  /// it may destroy the track.
  struct Target {
    std::optional<uint32_t> sinkInput;
    std::string device;
  };
  PulseTrack(pa_context* context, const Target& target, std::shared_ptr<MixTimeline> timeline,
             std::function<void()> ended);
  ~PulseTrack();
  PulseTrack(const PulseTrack&) = delete;
  PulseTrack& operator=(const PulseTrack&) = delete;

  /// False where the stream could not even be asked for.
  [[nodiscard]] bool isConnecting() const { return connecting_; }
  /// Whether it has recorded anything.
  [[nodiscard]] bool hasBegun() const { return anchored_; }

 private:
  void connect(const Target& target);
  void stateChanged();
  void readAvailable();
  void anchor(int64_t pending);
  void place(const void* data, size_t bytes);

  const std::shared_ptr<MixTimeline> timeline_;
  const std::function<void()> ended_;
  pa_stream* const stream_;
  bool connecting_ = false;
  bool anchored_ = false;
  bool settled_ = false;
  int64_t position_ = 0;  // frame of the next sample
  int64_t counted_ = 0;   // frames since the anchor
  int64_t placed_ = 0;    // the first frame that this track has not filled
};

}  // namespace qv::platform
