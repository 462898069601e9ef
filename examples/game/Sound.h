#pragma once

#include <pulse/pulseaudio.h>

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "MainLoop.h"

namespace comet {

/// The game's sound: a 1 kHz beep that is heard for 100 ms from each whole second of CLOCK_MONOTONIC
/// on, that is, together with the flash; or a tone without end.
///
/// The server says how long a sample written now takes until it is heard; every sample is computed for
/// the instant of its hearing. Samples come in stereo, 48 kHz.
///
/// Threading: made and destroyed in one thread; sound is made in libpulse's own.
class Sound {
 public:
  /// Nothing, and the reason in `error`, when no server takes our sound.
  static std::unique_ptr<Sound> create(const char* name, std::optional<double> tone, std::string& error);
  ~Sound();
  Sound(const Sound&) = delete;
  Sound& operator=(const Sound&) = delete;

 private:
  explicit Sound(std::optional<double> tone);
  [[nodiscard]] int16_t sampleAt(Instant heard) const;
  bool open(const char* name);
  void write(size_t bytes);
  void anchorTo(Instant heard);

  const std::optional<double> tone_;  // Hz, without end
  pa_threaded_mainloop* const loop_;
  pa_context* context_ = nullptr;
  pa_stream* stream_ = nullptr;
  int64_t written_ = 0;  // frames
  /// When frame 0 would have been heard, as the server's latest word has it.
  std::optional<Instant> anchor_;
};

}  // namespace comet
