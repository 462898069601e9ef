#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <vector>

#include "platform/base/Audio.h"
#include "platform/threads/PacedThread.h"

namespace qv::platform {

/// The 16-bit linear PCM that the audio backends produce.
struct PCMFormat {
  uint32_t sampleRate = 44100;  ///< 44100 or 48000 Hz
  uint32_t channels = 1;        ///< 1 or 2, interleaved
  bool isBigEndian = true;

  /// Nothing where the description is of another format.
  static std::optional<PCMFormat> fromDescription(const AudioStreamDescription& description);
  [[nodiscard]] AudioStreamDescription description() const;
  [[nodiscard]] uint32_t bytesPerFrame() const { return 2 * channels; }
};

/// Sound that exists at every moment of the host clock. It begins with the object.
///
/// Threading: `render` is called from one thread.
class PCMSource {
 public:
  virtual ~PCMSource() = default;
  /// How long after a moment its sound can be asked for.
  [[nodiscard]] virtual std::chrono::nanoseconds latency() const = 0;
  /// For the end, which does not sit out the latency: waits until whatever sounds steadily has come in up to
  /// `hostTime`, 50 ms at most. Called in the thread of `render`.
  virtual void awaitSound(uint64_t /*hostTime*/) {}
  /// Fills in, in native byte order and interleaved, the frames from host time `hostTime` on (in
  /// nanoseconds), silence included. Calls continue one another, except after a long hold-up.
  virtual void render(uint64_t hostTime, std::span<int16_t> samples) = 0;
};

/// A run of frames in their final byte order.
struct PCMBlock {
  uint64_t hostTime = 0;   ///< of the first frame, nanoseconds
  int64_t sampleTime = 0;  ///< frames since the start
  uint32_t frames = 0;
  std::span<const uint8_t> bytes;
};

/// Renders a source by the host clock, in blocks of at most 10 ms, until it is destroyed.
///
/// The first frame is of the moment of construction. A thread that was held up renders what it
/// missed, up to a second; of more it leaves out all but the last 100 ms. A `stop` renders all up to the
/// moment of the call; `abandon`, destruction and a stop from a callback leave out what was not rendered yet.
///
/// Threading: callbacks are called on the pacer's thread; `stop`, `abandon` and destruction are those of a
/// PacedThread, and `stop` waits for the sound besides (see `PCMSource::awaitSound`).
class PCMPacer {
 public:
  struct Callbacks {
    std::function<void()> opened;
    std::function<void(const PCMBlock&)> sink;
    std::function<void()> completed;  ///< after the last block of a stop that rendered the rest
    std::function<void()> closed;
  };
  /// `clock` is the host clock, and must outlive the pacer's thread.
  PCMPacer(PCMFormat format, std::unique_ptr<PCMSource> source, Callbacks callbacks,
           PacedClock& clock = monotonicClock());
  ~PCMPacer();
  void stop();
  void abandon();
  [[nodiscard]] bool isStopped() const;

 private:
  struct Run;
  std::shared_ptr<Run> run_;
  PacedThread thread_;
};

}  // namespace qv::platform
