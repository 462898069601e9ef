#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <vector>

#include "platform/Audio.h"
#include "platform/PacedThread.h"

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
/// missed, up to a second; of more it leaves out all but the last 100 ms.
///
/// Threading: `opened`, `sink` and `closed` are called on the pacer's thread; `stop` and destruction are
/// those of a PacedThread.
class PCMPacer {
 public:
  struct Callbacks {
    std::function<void()> opened;
    std::function<void(const PCMBlock&)> sink;
    std::function<void()> closed;
  };
  PCMPacer(PCMFormat format, std::unique_ptr<PCMSource> source, Callbacks callbacks);
  ~PCMPacer();
  void stop();
  [[nodiscard]] bool isStopped() const;

 private:
  struct Run;
  std::shared_ptr<Run> run_;
  PacedThread thread_;
};

}  // namespace qv::platform
